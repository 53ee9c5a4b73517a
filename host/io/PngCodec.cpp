// PNG through libpng. libpng reports errors by longjmp, so every call into it happens inside a small function
// that sets the jump point and holds nothing with a destructor; buffers are owned one frame further out.

#include "host/io/Codecs.h"

#include <png.h>

#include <bit>
#include <csetjmp>
#include <cstdio>
#include <cstring>
#include <new>
#include <utility>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

struct PngContext {
    // Reading: the encoded bytes. Writing: where they go.
    const std::byte* data = nullptr;
    std::size_t size = 0;
    std::size_t position = 0;
    std::vector<std::byte>* out = nullptr;
    char message[200] = {};
};

void OnPngError(png_structp png, png_const_charp message) {
    auto* context = static_cast<PngContext*>(png_get_error_ptr(png));
    std::snprintf(context->message, sizeof context->message, "%s", message ? message : "unknown error");
    png_longjmp(png, 1);
}

void OnPngWarning(png_structp, png_const_charp) {}

void ReadPngData(png_structp png, png_bytep out, std::size_t length) {
    auto* context = static_cast<PngContext*>(png_get_io_ptr(png));
    if (context->size - context->position < length) png_error(png, "unexpected end of data");
    std::memcpy(out, context->data + context->position, length);
    context->position += length;
}

void WritePngData(png_structp png, png_bytep data, std::size_t length) {
    auto* context = static_cast<PngContext*>(png_get_io_ptr(png));
    if (!AppendBytes(*context->out, data, length)) png_error(png, "out of memory");
}

void FlushPngData(png_structp) {}

// No block libpng needs for reading exceeds this: rows are at most 65536 × 8 bytes and the ancillary chunks
// it still buffers are capped below. Refusing larger requests turns a hostile length field into a plain
// error.
constexpr std::size_t MaxLibraryBlock = std::size_t(64) << 20;
// Ancillary chunks are not used, so libpng never needs to hold one longer than this.
constexpr std::size_t MaxChunkBytes = std::size_t(8) << 20;
constexpr png_uint_32 MaxCachedChunks = 1000;

png_voidp AllocatePng(png_structp, png_alloc_size_t size) {
    if (size > MaxLibraryBlock) return nullptr;
    return ::operator new(size, std::nothrow);
}

void FreePng(png_structp, png_voidp block) {
    ::operator delete(block);
}

template <class Result>
Result Failed(Result result, std::string_view name, std::string_view reason) {
    result.error = Describe(name, reason);
    return result;
}

struct PngHeader {
    png_uint_32 width = 0;
    png_uint_32 height = 0;
    int bitDepth = 0;
    int colorType = 0;
    bool hasTransparency = false;
};

bool ReadPngHeader(png_structp png, png_infop info, PngHeader& header) {
    if (setjmp(png_jmpbuf(png))) return false;
    png_read_info(png, info);
    header.width = png_get_image_width(png, info);
    header.height = png_get_image_height(png, info);
    header.bitDepth = png_get_bit_depth(png, info);
    header.colorType = png_get_color_type(png, info);
    header.hasTransparency = png_get_valid(png, info, PNG_INFO_tRNS) != 0;
    return true;
}

struct PngTransforms {
    bool toColour = false; // grey to RGB
    bool to16 = false;     // 8 to 16 bit
};

