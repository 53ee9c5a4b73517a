#pragma once
// The processor's stage types: transforms, extends, samplers, masks, the copy process and the normal blend.
// Each stage's Params holds, in order, the floats of its block in a kernel's parameter array.

#include "host/raster/AffineTransform.h"
#include "host/raster/Bitmap.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

// The bilinear interpolation of the four pixels around flocation (a transformed pixel centre less half a
// pixel), written once: BilinearSampler expands it and the kernel text of the bilinear Sample stage pastes
// the same tokens. ACC is the accumulator type, READ(x, y) the premultiplied accumulator of the pixel at (x,
// y) read through Extend, ZERO the accumulator of the format's minimum; it leaves the premultiplied sum in
// `result`. The cell's corner is the truncation, less one for negatives: a floor except at exact negative
// integers, where it is one less.
#define RASTER_BILINEAR_INTERPOLATION(ACC, READ, ZERO)                                                       \
    int ix = rt_sat_int(flocation.x);                                                                        \
    if (flocation.x < 0.0f) ix -= 1;                                                                         \
    int iy = rt_sat_int(flocation.y);                                                                        \
    if (flocation.y < 0.0f) iy -= 1;                                                                         \
    const ACC tl = READ(ix, iy);                                                                             \
    const ACC tr = READ(ix + 1, iy);                                                                         \
    const ACC bl = READ(ix, iy + 1);                                                                         \
    const ACC br = READ(ix + 1, iy + 1);                                                                     \
    const float fx = flocation.x - (float)ix;                                                                \
    const float fy = flocation.y - (float)iy;                                                                \
    const ACC result = ZERO + tl * ((1.0f - fx) * (1.0f - fy)) + tr * (fx * (1.0f - fy)) +                   \
                       bl * (fy * (1.0f - fx)) + br * (fy * fx);

namespace Raster {

// Rows top to bottom, each left to right: the order a tile is walked in.
struct Horizontal {};

// ---- Parameter blocks

// Floats a stage's Params contributes to the parameter array. A Params is either empty, a record of floats
// only (copied as it is), or declares FloatCount and Write itself.
template <class P>
constexpr int ParamFloatCount() noexcept {
    if constexpr (requires { P::FloatCount; }) {
        return P::FloatCount;
    } else if constexpr (std::is_empty_v<P>) {
        return 0;
    } else {
        static_assert(std::is_trivially_copyable_v<P> && sizeof(P) % sizeof(float) == 0 &&
                          alignof(P) == alignof(float),
                      "a parameter record holds floats only");
        return int(sizeof(P) / sizeof(float));
    }
}

template <class P>
void WriteParamFloats(const P& params, float* out) noexcept {
    if constexpr (requires { params.Write(out); })
        params.Write(out);
    else if constexpr (ParamFloatCount<P>() > 0)
        std::memcpy(out, &params, sizeof(P));
}

// ---- Transforms: where the source is read for a destination location. Prepare turns Params into what the
// per-pixel code uses (the kernel's floats).

template <class T>
using PreparedTransform = decltype(T::Prepare(std::declval<const typename T::Params&>()));

struct IdentityTransform {
    struct Params {};
    static constexpr bool IsIdentity = true;
    static Params Prepare(const Params& p) noexcept { return p; }
    static KernelMath::float2 Transform(KernelMath::float2 location, const Params&) noexcept {
        return location;
    }
};

struct ScaleTransform {
    struct Params {
        float x = 1.0f;
        float y = 1.0f;
    };
    static Params Prepare(const Params& p) noexcept { return p; }
    static KernelMath::float2 Transform(KernelMath::float2 location, const Params& p) noexcept {
        return KernelMath::float2_literal(location.x * p.x, location.y * p.y);
    }
};

// Right applied to the result of Left. The block is [floats of Left, Left's floats, Right's floats].
template <class Left, class Right>
struct ChainedTransform {
    struct Params {
        [[no_unique_address]] typename Left::Params left{};
        [[no_unique_address]] typename Right::Params right{};

