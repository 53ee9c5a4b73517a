#pragma once
// Typed views of images for the per-tile templates and kernels: Bitmap and Buffer over DynamicBuffer, the
// constant-colour source Pixel, and the 32-pixel spans that carry pixels between storage and stages.

#include "host/raster/DynamicBuffer.h"
#include "host/raster/HardwareCache.h"
#include "host/raster/PixelTraits.h"

#include <cstring>

namespace Raster {

// Which image of a kernel an access fragment reads or writes.
enum class KernelImageRole { Source, Dest, Mask };

// The access fragment: LoadSource(pixels, bounds, location) for a source, DestAddress(...) for a destination,
// LoadMask(...) for a mask. Device buffers are packed rows, so one text serves every format.
const char* GetImageAccessFragment(KernelImageRole role, HardwareKernelLanguage language);

// Floats an image writes into the parameter array: its width and height.
inline constexpr int ImageHardwareParamCount = 2;
inline int GetImageHardwareParams(const DynamicBase& image, float* out) noexcept {
    out[0] = float(image.GetWidth());
    out[1] = float(image.GetHeight());
    return ImageHardwareParamCount;
}

// A typed view of a DynamicBuffer whose format has the channel list C1..C5, and of its device mirror if it
// has one. The view owns nothing; the caller keeps image and mirror alive while it is used.
template <class C1, class C2, class C3, class C4, class C5>
class Bitmap {
public:
    static constexpr PixelFormat Format = FormatOf_v<C1, C2, C3, C4, C5>;
    using Traits = PixelTraits<Format>;
    using Stored = typename Traits::Stored;

    Bitmap() = default;
    // An image of another format, or none, gives an empty view.
    explicit Bitmap(DynamicBuffer* image, HardwareCache* cache = nullptr) noexcept
        : m_Image(image && image->GetFormat() == Format ? image : nullptr)
        , m_Cache(m_Image && cache && &cache->GetImage() == m_Image ? cache : nullptr) {}

    explicit operator bool() const noexcept { return m_Image != nullptr; }
    int GetWidth() const noexcept { return m_Image->GetWidth(); }
    int GetHeight() const noexcept { return m_Image->GetHeight(); }
    Kernel::RectT<int> GetBounds() const noexcept { return m_Image->GetBounds(); }
    Stored* Row(int y) const noexcept { return m_Image->template Row<Stored>(y); }
    DynamicBuffer* GetImage() const noexcept { return m_Image; }

    HardwareCache* GetHardwareCache() const noexcept { return m_Cache; }
    // The device the mirror lives on; null without a mirror or before its first device sync.
    const HardwareDevice* GetHardwareDevice() const noexcept {
        return m_Cache ? m_Cache->GetDevice() : nullptr;
    }
    // The reference host loads every image eagerly, so nothing is ever pending.
    bool IsPendingDelayLoad() const noexcept { return false; }

    // Writes the image's block of the parameter array (width, height); returns the number of floats.
    static int GetHardwareParams(const Bitmap& bitmap, float* out) noexcept {
        return GetImageHardwareParams(*bitmap.GetImage(), out);
    }
    static const char* GetSourceHardwareFragment(HardwareKernelLanguage language) {
        return GetImageAccessFragment(KernelImageRole::Source, language);
    }
    static const char* GetDestHardwareFragment(HardwareKernelLanguage language) {
        return GetImageAccessFragment(KernelImageRole::Dest, language);
    }
    static const char* GetMaskHardwareFragment(HardwareKernelLanguage language) {
        return GetImageAccessFragment(KernelImageRole::Mask, language);
    }

private:
    DynamicBuffer* m_Image = nullptr;
    HardwareCache* m_Cache = nullptr;
};

// A scratch image (intermediate results, any format including the float scratch format): the same access as a
// Bitmap.
template <class C1, class C2, class C3, class C4, class C5>
class Buffer : public Bitmap<C1, C2, C3, C4, C5> {
public:
    using Bitmap<C1, C2, C3, C4, C5>::Bitmap;
};

// A source that is one colour everywhere.
template <class C1, class C2, class C3, class C4, class C5>
struct Pixel {
    static constexpr PixelFormat Format = FormatOf_v<C1, C2, C3, C4, C5>;
    using Stored = StoredPixel<Format>;
    Stored value{};
};

template <PixelFormat F>
using BitmapOf =
    Bitmap<typename FormatChannels<F>::C1, typename FormatChannels<F>::C2, typename FormatChannels<F>::C3,
           typename FormatChannels<F>::C4, typename FormatChannels<F>::C5>;

// ---- Spans

inline constexpr int SpanLength = 32;

// Up to 32 pixels, all channels of a pixel together.
template <PixelFormat F>
struct InterleavedPixelSpan {
    using Stored = StoredPixel<F>;
    alignas(64) Stored pixels[SpanLength];
    int count = 0;
};

// Up to 32 pixels as one plane of 32 components per stored channel.
template <PixelFormat F>
struct PlanarPixelSpan {
    using Component = FormatComponent<F>;
    static constexpr int Channels = GetChannelCount(F);
    alignas(64) Component planes[Channels][SpanLength];
    int count = 0;
};

// Mask weights are planar: one float (0..1) per pixel.
using MaskSpan = PlanarPixelSpan<PixelFormat::MaskAF>;

template <PixelFormat F>
void Deinterleave(const InterleavedPixelSpan<F>& in, PlanarPixelSpan<F>& out) noexcept {
    out.count = in.count;
    for (int i = 0; i < in.count; ++i) {
        FormatComponent<F> components[GetChannelCount(F)];
        std::memcpy(components, &in.pixels[i], sizeof components);
        for (int c = 0; c < GetChannelCount(F); ++c)
            out.planes[c][i] = components[c];
    }
}

template <PixelFormat F>
void Interleave(const PlanarPixelSpan<F>& in, InterleavedPixelSpan<F>& out) noexcept {
    out.count = in.count;
    for (int i = 0; i < in.count; ++i) {
        FormatComponent<F> components[GetChannelCount(F)];
        for (int c = 0; c < GetChannelCount(F); ++c)
            components[c] = in.planes[c][i];
        std::memcpy(&out.pixels[i], components, sizeof components);
    }
}

// Multiplies the weights of mask by those of other, pixel by pixel.
inline void PlanarMergeMaskSpans(MaskSpan& mask, const MaskSpan& other) noexcept {
    for (int i = 0; i < mask.count; ++i)
        mask.planes[0][i] *= other.planes[0][i];
}

// One pixel of the normal blend: the result moves from dest towards source by the mask weight; a weight of 1
// or more is the source itself and 0 or less the destination itself.
template <PixelFormat F>
inline StoredPixel<F> BlendNormal(StoredPixel<F> source, StoredPixel<F> dest, float mask) noexcept {
    using T = PixelTraits<F>;
    if (mask >= 1.0f) return source;
    if (mask <= 0.0f) return dest;
    return T::FromAccumulator(T::Mix(T::Accumulate(dest), T::Accumulate(source), mask));
}

// Applies a mask span to a colour span: each result pixel is blended over the matching destination pixel by
// its weight (NormalBlend).
template <PixelFormat F>
void SpanApplyMask(InterleavedPixelSpan<F>& result, const InterleavedPixelSpan<F>& dest,
                   const MaskSpan& mask) noexcept {
    for (int i = 0; i < result.count; ++i)
        result.pixels[i] = BlendNormal<F>(result.pixels[i], dest.pixels[i], mask.planes[0][i]);
}

} // namespace Raster
