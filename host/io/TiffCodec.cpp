// TIFF through libtiff, from and to memory. libtiff reports errors by return values and per-file handlers, so
// no jump is involved; the handlers keep the first error, which names the cause, and the first warning that
// means the pixels are not what the file meant: libtiff goes on after those with made-up data.

#include "host/io/Codecs.h"
#include "host/kernel/UnalignedBytes.h"

#include <tiffio.h>

#include <algorithm>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <memory>
#include <optional>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

// ---------------------------------------------------------------------------------------------------------
// Memory streams and messages

struct TiffStream {
    const std::byte* data = nullptr; // reading
    std::uint64_t size = 0;
    std::vector<std::byte>* out = nullptr; // writing
    std::uint64_t position = 0;
};

struct TiffMessages {
    char error[256] = {};
    char damage[256] = {}; // the first warning that means damaged data
    bool decoding = false; // set once the directory is read: from then on every warning is about the data
};

// Directory warnings are mostly about odd metadata that libtiff corrects or ignores harmlessly. Those about
// the tables that locate the pixel data are not: libtiff then pads the tables with zeros or guesses the byte
// counts, and the file's own header bytes become pixels.
bool IsDamageWarning(std::string_view text) {
    for (std::string_view sign : {"StripOffsets", "StripByteCounts", "TileOffsets", "TileByteCounts",
                                  "[Strip|Tile]", "calculating from imagelength", "corrupt", "Corrupt"})
        if (text.find(sign) != std::string_view::npos) return true;
    return false;
}

tmsize_t TiffRead(thandle_t handle, void* buffer, tmsize_t size) {
    auto* stream = static_cast<TiffStream*>(handle);
    if (stream->out || size <= 0 || stream->position >= stream->size) return 0;
    const std::uint64_t count = std::min<std::uint64_t>(std::uint64_t(size), stream->size - stream->position);
    std::memcpy(buffer, stream->data + stream->position, count);
    stream->position += count;
    return tmsize_t(count);
}

tmsize_t TiffWrite(thandle_t handle, void* buffer, tmsize_t size) {
    auto* stream = static_cast<TiffStream*>(handle);
    if (!stream->out || size < 0) return -1;
    const std::uint64_t end = stream->position + std::uint64_t(size);
    try {
        if (end > stream->out->size()) stream->out->resize(end);
    } catch (...) {
        return -1;
    }
    std::memcpy(stream->out->data() + stream->position, buffer, std::size_t(size));
    stream->position = end;
    return size;
}

std::uint64_t TiffStreamSize(const TiffStream* stream) {
    return stream->out ? stream->out->size() : stream->size;
}

toff_t TiffSeek(thandle_t handle, toff_t offset, int whence) {
    auto* stream = static_cast<TiffStream*>(handle);
    std::uint64_t base = 0;
    if (whence == SEEK_CUR) base = stream->position;
    if (whence == SEEK_END) base = TiffStreamSize(stream);
    // libtiff passes negative relative offsets as wrapped unsigned values; the sum wraps back.
    const std::uint64_t target = base + offset;
    if (target > (std::uint64_t(1) << 40)) return toff_t(-1);
    stream->position = target;
    return target;
}

int TiffClose(thandle_t) {
    return 0;
}
toff_t TiffSize(thandle_t handle) {
    return TiffStreamSize(static_cast<TiffStream*>(handle));
}
int TiffMap(thandle_t, void**, toff_t*) {
    return 0;
}
void TiffUnmap(thandle_t, void*, toff_t) {}

int OnTiffError(TIFF*, void* user, const char*, const char* format, va_list args) {
    auto* messages = static_cast<TiffMessages*>(user);
    if (!messages->error[0]) std::vsnprintf(messages->error, sizeof messages->error, format, args);
    return 1;
}

// libtiff's renderer notes tiles that hold more bytes than a tile needs, as libtiff itself writes them; the
// surplus is never read. Fewer bytes than needed would fail the read itself.
bool IsSurplusTileWarning(const char* text) {
    unsigned long expected = 0, got = 0;
    return std::sscanf(text, "Invalid tile byte count for tile %*u. Expected %lu, got %lu", &expected,
                       &got) == 2 &&
           got >= expected;
}

int OnTiffWarning(TIFF*, void* user, const char*, const char* format, va_list args) {
    auto* messages = static_cast<TiffMessages*>(user);
    if (!messages || messages->damage[0]) return 1;
    char text[256];
    std::vsnprintf(text, sizeof text, format, args);
    // Old-style LZW is an early variant of the codec that libtiff still decodes exactly.
    const bool harmless =
        IsSurplusTileWarning(text) || std::string_view(text).find("Old-style LZW") != std::string_view::npos;
    if ((messages->decoding && !harmless) || IsDamageWarning(text))
        std::memcpy(messages->damage, text, sizeof text);
    return 1;
}

struct TiffFile {
    TiffMessages messages;
    TIFF* tif = nullptr;
    TiffFile() = default;
    TiffFile(const TiffFile&) = delete;
    TiffFile& operator=(const TiffFile&) = delete;
    ~TiffFile() {
        if (tif) TIFFClose(tif);
    }

