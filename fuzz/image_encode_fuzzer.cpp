// libFuzzer target for the encoders: whatever decodes is written, with the profile and metadata it came with,
// to every file type that can hold it and read back. PNG, TIFF, OpenEXR and lossless WebP must give the same
// pixels, byte for byte; JPEG, being lossy, the same size and format. (AVIF and HEIC encoders are too slow
// for the fuzzer's pace.) Metadata that libexiv2 refuses to write may fail the write, with a message.

#include "host/io/ImageIO.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <span>

namespace {

bool SamePixels(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b) {
    if (a.GetWidth() != b.GetWidth() || a.GetHeight() != b.GetHeight() || a.GetFormat() != b.GetFormat())
        return false;
    for (int y = 0; y < a.GetHeight(); ++y)
        if (std::memcmp(a.RowBytes(y), b.RowBytes(y), a.GetRowBytes()) != 0) return false;
    return true;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    // Upright, so that the Orientation written along (then 1) cannot turn the TIFF read back.
    const IO::ReadResult decoded =
        IO::DecodeImage(std::as_bytes(std::span(data, size)), "fuzz", {}, {.autoOrient = true});
    if (!decoded) return 0;
    const Raster::DynamicBuffer& image = *decoded.image;
    // Encoding is slow next to the fuzzer's pace; huge claims that happen to decode add nothing.
    if (std::int64_t(image.GetWidth()) * image.GetHeight() > 1 << 20) return 0;
    for (IO::FileType type :
         {IO::FileType::PNG, IO::FileType::JPEG, IO::FileType::TIFF, IO::FileType::WebP, IO::FileType::EXR}) {
        if (!IO::CanWrite(type, image.GetFormat())) continue;
        if (type == IO::FileType::WebP && (image.GetWidth() > 16383 || image.GetHeight() > 16383)) continue;
        const bool lossy = type == IO::FileType::JPEG;
        const IO::WriteOptions options{
            .quality = lossy ? 1 + int(size % 100) : 100, .compression = {}, .metadata = decoded.metadata};
        const IO::EncodeResult encoded = IO::EncodeImage(image, type, "fuzz", options);
        if (!encoded && encoded.error.rfind("fuzz: cannot add metadata", 0) == 0) continue;
        if (!encoded) std::abort(); // every writable image must encode
        const IO::ReadResult again = IO::DecodeImage(encoded.bytes, "again");
        if (!again || again.type != type) std::abort();
        if (lossy) {
            if (again.image->GetWidth() != image.GetWidth() ||
                again.image->GetHeight() != image.GetHeight() ||
                again.image->GetFormat() != image.GetFormat())
                std::abort();
        } else if (!SamePixels(image, *again.image)) {
            std::abort();
        }
    }
    return 0;
}
