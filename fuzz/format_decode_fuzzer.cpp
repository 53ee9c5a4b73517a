// libFuzzer target for the decoders of WebP, HEIF (AVIF and HEIC) and OpenEXR, built once per format so that
// each starts from its own seeds: files decode to an image or to a message, never to a crash, a hang or an
// allocation beyond the size checks; both with and without turning the pixels upright by their metadata.

#include "host/io/ImageIO.h"

#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto bytes = std::as_bytes(std::span(data, size));
    for (bool upright : {false, true}) {
        const IO::ReadResult result = IO::DecodeImage(bytes, "fuzz", {}, {.autoOrient = upright});
        if (bool(result.image) == !result.error.empty()) std::abort(); // exactly one of the two
        if (!result.image) return 0;
        const Raster::DynamicBuffer& image = *result.image;
        volatile std::byte sink{};
        for (int y = 0; y < image.GetHeight(); ++y)
            sink = image.RowBytes(y)[image.GetRowBytes() - 1];
        (void)sink;
    }
    return 0;
}