    bool Open(std::string_view fileName, const char* mode, TiffStream* stream) {
        TIFFOpenOptions* options = TIFFOpenOptionsAlloc();
        if (!options) return false;
        TIFFOpenOptionsSetErrorHandlerExtR(options, OnTiffError, &messages);
        TIFFOpenOptionsSetWarningHandlerExtR(options, OnTiffWarning, &messages);
        // No single allocation inside libtiff needs more than a whole image may take.
        TIFFOpenOptionsSetMaxSingleMemAlloc(options, tmsize_t(Raster::DynamicBuffer::MaxStorageBytes));
        name = std::string(fileName);
        tif = TIFFClientOpenExt(name.c_str(), mode, stream, TiffRead, TiffWrite, TiffSeek, TiffClose,
                                TiffSize, TiffMap, TiffUnmap, options);
        TIFFOpenOptionsFree(options);
        return tif != nullptr;
    }
    // libtiff's first error (else its first damage warning), without the file name that many of its messages
    // start with.
    std::string Reason(const char* fallback) const {
        std::string_view text = messages.error[0]    ? messages.error
                                : messages.damage[0] ? messages.damage
                                                     : fallback;
        if (text.size() > name.size() + 2 && text.substr(0, name.size()) == name &&
            text.substr(name.size(), 2) == ": ")
            text.remove_prefix(name.size() + 2);
        return std::string(text);
    }
    std::string name;
};

// ---------------------------------------------------------------------------------------------------------
// Reading: layout

enum class Colour { Grey, RGB, CMYK, CIELab, ICCLab };

struct Layout {
    std::uint32_t width = 0;
    std::uint32_t height = 0;
    int bits = 0;
    int samples = 0; // per pixel in the file
    int componentBytes = 0;
    bool isFloat = false;
    Colour colour = Colour::Grey;
    int colourSamples = 0;
    int alpha = -1; // sample index of alpha, -1 when the file has none
    bool associated = false;
    bool minIsWhite = false;
    bool planar = false;
    PixelFormat format = PixelFormat::RGBA8;
};

enum class Route { Direct, Rendered, Unsupported };

Route ReadLayout(TIFF* tif, Layout& layout, std::string& why) {
    std::uint16_t bits = 1, samples = 1, sampleFormat = SAMPLEFORMAT_UINT, planar = PLANARCONFIG_CONTIG;
    std::uint16_t photometric = 0, inkSet = INKSET_CMYK;
    TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &layout.width);
    TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &layout.height);
    TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &bits);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLEFORMAT, &sampleFormat);
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar);
    TIFFGetFieldDefaulted(tif, TIFFTAG_INKSET, &inkSet);
    if (!TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric)) {
        why = "no photometric interpretation";
        return Route::Unsupported;
    }
    std::uint16_t compression = COMPRESSION_NONE;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    if (!TIFFIsCODECConfigured(compression)) {
        why = "compression scheme " + std::to_string(compression) + " is not available";
        return Route::Unsupported;
    }
    layout.bits = bits;
    layout.samples = samples;
    layout.planar = planar == PLANARCONFIG_SEPARATE;

    auto rendered = [&] {
        char message[1024] = {};
        if (TIFFRGBAImageOK(tif, message)) return Route::Rendered;
        why = message;
        return Route::Unsupported;
    };

    switch (photometric) {
    case PHOTOMETRIC_MINISBLACK:
    case PHOTOMETRIC_MINISWHITE:
        layout.colour = Colour::Grey;
        layout.colourSamples = 1;
        layout.minIsWhite = photometric == PHOTOMETRIC_MINISWHITE;
        break;
    case PHOTOMETRIC_RGB:
        layout.colour = Colour::RGB;
        layout.colourSamples = 3;
        break;
    case PHOTOMETRIC_SEPARATED:
        if (inkSet != INKSET_CMYK) {
            why = "separated inks other than CMYK";
            return Route::Unsupported;
        }
        layout.colour = Colour::CMYK;
        layout.colourSamples = 4;
        break;
    case PHOTOMETRIC_CIELAB:
        layout.colour = Colour::CIELab;
        layout.colourSamples = 3;
        break;
    case PHOTOMETRIC_ICCLAB:
        layout.colour = Colour::ICCLab;
        layout.colourSamples = 3;
        break;
    default:
        return rendered();
    }

    // Packed low depths have no host format of their own; libtiff's renderer widens them.
    if (bits < 8) return rendered();
    if (bits == 8 || bits == 16) {
        // CIELab's a and b are signed whatever the sample format says; other signed data has no host format.
        const bool signedOk = layout.colour == Colour::CIELab || layout.colour == Colour::ICCLab;
        if (sampleFormat != SAMPLEFORMAT_UINT && sampleFormat != SAMPLEFORMAT_VOID &&
            !(signedOk && sampleFormat == SAMPLEFORMAT_INT)) {
            why = "signed or float " + std::to_string(bits) + "-bit samples";
            return Route::Unsupported;
        }
    } else if (bits == 32 && sampleFormat == SAMPLEFORMAT_IEEEFP) {
        if (layout.colour == Colour::CMYK || layout.colour == Colour::ICCLab) {
            why = "floating-point CMYK or ICCLab samples";
            return Route::Unsupported;
        }
        layout.isFloat = true;
    } else {
        why = std::to_string(bits) + "-bit " + (sampleFormat == SAMPLEFORMAT_IEEEFP ? "float" : "integer") +
              " samples";
        return Route::Unsupported;
    }
    layout.componentBytes = bits / 8;

    if (samples < layout.colourSamples || samples > 16) {
        why = std::to_string(samples) + " samples per pixel";
        return Route::Unsupported;
    }
    // Alpha is the first extra sample when it is declared as alpha; undeclared extras are ignored.
    std::uint16_t extraCount = 0;
    std::uint16_t* extraTypes = nullptr;
    if (TIFFGetField(tif, TIFFTAG_EXTRASAMPLES, &extraCount, &extraTypes) && extraCount > 0 && extraTypes &&
        samples > layout.colourSamples) {
        if (extraTypes[0] == EXTRASAMPLE_ASSOCALPHA || extraTypes[0] == EXTRASAMPLE_UNASSALPHA) {
            layout.alpha = layout.colourSamples;
            layout.associated = extraTypes[0] == EXTRASAMPLE_ASSOCALPHA;
        }
    }

    switch (layout.colour) {
    case Colour::Grey:
        layout.format = layout.isFloat ? PixelFormat::RGBAUF
                        : bits == 8    ? PixelFormat::IA8
                                       : PixelFormat::IA16;
        break;
    case Colour::RGB:
        layout.format = layout.isFloat ? PixelFormat::RGBAUF
                        : bits == 8    ? PixelFormat::RGBA8
                                       : PixelFormat::RGBA16;
        break;
    case Colour::CMYK:
        layout.format = PixelFormat::CMYKA8;
        break;
    case Colour::CIELab:
    case Colour::ICCLab:
        layout.format = PixelFormat::LabA16;
        break;
    }
    return Route::Direct;
}