// Sets up the transforms that turn the file's pixels into the rows of image, then decodes straight into them.
// Returns false with context.message set when libpng fails or the rows would not be what the image expects.
bool ReadPngPixels(png_structp png, png_infop info, const PngHeader& header, PngTransforms transforms,
                   Raster::DynamicBuffer* image, PngContext& context) {
    if (setjmp(png_jmpbuf(png))) return false;
    if (header.colorType == PNG_COLOR_TYPE_PALETTE) png_set_palette_to_rgb(png);
    if (header.colorType == PNG_COLOR_TYPE_GRAY && header.bitDepth < 8) png_set_expand_gray_1_2_4_to_8(png);
    if (header.hasTransparency) png_set_tRNS_to_alpha(png);
    if (transforms.to16) png_set_expand_16(png);
    if (transforms.toColour) png_set_gray_to_rgb(png);
    if (!(header.colorType & PNG_COLOR_MASK_ALPHA) && !header.hasTransparency)
        png_set_add_alpha(png, 0xFFFF, PNG_FILLER_AFTER); // libpng takes the low byte for 8-bit rows
    if constexpr (std::endian::native == std::endian::little) png_set_swap(png);
    const int passes = png_set_interlace_handling(png);
    png_read_update_info(png, info);
    if (png_get_rowbytes(png, info) != image->GetRowBytes()) {
        std::snprintf(context.message, sizeof context.message, "unexpected row layout after expansion");
        return false;
    }
    // Interlaced files: each pass adds its pixels to the rows already there.
    for (int pass = 0; pass < passes; ++pass)
        for (int y = 0; y < image->GetHeight(); ++y)
            png_read_row(png, reinterpret_cast<png_bytep>(image->RowBytes(y)), nullptr);
    // Reading to the end makes a file cut after its last image data count as truncated.
    png_read_end(png, nullptr);
    return true;
}

int CompressionLevel(std::string_view name) {
    if (name == "none") return 0;
    if (name == "fast") return 1;
    if (name == "best") return 9;
    return 6;
}

bool WritePng(png_structp png, png_infop info, const Raster::DynamicBuffer* image,
              const EncodeRequest* request) {
    if (setjmp(png_jmpbuf(png))) return false;
    const PixelFormat format = image->GetFormat();
    const bool grey = format == PixelFormat::IA8 || format == PixelFormat::IA16;
    const int depth = Raster::GetBytesPerComponent(format) * 8;
    const int colorType = grey ? (request->alpha ? PNG_COLOR_TYPE_GRAY_ALPHA : PNG_COLOR_TYPE_GRAY)
                               : (request->alpha ? PNG_COLOR_TYPE_RGB_ALPHA : PNG_COLOR_TYPE_RGB);
    png_set_IHDR(png, info, png_uint_32(image->GetWidth()), png_uint_32(image->GetHeight()), depth, colorType,
                 PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
    png_set_compression_level(png, CompressionLevel(request->compression));
    if (!request->icc.empty())
        png_set_iCCP(png, info, "ICC profile", PNG_COMPRESSION_TYPE_BASE,
                     reinterpret_cast<png_const_bytep>(request->icc.data()),
                     png_uint_32(request->icc.size()));
    png_write_info(png, info);
    // Opaque images leave their alpha out: libpng drops the last sample of every stored pixel.
    if (!request->alpha) png_set_filler(png, 0, PNG_FILLER_AFTER);
    if constexpr (std::endian::native == std::endian::little)
        if (depth == 16) png_set_swap(png);
    for (int y = 0; y < image->GetHeight(); ++y)
        png_write_row(png, reinterpret_cast<png_const_bytep>(image->RowBytes(y)));
    png_write_end(png, info);
    return true;
}

// Destroys libpng's structures however the frame is left.
struct PngReadGuard {
    png_structp png = nullptr;
    png_infop info = nullptr;
    ~PngReadGuard() {
        if (png) png_destroy_read_struct(&png, info ? &info : nullptr, nullptr);
    }
};
struct PngWriteGuard {
    png_structp png = nullptr;
    png_infop info = nullptr;
    ~PngWriteGuard() {
        if (png) png_destroy_write_struct(&png, info ? &info : nullptr);
    }
};

} // namespace

