#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include <png.h>
#include <tiffio.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <csetjmp>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <limits>
#include <random>
#include <unistd.h>

#include <jpeglib.h>

namespace IOTest {

using Raster::PixelFormat;

ScratchFolder::ScratchFolder() {
    static std::atomic<int> counter{0};
    m_Path = std::filesystem::temp_directory_path() /
             ("io_tests_" + std::to_string(::getpid()) + "_" + std::to_string(counter.fetch_add(1)));
    std::filesystem::remove_all(m_Path);
    std::filesystem::create_directories(m_Path);
}

ScratchFolder::~ScratchFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(m_Path, ignored);
}

std::vector<std::string> ScratchFolder::Names() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(m_Path))
        names.push_back(entry.path().filename());
    std::sort(names.begin(), names.end());
    return names;
}

std::filesystem::path DataFolder() {
    return RASTERTOOLS_TEST_DATA;
}

std::vector<std::byte> ReadBytes(const std::filesystem::path& path) {
    std::ifstream in(path, std::ios::binary);
    std::vector<char> chars((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<std::byte> bytes(chars.size());
    std::memcpy(bytes.data(), chars.data(), chars.size());
    return bytes;
}

void WriteBytes(const std::filesystem::path& path, const std::vector<std::byte>& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
}

Kernel::Counted<Raster::DynamicBuffer> Noise(PixelFormat format, int width, int height, std::uint32_t seed) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    std::mt19937 random(seed);
    const float specials[] = {0.0f,
                              -0.0f,
                              1.0f,
                              -2.5f,
                              1e30f,
                              std::numeric_limits<float>::infinity(),
                              -std::numeric_limits<float>::infinity(),
                              std::numeric_limits<float>::denorm_min(),
                              7.25f};
    for (int y = 0; y < height; ++y) {
        std::byte* row = image->RowBytes(y);
        if (Raster::IsFloatFormat(format)) {
            for (std::size_t i = 0; i < image->GetRowBytes() / 4; ++i) {
                const auto r = std::uint32_t(random());
                float value = r % 7 == 0 ? specials[r % std::size(specials)]
                                         : float(std::int32_t(r % 4000001) - 1000000) / 1000000.0f;
                std::memcpy(row + i * 4, &value, 4);
            }
        } else {
            for (std::size_t i = 0; i < image->GetRowBytes(); ++i)
                row[i] = std::byte(random() & 0xFF);
        }
    }
    return image;
}

Kernel::Counted<Raster::DynamicBuffer> Ramps(PixelFormat format, int width, int height) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const int channels = Raster::GetChannelCount(format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            for (int c = 0; c < channels; ++c) {
                const bool alpha = c == channels - 1;
                const double t =
                    alpha ? 1.0 : 0.5 + 0.45 * std::sin(0.05 * (c + 1) * x + 0.03 * (3 - c) * y + c);
                image->Row<std::uint8_t>(y)[x * channels + c] = std::uint8_t(std::lround(t * 255.0));
            }
    return image;
}

std::string Difference(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b) {
    if (a.GetFormat() != b.GetFormat())
        return "formats differ: " + std::string(Raster::GetPixelFormatName(a.GetFormat())) + " and " +
               std::string(Raster::GetPixelFormatName(b.GetFormat()));
    if (a.GetWidth() != b.GetWidth() || a.GetHeight() != b.GetHeight())
        return "sizes differ: " + std::to_string(a.GetWidth()) + "x" + std::to_string(a.GetHeight()) +
               " and " + std::to_string(b.GetWidth()) + "x" + std::to_string(b.GetHeight());
    for (int y = 0; y < a.GetHeight(); ++y)
        for (std::size_t i = 0; i < a.GetRowBytes(); ++i)
            if (a.RowBytes(y)[i] != b.RowBytes(y)[i])
                return "first difference at row " + std::to_string(y) + ", pixel " +
                       std::to_string(i / std::size_t(a.GetBytesPerPixel())) + ", byte " +
                       std::to_string(i % std::size_t(a.GetBytesPerPixel())) + ": " +
                       std::to_string(int(a.RowBytes(y)[i])) + " and " +
                       std::to_string(int(b.RowBytes(y)[i]));
    return {};
}

int MaxDifference8(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b) {
    int worst = 0;
    for (int y = 0; y < a.GetHeight(); ++y)
        for (std::size_t i = 0; i < a.GetRowBytes(); ++i)
            worst = std::max(worst, std::abs(int(a.RowBytes(y)[i]) - int(b.RowBytes(y)[i])));
    return worst;
}

namespace {

void PngAppend(png_structp png, png_bytep data, std::size_t length) {
    auto* out = static_cast<std::vector<std::byte>*>(png_get_io_ptr(png));
    const auto* bytes = reinterpret_cast<const std::byte*>(data);
    out->insert(out->end(), bytes, bytes + length);
}

bool WritePngRows(png_structp png, png_infop info, const PngSpec* spec) {
    if (setjmp(png_jmpbuf(png))) return false;
    png_set_IHDR(png, info, png_uint_32(spec->width), png_uint_32(spec->height), spec->bitDepth,
                 spec->colorType, spec->interlaced ? PNG_INTERLACE_ADAM7 : PNG_INTERLACE_NONE,
                 PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
    if (!spec->palette.empty())
        png_set_PLTE(png, info, reinterpret_cast<png_const_colorp>(spec->palette.data()),
                     int(spec->palette.size() / 3));
    if (!spec->transparency.empty())
        png_set_tRNS(png, info, spec->transparency.data(), int(spec->transparency.size()), nullptr);
    png_write_info(png, info);
    const int passes = png_set_interlace_handling(png);
    for (int pass = 0; pass < passes; ++pass)
        for (const auto& row : spec->rows)
            png_write_row(png, row.data());
    png_write_end(png, info);
    return true;
}

} // namespace

std::vector<std::byte> WritePngDirectly(const PngSpec& spec) {
    std::vector<std::byte> out;
    png_structp png = png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, nullptr, nullptr);
    png_infop info = png_create_info_struct(png);
    png_set_write_fn(png, &out, PngAppend, nullptr);
    const bool ok = WritePngRows(png, info, &spec);
    png_destroy_write_struct(&png, &info);
    EXPECT_TRUE(ok) << "the test's own PNG writer failed";
    return out;
}

std::vector<std::byte> WriteJpegDirectly(int width, int height, int components,
                                         const std::vector<std::uint8_t>& samples, bool adobeMarker,
                                         int quality) {
    jpeg_compress_struct info{};
    jpeg_error_mgr error{};
    info.err = jpeg_std_error(&error); // the default exits on error, acceptable for well-formed test input
    jpeg_create_compress(&info);
    unsigned char* buffer = nullptr;
    unsigned long size = 0;
    jpeg_mem_dest(&info, &buffer, &size);
    info.image_width = JDIMENSION(width);
    info.image_height = JDIMENSION(height);
    info.input_components = components;
    info.in_color_space = components == 1 ? JCS_GRAYSCALE : components == 3 ? JCS_RGB : JCS_CMYK;
    jpeg_set_defaults(&info);
    jpeg_set_quality(&info, quality, TRUE);
    for (int c = 0; c < info.num_components; ++c)
        info.comp_info[c].h_samp_factor = info.comp_info[c].v_samp_factor = 1;
    info.write_Adobe_marker = adobeMarker ? TRUE : FALSE;
    jpeg_start_compress(&info, TRUE);
    while (info.next_scanline < info.image_height) {
        auto* row = const_cast<std::uint8_t*>(samples.data()) +
                    std::size_t(info.next_scanline) * std::size_t(width) * std::size_t(components);
        JSAMPROW rows[1] = {row};
        jpeg_write_scanlines(&info, rows, 1);
    }
    jpeg_finish_compress(&info);
    std::vector<std::byte> out(size);
    std::memcpy(out.data(), buffer, size);
    jpeg_destroy_compress(&info);
    std::free(buffer);
    return out;
}

std::vector<std::byte> WriteTiffDirectly(const TiffSpec& spec) {
    ScratchFolder folder;
    const std::filesystem::path path = folder / "direct.tif";
    TIFF* tif = TIFFOpen(path.c_str(), spec.bigEndian ? "wb" : "wl");
    EXPECT_NE(tif, nullptr);
    if (!tif) return {};
    const std::size_t component = std::size_t(spec.bits / 8);
    const std::size_t pixelBytes = std::size_t(spec.samples) * component;
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, std::uint32_t(spec.width));
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, std::uint32_t(spec.height));
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, std::uint16_t(spec.bits));
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, std::uint16_t(spec.samples));
    TIFFSetField(tif, TIFFTAG_PLANARCONFIG, spec.planar ? PLANARCONFIG_SEPARATE : PLANARCONFIG_CONTIG);
    if (spec.tileSize) {
        TIFFSetField(tif, TIFFTAG_TILEWIDTH, std::uint32_t(spec.tileSize));
        TIFFSetField(tif, TIFFTAG_TILELENGTH, std::uint32_t(spec.tileSize));
    } else {
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, std::uint32_t(2));
    }
    spec.setup(tif);

    // One plane (or all samples interleaved) of a rectangle, from the interleaved pixels.
    auto gather = [&](int x0, int y0, int w, int h, int plane, std::vector<std::byte>& out) {
        const int perPixel = spec.planar ? 1 : spec.samples;
        out.assign(std::size_t(w) * std::size_t(h) * std::size_t(perPixel) * component, std::byte{0});
        for (int y = 0; y < h && y0 + y < spec.height; ++y)
            for (int x = 0; x < w && x0 + x < spec.width; ++x)
                for (int s = 0; s < perPixel; ++s)
                    std::memcpy(out.data() + ((std::size_t(y) * std::size_t(w) + std::size_t(x)) *
                                                  std::size_t(perPixel) +
                                              std::size_t(s)) *
                                                 component,
                                spec.pixels.data() +
                                    (std::size_t(y0 + y) * std::size_t(spec.width) + std::size_t(x0 + x)) *
                                        pixelBytes +
                                    std::size_t(spec.planar ? plane : s) * component,
                                component);
    };
    const int planes = spec.planar ? spec.samples : 1;
    std::vector<std::byte> chunk;
    bool ok = true;
    for (int plane = 0; plane < planes; ++plane) {
        if (spec.tileSize) {
            for (int y = 0; y < spec.height; y += spec.tileSize)
                for (int x = 0; x < spec.width; x += spec.tileSize) {
                    gather(x, y, spec.tileSize, spec.tileSize, plane, chunk);
                    ok = ok && TIFFWriteTile(tif, chunk.data(), std::uint32_t(x), std::uint32_t(y), 0,
                                             std::uint16_t(plane)) >= 0;
                }
        } else {
            for (int y = 0; y < spec.height; ++y) {
                gather(0, y, spec.width, 1, plane, chunk);
                ok = ok && TIFFWriteScanline(tif, chunk.data(), std::uint32_t(y), std::uint16_t(plane)) >= 0;
            }
        }
    }
    TIFFClose(tif);
    EXPECT_TRUE(ok) << "the test's own TIFF writer failed";
    return ReadBytes(path);
}

} // namespace IOTest