// ---------------------------------------------------------------------------------------------------------
// Reading: samples to pixels

using Kernel::LoadBytes;
using Kernel::StoreBytes;

// Straight colour from colour premultiplied by alpha, rounded; zero where alpha is zero.
template <class T>
T Unpremultiply(T colour, T alpha, std::uint32_t max) {
    if (alpha == 0) return 0;
    const std::uint64_t value = (std::uint64_t(colour) * max + alpha / 2u) / alpha;
    return T(std::min<std::uint64_t>(value, max));
}

float UnpremultiplyFloat(float colour, float alpha) {
    return alpha != 0.0f ? colour / alpha : colour;
}

std::uint16_t ClampRound16(double value) {
    if (!(value > 0.0)) return 0; // NaN too
    if (value >= 65535.0) return 65535;
    return std::uint16_t(std::lround(value));
}

// Grey, RGB and CMYK of integer files: colour samples in order, then alpha or the maximum.
template <class T>
void ConvertIntegerRow(const Layout& layout, const std::byte* in, std::byte* out, std::uint32_t width) {
    constexpr std::uint32_t max = T(~T(0));
    const std::size_t inPixel = std::size_t(layout.samples) * sizeof(T);
    const bool reduce16 = layout.format == PixelFormat::CMYKA8 && sizeof(T) == 2; // host CMYK is 8-bit only
    const std::size_t outComponent = reduce16 ? 1 : sizeof(T);
    const int channels = layout.colourSamples;
    for (std::uint32_t x = 0; x < width; ++x) {
        const std::byte* pixel = in + x * inPixel;
        std::byte* to = out + x * std::size_t(channels + 1) * outComponent;
        const T alpha =
            layout.alpha >= 0 ? LoadBytes<T>(pixel + std::size_t(layout.alpha) * sizeof(T)) : T(max);
        for (int c = 0; c <= channels; ++c) {
            T value = c == channels ? alpha : LoadBytes<T>(pixel + std::size_t(c) * sizeof(T));
            if (c < channels) {
                if (layout.minIsWhite) value = T(max - value);
                if (layout.associated) value = Unpremultiply(value, alpha, max);
            }
            if (reduce16)
                StoreBytes(to + std::size_t(c), std::uint8_t((std::uint32_t(value) + 128u) / 257u));
            else
                StoreBytes(to + std::size_t(c) * sizeof(T), value);
        }
    }
}

// Grey or RGB float files to RGBAUF; grey is replicated.
void ConvertFloatRow(const Layout& layout, const std::byte* in, std::byte* out, std::uint32_t width) {
    const std::size_t inPixel = std::size_t(layout.samples) * 4;
    for (std::uint32_t x = 0; x < width; ++x) {
        const std::byte* pixel = in + x * inPixel;
        const float alpha =
            layout.alpha >= 0 ? LoadBytes<float>(pixel + std::size_t(layout.alpha) * 4) : 1.0f;
        float rgb[3];
        for (int c = 0; c < 3; ++c) {
            float value = LoadBytes<float>(pixel + (layout.colourSamples == 1 ? 0 : std::size_t(c) * 4));
            if (layout.minIsWhite) value = 1.0f - value;
            rgb[c] = layout.associated ? UnpremultiplyFloat(value, alpha) : value;
        }
        std::byte* to = out + std::size_t(x) * 16;
        for (int c = 0; c < 3; ++c)
            StoreBytes(to + std::size_t(c) * 4, rgb[c]);
        StoreBytes(to + 12, alpha);
    }
}

