#include "host/raster/ICCManager.h"

#include "host/raster/LabMath.h"

#include <cstring>

namespace Raster {

namespace {

using namespace KernelMath;

// The LabA16 Convert bodies' expressions, so that the colour manager gives the kernels' values: stored /
// 65535 in, and scaled, 0.5 added and truncated (saturating) out.
float4 FromStored(ushort4 lab) noexcept {
    return labaf_to_rgbauf(convert_float4(lab) / 65535.0f);
}
ushort4 ToStored(float4 rgb) noexcept {
    return convert_ushort4(rgbauf_to_labaf(rgb) * 65535.0f + 0.5f);
}

} // namespace

ICCManager& ICCManager::GetInstance() {
    // Never destroyed: a rendering thread may still convert while the process is shutting down.
    static ICCManager* const instance = new ICCManager();
    return *instance;
}

void ICCManager::DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count) {
    for (int i = 0; i < count; ++i) {
        float4 rgb;
        std::memcpy(&rgb, in + std::size_t(i) * sizeof rgb, sizeof rgb);
        const ushort4 lab = ToStored(rgb);
        std::memcpy(out + std::size_t(i) * sizeof lab, &lab, sizeof lab);
    }
}

void ICCManager::DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count) {
    for (int i = 0; i < count; ++i) {
        ushort4 lab;
        std::memcpy(&lab, in + std::size_t(i) * sizeof lab, sizeof lab);
        const float4 rgb = FromStored(lab);
        std::memcpy(out + std::size_t(i) * sizeof rgb, &rgb, sizeof rgb);
    }
}

} // namespace Raster
