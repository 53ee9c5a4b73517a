// libFuzzer target: every byte string must decode to an image or to a message, never to a crash or a hang.

#include "host/io/ImageIO.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto bytes = std::as_bytes(std::span(data, size));
    const IO::ReadResult result = IO::DecodeImage(bytes, "fuzz");
    if (bool(result.image) == !result.error.empty()) std::abort(); // exactly one of the two
    if (result.image) {
        // A decoded image must be what its format says: touch the last byte of every row.
        const Raster::DynamicBuffer& image = *result.image;
        volatile std::byte sink{};
        for (int y = 0; y < image.GetHeight(); ++y)
            sink = image.RowBytes(y)[image.GetRowBytes() - 1];
        (void)sink;
        // The hinted path must be as safe as the plain one.
        (void)IO::DecodeImage(bytes, "fuzz", Raster::PixelFormat::RGBA16);
    }
    return 0;
}
