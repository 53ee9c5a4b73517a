// JPEG through libjpeg. Like libpng it reports errors by longjmp, so each call into it happens inside a small
// function that sets the jump point and holds nothing with a destructor.

#include "host/io/Codecs.h"

#include <csetjmp>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include <jpeglib.h>

#include <jerror.h>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

// Progressive files may hold any number of scans, each a full pass over the image; real ones have a dozen.
constexpr int MaxScans = 1000;

struct JpegError {
    jpeg_error_mgr manager; // first, so that the library's pointer to it is a pointer to the whole
    std::jmp_buf jump;
    char message[JMSG_LENGTH_MAX] = {};
    int code = 0; // the library's message code of the error, 0 for errors raised here
};

[[noreturn]] void OnJpegError(j_common_ptr info) {
    auto* error = reinterpret_cast<JpegError*>(info->err);
    info->err->format_message(info, error->message);
    error->code = info->err->msg_code;
    std::longjmp(error->jump, 1);
}

// Warnings that mean the pixels are not what the file meant are errors here: the library would otherwise
// hand back a grey-filled or scrambled image for a truncated or corrupt file.
void OnJpegMessage(j_common_ptr info, int level) {
    if (level != -1) return;
    switch (info->err->msg_code) {
    case JWRN_JPEG_EOF:
    case JWRN_HIT_MARKER:
    case JWRN_HUFF_BAD_CODE:
    case JWRN_ARITH_BAD_CODE:
    case JWRN_MUST_RESYNC:
    case JWRN_NOT_SEQUENTIAL:
        OnJpegError(info);
    default:
        ++info->err->num_warnings;
    }
}

void OnJpegProgress(j_common_ptr info) {
    if (!info->is_decompressor) return;
    if (reinterpret_cast<j_decompress_ptr>(info)->input_scan_number > MaxScans) {
        auto* error = reinterpret_cast<JpegError*>(info->err);
        std::snprintf(error->message, sizeof error->message, "more than %d scans", MaxScans);
        std::longjmp(error->jump, 1);
    }
}

// Compressed bytes go to a fixed block and from there to the output vector.
struct JpegSink {
    jpeg_destination_mgr manager; // first, as above
    std::vector<std::byte>* out = nullptr;
    JOCTET block[65536];
};

void InitSink(j_compress_ptr info) {
    auto* sink = reinterpret_cast<JpegSink*>(info->dest);
    sink->manager.next_output_byte = sink->block;
    sink->manager.free_in_buffer = sizeof sink->block;
}

boolean EmptySink(j_compress_ptr info) {
    auto* sink = reinterpret_cast<JpegSink*>(info->dest);
    if (!AppendBytes(*sink->out, sink->block, sizeof sink->block)) ERREXIT(info, JERR_OUT_OF_MEMORY);
    InitSink(info);
    return TRUE;
}

void TerminateSink(j_compress_ptr info) {
    auto* sink = reinterpret_cast<JpegSink*>(info->dest);
    if (!AppendBytes(*sink->out, sink->block, sizeof sink->block - sink->manager.free_in_buffer))
        ERREXIT(info, JERR_OUT_OF_MEMORY);
}

struct JpegHeader {
    int width = 0;
    int height = 0;
    J_COLOR_SPACE colorSpace = JCS_UNKNOWN;
    bool adobe = false;
};

bool StartJpegDecoder(jpeg_decompress_struct* info, JpegError* error, jpeg_progress_mgr* progress,
                      std::span<const std::byte> data, JpegHeader& header) {
    if (setjmp(error->jump)) return false;
    jpeg_create_decompress(info); // clears everything but the error manager
    info->progress = progress;
    jpeg_mem_src(info, reinterpret_cast<const unsigned char*>(data.data()),
                 static_cast<unsigned long>(data.size()));
    // The colour profile lives in APP2 markers, split over as many as it needs.
    jpeg_save_markers(info, JPEG_APP0 + 2, 0xFFFF);
    jpeg_read_header(info, TRUE);
    header.width = int(info->image_width);
    header.height = int(info->image_height);
    header.colorSpace = info->jpeg_color_space;
    header.adobe = info->saw_Adobe_marker != 0;
    return true;
}