        static constexpr int LeftFloatCount = ParamFloatCount<typename Left::Params>();
        static constexpr int FloatCount = 1 + LeftFloatCount + ParamFloatCount<typename Right::Params>();
        void Write(float* out) const noexcept {
            out[0] = float(LeftFloatCount);
            WriteParamFloats(left, out + 1);
            WriteParamFloats(right, out + 1 + LeftFloatCount);
        }
    };
    struct Prepared {
        PreparedTransform<Left> left;
        PreparedTransform<Right> right;
    };
    static Prepared Prepare(const Params& p) noexcept {
        return {Left::Prepare(p.left), Right::Prepare(p.right)};
    }
    static KernelMath::float2 Transform(KernelMath::float2 location, const Prepared& p) noexcept {
        return Right::Transform(Left::Transform(location, p.left), p.right);
    }
};

template <class T>
inline constexpr bool IsIdentityTransform = requires {
    requires T::IsIdentity;
};

// Stages transform pixel centres, not corners.
template <class T>
inline KernelMath::float2 TransformPixelCenterToFloat(KernelMath::int2 location,
                                                      const PreparedTransform<T>& p) noexcept {
    using namespace KernelMath;
    return T::Transform(convert_float2(location) + 0.5f, p);
}
template <class T>
inline KernelMath::int2 TransformPixelCenterToInt(KernelMath::int2 location,
                                                  const PreparedTransform<T>& p) noexcept {
    using namespace KernelMath;
    return convert_int2(floor(T::Transform(convert_float2(location) + 0.5f, p)));
}

// ---- Extends: what a read outside the image gives. Image is a Bitmap view; the kernel's extend parameters
// are the image's own (width, height), which the view already knows.

// Coordinates are clamped into the image: the edge pixels continue outwards.
struct Safe {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        const int x = KernelMath::rt_clampi(l.x, 0, image.GetWidth() - 1);
        const int y = KernelMath::rt_clampi(l.y, 0, image.GetHeight() - 1);
        return image.Row(y)[x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// Outside is transparent black (every component zero).
struct Zero {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        if (l.x < 0 || l.y < 0 || l.x >= image.GetWidth() || l.y >= image.GetHeight()) return {};
        return image.Row(l.y)[l.x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// The image wraps around horizontally (a cylinder); rows are clamped.
struct Wrap {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        const int x = KernelMath::rt_wrapi(l.x, image.GetWidth());
        const int y = KernelMath::rt_clampi(l.y, 0, image.GetHeight() - 1);
        return image.Row(y)[x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// The image tiles the plane in both directions.
struct Repeat {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        const int x = KernelMath::rt_wrapi(l.x, image.GetWidth());
        const int y = KernelMath::rt_wrapi(l.y, image.GetHeight());
        return image.Row(y)[x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// The image is reflected at its edges (the edge pixel repeats once: ... 1 0 | 0 1 ...).
struct Mirror {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        const int x = KernelMath::rt_mirrori(l.x, image.GetWidth());
        const int y = KernelMath::rt_mirrori(l.y, image.GetHeight());
        return image.Row(y)[x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// No edge handling at all: for stages whose reads are known to stay inside the image (a same-size copy).
// The cheapest extend; a read outside is a caller's error.
struct Full {
    template <class Image>
    static typename Image::Stored Read(const Image& image, KernelMath::int2 l) noexcept {
        return image.Row(l.y)[l.x];
    }
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language);
};

// ---- Samplers: the source pixel for a destination location, through Transform and Extend.

template <class Sampler>
struct SamplerBase {
    struct Params {
        typename Sampler::Params block{};
        const DynamicBuffer* pixels = nullptr; // a secondary image the sampler reads, if any
    };
};

// Nearest: the pixel under the transformed pixel centre.
struct IdentitySampler {
    struct Params {};
    static constexpr bool IsNearest = true;
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, KernelMath::int2 location,
                                         const PreparedTransform<Transform>& t) noexcept {
        return Extend::Read(image, TransformPixelCenterToInt<Transform>(location, t));
    }
};

// Bilinear over the four neighbours, premultiplied by alpha.
struct BilinearSampler {
    struct Params {};
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, KernelMath::int2 location,
                                         const PreparedTransform<Transform>& t) noexcept {
        using namespace KernelMath;
        float2 flocation = TransformPixelCenterToFloat<Transform>(location, t);
        flocation -= 0.5f;
        return Interpolate<Extend>(image, flocation);
    }

    // The interpolated pixel at flocation, a transformed pixel centre less half a pixel: for samplers that
    // transform a whole span first.
    template <class Extend, class Image>
    static typename Image::Stored Interpolate(const Image& image, KernelMath::float2 flocation) noexcept {
        using namespace KernelMath;
        using T = typename Image::Traits;
#define RASTER_BILINEAR_READ(x, y) T::Premultiplied(Extend::Read(image, make_int2(x, y)))
        RASTER_BILINEAR_INTERPOLATION(auto, RASTER_BILINEAR_READ, T::Accumulate(typename Image::Stored{}))
#undef RASTER_BILINEAR_READ
        return T::FromAccumulator(T::Postdivided(result));
    }
};

// ---- Masks: a weight 0..1 per destination pixel. MaskImage is the typed view of the mask bitmap.

template <class Mask>
struct MaskBase {
    struct Params {
        typename Mask::Params block{};
        const DynamicBuffer* pixels = nullptr;          // the mask bitmap
        const DynamicBuffer* secondaryPixels = nullptr; // a second mask, if any
    };
};

// Every weight 1; the per-tile loop skips masking altogether.
struct IdentityMask {
    struct Params {};
    static constexpr bool IsIdentity = true;
    template <class MaskImage>
    static void ReadSpan(const MaskImage&, const Params&, int, int, MaskSpan& out) noexcept {
        std::fill_n(out.planes[0], out.count, 1.0f);
    }
};

// One weight everywhere: a uniform opacity.
struct ConstantMask {
    struct Params {
        float opacity = 1.0f;
    };
    template <class MaskImage>
    static void ReadSpan(const MaskImage&, const Params& p, int, int, MaskSpan& out) noexcept {
        std::fill_n(out.planes[0], out.count, p.opacity);
    }
};

// A mask bitmap read through an affine transform, nearest, with zero outside. Its block holds three
// length-prefixed parts: the extend's (the mask's width and height), the transform's and the sampler's.
struct BitmapMask {
    struct Params {
        float extendCount = 2.0f;
        float width = 0.0f;
        float height = 0.0f;
        float transformCount = 6.0f;
        float transform[6] = {1.0f, 0.0f, 0.0f, 0.0f, 1.0f, 0.0f};
        float samplerCount = 0.0f;
    };
    template <class MaskImage>
    static void ReadSpan(const MaskImage& mask, const Params& p, int x0, int y, MaskSpan& out) noexcept {
        using namespace KernelMath;
        AffineTransform::Prepared t;
        std::copy_n(p.transform, 6, t.p);
        for (int i = 0; i < out.count; ++i) {
            const int2 l = TransformPixelCenterToInt<AffineTransform>(make_int2(x0 + i, y), t);
            out.planes[0][i] =
                MaskImage::Traits::Accumulate(Zero::Read(mask, l)) / MaskImage::Traits::Maximum;
        }
    }
};

// The product of two masks' weights (a selection times an opacity). The block is [floats of Left, Left's
// floats, Right's floats].
template <class Left, class Right>
struct ChainedMask {
    struct Params {
        [[no_unique_address]] typename Left::Params left{};
        [[no_unique_address]] typename Right::Params right{};

        static constexpr int LeftFloatCount = ParamFloatCount<typename Left::Params>();
        static constexpr int FloatCount = 1 + LeftFloatCount + ParamFloatCount<typename Right::Params>();
        void Write(float* out) const noexcept {
            out[0] = float(LeftFloatCount);
            WriteParamFloats(left, out + 1);
            WriteParamFloats(right, out + 1 + LeftFloatCount);
        }
    };
    template <class MaskImage>
    static void ReadSpan(const MaskImage& mask, const Params& p, int x0, int y, MaskSpan& out) noexcept {
        Left::ReadSpan(mask, p.left, x0, y, out);
        MaskSpan other;
        other.count = out.count;
        Right::ReadSpan(mask, p.right, x0, y, other);
        PlanarMergeMaskSpans(out, other);
    }
};

template <class M>
inline constexpr bool IsIdentityMask = requires {
    requires M::IsIdentity;
};

// ---- Process and blend

// Hands the sampled pixel on unchanged.
struct Copy {
    struct Params {};
    static constexpr bool ReadsDestination = false;
    const Params& GetParams() const noexcept { return m_Params; }
    template <PixelFormat F>
    StoredPixel<F> Process(StoredPixel<F> source, StoredPixel<F>, float) const noexcept {
        return source;
    }

private:
    Params m_Params;
};

template <class P>
inline constexpr bool ProcessReadsDestination = [] {
    if constexpr (requires { P::ReadsDestination; })
        return bool(P::ReadsDestination);
    else
        return true;
}();

// The result replaces the destination in proportion to the mask weight.
struct NormalBlend {
    template <PixelFormat F>
    static StoredPixel<F> Blend(StoredPixel<F> source, StoredPixel<F> dest, float mask) noexcept {
        return BlendNormal<F>(source, dest, mask);
    }
    // Blend(source, dest, mask) over dest_type.
    static const char* GetHardwareFragment(HardwareKernelLanguage language);
};

// ---- Conversion between the sampled source format and the destination format. Between equal formats it is
// the identity; the library that owns the conversion arithmetic specialises the others.
template <PixelFormat Source, PixelFormat Dest>
struct PixelConversion;

template <PixelFormat F>
struct PixelConversion<F, F> {
    static constexpr bool IsIdentity = true;
    static StoredPixel<F> Convert(StoredPixel<F> p) noexcept { return p; }
};

} // namespace Raster
