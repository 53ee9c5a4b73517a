// AVIF and HEIC through libheif, which picks the AV1 or HEVC codec it was built with. Only the primary image
// is read, with libheif's own rotation and mirroring applied; its colour profile, EXIF and XMP come with it.

#include "host/io/Codecs.h"

#include <libheif/heif.h>

#include <cmath>
#include <cstring>
#include <memory>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

struct ContextDeleter {
    void operator()(heif_context* p) const noexcept { heif_context_free(p); }
};
struct HandleDeleter {
    void operator()(heif_image_handle* p) const noexcept { heif_image_handle_release(p); }
};
struct ImageDeleter {
    void operator()(heif_image* p) const noexcept { heif_image_release(p); }
};
struct EncoderDeleter {
    void operator()(heif_encoder* p) const noexcept { heif_encoder_release(p); }
};
using Context = std::unique_ptr<heif_context, ContextDeleter>;
using Handle = std::unique_ptr<heif_image_handle, HandleDeleter>;
using Image = std::unique_ptr<heif_image, ImageDeleter>;
using Encoder = std::unique_ptr<heif_encoder, EncoderDeleter>;

std::string Reason(const heif_error& error) {
    return error.message && *error.message ? error.message : "unknown error";
}

// The longest side whose square fits the pixel limit.
int LongestHeifSide(PixelFormat format) {
    int side =
        int(std::sqrt(double(Raster::DynamicBuffer::MaxStorageBytes) / Raster::GetBytesPerPixel(format)));
    while (side > 1 && !Raster::DynamicBuffer::IsSizeAllowed(side, side, format))
        --side;
    return side;
}

// The metadata blocks of one kind ("Exif", or "mime" XMP), the first of each.
std::vector<std::byte> ReadBlock(const heif_image_handle* handle, const char* type, const char* contentType) {
    std::vector<std::byte> block;
    const int count = heif_image_handle_get_number_of_metadata_blocks(handle, type);
    if (count <= 0) return block;
    std::vector<heif_item_id> ids(static_cast<std::size_t>(count));
    const int listed = heif_image_handle_get_list_of_metadata_block_IDs(handle, type, ids.data(), count);
    for (int i = 0; i < listed; ++i) {
        if (contentType &&
            std::strcmp(heif_image_handle_get_metadata_content_type(handle, ids[std::size_t(i)]),
                        contentType) != 0)
            continue;
        const std::size_t size = heif_image_handle_get_metadata_size(handle, ids[std::size_t(i)]);
        // Metadata larger than any real camera writes is left out rather than allocated.
        if (size == 0 || size > (std::size_t(64) << 20)) continue;
        block.resize(size);
        if (heif_image_handle_get_metadata(handle, ids[std::size_t(i)], block.data()).code != heif_error_Ok)
            block.clear();
        break;
    }
    return block;
}

heif_error WriteToVector(heif_context*, const void* data, size_t size, void* user) {
    auto* out = static_cast<std::vector<std::byte>*>(user);
    if (!AppendBytes(*out, data, size))
        return {heif_error_Memory_allocation_error, heif_suberror_Unspecified, "out of memory"};
    return {heif_error_Ok, heif_suberror_Unspecified, "ok"};
}

} // namespace