// Lab files to LabA16. Each sample is first expressed in LabA16 units (see ImageIO.h), in double, which is
// exact for every integer input; associated alpha is then divided out around the a/b neutral point.
void ConvertLabRow(const Layout& layout, const std::byte* in, std::byte* out, std::uint32_t width) {
    const std::size_t bytes = std::size_t(layout.componentBytes);
    const std::size_t inPixel = std::size_t(layout.samples) * bytes;
    const bool icc = layout.colour == Colour::ICCLab;
    constexpr double neutral = Raster::LabA16Encoding::OpponentNeutral;
    auto lightness = [&](const std::byte* p) -> double {
        if (layout.isFloat) return double(LoadBytes<float>(p)) * Raster::LabA16Encoding::LightnessScale;
        return bytes == 1 ? double(LoadBytes<std::uint8_t>(p)) * 257.0 : double(LoadBytes<std::uint16_t>(p));
    };
    auto opponent = [&](const std::byte* p) -> double {
        if (layout.isFloat)
            return double(LoadBytes<float>(p)) * Raster::LabA16Encoding::OpponentScale + neutral;
        if (bytes == 1)
            return icc ? double(LoadBytes<std::uint8_t>(p)) * 256.0
                       : (double(LoadBytes<std::int8_t>(p)) + 128.0) * 256.0;
        return icc ? double(LoadBytes<std::uint16_t>(p)) : double(LoadBytes<std::int16_t>(p)) + neutral;
    };
    auto alphaOf = [&](const std::byte* p) -> double {
        if (layout.isFloat) return double(LoadBytes<float>(p)) * 65535.0;
        return bytes == 1 ? double(LoadBytes<std::uint8_t>(p)) * 257.0 : double(LoadBytes<std::uint16_t>(p));
    };
    for (std::uint32_t x = 0; x < width; ++x) {
        const std::byte* pixel = in + x * inPixel;
        double l = lightness(pixel);
        double a = opponent(pixel + bytes);
        double b = opponent(pixel + 2 * bytes);
        const double alpha = layout.alpha >= 0 ? alphaOf(pixel + std::size_t(layout.alpha) * bytes) : 65535.0;
        if (layout.associated) {
            const double share = alpha / 65535.0;
            if (share > 0.0) {
                l /= share;
                a = neutral + (a - neutral) / share;
                b = neutral + (b - neutral) / share;
            } else {
                l = 0.0;
                a = b = neutral;
            }
        }
        std::byte* to = out + std::size_t(x) * 8;
        StoreBytes(to, ClampRound16(l));
        StoreBytes(to + 2, ClampRound16(a));
        StoreBytes(to + 4, ClampRound16(b));
        StoreBytes(to + 6, ClampRound16(alpha));
    }
}

void ConvertRow(const Layout& layout, const std::byte* in, std::byte* out, std::uint32_t width) {
    if (layout.colour == Colour::CIELab || layout.colour == Colour::ICCLab)
        ConvertLabRow(layout, in, out, width);
    else if (layout.isFloat)
        ConvertFloatRow(layout, in, out, width);
    else if (layout.componentBytes == 1)
        ConvertIntegerRow<std::uint8_t>(layout, in, out, width);
    else
        ConvertIntegerRow<std::uint16_t>(layout, in, out, width);
}

// The photometric interpretation as the file states it, read from the directory at offset. libtiff quietly
// turns a palette image without its colour map into grey or RGB, which would show indices as colours.
std::optional<std::uint16_t> StatedPhotometric(std::span<const std::byte> data, std::uint64_t offset) {
    if (data.size() < 8) return std::nullopt;
    const bool big = data[0] == std::byte{'M'};
    const bool bigTiff = std::to_integer<int>(data[big ? 3 : 2]) == 43;
    auto read = [&](std::uint64_t at, int bytes) -> std::optional<std::uint64_t> {
        if (at > data.size() || std::uint64_t(bytes) > data.size() - at) return std::nullopt;
        std::uint64_t value = 0;
        for (int i = 0; i < bytes; ++i) {
            const auto b = std::to_integer<std::uint64_t>(data[std::size_t(at) + std::size_t(i)]);
            value |= b << (8 * (big ? bytes - 1 - i : i));
        }
        return value;
    };
    const int countBytes = bigTiff ? 8 : 2;
    const int entryBytes = bigTiff ? 20 : 12;
    const std::optional<std::uint64_t> count = read(offset, countBytes);
    if (!count) return std::nullopt;
    for (std::uint64_t i = 0; i < std::min<std::uint64_t>(*count, 4096); ++i) {
        const std::uint64_t entry = offset + std::uint64_t(countBytes) + i * std::uint64_t(entryBytes);
        const std::optional<std::uint64_t> tag = read(entry, 2);
        const std::optional<std::uint64_t> type = read(entry + 2, 2);
        if (!tag || !type) return std::nullopt;
        if (*tag != TIFFTAG_PHOTOMETRIC) continue;
        // SHORT as the format says, though some writers use LONG.
        const std::optional<std::uint64_t> value =
            read(entry + (bigTiff ? 12 : 8), *type == TIFF_LONG ? 4 : 2);
        if (!value) return std::nullopt;
        return std::uint16_t(*value);
    }
    return std::nullopt;
}

constexpr std::uint64_t MaxWholeStripBytes = std::uint64_t(16) << 20;

