// libFuzzer target: every byte string must decode to an image or to a message, never to a crash or a hang;
// and a TIFF that decodes must be one whose pixel data libtiff itself can find and read without complaint.

#include "host/io/ImageIO.h"

#include <tiffio.h>

#include <algorithm>
#include <cstdarg>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <span>
#include <string_view>

namespace {

struct Source {
    std::span<const std::uint8_t> bytes;
    std::uint64_t position = 0;
    bool complained = false; // an error or warning about the tables that locate the pixel data
};

tmsize_t Read(thandle_t handle, void* buffer, tmsize_t size) {
    auto* source = static_cast<Source*>(handle);
    if (size <= 0 || source->position >= source->bytes.size()) return 0;
    const auto count = std::min<std::uint64_t>(std::uint64_t(size), source->bytes.size() - source->position);
    std::memcpy(buffer, source->bytes.data() + source->position, count);
    source->position += count;
    return tmsize_t(count);
}
tmsize_t Write(thandle_t, void*, tmsize_t) {
    return -1;
}
toff_t Seek(thandle_t handle, toff_t offset, int whence) {
    auto* source = static_cast<Source*>(handle);
    const std::uint64_t base = whence == SEEK_CUR   ? source->position
                               : whence == SEEK_END ? source->bytes.size()
                                                    : 0;
    source->position = base + offset;
    return source->position;
}
int Close(thandle_t) {
    return 0;
}
toff_t Size(thandle_t handle) {
    return static_cast<Source*>(handle)->bytes.size();
}
int Map(thandle_t, void**, toff_t*) {
    return 0;
}
void Unmap(thandle_t, void*, toff_t) {}

// libtiff complains about much odd metadata that it then ignores; only complaints about the tables that
// locate the pixel data count here.
int OnMessage(TIFF*, void* user, const char*, const char* format, va_list args) {
    char text[256];
    std::vsnprintf(text, sizeof text, format, args);
    const std::string_view message(text);
    for (std::string_view table : {"StripOffsets", "StripByteCounts", "TileOffsets", "TileByteCounts"})
        if (message.find(table) != std::string_view::npos) static_cast<Source*>(user)->complained = true;
    return 1;
}

// A second look at a TIFF the decoder accepted, through libtiff alone: the first directory must open without
// complaint about its strip or tile tables, every strip or tile must lie after the header and inside the
// file, and each must decode.
void CheckAcceptedTiff(std::span<const std::uint8_t> bytes) {
    Source source{bytes};
    TIFFOpenOptions* options = TIFFOpenOptionsAlloc();
    TIFFOpenOptionsSetErrorHandlerExtR(options, OnMessage, &source);
    TIFFOpenOptionsSetWarningHandlerExtR(options, OnMessage, &source);
    TIFFOpenOptionsSetMaxSingleMemAlloc(options, tmsize_t(256) << 20);
    TIFF* tif = TIFFClientOpenExt("fuzz", "rm", &source, Read, Write, Seek, Close, Size, Map, Unmap, options);
    TIFFOpenOptionsFree(options);
    if (!tif || source.complained) std::abort(); // accepted, yet libtiff cannot open it cleanly
    const bool tiled = TIFFIsTiled(tif) != 0;
    const std::uint32_t count = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    const tmsize_t chunk = tiled ? TIFFTileSize(tif) : TIFFStripSize(tif);
    auto buffer = static_cast<std::uint8_t*>(_TIFFmalloc(chunk > 0 ? chunk : 1));
    for (std::uint32_t i = 0; i < count; ++i) {
        const std::uint64_t offset = TIFFGetStrileOffset(tif, i);
        const std::uint64_t length = TIFFGetStrileByteCount(tif, i);
        if (offset < 8 || length == 0 || offset > bytes.size() || length > bytes.size() - offset)
            std::abort();
        const tmsize_t got =
            tiled ? TIFFReadEncodedTile(tif, i, buffer, chunk) : TIFFReadEncodedStrip(tif, i, buffer, chunk);
        if (got < 0) std::abort();
    }
    _TIFFfree(buffer);
    TIFFClose(tif);
}

} // namespace

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
        if (result.type == IO::FileType::TIFF) CheckAcceptedTiff(std::span(data, size));
        // The hinted path must be as safe as the plain one.
        (void)IO::DecodeImage(bytes, "fuzz", Raster::PixelFormat::RGBA16);
    }
    return 0;
}