ReadResult DecodeHeif(std::span<const std::byte> data, std::string_view name) {
    ReadResult result;
    auto damaged = [&](const std::string& reason) {
        result.image.Reset();
        result.error = Describe(name, "truncated or damaged HEIF data (" + reason + ")");
        return result;
    };
    Context context(heif_context_alloc());
    if (!context) return damaged("out of memory");
    heif_context_set_maximum_image_size_limit(context.get(), Raster::DynamicBuffer::MaxSide);
    heif_error error =
        heif_context_read_from_memory_without_copy(context.get(), data.data(), data.size(), nullptr);
    if (error.code != heif_error_Ok) return damaged(Reason(error));
    heif_image_handle* rawHandle = nullptr;
    error = heif_context_get_primary_image_handle(context.get(), &rawHandle);
    Handle handle(rawHandle);
    if (error.code != heif_error_Ok || !handle) return damaged(Reason(error));

    const int width = heif_image_handle_get_width(handle.get());
    const int height = heif_image_handle_get_height(handle.get());
    const bool deep = heif_image_handle_get_luma_bits_per_pixel(handle.get()) > 8;
    const PixelFormat format = deep ? PixelFormat::RGBA16 : PixelFormat::RGBA8;
    result.error =
        CheckImageSize(name, std::uint64_t(std::max(width, 0)), std::uint64_t(std::max(height, 0)), format);
    if (!result.error.empty()) return result;
    // A grid or overlay states its canvas size apart from the size above, and the decoder fills that canvas
    // before it reads any picture: a few bytes could ask for gigabytes. The decoder only bounds each side,
    // so the square on the longer side must fit the pixel limit, and the canvas may not outgrow it.
    const int side = std::max(width, height);
    if (!Raster::DynamicBuffer::IsSizeAllowed(side, side, format)) {
        result.error = Describe(name, "HEIF image " + std::to_string(width) + " x " + std::to_string(height) +
                                          " is too long: sides beyond " +
                                          std::to_string(LongestHeifSide(format)) + " pixels are not read");
        return result;
    }
    heif_context_set_maximum_image_size_limit(context.get(), side + 1);

    heif_image* rawImage = nullptr;
    error =
        heif_decode_image(handle.get(), &rawImage, heif_colorspace_RGB,
                          deep ? heif_chroma_interleaved_RRGGBBAA_LE : heif_chroma_interleaved_RGBA, nullptr);
    Image decoded(rawImage);
    if (error.code != heif_error_Ok || !decoded) return damaged(Reason(error));
    int stride = 0;
    const std::uint8_t* plane =
        heif_image_get_plane_readonly(decoded.get(), heif_channel_interleaved, &stride);
    if (!plane || heif_image_get_width(decoded.get(), heif_channel_interleaved) != width ||
        heif_image_get_height(decoded.get(), heif_channel_interleaved) != height)
        return damaged("unexpected decoder output layout");
    const int bits = heif_image_get_bits_per_pixel_range(decoded.get(), heif_channel_interleaved);
    const bool premultiplied = heif_image_handle_is_premultiplied_alpha(handle.get()) != 0;

    result.image = Raster::DynamicBuffer::Create(width, height, format);
    if (!result.image) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    // Samples are stretched from the coded range (10 or 12 bits) to the full 16; straight alpha throughout.
    const std::uint32_t max = deep ? (std::uint32_t(1) << std::clamp(bits, 9, 16)) - 1 : 255;
    const std::uint32_t full = deep ? 65535 : 255;
    bool grey = true;
    for (int y = 0; y < height; ++y) {
        const std::uint8_t* from = plane + std::ptrdiff_t(y) * stride;
        std::byte* to = result.image->RowBytes(y);
        for (int x = 0; x < width; ++x) {
            std::uint32_t v[4];
            for (int c = 0; c < 4; ++c) {
                if (deep) {
                    v[c] = std::uint32_t(from[(x * 4 + c) * 2]) |
                           (std::uint32_t(from[(x * 4 + c) * 2 + 1]) << 8);
                    v[c] = std::min(v[c], max);
                    v[c] = (v[c] * full + max / 2) / max;
                } else {
                    v[c] = from[x * 4 + c];
                }
            }
            if (premultiplied && v[3] > 0 && v[3] < full)
                for (int c = 0; c < 3; ++c)
                    v[c] = std::min(full, (v[c] * full + v[3] / 2) / v[3]);
            grey = grey && v[0] == v[1] && v[1] == v[2];
            for (int c = 0; c < 4; ++c) {
                if (deep) {
                    const auto s = std::uint16_t(v[c]);
                    std::memcpy(to + (x * 4 + c) * 2, &s, 2);
                } else {
                    to[x * 4 + c] = std::byte(v[c]);
                }
            }
        }
    }
    // Grey pictures (coded as monochrome, or with no colour in any pixel) come back as grey: nothing is lost.
    if (grey) {
        auto narrow =
            Raster::DynamicBuffer::Create(width, height, deep ? PixelFormat::IA16 : PixelFormat::IA8);
        if (narrow) {
            const std::size_t component = deep ? 2 : 1;
            for (int y = 0; y < height; ++y)
                for (int x = 0; x < width; ++x) {
                    std::memcpy(narrow->RowBytes(y) + x * 2 * component,
                                result.image->RowBytes(y) + x * 4 * component, component);
                    std::memcpy(narrow->RowBytes(y) + (x * 2 + 1) * component,
                                result.image->RowBytes(y) + (x * 4 + 3) * component, component);
                }
            result.image = std::move(narrow);
        }
    }

    const heif_color_profile_type profileType = heif_image_handle_get_color_profile_type(handle.get());
    if (profileType == heif_color_profile_type_prof || profileType == heif_color_profile_type_rICC) {
        const std::size_t size = heif_image_handle_get_raw_color_profile_size(handle.get());
        if (size > 0 && size <= (std::size_t(64) << 20)) {
            result.metadata.iccProfile.resize(size);
            if (heif_image_handle_get_raw_color_profile(handle.get(), result.metadata.iccProfile.data())
                    .code != heif_error_Ok)
                result.metadata.iccProfile.clear();
        }
    }
    // HEIF's EXIF block starts with the offset of the TIFF header within it.
    std::vector<std::byte> exif = ReadBlock(handle.get(), "Exif", nullptr);
    if (exif.size() > 4) {
        const std::uint32_t offset = (std::uint32_t(exif[0]) << 24) | (std::uint32_t(exif[1]) << 16) |
                                     (std::uint32_t(exif[2]) << 8) | std::uint32_t(exif[3]);
        if (offset < exif.size() - 4) result.metadata.exif.assign(exif.begin() + 4 + offset, exif.end());
    }
    const std::vector<std::byte> xmp = ReadBlock(handle.get(), "mime", "application/rdf+xml");
    result.metadata.xmp.assign(reinterpret_cast<const char*>(xmp.data()), xmp.size());
    return result;
}