// Strips or tiles, contiguous or planar: each band of rows (one strip or one row of tiles) is gathered into
// interleaved file samples, then converted row by row into the image.
bool ReadDirect(TIFF* tif, const Layout& layout, Raster::DynamicBuffer& image, std::string& why) {
    const std::uint32_t width = layout.width;
    const std::uint32_t height = layout.height;
    const std::size_t bytes = std::size_t(layout.componentBytes);
    const std::size_t pixelBytes = std::size_t(layout.samples) * bytes;
    const std::uint64_t imageSampleBytes = std::uint64_t(width) * height * pixelBytes;
    const bool tiled = TIFFIsTiled(tif) != 0;

    std::uint32_t bandHeight = 0;
    std::uint32_t tileWidth = 0;
    std::uint64_t chunkBytes = 0;
    if (tiled) {
        std::uint32_t tileHeight = 0;
        TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tileWidth);
        TIFFGetField(tif, TIFFTAG_TILELENGTH, &tileHeight);
        if (tileWidth == 0 || tileHeight == 0) {
            why = "tiles without a size";
            return false;
        }
        bandHeight = tileHeight;
        chunkBytes = TIFFTileSize64(tif);
        const std::uint64_t expected =
            std::uint64_t(tileWidth) * tileHeight * (layout.planar ? bytes : pixelBytes);
        if (chunkBytes < expected) {
            why = "tile size does not match the layout";
            return false;
        }
    } else {
        std::uint32_t rowsPerStrip = height;
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        bandHeight = std::clamp<std::uint32_t>(rowsPerStrip, 1, height);
        chunkBytes = std::uint64_t(bandHeight) * width * (layout.planar ? bytes : pixelBytes);
    }
    // Tiles may be larger than the image, but not absurdly: this bounds what a small hostile file can claim.
    if (chunkBytes == 0 ||
        chunkBytes > std::max<std::uint64_t>(4 * imageSampleBytes, std::uint64_t(64) << 20)) {
        why = "strip or tile larger than the image warrants";
        return false;
    }
    bandHeight = std::min(bandHeight, height);

    // Large contiguous strips are read a row at a time, so that a small file cannot make the reader hold a
    // strip it claims is gigabytes; the rows are the same as from whole strips.
    if (!tiled && !layout.planar && chunkBytes > MaxWholeStripBytes) {
        auto row = std::make_unique_for_overwrite<std::byte[]>(std::size_t(width) * pixelBytes);
        for (std::uint32_t y = 0; y < height; ++y) {
            if (TIFFReadScanline(tif, row.get(), y, 0) < 0) return false;
            ConvertRow(layout, row.get(), image.RowBytes(int(y)), width);
        }
        return true;
    }
    // Large planar strips likewise, a group of rows at a time, each plane's rows read in turn. libtiff
    // decodes a plane's strip from its start again for each group, so groups are as large as the cap allows.
    const std::uint64_t rowBytes = std::uint64_t(width) * pixelBytes;
    if (!tiled && layout.planar && bandHeight * rowBytes > MaxWholeStripBytes) {
        const auto groupRows = std::uint32_t(std::max<std::uint64_t>(1, MaxWholeStripBytes / rowBytes));
        auto group = std::make_unique_for_overwrite<std::byte[]>(std::size_t(groupRows * rowBytes));
        auto row = std::make_unique_for_overwrite<std::byte[]>(std::size_t(width) * bytes);
        for (std::uint32_t y0 = 0; y0 < height; y0 += groupRows) {
            const std::uint32_t rows = std::min(groupRows, height - y0);
            for (int plane = 0; plane < layout.samples; ++plane)
                for (std::uint32_t r = 0; r < rows; ++r) {
                    if (TIFFReadScanline(tif, row.get(), y0 + r, std::uint16_t(plane)) < 0) return false;
                    std::byte* to = group.get() + r * rowBytes + std::size_t(plane) * bytes;
                    for (std::uint32_t x = 0; x < width; ++x)
                        std::memcpy(to + x * pixelBytes, row.get() + x * bytes, bytes);
                }
            for (std::uint32_t r = 0; r < rows; ++r)
                ConvertRow(layout, group.get() + r * rowBytes, image.RowBytes(int(y0 + r)), width);
        }
        return true;
    }

    // Uninitialised on purpose: fresh large blocks cost nothing until decoded into, so a small file that
    // claims a large image fails on its missing data before memory is touched.
    auto band = std::make_unique_for_overwrite<std::byte[]>(std::size_t(bandHeight) * width * pixelBytes);
    std::unique_ptr<std::byte[]> chunk;
    if (tiled || layout.planar) chunk = std::make_unique_for_overwrite<std::byte[]>(std::size_t(chunkBytes));

    const int planes = layout.planar ? layout.samples : 1;
    for (std::uint32_t y0 = 0; y0 < height; y0 += bandHeight) {
        const std::uint32_t rows = std::min(bandHeight, height - y0);
        if (!tiled) {
            for (int plane = 0; plane < planes; ++plane) {
                const std::uint32_t strip = TIFFComputeStrip(tif, y0, std::uint16_t(plane));
                const std::size_t want = std::size_t(rows) * width * (layout.planar ? bytes : pixelBytes);
                std::byte* target = layout.planar ? chunk.get() : band.get();
                if (TIFFReadEncodedStrip(tif, strip, target, tmsize_t(want)) < tmsize_t(want)) return false;
                if (layout.planar)
                    for (std::size_t i = 0; i < std::size_t(rows) * width; ++i)
                        std::memcpy(band.get() + i * pixelBytes + std::size_t(plane) * bytes,
                                    target + i * bytes, bytes);
            }
        } else {
            for (std::uint32_t x0 = 0; x0 < width; x0 += tileWidth) {
                const std::uint32_t columns = std::min(tileWidth, width - x0);
                for (int plane = 0; plane < planes; ++plane) {
                    const std::uint32_t tile = TIFFComputeTile(tif, x0, y0, 0, std::uint16_t(plane));
                    if (TIFFReadEncodedTile(tif, tile, chunk.get(), tmsize_t(chunkBytes)) <
                        tmsize_t(chunkBytes))
                        return false;
                    for (std::uint32_t r = 0; r < rows; ++r) {
                        std::byte* to = band.get() + (std::size_t(r) * width + x0) * pixelBytes;
                        if (!layout.planar) {
                            std::memcpy(to, chunk.get() + std::size_t(r) * tileWidth * pixelBytes,
                                        std::size_t(columns) * pixelBytes);
                            continue;
                        }
                        const std::byte* from = chunk.get() + std::size_t(r) * tileWidth * bytes;
                        for (std::uint32_t c = 0; c < columns; ++c)
                            std::memcpy(to + c * pixelBytes + std::size_t(plane) * bytes, from + c * bytes,
                                        bytes);
                    }
                }
            }
        }
        for (std::uint32_t r = 0; r < rows; ++r)
            ConvertRow(layout, band.get() + std::size_t(r) * width * pixelBytes, image.RowBytes(int(y0 + r)),
                       width);
    }
    return true;
}

