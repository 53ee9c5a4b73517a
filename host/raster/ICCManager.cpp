#include "host/raster/ICCManager.h"

#include "host/raster/PixelFormat.h"

#include <lcms2.h>

#include <algorithm>
#include <cstdint>
#include <cstring>

namespace Raster {

namespace {

namespace Space = WorkingColourSpace;

// Pixels go through lcms2 in chunks held on the stack, so that a call of any length allocates nothing.
constexpr int ChunkPixels = 64;

// The working RGB profile, built from the shared constants rather than taken ready-made, so that the kernel
// text and this profile provably describe the same space. In memory, lcms2 keeps the colorants in double.
cmsHPROFILE CreateWorkingRGBProfile() {
    const cmsCIExyY white{Space::WhiteX, Space::WhiteY, 1.0};
    const cmsCIExyYTRIPLE primaries{{Space::RedX, Space::RedY, 1.0},
                                    {Space::GreenX, Space::GreenY, 1.0},
                                    {Space::BlueX, Space::BlueY, 1.0}};
    // lcms2's parametric type 4: Y = (a X + b)^g for X >= d, Y = c X below. Evaluated analytically in float
    // transforms, which is what keeps values outside 0..1 intact in both directions.
    const cmsFloat64Number curve[5] = {Space::Gamma, 1.0 / (1.0 + Space::Offset),
                                       Space::Offset / (1.0 + Space::Offset), 1.0 / Space::LinearSlope,
                                       Space::Break};
    cmsToneCurve* transfer = cmsBuildParametricToneCurve(nullptr, 4, curve);
    if (!transfer) return nullptr;
    cmsToneCurve* curves[3] = {transfer, transfer, transfer};
    cmsHPROFILE profile = cmsCreateRGBProfile(&white, &primaries, curves);
    cmsFreeToneCurve(transfer);
    return profile;
}

std::uint16_t StoreComponent(double value) {
    if (!(value > 0.0)) return 0; // NaN too
    if (value >= 65535.0) return 65535;
    return static_cast<std::uint16_t>(value + 0.5);
}

// Float arithmetic, exactly as the kernel text writes alpha.
std::uint16_t StoreAlpha(float alpha) {
    const float clamped = alpha > 0.0f ? (alpha < 1.0f ? alpha : 1.0f) : 0.0f;
    return static_cast<std::uint16_t>(clamped * 65535.0f + 0.5f);
}

} // namespace

ICCManager& ICCManager::GetInstance() {
    // Never destroyed: a rendering thread may still convert while the process is shutting down.
    static ICCManager* const instance = new ICCManager();
    return *instance;
}

ICCManager::ICCManager() {
    cmsHPROFILE rgb = CreateWorkingRGBProfile();
    cmsHPROFILE lab = cmsCreateLab4Profile(nullptr); // D50
    if (rgb && lab) {
        // Without the one-pixel cache a transform is documented as safe to share between threads, so one
        // pair serves every rendering thread. Without optimisation no sampled table can ever stand in for the
        // exact curves and matrices.
        constexpr cmsUInt32Number flags = cmsFLAGS_NOCACHE | cmsFLAGS_NOOPTIMIZE;
        m_ToLab =
            cmsCreateTransform(rgb, TYPE_RGBA_FLT, lab, TYPE_Lab_FLT, INTENT_RELATIVE_COLORIMETRIC, flags);
        m_FromLab =
            cmsCreateTransform(lab, TYPE_Lab_FLT, rgb, TYPE_RGBA_FLT, INTENT_RELATIVE_COLORIMETRIC, flags);
    }
    if (rgb) cmsCloseProfile(rgb);
    if (lab) cmsCloseProfile(lab);
}

void ICCManager::DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count) {
    float rgba[ChunkPixels * 4];
    float lab[ChunkPixels * 3];
    std::uint16_t stored[ChunkPixels * 4];
    for (int done = 0; done < count;) {
        const int n = std::min(ChunkPixels, count - done);
        std::memcpy(rgba, in + std::size_t(done) * sizeof(float) * 4, std::size_t(n) * sizeof(float) * 4);
        if (m_ToLab)
            cmsDoTransform(static_cast<cmsHTRANSFORM>(m_ToLab), rgba, lab, static_cast<cmsUInt32Number>(n));
        else
            std::fill_n(lab, n * 3, 0.0f);
        for (int i = 0; i < n; ++i) {
            stored[i * 4 + 0] = StoreComponent(double(lab[i * 3 + 0]) * LabA16Encoding::LightnessScale);
            stored[i * 4 + 1] = StoreComponent(double(lab[i * 3 + 1]) * LabA16Encoding::OpponentScale +
                                               LabA16Encoding::OpponentNeutral);
            stored[i * 4 + 2] = StoreComponent(double(lab[i * 3 + 2]) * LabA16Encoding::OpponentScale +
                                               LabA16Encoding::OpponentNeutral);
            stored[i * 4 + 3] = StoreAlpha(rgba[i * 4 + 3]);
        }
        std::memcpy(out + std::size_t(done) * sizeof(std::uint16_t) * 4, stored,
                    std::size_t(n) * sizeof(std::uint16_t) * 4);
        done += n;
    }
}

void ICCManager::DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count) {
    std::uint16_t stored[ChunkPixels * 4];
    float lab[ChunkPixels * 3];
    float rgba[ChunkPixels * 4];
    for (int done = 0; done < count;) {
        const int n = std::min(ChunkPixels, count - done);
        std::memcpy(stored, in + std::size_t(done) * sizeof(std::uint16_t) * 4,
                    std::size_t(n) * sizeof(std::uint16_t) * 4);
        for (int i = 0; i < n; ++i) {
            lab[i * 3 + 0] = static_cast<float>(stored[i * 4 + 0] / LabA16Encoding::LightnessScale);
            lab[i * 3 + 1] =
                static_cast<float>((stored[i * 4 + 1] - double(LabA16Encoding::OpponentNeutral)) /
                                   LabA16Encoding::OpponentScale);
            lab[i * 3 + 2] =
                static_cast<float>((stored[i * 4 + 2] - double(LabA16Encoding::OpponentNeutral)) /
                                   LabA16Encoding::OpponentScale);
        }
        if (m_FromLab)
            cmsDoTransform(static_cast<cmsHTRANSFORM>(m_FromLab), lab, rgba, static_cast<cmsUInt32Number>(n));
        else
            std::fill_n(rgba, n * 4, 0.0f);
        // lcms2 leaves the extra channel alone; alpha is ours, as the kernel text computes it.
        for (int i = 0; i < n; ++i)
            rgba[i * 4 + 3] = static_cast<float>(stored[i * 4 + 3]) / 65535.0f;
        std::memcpy(out + std::size_t(done) * sizeof(float) * 4, rgba, std::size_t(n) * sizeof(float) * 4);
        done += n;
    }
}

} // namespace Raster
