// WebP through libwebp: still images only, decoded to RGBA8; the profile travels in the container's ICCP
// chunk, read through the demuxer and written through the muxer.

#include "host/io/Codecs.h"

#include <webp/decode.h>
#include <webp/demux.h>
#include <webp/encode.h>
#include <webp/mux.h>

#include <cstring>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

// The largest side the format can describe.
constexpr int MaxWebpSide = 16383;

std::vector<std::byte> ReadProfile(std::span<const std::byte> data) {
    std::vector<std::byte> profile;
    WebPData whole{reinterpret_cast<const std::uint8_t*>(data.data()), data.size()};
    WebPDemuxer* demux = WebPDemux(&whole);
    if (!demux) return profile;
    WebPChunkIterator chunk;
    if ((WebPDemuxGetI(demux, WEBP_FF_FORMAT_FLAGS) & ICCP_FLAG) &&
        WebPDemuxGetChunk(demux, "ICCP", 1, &chunk)) {
        const auto* bytes = reinterpret_cast<const std::byte*>(chunk.chunk.bytes);
        try {
            profile.assign(bytes, bytes + chunk.chunk.size);
        } catch (...) {
            WebPDemuxReleaseChunkIterator(&chunk);
            WebPDemuxDelete(demux);
            throw;
        }
        WebPDemuxReleaseChunkIterator(&chunk);
    }
    WebPDemuxDelete(demux);
    return profile;
}

} // namespace

ReadResult DecodeWebp(std::span<const std::byte> data, std::string_view name) {
    ReadResult result;
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(data.data());
    WebPBitstreamFeatures features;
    if (WebPGetFeatures(bytes, data.size(), &features) != VP8_STATUS_OK) {
        result.error = Describe(name, "truncated or damaged WebP data (cannot read the header)");
        return result;
    }
    if (features.has_animation) {
        result.error = Describe(name, "unsupported WebP data (animations are not read)");
        return result;
    }
    result.error = CheckImageSize(name, std::uint64_t(std::max(features.width, 0)),
                                  std::uint64_t(std::max(features.height, 0)), PixelFormat::RGBA8);
    if (!result.error.empty()) return result;
    result.image = Raster::DynamicBuffer::Create(features.width, features.height, PixelFormat::RGBA8);
    if (!result.image) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    Raster::DynamicBuffer& image = *result.image;
    const std::size_t size =
        std::size_t(image.Stride()) * std::size_t(image.GetHeight() - 1) + image.GetRowBytes();
    if (!WebPDecodeRGBAInto(bytes, data.size(), reinterpret_cast<std::uint8_t*>(image.RowBytes(0)), size,
                            int(image.Stride()))) {
        result.image.Reset();
        result.error = Describe(name, "truncated or damaged WebP data (cannot decode)");
        return result;
    }
    result.metadata.iccProfile = ReadProfile(data);
    return result;
}

EncodeResult EncodeWebp(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request) {
    EncodeResult result;
    const int width = image.GetWidth(), height = image.GetHeight();
    if (width > MaxWebpSide || height > MaxWebpSide) {
        result.error =
            Describe(name, "WebP holds at most " + std::to_string(MaxWebpSide) + " pixels a side, not " +
                               std::to_string(width) + " x " + std::to_string(height));
        return result;
    }
    // Opaque images go in as RGB so that no alpha plane is coded at all.
    const int channels = request.alpha ? 4 : 3;
    std::vector<std::uint8_t> packed(std::size_t(width) * std::size_t(height) * std::size_t(channels));
    for (int y = 0; y < height; ++y) {
        const auto* row = reinterpret_cast<const std::uint8_t*>(image.RowBytes(y));
        std::uint8_t* to = packed.data() + std::size_t(y) * std::size_t(width) * std::size_t(channels);
        for (int x = 0; x < width; ++x)
            std::memcpy(to + std::size_t(x) * std::size_t(channels), row + std::size_t(x) * 4,
                        std::size_t(channels));
    }
    // Quality 100 asks for every pixel back: the lossless coder, told to keep the colour of transparent
    // pixels too.
    WebPConfig config;
    if (!WebPConfigInit(&config)) {
        result.error = Describe(name, "cannot encode WebP (library version mismatch)");
        return result;
    }
    config.quality = float(request.quality);
    if (request.quality >= 100) {
        config.lossless = 1;
        config.exact = 1;
    }
    WebPPicture picture;
    if (!WebPPictureInit(&picture)) {
        result.error = Describe(name, "cannot encode WebP (library version mismatch)");
        return result;
    }
    picture.use_argb = config.lossless;
    picture.width = width;
    picture.height = height;
    WebPMemoryWriter writer;
    WebPMemoryWriterInit(&writer);
    picture.writer = WebPMemoryWrite;
    picture.custom_ptr = &writer;
    struct Release {
        WebPPicture* picture;
        WebPMemoryWriter* writer;
        ~Release() {
            WebPPictureFree(picture);
            WebPMemoryWriterClear(writer);
        }
    } release{&picture, &writer};
    const int stride = width * channels;
    const int imported = request.alpha ? WebPPictureImportRGBA(&picture, packed.data(), stride)
                                       : WebPPictureImportRGB(&picture, packed.data(), stride);
    if (!imported || !WebPEncode(&config, &picture)) {
        result.error =
            Describe(name, "cannot encode WebP (error " + std::to_string(int(picture.error_code)) + ")");
        return result;
    }
    const std::uint8_t* encoded = writer.mem;
    const std::size_t length = writer.size;

    if (request.icc.empty()) {
        if (!AppendBytes(result.bytes, encoded, length)) result.error = Describe(name, "out of memory");
        return result;
    }
    // The profile needs the extended container, which the muxer builds around the coded image.
    WebPMux* mux = WebPMuxNew();
    if (!mux) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    struct DeleteMux {
        WebPMux* p;
        ~DeleteMux() { WebPMuxDelete(p); }
    } deleteMux{mux};
    const WebPData bitstream{encoded, length};
    const WebPData profile{reinterpret_cast<const std::uint8_t*>(request.icc.data()), request.icc.size()};
    WebPData assembled{nullptr, 0};
    if (WebPMuxSetImage(mux, &bitstream, 0) != WEBP_MUX_OK ||
        WebPMuxSetChunk(mux, "ICCP", &profile, 0) != WEBP_MUX_OK ||
        WebPMuxAssemble(mux, &assembled) != WEBP_MUX_OK) {
        WebPDataClear(&assembled);
        result.error = Describe(name, "cannot encode WebP (cannot add the colour profile)");
        return result;
    }
    if (!AppendBytes(result.bytes, assembled.bytes, assembled.size))
        result.error = Describe(name, "out of memory");
    WebPDataClear(&assembled);
    return result;
}

} // namespace IO::Detail