// Every strip or tile the image needs must lie inside the file, after its header. libtiff pads short offset
// and byte-count tables with zeros, which would read the header as pixels; it only warns about that.
std::string CheckChunkTable(TIFF* tif, std::uint64_t fileSize) {
    const bool tiled = TIFFIsTiled(tif) != 0;
    const std::uint32_t count = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    const char* what = tiled ? "tile" : "strip";
    if (count == 0) return std::string("no ") + what + "s";
    constexpr std::uint64_t headerBytes = 8;
    for (std::uint32_t i = 0; i < count; ++i) {
        int failed = 0;
        const std::uint64_t offset = TIFFGetStrileOffsetWithErr(tif, i, &failed);
        const std::uint64_t bytes = failed ? 0 : TIFFGetStrileByteCountWithErr(tif, i, &failed);
        auto which = [&] {
            return std::string(what) + " " + std::to_string(i + 1) + " of " + std::to_string(count);
        };
        if (failed || offset < headerBytes || bytes == 0)
            return "the " + std::string(what) + " table does not cover the image: " + which() +
                   " has no data";
        if (offset > fileSize || bytes > fileSize - offset) return which() + " lies outside the file";
    }
    return {};
}

// Orientation tells where the stored first row and first column belong; 5..8 swap rows and columns.
int OrientationOf(TIFF* tif) {
    std::uint16_t orientation = ORIENTATION_TOPLEFT;
    TIFFGetFieldDefaulted(tif, TIFFTAG_ORIENTATION, &orientation);
    return orientation >= ORIENTATION_TOPLEFT && orientation <= ORIENTATION_LEFTBOT ? orientation
                                                                                    : ORIENTATION_TOPLEFT;
}

// Layouts without a host format of their own (palette, YCbCr, bilevel, ...) go through libtiff's own
// renderer, which gives 8-bit RGBA with premultiplied alpha.
ReadResult ReadRendered(TIFF* tif, std::string_view name, TiffFile& file) {
    ReadResult result;
    char message[1024] = {};
    TIFFRGBAImage renderer{};
    if (!TIFFRGBAImageBegin(&renderer, tif, 1 /* stop at the first damaged strip */, message)) {
        result.error = Describe(name, std::string("unsupported TIFF layout (") + message + ")");
        return result;
    }
    struct Guard {
        TIFFRGBAImage* renderer;
        ~Guard() { TIFFRGBAImageEnd(renderer); }
    } guard{&renderer};
    // Starting may warn about harmless things, such as a colour map of 8-bit values that old writers made.
    file.messages.decoding = true;
    // Rows as stored, like the direct route; Upright turns the result for both.
    renderer.req_orientation = renderer.orientation;
    const std::uint32_t width = renderer.width;
    const std::uint32_t height = renderer.height;
    result.error = CheckImageSize(name, width, height, PixelFormat::RGBA8);
    if (!result.error.empty()) return result;

    // Bands follow the file's strips or tiles so that nothing is decoded twice.
    std::uint32_t bandHeight = 0;
    if (TIFFIsTiled(tif))
        TIFFGetField(tif, TIFFTAG_TILELENGTH, &bandHeight);
    else
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &bandHeight);
    bandHeight = std::clamp<std::uint32_t>(bandHeight, 1, height);
    if (std::uint64_t(bandHeight) * width * 4 >
        std::max<std::uint64_t>(std::uint64_t(width) * height * 4, 64u << 20))
        bandHeight = height;

    result.image = Raster::DynamicBuffer::Create(int(width), int(height), PixelFormat::RGBA8);
    if (!result.image) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    auto raster = std::make_unique_for_overwrite<std::uint32_t[]>(std::size_t(bandHeight) * width);
    for (std::uint32_t y0 = 0; y0 < height; y0 += bandHeight) {
        const std::uint32_t rows = std::min(bandHeight, height - y0);
        renderer.row_offset = int(y0);
        renderer.col_offset = 0;
        if (!TIFFRGBAImageGet(&renderer, raster.get(), width, rows)) {
            result.image.Reset();
            result.error =
                Describe(name, "truncated or damaged TIFF data (" + file.Reason("cannot decode") + ")");
            return result;
        }
        for (std::uint32_t r = 0; r < rows; ++r) {
            auto* to = result.image->Row<std::uint8_t>(int(y0 + r));
            const std::uint32_t* from = raster.get() + std::size_t(r) * width;
            for (std::uint32_t x = 0; x < width; ++x) {
                const std::uint32_t p = from[x];
                const auto a = std::uint8_t(TIFFGetA(p));
                std::uint8_t rgba[4] = {std::uint8_t(TIFFGetR(p)), std::uint8_t(TIFFGetG(p)),
                                        std::uint8_t(TIFFGetB(p)), a};
                if (renderer.alpha)
                    for (int c = 0; c < 3; ++c)
                        rgba[c] = Unpremultiply<std::uint8_t>(rgba[c], a, 255);
                std::memcpy(to + x * 4, rgba, 4);
            }
        }
    }
    return result;
}

