#include "PipelineTestSupport.h"

#include "pipeline/Conversions.h"
#include "pipeline/RenderJob.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <sstream>

namespace PipelineTest {

namespace {

std::uint32_t Hash(std::uint32_t a) {
    a = (a ^ 61u) ^ (a >> 16);
    a = a + (a << 3);
    a = a ^ (a >> 4);
    a = a * 0x27D4EB2Du;
    return a ^ (a >> 15);
}

// A component value for an integer channel: the extremes and their neighbours often, anything otherwise.
template <class T>
T IntegerComponent(std::uint32_t h) {
    constexpr double max = double(std::numeric_limits<T>::max());
    switch (h % 8) {
    case 0:
        return 0;
    case 1:
        return T(max);
    case 2:
        return T(1);
    case 3:
        return T(max - 1);
    case 4:
        return T(max / 2 + 1); // the middle (128, 32768)
    default:
        return T(double(h >> 8) / double(0xFFFFFF) * max);
    }
}

float FloatColour(std::uint32_t h) {
    switch (h % 8) {
    case 0:
        return 0.0f;
    case 1:
        return 1.0f;
    case 2:
        return -0.25f - float(h >> 24) / 256.0f;
    case 3:
        return 1.0f + float(h >> 24) / 64.0f;
    default:
        return float(h >> 8) / float(0xFFFFFF);
    }
}

float FloatAlpha(std::uint32_t h) {
    switch (h % 4) {
    case 0:
        return 0.0f;
    case 1:
        return 1.0f;
    default:
        return float(h >> 8) / float(0xFFFFFF);
    }
}

} // namespace

Kernel::Counted<Raster::DynamicBuffer> MakeImage(PixelFormat format, int width, int height, unsigned seed) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const auto& info = Raster::GetPixelFormatInfo(format);
    for (int y = 0; y < height; ++y) {
        std::byte* row = image->RowBytes(y);
        for (int x = 0; x < width; ++x) {
            for (int c = 0; c < info.channelCount; ++c) {
                const std::uint32_t h =
                    Hash(seed * 7919u + std::uint32_t(y * 65536 + x) * 8u + std::uint32_t(c));
                std::byte* at = row + std::size_t(x * info.bytesPerPixel + c * info.bytesPerComponent);
                if (info.bytesPerComponent == 1) {
                    const std::uint8_t v = IntegerComponent<std::uint8_t>(h);
                    std::memcpy(at, &v, 1);
                } else if (info.bytesPerComponent == 2) {
                    const std::uint16_t v = IntegerComponent<std::uint16_t>(h);
                    std::memcpy(at, &v, 2);
                } else {
                    const float v = c == info.alphaIndex ? FloatAlpha(h) : FloatColour(h);
                    std::memcpy(at, &v, 4);
                }
            }
        }
    }
    return image;
}

Kernel::Counted<Raster::DynamicBuffer> MakeFilled(PixelFormat format, int width, int height,
                                                  const void* pixel) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const int bpp = Raster::GetBytesPerPixel(format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            std::memcpy(image->RowBytes(y) + std::size_t(x * bpp), pixel, std::size_t(bpp));
    return image;
}

std::vector<double> ReadComponents(const Raster::DynamicBuffer& image, int x, int y) {
    const auto& info = Raster::GetPixelFormatInfo(image.GetFormat());
    std::vector<double> out;
    const std::byte* pixel = image.RowBytes(y) + std::size_t(x * info.bytesPerPixel);
    for (int c = 0; c < info.channelCount; ++c) {
        const std::byte* at = pixel + c * info.bytesPerComponent;
        if (info.bytesPerComponent == 1) {
            std::uint8_t v;
            std::memcpy(&v, at, 1);
            out.push_back(v);
        } else if (info.bytesPerComponent == 2) {
            std::uint16_t v;
            std::memcpy(&v, at, 2);
            out.push_back(v);
        } else {
            float v;
            std::memcpy(&v, at, 4);
            out.push_back(v);
        }
    }
    return out;
}

std::string Difference::Describe() const {
    std::ostringstream text;
    text.precision(9);
    text << "pixel (" << x << ", " << y << ") channel " << channel << ": " << a << " against " << b << " ("
         << units << " units)";
    return text.str();
}