// Decodes into image, whose format chose the output colour space. The library writes 1, 3 or 4 samples a
// pixel at the start of each row; they are spread to the image's layout from the right, in place.
bool DecodeJpegPixels(jpeg_decompress_struct* info, JpegError* error, Raster::DynamicBuffer* image,
                      bool invert) {
    if (setjmp(error->jump)) return false;
    jpeg_start_decompress(info);
    const int width = image->GetWidth();
    const int pixelBytes = image->GetBytesPerPixel();
    const int outputBytes = pixelBytes == 2 ? 1 : pixelBytes - 1;
    if (int(info->output_width) != width || int(info->output_height) != image->GetHeight() ||
        info->output_components != outputBytes) {
        std::snprintf(error->message, sizeof error->message, "unexpected decoder output layout");
        return false;
    }
    while (info->output_scanline < info->output_height) {
        const int y = int(info->output_scanline);
        auto* row = reinterpret_cast<unsigned char*>(image->RowBytes(y));
        JSAMPROW rows[1] = {row};
        if (jpeg_read_scanlines(info, rows, 1) != 1) {
            std::snprintf(error->message, sizeof error->message, "decoder returned no rows");
            return false;
        }
        // Right to left, each pixel's samples lie at or before where they go, so no unread sample is
        // overwritten.
        for (int x = width - 1; x >= 0; --x) {
            unsigned char pixel[4];
            std::memcpy(pixel, row + x * outputBytes, std::size_t(outputBytes));
            unsigned char* to = row + x * pixelBytes;
            for (int c = 0; c < outputBytes; ++c)
                to[c] = invert ? static_cast<unsigned char>(255 - pixel[c]) : pixel[c];
            to[pixelBytes - 1] = 255;
        }
    }
    jpeg_finish_decompress(info);
    return true;
}

bool ReadJpegProfile(jpeg_decompress_struct* info, JpegError* error, JOCTET** profile, unsigned int* length) {
    if (setjmp(error->jump)) return false;
    return jpeg_read_icc_profile(info, profile, length) != 0;
}

bool EncodeJpegPixels(jpeg_compress_struct* info, JpegError* error, JpegSink* sink,
                      const Raster::DynamicBuffer* image, const EncodeRequest* request,
                      unsigned char* scratch) {
    if (setjmp(error->jump)) return false;
    jpeg_create_compress(info);
    info->dest = &sink->manager;
    sink->manager.init_destination = InitSink;
    sink->manager.empty_output_buffer = EmptySink;
    sink->manager.term_destination = TerminateSink;
    const PixelFormat format = image->GetFormat();
    const bool grey = format == PixelFormat::IA8;
    const bool cmyk = format == PixelFormat::CMYKA8;
    info->image_width = JDIMENSION(image->GetWidth());
    info->image_height = JDIMENSION(image->GetHeight());
    info->input_components = grey ? 1 : cmyk ? 4 : 3;
    info->in_color_space = grey ? JCS_GRAYSCALE : cmyk ? JCS_CMYK : JCS_RGB;
    jpeg_set_defaults(info);
    // CMYK is stored as it comes, with Adobe's marker; readers then expect inverted ink (see below).
    if (cmyk) jpeg_set_colorspace(info, JCS_CMYK);
    jpeg_set_quality(info, request->quality, TRUE);
    info->optimize_coding = TRUE;
    // At high quality, chroma at full resolution: halving it would cost more than the quantiser does.
    if (!grey && !cmyk && request->quality >= 90)
        info->comp_info[0].h_samp_factor = info->comp_info[0].v_samp_factor = 1;
    jpeg_start_compress(info, TRUE);
    if (!request->icc.empty())
        jpeg_write_icc_profile(info, reinterpret_cast<const JOCTET*>(request->icc.data()),
                               static_cast<unsigned int>(request->icc.size()));
    const int width = image->GetWidth();
    const int components = info->input_components;
    const int pixelBytes = image->GetBytesPerPixel();
    while (info->next_scanline < info->image_height) {
        const auto* row = reinterpret_cast<const unsigned char*>(image->RowBytes(int(info->next_scanline)));
        for (int x = 0; x < width; ++x)
            for (int c = 0; c < components; ++c)
                scratch[x * components + c] = cmyk ? static_cast<unsigned char>(255 - row[x * pixelBytes + c])
                                                   : row[x * pixelBytes + c];
        JSAMPROW rows[1] = {scratch};
        jpeg_write_scanlines(info, rows, 1);
    }
    jpeg_finish_compress(info);
    return true;
}

} // namespace