ReadResult DecodePng(std::span<const std::byte> data, std::string_view name,
                     std::optional<PixelFormat> requested) {
    ReadResult result;
    PngContext context;
    context.data = data.data();
    context.size = data.size();
    auto damaged = [&] {
        result.image.Reset();
        result.error = Describe(name, std::string("truncated or damaged PNG data (") + context.message + ")");
        return result;
    };

    PngReadGuard guard;
    guard.png = png_create_read_struct_2(PNG_LIBPNG_VER_STRING, &context, OnPngError, OnPngWarning, nullptr,
                                         AllocatePng, FreePng);
    if (!guard.png) return Failed(std::move(result), name, "out of memory");
    guard.info = png_create_info_struct(guard.png);
    if (!guard.info) return Failed(std::move(result), name, "out of memory");
    png_set_read_fn(guard.png, &context, ReadPngData);
    // Sizes are judged below against the host's own limit, with its own message; libpng only needs to let
    // them through.
    png_set_user_limits(guard.png, 0x7FFFFFFF, 0x7FFFFFFF);
    // libpng only warns about an ancillary chunk longer than its cap and then allocates the claimed length
    // anyway (2 GiB for a 44-byte file). Text, profiles, EXIF and the rest are never used here, so every
    // chunk but the ones decoding needs is skipped unread, and the caps hold for anything libpng still keeps.
    png_set_keep_unknown_chunks(guard.png, PNG_HANDLE_CHUNK_NEVER, nullptr, -1);
    // The colour profile is the exception: it says what the pixels mean.
    static const png_byte profileChunk[] = {'i', 'C', 'C', 'P', 0};
    png_set_keep_unknown_chunks(guard.png, PNG_HANDLE_CHUNK_AS_DEFAULT, profileChunk, 1);
    png_set_chunk_malloc_max(guard.png, MaxChunkBytes);
    png_set_chunk_cache_max(guard.png, MaxCachedChunks);

    PngHeader header;
    if (!ReadPngHeader(guard.png, guard.info, header)) return damaged();

    const bool grey = !(header.colorType & PNG_COLOR_MASK_COLOR);
    const bool deep = header.bitDepth == 16;
    auto formatFor = [](bool isGrey, bool is16) {
        if (isGrey) return is16 ? PixelFormat::IA16 : PixelFormat::IA8;
        return is16 ? PixelFormat::RGBA16 : PixelFormat::RGBA8;
    };
    // The hint is taken only when the widening libpng offers yields exactly the requested format.
    PngTransforms transforms;
    if (requested) {
        for (int toColour = 0; toColour <= int(grey); ++toColour)
            for (int to16 = 0; to16 <= int(!deep); ++to16)
                if (formatFor(grey && !toColour, deep || to16) == *requested)
                    transforms = {toColour != 0, to16 != 0};
    }
    const PixelFormat format = formatFor(grey && !transforms.toColour, deep || transforms.to16);

    result.error = CheckImageSize(name, header.width, header.height, format);
    if (!result.error.empty()) return result;
    result.image = Raster::DynamicBuffer::Create(int(header.width), int(header.height), format);
    if (!result.image) return Failed(std::move(result), name, "out of memory");
    if (!ReadPngPixels(guard.png, guard.info, header, transforms, result.image.Get(), context))
        return damaged();
    png_charp profileName = nullptr;
    int profileCompression = 0;
    png_bytep profile = nullptr;
    png_uint_32 profileLength = 0;
    if (png_get_iCCP(guard.png, guard.info, &profileName, &profileCompression, &profile, &profileLength) &&
        profile && profileLength > 0) {
        const auto* bytes = reinterpret_cast<const std::byte*>(profile);
        result.metadata.iccProfile.assign(bytes, bytes + profileLength);
    }
    return result;
}

EncodeResult EncodePng(const Raster::DynamicBuffer& image, std::string_view name,
                       const EncodeRequest& request) {
    EncodeResult result;
    PngContext context;
    context.out = &result.bytes;
    PngWriteGuard guard;
    guard.png = png_create_write_struct(PNG_LIBPNG_VER_STRING, &context, OnPngError, OnPngWarning);
    if (!guard.png) return Failed(std::move(result), name, "out of memory");
    guard.info = png_create_info_struct(guard.png);
    if (!guard.info) return Failed(std::move(result), name, "out of memory");
    png_set_write_fn(guard.png, &context, WritePngData, FlushPngData);
    if (!WritePng(guard.png, guard.info, &image, &request)) {
        result.bytes.clear();
        result.error = Describe(name, std::string("cannot encode PNG (") + context.message + ")");
    }
    return result;
}

} // namespace IO::Detail