std::optional<Difference> Compare(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b,
                                  double tolerance) {
    if (a.GetWidth() != b.GetWidth() || a.GetHeight() != b.GetHeight() || a.GetFormat() != b.GetFormat()) {
        Difference d;
        d.units = INFINITY;
        d.x = -1;
        return d;
    }
    const bool isFloat = Raster::IsFloatFormat(a.GetFormat());
    std::optional<Difference> worst;
    for (int y = 0; y < a.GetHeight(); ++y)
        for (int x = 0; x < a.GetWidth(); ++x) {
            const auto pa = ReadComponents(a, x, y), pb = ReadComponents(b, x, y);
            for (std::size_t c = 0; c < pa.size(); ++c) {
                double units;
                if (isFloat) {
                    const float fa = float(pa[c]), fb = float(pb[c]);
                    if (std::memcmp(&fa, &fb, 4) == 0) continue;
                    // Units of the last bit at the larger magnitude, and at least at 1 (nominal white), so
                    // that values near zero are not held to a finer step than the range they stand for.
                    const float scale = std::max({std::fabs(fa), std::fabs(fb), 1.0f});
                    units = std::isnan(fa) || std::isnan(fb)
                                ? INFINITY
                                : std::fabs(double(fa) - double(fb)) /
                                      double(std::nextafter(scale, INFINITY) - scale);
                } else {
                    units = std::fabs(pa[c] - pb[c]);
                }
                if (units <= tolerance) continue;
                if (!worst || units > worst->units) worst = Difference{x, y, int(c), pa[c], pb[c], units};
            }
        }
    return worst;
}

Kernel::Counted<Raster::HardwareDevice> OpenCLDevice() {
    return Raster::Hardware::GetDevice("opencl");
}

TiledResult RenderTiled(const RasterTools::PipelineCommand& command, const RasterTools::RenderTarget& base,
                        int tileWidth, int tileHeight, int originX, int originY) {
    TiledResult result;
    const auto bounds = base.destination.pixels->GetBounds();
    const int stepX = tileWidth > 0 ? tileWidth : bounds.Width();
    const int stepY = tileHeight > 0 ? tileHeight : bounds.Height();
    // The grid starts at the origin, so that the first row and column of tiles may be partial.
    const int startX = originX > 0 ? originX - stepX * ((originX + stepX - 1) / stepX) : 0;
    const int startY = originY > 0 ? originY - stepY * ((originY + stepY - 1) / stepY) : 0;
    for (int y = startY; y < bounds.bottom; y += stepY)
        for (int x = startX; x < bounds.right; x += stepX) {
            RasterTools::RenderTarget target = base;
            target.rect = Kernel::RectT<int>{x, y, x + stepX, y + stepY}.Intersect(bounds);
            if (target.rect.IsEmpty()) continue;
            switch (command.Render(target)) {
            case RasterTools::RenderPath::Device:
                ++result.device;
                break;
            case RasterTools::RenderPath::Processor:
                ++result.processor;
                break;
            default:
                ++result.other;
                break;
            }
        }
    if (base.destination.cache) {
        EXPECT_TRUE(base.destination.cache->SyncHostCache(bounds));
    }
    return result;
}

Kernel::Counted<Raster::DynamicBuffer> MakeDestination(const RasterTools::PipelineCommand& command,
                                                       const Raster::DynamicBuffer& source) {
    const auto shape = command.GetOutputShape(source.GetWidth(), source.GetHeight(), source.GetFormat());
    return MakeImage(shape.format, shape.width, shape.height, 991u);
}

} // namespace PipelineTest

namespace PipelineTest {

std::optional<Difference> CompareCMYKMeaning(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b,
                                             double tolerance) {
    using Raster::PixelFormat;
    std::optional<Difference> worst;
    for (int y = 0; y < a.GetHeight(); ++y)
        for (int x = 0; x < a.GetWidth(); ++x) {
            const auto pa =
                RasterTools::ToWorking<PixelFormat::CMYKA8>(a.Row<Raster::KernelMath::cmyka8>(y)[x]);
            const auto pb =
                RasterTools::ToWorking<PixelFormat::CMYKA8>(b.Row<Raster::KernelMath::cmyka8>(y)[x]);
            const float wa[4] = {pa.x, pa.y, pa.z, pa.w}, wb[4] = {pb.x, pb.y, pb.z, pb.w};
            for (int c = 0; c < 4; ++c) {
                const double units = std::fabs(double(wa[c]) - double(wb[c])) * 255.0;
                if (units <= tolerance) continue;
                if (!worst || units > worst->units) worst = Difference{x, y, c, wa[c], wb[c], units};
            }
        }
    return worst;
}

Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterTools::PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
       int tileSize, const Kernel::Counted<Raster::HardwareDevice>& device, const View& view) {
    auto destination = PipelineTest::MakeDestination(command, *source);
    RasterTools::RenderJobOptions options;
    options.tileSize = tileSize;
    options.device = device;
    options.bounds = view.bounds;
    options.transform = view.transform;
    const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
    EXPECT_TRUE(result.complete) << result.error;
    if (device) {
        EXPECT_EQ(result.processorTiles, 0) << "tiles fell back to the processor\n"
                                            << Raster::GetLastHardwareError();
    }
    return result.complete ? destination : nullptr;
}

} // namespace PipelineTest