ReadResult DecodeJpeg(std::span<const std::byte> data, std::string_view name,
                      std::optional<PixelFormat> requested) {
    ReadResult result;
    jpeg_decompress_struct info{};
    JpegError error;
    info.err = jpeg_std_error(&error.manager);
    error.manager.error_exit = OnJpegError;
    error.manager.emit_message = OnJpegMessage;
    jpeg_progress_mgr progress{};
    progress.progress_monitor = OnJpegProgress;
    // jpeg_destroy is safe on a structure whose creation failed half-way, and frees everything the library
    // holds.
    struct Guard {
        jpeg_decompress_struct* info;
        ~Guard() { jpeg_destroy_decompress(info); }
    } guard{&info};

    auto damaged = [&] {
        // A few errors are about what this build of the library can decode, not about the file.
        const bool unsupported = error.code == JERR_BAD_PRECISION || error.code == JERR_NOT_COMPILED ||
                                 error.code == JERR_CONVERSION_NOTIMPL;
        result.image.Reset();
        result.error = Describe(
            name, std::string(unsupported ? "unsupported JPEG data (" : "truncated or damaged JPEG data (") +
                      error.message + ")");
        return result;
    };

    JpegHeader header;
    if (!StartJpegDecoder(&info, &error, &progress, data, header)) return damaged();
    // The markers came with the header; a profile whose pieces do not fit together is left out.
    JOCTET* profile = nullptr;
    unsigned int profileLength = 0;
    if (ReadJpegProfile(&info, &error, &profile, &profileLength) && profile) {
        const auto* bytes = reinterpret_cast<const std::byte*>(profile);
        try {
            result.metadata.iccProfile.assign(bytes, bytes + profileLength);
        } catch (...) {
            std::free(profile);
            throw;
        }
    }
    std::free(profile);

    PixelFormat format;
    bool invert = false;
    switch (header.colorSpace) {
    case JCS_GRAYSCALE:
        format = requested == PixelFormat::RGBA8 ? PixelFormat::RGBA8 : PixelFormat::IA8;
        info.out_color_space = format == PixelFormat::RGBA8 ? JCS_RGB : JCS_GRAYSCALE;
        break;
    case JCS_RGB:
    case JCS_YCbCr:
        format = PixelFormat::RGBA8;
        info.out_color_space = JCS_RGB;
        break;
    case JCS_CMYK:
    case JCS_YCCK:
        // Files with Adobe's marker store 255 for no ink; the host stores 0 for no ink.
        format = PixelFormat::CMYKA8;
        info.out_color_space = JCS_CMYK;
        invert = header.adobe;
        break;
    default:
        result.error = Describe(name, "unsupported JPEG colour space");
        return result;
    }

    result.error = CheckImageSize(name, std::uint64_t(header.width), std::uint64_t(header.height), format);
    if (!result.error.empty()) return result;
    result.image = Raster::DynamicBuffer::Create(header.width, header.height, format);
    if (!result.image) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    if (!DecodeJpegPixels(&info, &error, result.image.Get(), invert)) return damaged();
    return result;
}

EncodeResult EncodeJpeg(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request) {
    EncodeResult result;
    std::vector<unsigned char> scratch(std::size_t(image.GetWidth()) * 4);
    auto sink = std::make_unique<JpegSink>();
    sink->out = &result.bytes;
    jpeg_compress_struct info{};
    JpegError error;
    info.err = jpeg_std_error(&error.manager);
    error.manager.error_exit = OnJpegError;
    error.manager.emit_message = OnJpegMessage;
    struct Guard {
        jpeg_compress_struct* info;
        ~Guard() { jpeg_destroy_compress(info); }
    } guard{&info};
    if (!EncodeJpegPixels(&info, &error, sink.get(), &image, &request, scratch.data())) {
        result.bytes.clear();
        result.error = Describe(name, std::string("cannot encode JPEG (") + error.message + ")");
    }
    return result;
}

} // namespace IO::Detail