EncodeResult EncodeHeif(const Raster::DynamicBuffer& image, std::string_view name, FileType type,
                        const EncodeRequest& request) {
    EncodeResult result;
    const char* typeName = type == FileType::AVIF ? "AVIF" : "HEIC";
    auto failed = [&](const std::string& reason) {
        result.bytes.clear();
        result.error = Describe(name, std::string("cannot encode ") + typeName + " (" + reason + ")");
        return result;
    };
    Context context(heif_context_alloc());
    if (!context) return failed("out of memory");
    heif_encoder* rawEncoder = nullptr;
    const heif_compression_format compression =
        type == FileType::AVIF ? heif_compression_AV1 : heif_compression_HEVC;
    heif_error error = heif_context_get_encoder_for_format(context.get(), compression, &rawEncoder);
    Encoder encoder(rawEncoder);
    if (error.code != heif_error_Ok || !encoder) {
        result.error = Describe(name, std::string("this build of libheif has no ") +
                                          (type == FileType::AVIF ? "AV1" : "HEVC") + " encoder, so " +
                                          typeName + " files cannot be written (it can still read them)");
        return result;
    }
    heif_encoder_set_lossy_quality(encoder.get(), request.quality);
    // The plugins' defaults favour size over time beyond reason for a command line (x265's "slow" took a
    // minute for a 1-megapixel picture): a middle setting, where the plugin has one.
    if (type == FileType::HEIC)
        heif_encoder_set_parameter(encoder.get(), "preset", "fast");
    else
        heif_encoder_set_parameter(encoder.get(), "speed", "6");

    const int width = image.GetWidth(), height = image.GetHeight();
    const bool grey = image.GetFormat() == PixelFormat::IA8;
    heif_image* rawImage = nullptr;
    error =
        grey ? heif_image_create(width, height, heif_colorspace_monochrome, heif_chroma_monochrome, &rawImage)
             : heif_image_create(width, height, heif_colorspace_RGB,
                                 request.alpha ? heif_chroma_interleaved_RGBA : heif_chroma_interleaved_RGB,
                                 &rawImage);
    Image picture(rawImage);
    if (error.code != heif_error_Ok || !picture) return failed(Reason(error));
    if (grey) {
        if (heif_image_add_plane(picture.get(), heif_channel_Y, width, height, 8).code != heif_error_Ok ||
            (request.alpha &&
             heif_image_add_plane(picture.get(), heif_channel_Alpha, width, height, 8).code != heif_error_Ok))
            return failed("out of memory");
        int yStride = 0, aStride = 0;
        std::uint8_t* luma = heif_image_get_plane(picture.get(), heif_channel_Y, &yStride);
        std::uint8_t* alpha =
            request.alpha ? heif_image_get_plane(picture.get(), heif_channel_Alpha, &aStride) : nullptr;
        for (int y = 0; y < height; ++y)
            for (int x = 0; x < width; ++x) {
                luma[std::ptrdiff_t(y) * yStride + x] = std::uint8_t(image.RowBytes(y)[x * 2]);
                if (alpha)
                    alpha[std::ptrdiff_t(y) * aStride + x] = std::uint8_t(image.RowBytes(y)[x * 2 + 1]);
            }
    } else {
        if (heif_image_add_plane(picture.get(), heif_channel_interleaved, width, height, 8).code !=
            heif_error_Ok)
            return failed("out of memory");
        int stride = 0;
        std::uint8_t* plane = heif_image_get_plane(picture.get(), heif_channel_interleaved, &stride);
        const int channels = request.alpha ? 4 : 3;
        for (int y = 0; y < height; ++y)
            for (int x = 0; x < width; ++x)
                std::memcpy(plane + std::ptrdiff_t(y) * stride + x * channels, image.RowBytes(y) + x * 4,
                            std::size_t(channels));
    }
    if (!request.icc.empty() &&
        heif_image_set_raw_color_profile(picture.get(), "prof", request.icc.data(), request.icc.size())
                .code != heif_error_Ok)
        return failed("cannot add the colour profile");

    heif_image_handle* rawHandle = nullptr;
    error = heif_context_encode_image(context.get(), picture.get(), encoder.get(), nullptr, &rawHandle);
    Handle handle(rawHandle);
    if (error.code != heif_error_Ok || !handle) return failed(Reason(error));
    if (request.metadata) {
        const Raster::ImageMetadata& metadata = *request.metadata;
        if (!metadata.exif.empty() &&
            heif_context_add_exif_metadata(context.get(), handle.get(), metadata.exif.data(),
                                           int(metadata.exif.size()))
                    .code != heif_error_Ok)
            return failed("cannot add the EXIF metadata");
        if (!metadata.xmp.empty() &&
            heif_context_add_XMP_metadata(context.get(), handle.get(), metadata.xmp.data(),
                                          int(metadata.xmp.size()))
                    .code != heif_error_Ok)
            return failed("cannot add the XMP metadata");
    }
    heif_writer writer{1, WriteToVector};
    error = heif_context_write(context.get(), &writer, &result.bytes);
    if (error.code != heif_error_Ok) return failed(Reason(error));
    return result;
}

} // namespace IO::Detail