// ---------------------------------------------------------------------------------------------------------
// Writing

struct WriteLayout {
    std::uint16_t bits;
    std::uint16_t samples;
    std::uint16_t photometric;
    std::uint16_t sampleFormat;
};

WriteLayout WriteLayoutFor(PixelFormat format) {
    switch (format) {
    case PixelFormat::RGBA16:
        return {16, 4, PHOTOMETRIC_RGB, SAMPLEFORMAT_UINT};
    case PixelFormat::RGBAUF:
        return {32, 4, PHOTOMETRIC_RGB, SAMPLEFORMAT_IEEEFP};
    case PixelFormat::IA8:
        return {8, 2, PHOTOMETRIC_MINISBLACK, SAMPLEFORMAT_UINT};
    case PixelFormat::IA16:
        return {16, 2, PHOTOMETRIC_MINISBLACK, SAMPLEFORMAT_UINT};
    case PixelFormat::CMYKA8:
        return {8, 5, PHOTOMETRIC_SEPARATED, SAMPLEFORMAT_UINT};
    case PixelFormat::LabA16:
        return {16, 4, PHOTOMETRIC_CIELAB, SAMPLEFORMAT_UINT};
    default:
        return {8, 4, PHOTOMETRIC_RGB, SAMPLEFORMAT_UINT};
    }
}

} // namespace

ReadResult DecodeTiff(std::span<const std::byte> data, std::string_view name) {
    ReadResult result;
    TiffStream stream;
    stream.data = data.data();
    stream.size = data.size();
    TiffFile file;
    auto damaged = [&](const std::string& reason) {
        result.image.Reset();
        result.error = Describe(name, "truncated or damaged TIFF data (" + reason + ")");
        return result;
    };
    if (!file.Open(name, "rm", &stream)) return damaged(file.Reason("cannot read the header"));

    Layout layout;
    std::string why;
    std::uint16_t photometric = 0;
    if (StatedPhotometric(data, TIFFCurrentDirOffset(file.tif)) == PHOTOMETRIC_PALETTE &&
        (!TIFFGetField(file.tif, TIFFTAG_PHOTOMETRIC, &photometric) || photometric != PHOTOMETRIC_PALETTE)) {
        result.error = Describe(name, "unsupported TIFF layout (a palette image without its colour map)");
        return result;
    }
    const Route route = ReadLayout(file.tif, layout, why);
    if (route == Route::Unsupported) {
        result.error = Describe(name, "unsupported TIFF layout (" + why + ")");
        return result;
    }
    // The claimed size is judged first: it has the clearer message when a file is both huge and short.
    result.error = CheckImageSize(name, layout.width, layout.height,
                                  route == Route::Direct ? layout.format : PixelFormat::RGBA8);
    if (!result.error.empty()) return result;
    if (file.messages.damage[0]) return damaged(file.Reason(""));
    if (std::string table = CheckChunkTable(file.tif, stream.size); !table.empty()) return damaged(table);
    const int orientation = OrientationOf(file.tif);

    if (route == Route::Rendered) {
        result = ReadRendered(file.tif, name, file);
    } else {
        file.messages.decoding = true;
        result.image = Raster::DynamicBuffer::Create(int(layout.width), int(layout.height), layout.format);
        if (!result.image) {
            result.error = Describe(name, "out of memory");
            return result;
        }
        if (!ReadDirect(file.tif, layout, *result.image, why)) {
            if (!why.empty()) {
                result.image.Reset();
                result.error = Describe(name, "unsupported TIFF layout (" + why + ")");
                return result;
            }
            return damaged(file.Reason("cannot decode"));
        }
    }
    if (!result.image) return result;
    // libtiff carries on after damaged data with whatever it made of it; such an image is not the file's.
    if (file.messages.damage[0]) return damaged(file.Reason(""));
    result.image = Upright(std::move(result.image), orientation);
    if (!result.image) {
        result.error = Describe(name, "out of memory");
        return result;
    }
    std::uint32_t profileLength = 0;
    const void* profile = nullptr;
    if (TIFFGetField(file.tif, TIFFTAG_ICCPROFILE, &profileLength, &profile) && profile &&
        profileLength > 0) {
        const auto* bytes = static_cast<const std::byte*>(profile);
        result.metadata.iccProfile.assign(bytes, bytes + profileLength);
    }
    return result;
}

