#include "host/raster/ICCManager.h"

#include "host/kernel/Simd.h"
#include "host/kernel/UnalignedBytes.h"
#include "host/raster/LabMath.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

namespace Raster {

namespace {

using namespace KernelMath;

// Pixels go through planes of up to this many, across which the compiler runs the conversion in vector
// lanes (the same IEEE operations in every lane, so the results are those of one pixel at a time).
constexpr int ChunkPixels = 32;

struct Planes {
    alignas(64) float c[4][ChunkPixels];
};

// The LabA16 Convert bodies' expressions, so that the colour manager gives the kernels' values: stored /
// 65535 in, and scaled, 0.5 added and truncated (saturating) out. Built for AVX2 and for any x86-64 (see
// Kernel::HasAvx2).
inline void ToStoredBody(Planes& p, int n) noexcept {
#pragma omp simd
    for (int i = 0; i < n; ++i) {
        const ushort4 lab = convert_ushort4(
            rgbauf_to_labaf(make_float4(p.c[0][i], p.c[1][i], p.c[2][i], p.c[3][i])) * 65535.0f + 0.5f);
        p.c[0][i] = lab.x;
        p.c[1][i] = lab.y;
        p.c[2][i] = lab.z;
        p.c[3][i] = lab.w;
    }
}

inline void FromStoredBody(Planes& p, int n) noexcept {
#pragma omp simd
    for (int i = 0; i < n; ++i) {
        const float4 rgb = labaf_to_rgbauf(make_float4(p.c[0][i] / 65535.0f, p.c[1][i] / 65535.0f,
                                                       p.c[2][i] / 65535.0f, p.c[3][i] / 65535.0f));
        p.c[0][i] = rgb.x;
        p.c[1][i] = rgb.y;
        p.c[2][i] = rgb.z;
        p.c[3][i] = rgb.w;
    }
}

RT_AVX2_DISPATCH(ToStored, ToStoredBody, (Planes & p, int n), (p, n))
RT_AVX2_DISPATCH(FromStored, FromStoredBody, (Planes & p, int n), (p, n))

// Runs convert over count pixels a chunk at a time: each In pixel spread over the planes, each Out pixel
// gathered from them (whole numbers 0..65535 are exact in float, so the narrowing to ushort4 loses nothing).
template <class In, class Out>
void ConvertInChunks(const unsigned char* in, unsigned char* out, int count,
                     void (*convert)(Planes&, int) noexcept) {
    Planes p;
    for (int done = 0; done < count; done += ChunkPixels) {
        const int n = std::min(ChunkPixels, count - done);
        for (int i = 0; i < n; ++i) {
            In pixel;
            std::memcpy(&pixel, in + std::size_t(done + i) * sizeof pixel, sizeof pixel);
            float4 v;
            if constexpr (std::is_same_v<In, float4>)
                v = pixel;
            else
                v = convert_float4(pixel);
            p.c[0][i] = v.x;
            p.c[1][i] = v.y;
            p.c[2][i] = v.z;
            p.c[3][i] = v.w;
        }
        convert(p, n);
        for (int i = 0; i < n; ++i) {
            Out pixel;
            if constexpr (std::is_same_v<Out, float4>)
                pixel = make_float4(p.c[0][i], p.c[1][i], p.c[2][i], p.c[3][i]);
            else
                pixel =
                    make_ushort4(ushort(p.c[0][i]), ushort(p.c[1][i]), ushort(p.c[2][i]), ushort(p.c[3][i]));
            std::memcpy(out + std::size_t(done + i) * sizeof pixel, &pixel, sizeof pixel);
        }
    }
}

} // namespace

ICCManager& ICCManager::GetInstance() {
    // Never destroyed: a rendering thread may still convert while the process is shutting down.
    static ICCManager* const instance = new ICCManager();
    return *instance;
}

void ICCManager::DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count) {
    ConvertInChunks<float4, ushort4>(in, out, count, ToStored);
}

void ICCManager::DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count) {
    ConvertInChunks<ushort4, float4>(in, out, count, FromStored);
}

} // namespace Raster

// Profile conversions through lcms2. Kept apart from the closed forms above: those must match the kernels
// bit for bit, these must match the profiles.

#include "host/raster/DynamicBuffer.h"

#include <lcms2.h>

#include <cmath>
#include <memory>
#include <thread>

