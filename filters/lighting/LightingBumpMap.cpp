// Bump maps from image files: any layer format's pixels as heights, the luminance of their colour.
#include "filters/lighting/LightingMath.h"
#include "filters/lighting/LightingParams.h"
#include "host/io/ImageIO.h"
#include "pipeline/Conversions.h"
#include "pipeline/Pipeline.h"

#include <cmath>

namespace RasterTools {

Kernel::Counted<const Raster::DynamicBuffer> ReadBumpMap(const std::filesystem::path& path,
                                                         std::string& error) {
    const IO::ReadResult read = IO::ReadImage(path);
    if (!read) {
        error = path.string() + ": " + read.error;
        return nullptr;
    }
    const Raster::DynamicBuffer& image = *read.image;
    auto map =
        Raster::DynamicBuffer::Create(image.GetWidth(), image.GetHeight(), Raster::PixelFormat::IntensityUF);
    if (!map) {
        error = path.string() + ": too large for a bump map";
        return nullptr;
    }
    const bool converted = LayerFormatList::Dispatch(image.GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        for (int y = 0; y < image.GetHeight(); ++y) {
            const auto* row = reinterpret_cast<const Raster::StoredPixel<F>*>(image.RowBytes(y));
            float* out = map->Row<float>(y);
            for (int x = 0; x < image.GetWidth(); ++x) {
                const float height = LightingMath::LightingLuminance(ToWorking<F>(row[x]));
                out[x] = std::isfinite(height) ? height : 0.0f;
            }
        }
        return true;
    });
    if (!converted) {
        error = path.string() + ": its pixel format (" +
                std::string(Raster::GetPixelFormatName(image.GetFormat())) + ") cannot be a bump map";
        return nullptr;
    }
    return map;
}

} // namespace RasterTools