std::uint16_t CompressionScheme(std::string_view name) {
    if (name == "none") return COMPRESSION_NONE;
    if (name == "lzw") return COMPRESSION_LZW;
    if (name == "packbits") return COMPRESSION_PACKBITS;
    if (name == "zstd") return COMPRESSION_ZSTD;
    return COMPRESSION_ADOBE_DEFLATE;
}

EncodeResult EncodeTiff(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request) {
    EncodeResult result;
    TiffStream stream;
    stream.out = &result.bytes;
    TiffFile file;
    auto failed = [&](const char* fallback) {
        result.bytes.clear();
        result.error = Describe(name, "cannot encode TIFF (" + file.Reason(fallback) + ")");
        return result;
    };
    if (!file.Open(name, "w", &stream)) return failed("cannot start the file");

    const PixelFormat format = image.GetFormat();
    const WriteLayout layout = WriteLayoutFor(format);
    const auto width = std::uint32_t(image.GetWidth());
    const auto height = std::uint32_t(image.GetHeight());
    // Opaque images are stored without their alpha sample.
    const std::uint16_t samples = request.alpha ? layout.samples : std::uint16_t(layout.samples - 1);
    const std::size_t componentBytes = layout.bits / 8u;
    const std::size_t pixelBytes = std::size_t(image.GetBytesPerPixel());
    const std::size_t storedPixelBytes = componentBytes * samples;
    const std::size_t rowBytes = storedPixelBytes * width;
    const std::uint16_t compression = CompressionScheme(request.compression);
    // About 256 KiB a strip: large enough for deflate to work well, small enough for readers to stream.
    const std::uint32_t rowsPerStrip =
        std::clamp<std::uint32_t>(std::uint32_t((256u << 10) / rowBytes), 1, height);
    const std::uint16_t extra[1] = {EXTRASAMPLE_UNASSALPHA};
    TIFF* tif = file.tif;
    bool ok = TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width) &&
              TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height) &&
              TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, layout.bits) &&
              TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, samples) &&
              TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, layout.photometric) &&
              TIFFSetField(tif, TIFFTAG_SAMPLEFORMAT, layout.sampleFormat) &&
              TIFFSetField(tif, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG) &&
              (!request.alpha || TIFFSetField(tif, TIFFTAG_EXTRASAMPLES, 1, extra)) &&
              TIFFSetField(tif, TIFFTAG_COMPRESSION, compression) &&
              TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, rowsPerStrip) &&
              TIFFSetField(tif, TIFFTAG_ORIENTATION, ORIENTATION_TOPLEFT);
    // The predictor belongs to the schemes that model differences: deflate, LZW and zstd.
    if (ok && compression != COMPRESSION_NONE && compression != COMPRESSION_PACKBITS)
        ok = TIFFSetField(tif, TIFFTAG_PREDICTOR,
                          layout.sampleFormat == SAMPLEFORMAT_IEEEFP ? PREDICTOR_FLOATINGPOINT
                                                                     : PREDICTOR_HORIZONTAL);
    if (ok && format == PixelFormat::CMYKA8) ok = TIFFSetField(tif, TIFFTAG_INKSET, INKSET_CMYK);
    if (ok && !request.icc.empty())
        ok = TIFFSetField(tif, TIFFTAG_ICCPROFILE, std::uint32_t(request.icc.size()), request.icc.data());
    if (!ok) return failed("cannot set the tags");

    auto strip = std::make_unique_for_overwrite<std::byte[]>(std::size_t(rowsPerStrip) * rowBytes);
    for (std::uint32_t y0 = 0, index = 0; y0 < height; y0 += rowsPerStrip, ++index) {
        const std::uint32_t rows = std::min(rowsPerStrip, height - y0);
        for (std::uint32_t r = 0; r < rows; ++r) {
            std::byte* to = strip.get() + std::size_t(r) * rowBytes;
            const std::byte* from = image.RowBytes(int(y0 + r));
            if (request.alpha)
                std::memcpy(to, from, rowBytes);
            else
                for (std::uint32_t x = 0; x < width; ++x)
                    std::memcpy(to + x * storedPixelBytes, from + x * pixelBytes, storedPixelBytes);
            // CIELab keeps a and b as signed 16-bit; LabA16 has them offset by 32768.
            if (format == PixelFormat::LabA16)
                for (std::uint32_t x = 0; x < width; ++x)
                    for (std::size_t c : {std::size_t(1), std::size_t(2)}) {
                        std::byte* p = to + std::size_t(x) * storedPixelBytes + c * 2;
                        StoreBytes(p, std::uint16_t(LoadBytes<std::uint16_t>(p) ^ 0x8000u));
                    }
        }
        const auto size = tmsize_t(std::size_t(rows) * rowBytes);
        if (TIFFWriteEncodedStrip(tif, index, strip.get(), size) != size)
            return failed("cannot write a strip");
    }
    if (!TIFFFlush(tif)) return failed("cannot finish the file");
    TIFFClose(tif);
    file.tif = nullptr;
    if (file.messages.error[0]) return failed("");
    return result;
}

} // namespace IO::Detail