namespace Raster {

namespace {

enum class Model { RGB, Grey, CMYK, Lab, None };

Model ModelOf(PixelFormat format) noexcept {
    switch (format) {
    case PixelFormat::RGBA8:
    case PixelFormat::RGBA16:
    case PixelFormat::RGBAUF:
        return Model::RGB;
    case PixelFormat::IA8:
    case PixelFormat::IA16:
        return Model::Grey;
    case PixelFormat::CMYKA8:
        return Model::CMYK;
    case PixelFormat::LabA16:
        return Model::Lab;
    default:
        return Model::None;
    }
}

std::string_view SpaceOf(std::span<const std::byte> profile) noexcept {
    if (profile.size() < 132) return {};
    return std::string_view(reinterpret_cast<const char*>(profile.data()) + 16, 4);
}

struct ProfileCloser {
    void operator()(void* p) const noexcept { cmsCloseProfile(p); }
};
struct TransformDeleter {
    void operator()(void* p) const noexcept { cmsDeleteTransform(p); }
};
using Profile = std::unique_ptr<void, ProfileCloser>;
using Transform = std::unique_ptr<void, TransformDeleter>;

// sRGB's curve, for the built-in grey: grey pixels are neutral working-space colours.
Profile BuiltInGrey() {
    const double parameters[5] = {2.4, 1.0 / 1.055, 0.055 / 1.055, 1.0 / 12.92, 0.04045};
    cmsToneCurve* curve = cmsBuildParametricToneCurve(nullptr, 4, parameters);
    if (!curve) return nullptr;
    Profile profile(cmsCreateGrayProfile(cmsD50_xyY(), curve));
    cmsFreeToneCurve(curve);
    return profile;
}

// The lcms2 profile for model's numbers, and the float layout lcms2 reads and writes them in. CMYK without a
// profile goes through sRGB (see Side).
struct Side {
    Model model = Model::None;
    bool formula = false; // CMYK by the undercolour formula, lcms2 seeing the sRGB it gives
    Profile profile;
    cmsUInt32Number layout = 0;
};

bool OpenSide(Model model, const std::vector<std::byte>& bytes, Side& side, std::string& error) {
    side.model = model;
    if (!bytes.empty()) {
        side.profile.reset(cmsOpenProfileFromMem(bytes.data(), cmsUInt32Number(bytes.size())));
        if (!side.profile) {
            error = "the colour profile is damaged";
            return false;
        }
    } else if (model == Model::RGB || model == Model::CMYK) {
        side.formula = model == Model::CMYK;
        side.profile.reset(cmsCreate_sRGBProfile());
    } else if (model == Model::Grey) {
        side.profile = BuiltInGrey();
    } else {
        side.profile.reset(cmsCreateLab4Profile(nullptr));
    }
    if (!side.profile) {
        error = "lcms2 cannot make a profile";
        return false;
    }
    const Model seen = side.formula ? Model::RGB : model;
    side.layout = seen == Model::RGB    ? TYPE_RGB_FLT
                  : seen == Model::Grey ? TYPE_GRAY_FLT
                  : seen == Model::CMYK ? TYPE_CMYK_FLT
                                        : TYPE_Lab_FLT;
    return true;
}

int ColourCount(Model model) {
    return model == Model::Grey ? 1 : model == Model::CMYK ? 4 : 3;
}

using Kernel::LoadBytes;
using Kernel::StoreBytes;

// One pixel's stored components to the numbers lcms2 reads (0..1 RGB and grey, 0..100 ink, Lab as it is) and
// its alpha as 0..1.
void Unpack(PixelFormat format, const std::byte* p, bool formula, float* colour, float& alpha) {
    switch (format) {
    case PixelFormat::RGBA8:
        for (int c = 0; c < 3; ++c)
            colour[c] = float(std::uint8_t(p[c])) / 255.0f;
        alpha = float(std::uint8_t(p[3])) / 255.0f;
        break;
    case PixelFormat::RGBA16:
        for (int c = 0; c < 3; ++c)
            colour[c] = float(LoadBytes<std::uint16_t>(p + c * 2)) / 65535.0f;
        alpha = float(LoadBytes<std::uint16_t>(p + 6)) / 65535.0f;
        break;
    case PixelFormat::RGBAUF:
        for (int c = 0; c < 3; ++c)
            colour[c] = LoadBytes<float>(p + c * 4);
        alpha = LoadBytes<float>(p + 12);
        break;
    case PixelFormat::IA8:
        colour[0] = float(std::uint8_t(p[0])) / 255.0f;
        alpha = float(std::uint8_t(p[1])) / 255.0f;
        break;
    case PixelFormat::IA16:
        colour[0] = float(LoadBytes<std::uint16_t>(p)) / 65535.0f;
        alpha = float(LoadBytes<std::uint16_t>(p + 2)) / 65535.0f;
        break;
    case PixelFormat::CMYKA8: {
        float ink[4];
        for (int c = 0; c < 4; ++c)
            ink[c] = float(std::uint8_t(p[c])) / 255.0f;
        if (formula) // the pipeline's undercolour formula: black first, the inks over what it leaves
            for (int c = 0; c < 3; ++c)
                colour[c] = 1.0f - std::min(1.0f, ink[c] * (1.0f - ink[3]) + ink[3]);
        else
            for (int c = 0; c < 4; ++c)
                colour[c] = ink[c] * 100.0f;
        alpha = float(std::uint8_t(p[4])) / 255.0f;
        break;
    }
    case PixelFormat::LabA16:
        colour[0] = float(LoadBytes<std::uint16_t>(p)) / float(LabA16Encoding::LightnessScale);
        for (int c = 1; c < 3; ++c)
            colour[c] =
                (float(LoadBytes<std::uint16_t>(p + c * 2)) - float(LabA16Encoding::OpponentNeutral)) /
                float(LabA16Encoding::OpponentScale);
        alpha = float(LoadBytes<std::uint16_t>(p + 6)) / 65535.0f;
        break;
    default:
        break;
    }
}

template <class T>
T Quantise(float v, float max) {
    if (!(v > 0.0f)) return T(0); // NaN too
    return v >= max ? T(max) : T(std::lround(v));
}

void Pack(PixelFormat format, const float* colour, float alpha, bool formula, std::byte* p) {
    switch (format) {
    case PixelFormat::RGBA8:
        for (int c = 0; c < 3; ++c)
            p[c] = std::byte(Quantise<std::uint8_t>(colour[c] * 255.0f, 255.0f));
        p[3] = std::byte(Quantise<std::uint8_t>(alpha * 255.0f, 255.0f));
        break;
    case PixelFormat::RGBA16:
        for (int c = 0; c < 3; ++c)
            StoreBytes(p + c * 2, Quantise<std::uint16_t>(colour[c] * 65535.0f, 65535.0f));
        StoreBytes(p + 6, Quantise<std::uint16_t>(alpha * 65535.0f, 65535.0f));
        break;
    case PixelFormat::RGBAUF:
        for (int c = 0; c < 3; ++c)
            StoreBytes(p + c * 4, colour[c]);
        StoreBytes(p + 12, alpha);
        break;
    case PixelFormat::IA8:
        p[0] = std::byte(Quantise<std::uint8_t>(colour[0] * 255.0f, 255.0f));
        p[1] = std::byte(Quantise<std::uint8_t>(alpha * 255.0f, 255.0f));
        break;
    case PixelFormat::IA16:
        StoreBytes(p, Quantise<std::uint16_t>(colour[0] * 65535.0f, 65535.0f));
        StoreBytes(p + 2, Quantise<std::uint16_t>(alpha * 65535.0f, 65535.0f));
        break;
    case PixelFormat::CMYKA8: {
        float ink[4];
        if (formula) { // the pipeline's inverse: black takes what the three inks share
            float rgb[3];
            for (int c = 0; c < 3; ++c)
                rgb[c] = std::clamp(colour[c], 0.0f, 1.0f);
            ink[3] = std::min({1.0f - rgb[0], 1.0f - rgb[1], 1.0f - rgb[2]});
            for (int c = 0; c < 3; ++c)
                ink[c] = ink[3] * 255.0f < 254.5f ? (1.0f - rgb[c] - ink[3]) / (1.0f - ink[3]) : 0.0f;
        } else {
            for (int c = 0; c < 4; ++c)
                ink[c] = colour[c] / 100.0f;
        }
        for (int c = 0; c < 4; ++c)
            p[c] = std::byte(Quantise<std::uint8_t>(ink[c] * 255.0f, 255.0f));
        p[4] = std::byte(Quantise<std::uint8_t>(alpha * 255.0f, 255.0f));
        break;
    }
    case PixelFormat::LabA16:
        StoreBytes(p, Quantise<std::uint16_t>(colour[0] * float(LabA16Encoding::LightnessScale), 65535.0f));
        for (int c = 1; c < 3; ++c)
            StoreBytes(p + c * 2, Quantise<std::uint16_t>(colour[c] * float(LabA16Encoding::OpponentScale) +
                                                              float(LabA16Encoding::OpponentNeutral),
                                                          65535.0f));
        StoreBytes(p + 6, Quantise<std::uint16_t>(alpha * 65535.0f, 65535.0f));
        break;
    default:
        break;
    }
}

} // namespace

const std::vector<std::byte>& ColourProfiles::For(PixelFormat format) const noexcept {
    static const std::vector<std::byte> none;
    switch (ModelOf(format)) {
    case Model::RGB:
        return rgb;
    case Model::Grey:
        return grey;
    case Model::CMYK:
        return cmyk;
    default:
        return none;
    }
}

bool ColourProfiles::Add(std::span<const std::byte> profile) {
    const std::string_view space = SpaceOf(profile);
    std::vector<std::byte>* slot = space == "RGB "   ? &rgb
                                   : space == "GRAY" ? &grey
                                   : space == "CMYK" ? &cmyk
                                                     : nullptr;
    if (!slot) return false;
    slot->assign(profile.begin(), profile.end());
    return true;
}

bool ICCManager::NeedsProfileConversion(PixelFormat from, const ColourProfiles& fromProfiles, PixelFormat to,
                                        const ColourProfiles& toProfiles) {
    const Model a = ModelOf(from), b = ModelOf(to);
    if (a == Model::None || b == Model::None) return false;
    const std::vector<std::byte>& source = fromProfiles.For(from);
    const std::vector<std::byte>& target = toProfiles.For(to);
    if (source.empty() && target.empty()) return false;
    return a != b || source != target;
}

Kernel::Counted<DynamicBuffer> ICCManager::ConvertImage(const DynamicBuffer& image,
                                                        const ColourProfiles& fromProfiles, PixelFormat to,
                                                        const ColourProfiles& toProfiles,
                                                        std::string& error) {
    const PixelFormat from = image.GetFormat();
    if (ModelOf(from) == Model::None || ModelOf(to) == Model::None) {
        error = "only layer formats are colour-converted";
        return nullptr;
    }
    Side source, target;
    if (!OpenSide(ModelOf(from), fromProfiles.For(from), source, error) ||
        !OpenSide(ModelOf(to), toProfiles.For(to), target, error))
        return nullptr;
    // The profile's own colour space must be the pixels': an RGB profile cannot read CMYK numbers.
    const cmsColorSpaceSignature expected[2] = {
        source.formula ? cmsSigRgbData : cmsGetColorSpace(source.profile.get()),
        target.formula ? cmsSigRgbData : cmsGetColorSpace(target.profile.get())};
    const Side* sides[2] = {&source, &target};
    for (int i = 0; i < 2; ++i) {
        const Model seen = sides[i]->formula ? Model::RGB : sides[i]->model;
        const cmsColorSpaceSignature wanted = seen == Model::RGB    ? cmsSigRgbData
                                              : seen == Model::Grey ? cmsSigGrayData
                                              : seen == Model::CMYK ? cmsSigCmykData
                                                                    : cmsSigLabData;
        if (expected[i] != wanted) {
            error = "the colour profile is for other pixels than these";
            return nullptr;
        }
    }
    Transform transform(cmsCreateTransform(source.profile.get(), source.layout, target.profile.get(),
                                           target.layout, INTENT_RELATIVE_COLORIMETRIC, cmsFLAGS_NOCACHE));
    if (!transform) {
        error = "lcms2 cannot join the two colour profiles";
        return nullptr;
    }
    auto result = DynamicBuffer::Create(image.GetWidth(), image.GetHeight(), to);
    if (!result) {
        error = "out of memory";
        return nullptr;
    }
    const int width = image.GetWidth();
    const int inCount = ColourCount(source.formula ? Model::RGB : source.model);
    const int outCount = ColourCount(target.formula ? Model::RGB : target.model);
    const std::size_t inPixel = std::size_t(image.GetBytesPerPixel());
    const std::size_t outPixel = std::size_t(result->GetBytesPerPixel());
    // Rows in bands on every core: one transform without a cache may serve several threads at once.
    auto convertRows = [&](int first, int last) {
        std::vector<float> in(std::size_t(width) * std::size_t(inCount));
        std::vector<float> out(std::size_t(width) * std::size_t(outCount));
        std::vector<float> alpha(static_cast<std::size_t>(width));
        for (int y = first; y < last; ++y) {
            const std::byte* row = image.RowBytes(y);
            for (int x = 0; x < width; ++x)
                Unpack(from, row + std::size_t(x) * inPixel, source.formula,
                       &in[std::size_t(x) * std::size_t(inCount)], alpha[std::size_t(x)]);
            cmsDoTransform(transform.get(), in.data(), out.data(), cmsUInt32Number(width));
            std::byte* outRow = result->RowBytes(y);
            for (int x = 0; x < width; ++x)
                Pack(to, &out[std::size_t(x) * std::size_t(outCount)], alpha[std::size_t(x)], target.formula,
                     outRow + std::size_t(x) * outPixel);
        }
    };
    const int height = image.GetHeight();
    const int bands = std::clamp(int(std::thread::hardware_concurrency()), 1,
                                 std::max(1, int(std::int64_t(width) * height / 65536)));
    std::vector<std::thread> threads;
    try {
        for (int band = 1; band < bands; ++band)
            threads.emplace_back(convertRows, height * band / bands, height * (band + 1) / bands);
    } catch (...) {
        // Without more threads the rest is converted here.
        const int done = int(threads.size());
        for (auto& thread : threads)
            thread.join();
        convertRows(0, height / bands);
        convertRows(height * (done + 1) / bands, height);
        return result;
    }
    convertRows(0, height / bands);
    for (auto& thread : threads)
        thread.join();
    return result;
}

} // namespace Raster
