// Inputs and situations that must be refused with a message: damaged and truncated files, files that claim
// enormous images, unknown names, and writes that fail half-way.

#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include <tiffio.h>

#include <csignal>
#include <fstream>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace IOTest;
using Raster::PixelFormat;

namespace {

bool StartsWith(const std::string& text, const std::string& prefix) {
    return text.rfind(prefix, 0) == 0;
}
bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

std::uint32_t Crc32(const std::uint8_t* data, std::size_t size) {
    std::uint32_t crc = 0xFFFFFFFFu;
    for (std::size_t i = 0; i < size; ++i) {
        crc ^= data[i];
        for (int k = 0; k < 8; ++k)
            crc = (crc >> 1) ^ (0xEDB88320u & (0u - (crc & 1u)));
    }
    return ~crc;
}

void PutBig32(std::vector<std::uint8_t>& out, std::uint32_t v) {
    for (int shift = 24; shift >= 0; shift -= 8)
        out.push_back(std::uint8_t(v >> shift));
}

void PngChunk(std::vector<std::uint8_t>& out, const char* type, const std::vector<std::uint8_t>& body) {
    PutBig32(out, std::uint32_t(body.size()));
    const std::size_t start = out.size();
    out.insert(out.end(), type, type + 4);
    out.insert(out.end(), body.begin(), body.end());
    PutBig32(out, Crc32(out.data() + start, out.size() - start));
}

// A well-formed PNG header for any claimed size, followed by a token of image data.
std::vector<std::byte> PngClaiming(std::uint32_t width, std::uint32_t height) {
    std::vector<std::uint8_t> out = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A};
    std::vector<std::uint8_t> header;
    PutBig32(header, width);
    PutBig32(header, height);
    header.insert(header.end(), {8, 6, 0, 0, 0}); // 8-bit RGBA, deflate, adaptive filters, not interlaced
    PngChunk(out, "IHDR", header);
    PngChunk(out, "IDAT", {0x78, 0x9C, 0x03, 0x00});
    PngChunk(out, "IEND", {});
    std::vector<std::byte> bytes(out.size());
    std::memcpy(bytes.data(), out.data(), out.size());
    return bytes;
}

// An uncompressed little-endian TIFF with its directory before the pixel data, so that cutting the file cuts
// the pixels and not the directory: samples of bits each a pixel (1: grey, 3: RGB), rowsPerStrip rows a strip
// (0: one strip), then data.
std::vector<std::byte> TiffClaiming(std::uint32_t width, std::uint32_t height, std::uint16_t samples,
                                    const std::vector<std::uint8_t>& data, std::uint16_t bits = 8,
                                    std::uint32_t rowsPerStrip = 0) {
    if (rowsPerStrip == 0) rowsPerStrip = height;
    const std::uint32_t strips = (height + rowsPerStrip - 1) / rowsPerStrip;
    const auto rowBytes = std::uint32_t((std::uint64_t(width) * samples * bits + 7) / 8);
    const std::uint32_t entries = 9;
    // After the directory: the bits array (several samples), offsets and counts (several strips), the data.
    const std::uint32_t bitsAt = 8 + 2 + entries * 12 + 4;
    const std::uint32_t offsetsAt = bitsAt + (samples > 1 ? 2u * samples : 0u);
    const std::uint32_t countsAt = offsetsAt + (strips > 1 ? 4u * strips : 0u);
    const std::uint32_t dataAt = countsAt + (strips > 1 ? 4u * strips : 0u);
    struct Entry {
        std::uint16_t tag, type;
        std::uint32_t count, value; // value: the value itself when it fits in four bytes, else where it lies
    };
    const Entry list[entries] = {
        {256, 4, 1, width},
        {257, 4, 1, height},
        {258, 3, samples, samples == 1 ? bits : bitsAt},
        {259, 3, 1, 1},
        {262, 3, 1, samples == 1 ? 1u : 2u},
        {273, 4, strips, strips == 1 ? dataAt : offsetsAt},
        {277, 3, 1, samples},
        {278, 4, 1, rowsPerStrip},
        {279, 4, strips, strips == 1 ? rowBytes * height : countsAt},
    };
    std::vector<std::uint8_t> out = {'I', 'I', 42, 0, 8, 0, 0, 0};
    auto put16 = [&](std::uint32_t v) { out.insert(out.end(), {std::uint8_t(v), std::uint8_t(v >> 8)}); };
    auto put32 = [&](std::uint32_t v) {
        put16(v & 0xFFFF);
        put16(v >> 16);
    };
    put16(entries);
    for (const Entry& e : list) {
        put16(e.tag);
        put16(e.type);
        put32(e.count);
        if (e.type == 3 && e.count == 1) {
            put16(e.value);
            put16(0);
        } else {
            put32(e.value);
        }
    }
    put32(0);
    for (int s = 0; s < samples && samples > 1; ++s)
        put16(bits);
    for (std::uint32_t i = 0; i < strips && strips > 1; ++i)
        put32(dataAt + i * rowsPerStrip * rowBytes);
    for (std::uint32_t i = 0; i < strips && strips > 1; ++i)
        put32(std::min(rowsPerStrip, height - i * rowsPerStrip) * rowBytes);
    out.insert(out.end(), data.begin(), data.end());
    std::vector<std::byte> bytes(out.size());
    std::memcpy(bytes.data(), out.data(), out.size());
    return bytes;
}

// Where the directory entry of tag lies in a little-endian classic TIFF, or 0.
std::size_t FindTiffEntry(const std::vector<std::byte>& bytes, std::uint16_t tag) {
    auto u16 = [&](std::size_t at) { return std::uint32_t(bytes[at]) | std::uint32_t(bytes[at + 1]) << 8; };
    const std::size_t directory = u16(4) | std::size_t(u16(6)) << 16;
    for (std::size_t i = 0; i < u16(directory); ++i)
        if (u16(directory + 2 + i * 12) == tag) return directory + 2 + i * 12;
    return 0;
}

void Put32(std::vector<std::byte>& bytes, std::size_t at, std::uint32_t value) {
    for (int i = 0; i < 4; ++i)
        bytes[at + std::size_t(i)] = std::byte(value >> (8 * i));
}

std::vector<std::byte> AsBytes(const std::vector<std::uint8_t>& in) {
    std::vector<std::byte> bytes(in.size());
    if (!in.empty()) std::memcpy(bytes.data(), in.data(), in.size());
    return bytes;
}

// The process's peak virtual size in KiB, from /proc: it counts every block ever mapped, touched or not.
long PeakVirtualKiB() {
    std::ifstream status("/proc/self/status");
    std::string line;
    while (std::getline(status, line))
        if (line.rfind("VmPeak:", 0) == 0) return std::stol(line.substr(7));
    return -1;
}

// Runs work in a child process, whose peak virtual size starts at its current size, and gives how much the
// peak grew (KiB), or -1 when the child failed. No allocation escapes this, however the library makes it.
long PeakGrowthKiB(const std::function<bool()>& work) {
    const pid_t child = fork();
    if (child == 0) {
        const long before = PeakVirtualKiB();
        const bool ok = work();
        const long grown = PeakVirtualKiB() - before;
        // Exit codes carry units of 16 MiB, capped; 255 means the work itself failed.
        _exit(!ok || before < 0 ? 255 : int(std::min<long>(grown >> 14, 254)));
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status) || WEXITSTATUS(status) == 255)
        return -1;
    return long(WEXITSTATUS(status)) << 14;
}

std::vector<std::byte> Cut(const std::vector<std::byte>& bytes, std::size_t length) {
    return {bytes.begin(), bytes.begin() + std::ptrdiff_t(std::min(length, bytes.size()))};
}

TEST(HostileInput, HandMadeTiffReadsWhole) {
    // The hand-made layout itself must be valid, or the truncation test below would prove nothing.
    std::vector<std::uint8_t> data(4 * 3 * 3);
    for (std::size_t i = 0; i < data.size(); ++i)
        data[i] = std::uint8_t(i * 7);
    const IO::ReadResult result = IO::DecodeImage(TiffClaiming(4, 3, 3, data), "made.tif");
    ASSERT_TRUE(result) << result.error;
    EXPECT_EQ(result.image->GetFormat(), PixelFormat::RGBA8);
    EXPECT_EQ(Component<std::uint8_t>(*result.image, 3, 2, 1), std::uint8_t((11 * 3 + 1) * 7));
    EXPECT_EQ(Component<std::uint8_t>(*result.image, 3, 2, 3), 255);
}

TEST(HostileInput, CompressionThisBuildCannotDecodeIsNamedNotCalledDamage) {
    auto bytes = TiffClaiming(4, 3, 1, std::vector<std::uint8_t>(12, 7));
    // The value of the Compression entry, the fourth of the directory: 34712 (JPEG 2000) = 0x8798.
    const std::size_t at = 8 + 2 + 3 * 12 + 8;
    ASSERT_EQ(bytes[at - 8], std::byte{0x03}); // tag 259 starts the entry, little-endian
    ASSERT_EQ(bytes[at - 7], std::byte{0x01});
    bytes[at] = std::byte{0x98};
    bytes[at + 1] = std::byte{0x87};
    const IO::ReadResult result = IO::DecodeImage(bytes, "j2k.tif");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, "j2k.tif: unsupported TIFF layout (compression scheme 34712 is not available)");
}

TEST(HostileInput, TruncatedFilesAreRefusedAtEveryLength) {
    std::vector<std::uint8_t> raw(40 * 30 * 3);
    for (std::size_t i = 0; i < raw.size(); ++i)
        raw[i] = std::uint8_t(i * 31 + i / 7);
    struct Case {
        const char* name;
        std::vector<std::byte> bytes;
        const char* damage;
    };
    const Case cases[] = {
        {"cut.png", IO::EncodeImage(*Noise(PixelFormat::RGBA16, 40, 30, 1), IO::FileType::PNG, "").bytes,
         "truncated or damaged PNG data"},
        {"cut.jpg", IO::EncodeImage(*Ramps(PixelFormat::RGBA8, 40, 30), IO::FileType::JPEG, "").bytes,
         "truncated or damaged JPEG data"},
        {"cut.tif", IO::EncodeImage(*Noise(PixelFormat::CMYKA8, 40, 30, 2), IO::FileType::TIFF, "").bytes,
         "truncated or damaged TIFF data"},
        {"plain.tif", TiffClaiming(40, 30, 3, raw, 8, 7), "truncated or damaged TIFF data"},
        // Bilevel goes through libtiff's renderer; a missing strip must end the read there as well.
        {"bilevel.tif", TiffClaiming(160, 30, 1, {raw.begin(), raw.begin() + 160 / 8 * 30}, 1, 4),
         "truncated or damaged TIFF data"},
    };
    for (const Case& c : cases) {
        ASSERT_GT(c.bytes.size(), 200u) << c.name;
        const IO::ReadResult whole = IO::DecodeImage(c.bytes, c.name);
        ASSERT_TRUE(whole) << whole.error;
        const std::size_t n = c.bytes.size();
        for (std::size_t length : {std::size_t(0), std::size_t(1), std::size_t(2), std::size_t(3),
                                   std::size_t(7), std::size_t(8), std::size_t(12), std::size_t(33),
                                   std::size_t(100), n / 4, n / 2, n - 100, n - 13, n - 2, n - 1}) {
            SCOPED_TRACE(std::string(c.name) + " cut to " + std::to_string(length) + " of " +
                         std::to_string(n));
            const IO::ReadResult result = IO::DecodeImage(Cut(c.bytes, length), c.name);
            EXPECT_FALSE(result.image);
            ASSERT_TRUE(StartsWith(result.error, std::string(c.name) + ": ")) << result.error;
            // Too short to carry a whole signature, a file is simply not recognised.
            const bool recognised = IO::DetectFileType(Cut(c.bytes, length)).has_value();
            EXPECT_TRUE(
                Contains(result.error,
                         recognised ? c.damage : "not a PNG, JPEG, TIFF, WebP, AVIF, HEIC or OpenEXR file"))
                << result.error;
        }
    }
}

TEST(HostileInput, EveryDamagedPngByteIsCaught) {
    // Every chunk carries a CRC over its type and data, so any single changed byte after the signature
    // must be refused.
    const auto bytes = IO::EncodeImage(*Noise(PixelFormat::IA8, 9, 7, 4), IO::FileType::PNG, "").bytes;
    for (std::size_t i = 8; i < bytes.size(); ++i) {
        auto damaged = bytes;
        damaged[i] ^= std::byte{0x5A};
        const IO::ReadResult result = IO::DecodeImage(damaged, "bad.png");
        EXPECT_FALSE(result) << "byte " << i;
        EXPECT_TRUE(StartsWith(result.error, "bad.png: ")) << result.error;
    }
}

TEST(HostileInput, DamagedJpegAndTiffBytesNeverBreakTheReader) {
    // Not every change is detectable in these formats; each must still end in an image or a message.
    for (IO::FileType type : {IO::FileType::JPEG, IO::FileType::TIFF}) {
        auto source = type == IO::FileType::JPEG ? Ramps(PixelFormat::RGBA8, 24, 16)
                                                 : Noise(PixelFormat::LabA16, 24, 16, 6);
        const auto bytes = IO::EncodeImage(*source, type, "").bytes;
        for (std::size_t i = 0; i < bytes.size(); i += 3) {
            auto damaged = bytes;
            damaged[i] ^= std::byte(0xFF);
            const IO::ReadResult result = IO::DecodeImage(damaged, "bad");
            EXPECT_NE(bool(result.image), !result.error.empty()) << "byte " << i;
        }
    }
}

TEST(HostileInput, TiffChunkTablesMustCoverTheImage) {
    std::vector<std::uint8_t> data(4 * 6);
    for (std::size_t i = 0; i < data.size(); ++i)
        data[i] = std::uint8_t(100 + i);
    const auto whole = TiffClaiming(4, 6, 1, data, 8, 2); // three strips of two rows
    ASSERT_TRUE(IO::DecodeImage(whole, "whole.tif"));
    auto tiled = [] {
        TiffSpec spec{.width = 40, .height = 20, .samples = 3, .bits = 8, .tileSize = 16};
        spec.pixels.assign(40 * 20 * 3, std::byte{77});
        spec.setup = [](tiff* tif) { TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB); };
        return WriteTiffDirectly(spec);
    }();
    ASSERT_TRUE(IO::DecodeImage(tiled, "tiled.tif"));
    auto palette = [] {
        TiffSpec spec{.width = 5, .height = 6, .samples = 1, .bits = 8};
        spec.pixels.assign(5 * 6, std::byte{1});
        spec.setup = [](tiff* tif) {
            TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_PALETTE);
            static std::uint16_t map[3][256] = {{0, 65535}, {0, 65535}, {0, 0}};
            TIFFSetField(tif, TIFFTAG_COLORMAP, map[0], map[1], map[2]);
        };
        return WriteTiffDirectly(spec);
    }();
    ASSERT_TRUE(IO::DecodeImage(palette, "palette.tif"));

    // Each case damages one table; the number in a case is what replaces the count or the value.
    struct Case {
        const char* name;
        const std::vector<std::byte>* source;
        std::uint16_t tag;
        bool value; // replace the value (or first offset of the table) rather than the count
        std::uint32_t replacement;
        const char* says;
    };
    const Case cases[] = {
        {"few offsets.tif", &whole, 273, false, 2, "StripOffsets"},
        {"few counts.tif", &whole, 279, false, 1, "StripByteCounts"},
        {"few tile offsets.tif", &tiled, 324, false, 4, "TileOffsets"},
        {"few tile counts.tif", &tiled, 325, false, 5, "TileByteCounts"},
        {"few palette offsets.tif", &palette, 273, false, 1, "StripOffsets"},
        {"header as pixels.tif", &whole, 273, true, 0,
         "the strip table does not cover the image: strip 1 of 3"},
        {"far away.tif", &whole, 273, true, 1u << 30, "strip 1 of 3 lies outside the file"},
        {"far tile.tif", &tiled, 324, true, 1u << 30, "tile 1 of 6 lies outside the file"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        auto bytes = *c.source;
        const std::size_t entry = FindTiffEntry(bytes, c.tag);
        ASSERT_NE(entry, 0u);
        if (!c.value) {
            Put32(bytes, entry + 4, c.replacement);
        } else {
            // A table of several entries lies elsewhere; its first entry is the first strip's or tile's.
            const std::uint32_t count = std::uint32_t(bytes[entry + 4]) | std::uint32_t(bytes[entry + 5])
                                                                              << 8;
            std::size_t at = entry + 8;
            if (count > 1)
                at = std::size_t(bytes[at]) | std::size_t(bytes[at + 1]) << 8 |
                     std::size_t(bytes[at + 2]) << 16;
            Put32(bytes, at, c.replacement);
        }
        const IO::ReadResult result = IO::DecodeImage(bytes, c.name);
        EXPECT_FALSE(result);
        EXPECT_TRUE(StartsWith(result.error, std::string(c.name) + ": truncated or damaged TIFF data ("))
            << result.error;
        EXPECT_TRUE(Contains(result.error, c.says)) << result.error;
    }
}

TEST(HostileInput, DamagedJpegInsideTiffIsRefused) {
    // libjpeg only warns about a cut or corrupt stream and fills in grey; inside a TIFF that warning reaches
    // libtiff's warning handler, not the decoder's result.
    TiffSpec spec{.width = 32, .height = 32, .samples = 1, .bits = 8, .tileSize = 32};
    spec.pixels.resize(32 * 32);
    for (std::size_t i = 0; i < spec.pixels.size(); ++i)
        spec.pixels[i] = std::byte(i * 13 + i / 32 * 7);
    spec.setup = [](tiff* tif) {
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
    };
    const auto bytes = WriteTiffDirectly(spec);
    ASSERT_TRUE(IO::DecodeImage(bytes, "intact.tif"));
    auto value = [&](std::uint16_t tag) {
        const std::size_t entry = FindTiffEntry(bytes, tag) + 8;
        return std::size_t(bytes[entry]) | std::size_t(bytes[entry + 1]) << 8 |
               std::size_t(bytes[entry + 2]) << 16;
    };
    const std::size_t start = value(324), length = value(325);
    ASSERT_GT(length, 100u);
    for (std::size_t cut : {length / 2, length - 2}) {
        auto damaged = bytes;
        std::fill(damaged.begin() + std::ptrdiff_t(start + cut),
                  damaged.begin() + std::ptrdiff_t(start + length), std::byte{0});
        const IO::ReadResult result = IO::DecodeImage(damaged, "cut.tif");
        EXPECT_FALSE(result) << "cut at " << cut;
        EXPECT_TRUE(StartsWith(result.error, "cut.tif: truncated or damaged TIFF data (")) << result.error;
    }
}

TEST(HostileInput, PaletteTiffWithoutItsColourMapIsRefused) {
    // libtiff reads such a file as grey (one sample) or RGB (three) without a word: indices as colours.
    for (int samples : {1, 3}) {
        SCOPED_TRACE(std::to_string(samples) + " samples");
        TiffSpec spec{.width = 5, .height = 3, .samples = samples, .bits = 8};
        spec.pixels.assign(std::size_t(5 * 3 * samples), std::byte{2});
        spec.setup = [](tiff* tif) {
            TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_PALETTE);
            static std::uint16_t map[3][256] = {{0, 0, 65535}, {0, 0, 0}, {0, 0, 0}};
            TIFFSetField(tif, TIFFTAG_COLORMAP, map[0], map[1], map[2]);
        };
        auto bytes = WriteTiffDirectly(spec);
        if (samples == 1) {
            const IO::ReadResult intact = IO::DecodeImage(bytes, "intact.tif");
            ASSERT_TRUE(intact) << intact.error;
            EXPECT_EQ(Component<std::uint8_t>(*intact.image, 4, 2, 0), 255);
        }
        const std::size_t entry = FindTiffEntry(bytes, 320);
        ASSERT_NE(entry, 0u);
        bytes[entry] = std::byte{0xE8}; // tag 65000, which no reader knows
        bytes[entry + 1] = std::byte{0xFD};
        const IO::ReadResult result = IO::DecodeImage(bytes, "nomap.tif");
        EXPECT_FALSE(result);
        EXPECT_EQ(result.error,
                  "nomap.tif: unsupported TIFF layout (a palette image without its colour map)");
    }

    // A colour map of 8-bit values, as old writers made, draws a warning from libtiff and still reads.
    TiffSpec old{.width = 2, .height = 1, .samples = 1, .bits = 8};
    old.pixels = {std::byte{1}, std::byte{2}};
    old.setup = [](tiff* tif) {
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_PALETTE);
        static std::uint16_t map[3][256] = {{0, 200, 0}, {0, 0, 100}, {0, 0, 0}};
        TIFFSetField(tif, TIFFTAG_COLORMAP, map[0], map[1], map[2]);
    };
    const IO::ReadResult result = IO::DecodeImage(WriteTiffDirectly(old), "old.tif");
    ASSERT_TRUE(result) << result.error;
    EXPECT_EQ(Component<std::uint8_t>(*result.image, 0, 0, 0), 200);
    EXPECT_EQ(Component<std::uint8_t>(*result.image, 1, 0, 1), 100);
}

TEST(HostileInput, OneHugeStripIsNotHeldWhole) {
    // 4096 × 8 pixels of sixteen 16-bit samples in one deflated strip (a strip for each plane when planar),
    // then told it is 4096 rows high: 512 MiB of strips that hold 1 MiB. The image itself takes 128 MiB; the
    // strips must not take more.
    for (bool planar : {false, true}) {
        SCOPED_TRACE(planar ? "planar" : "contiguous");
        TiffSpec spec{.width = 4096, .height = 8, .samples = 16, .bits = 16, .planar = planar};
        spec.pixels.assign(std::size_t(4096) * 8 * 16 * 2, std::byte{3});
        spec.setup = [](tiff* tif) {
            TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB);
            TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_ADOBE_DEFLATE);
            TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, std::uint32_t(8));
        };
        auto bytes = WriteTiffDirectly(spec);
        ASSERT_TRUE(IO::DecodeImage(bytes, "short.tif"));
        for (std::uint16_t tag : {std::uint16_t(257), std::uint16_t(278)}) {
            const std::size_t entry = FindTiffEntry(bytes, tag);
            ASSERT_NE(entry, 0u);
            Put32(bytes, entry + 8, 4096);
        }
        const long grown = PeakGrowthKiB([&] {
            const IO::ReadResult result = IO::DecodeImage(bytes, "tall.tif");
            return !result && StartsWith(result.error, "tall.tif: truncated or damaged TIFF data");
        });
        ASSERT_GE(grown, 0) << "not refused as damaged";
        EXPECT_LT(grown, 320 << 10) << "KiB of address space taken";
    }
}

TEST(HostileInput, EnormousClaimsAreRefusedBeforeAllocating) {
    const long before = Kernel::Countable::GetLiveObjectCount();
    IO::ReadResult result = IO::DecodeImage(PngClaiming(1000000, 1000000), "huge.png");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error,
              "huge.png: image 1000000 x 1000000 (rgba8) exceeds the limit of 65536 pixels a side "
              "and 2 GiB of pixel data");

    result = IO::DecodeImage(TiffClaiming(1000000, 1000000, 1, {1, 2, 3, 4}), "huge.tif");
    EXPECT_FALSE(result);
    EXPECT_TRUE(StartsWith(result.error, "huge.tif: image 1000000 x 1000000 (ia8) exceeds the limit"))
        << result.error;

    // Within the side limit, beyond the bytes: 60000 × 60000 RGBA8 is 14.4 GB.
    result = IO::DecodeImage(TiffClaiming(60000, 60000, 3, {1, 2, 3}), "wide.tif");
    EXPECT_FALSE(result);
    EXPECT_TRUE(Contains(result.error, "image 60000 x 60000 (rgba8) exceeds the limit")) << result.error;

    // JPEG sides stop at 65535, still far too much: patch a real file's frame header to 65000 × 65000.
    auto jpeg = IO::EncodeImage(*Ramps(PixelFormat::RGBA8, 16, 16), IO::FileType::JPEG, "").bytes;
    bool patched = false;
    for (std::size_t i = 2; i + 9 < jpeg.size() && !patched; ++i)
        if (jpeg[i] == std::byte{0xFF} &&
            (jpeg[i + 1] == std::byte{0xC0} || jpeg[i + 1] == std::byte{0xC2})) {
            for (std::size_t k : {i + 5, i + 7}) {
                jpeg[k] = std::byte{0xFD}; // 65000 = 0xFDE8
                jpeg[k + 1] = std::byte{0xE8};
            }
            patched = true;
        }
    ASSERT_TRUE(patched);
    result = IO::DecodeImage(jpeg, "huge.jpg");
    EXPECT_FALSE(result);
    EXPECT_TRUE(Contains(result.error, "image 65000 x 65000 (rgba8) exceeds the limit")) << result.error;

    EXPECT_EQ(Kernel::Countable::GetLiveObjectCount(), before);
}

TEST(HostileInput, AncillaryPngChunkLengthsCannotMakeTheReaderAllocate) {
    // 44 bytes: a valid header, then a chunk whose length field claims 0x7ffffff0 bytes that never come.
    for (const char* type : {"tEXt", "zTXt", "iTXt", "iCCP", "eXIf", "sPLT", "pCAL", "prIV"}) {
        SCOPED_TRACE(type);
        std::vector<std::uint8_t> out = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A};
        std::vector<std::uint8_t> header;
        PutBig32(header, 1);
        PutBig32(header, 1);
        header.insert(header.end(), {8, 6, 0, 0, 0});
        PngChunk(out, "IHDR", header);
        PutBig32(out, 0x7ffffff0u);
        out.insert(out.end(), type, type + 4);
        out.insert(out.end(), {'a', 'b', 'c'});
        ASSERT_EQ(out.size(), 44u);
        const auto bytes = AsBytes(out);
        const long grown = PeakGrowthKiB([&] {
            const IO::ReadResult result = IO::DecodeImage(bytes, "text.png");
            return !result && StartsWith(result.error, "text.png: truncated or damaged PNG data");
        });
        ASSERT_GE(grown, 0) << "not refused as damaged";
        EXPECT_LT(grown, 64 << 10) << "KiB of address space taken for a 44-byte file";
    }

    // Sizeable but honest ancillary chunks are skipped and the image reads as before.
    auto image = Noise(PixelFormat::RGBA8, 5, 4, 21);
    const auto plain = IO::EncodeImage(*image, IO::FileType::PNG, "").bytes;
    std::vector<std::uint8_t> out(reinterpret_cast<const std::uint8_t*>(plain.data()),
                                  reinterpret_cast<const std::uint8_t*>(plain.data()) + 33);
    std::vector<std::uint8_t> text(3 << 20, 'x');
    text[7] = 0; // keyword "xxxxxxx"
    PngChunk(out, "tEXt", text);
    PngChunk(out, "iCCP", std::vector<std::uint8_t>(1 << 20, 0x41));
    for (int i = 0; i < 2000; ++i)
        PngChunk(out, "tEXt", {'k', 0, std::uint8_t('a' + i % 26)});
    out.insert(out.end(), reinterpret_cast<const std::uint8_t*>(plain.data()) + 33,
               reinterpret_cast<const std::uint8_t*>(plain.data()) + plain.size());
    const IO::ReadResult result = IO::DecodeImage(AsBytes(out), "chatty.png");
    ASSERT_TRUE(result) << result.error;
    EXPECT_EQ(Difference(*result.image, *image), "");
}

TEST(HostileInput, HeifCanvasesCannotOutgrowTheDeclaredImage) {
    // A 1225-byte file whose overlay canvas claims 45619 x 53437 pixels: the decoder filled gigabytes.
    const auto overlay = ReadBytes(DataFolder() / "overlay-canvas.heic");
    const long grown = PeakGrowthKiB([&] {
        const IO::ReadResult result = IO::DecodeImage(overlay, "overlay.heic");
        return !result && StartsWith(result.error, "overlay.heic: truncated or damaged HEIF data");
    });
    ASSERT_GE(grown, 0) << "not refused as damaged";
    EXPECT_LT(grown, 256 << 10) << "KiB of address space taken for a 1225-byte file";

    // A long thin image is refused when the square on its longer side passes the pixel limit, and read
    // when it does not: the size box of the primary image (the one of the picture's own size) is patched.
    auto image = Ramps(PixelFormat::RGBA8, 8, 6);
    const auto heic = IO::EncodeImage(*image, IO::FileType::HEIC, "").bytes;
    auto claiming = [&](std::uint32_t width, std::uint32_t height) {
        std::vector<std::byte> bytes = heic;
        const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
        const std::byte own[8] = {std::byte{0}, std::byte{0}, std::byte{0}, std::byte{8},
                                  std::byte{0}, std::byte{0}, std::byte{0}, std::byte{6}};
        int patched = 0;
        for (std::size_t at = text.find("ispe"); at != std::string_view::npos; at = text.find("ispe", at + 4))
            if (at + 16 <= bytes.size() && std::memcmp(&bytes[at + 8], own, 8) == 0) {
                for (int i = 0; i < 4; ++i) {
                    bytes[at + 8 + std::size_t(i)] = std::byte(width >> (24 - 8 * i));
                    bytes[at + 12 + std::size_t(i)] = std::byte(height >> (24 - 8 * i));
                }
                ++patched;
            }
        EXPECT_GT(patched, 0);
        return bytes;
    };
    const IO::ReadResult thin = IO::DecodeImage(claiming(30000, 2), "thin.heic");
    EXPECT_FALSE(thin);
    EXPECT_EQ(thin.error,
              "thin.heic: HEIF image 30000 x 2 is too long: sides beyond 23168 pixels are not read");
    const IO::ReadResult honest = IO::DecodeImage(heic, "small.heic");
    ASSERT_TRUE(honest) << honest.error;
    EXPECT_EQ(honest.image->GetWidth(), 8);
}

TEST(HostileInput, FilesAreRecognisedByContentNotName) {
    ScratchFolder folder;
    const auto png = IO::EncodeImage(*Noise(PixelFormat::RGBA8, 3, 3, 7), IO::FileType::PNG, "").bytes;
    WriteBytes(folder / "photo.jpg", png);
    IO::ReadResult result = IO::ReadImage(folder / "photo.jpg");
    ASSERT_TRUE(result) << result.error;
    EXPECT_EQ(result.type, IO::FileType::PNG);

    std::ofstream(folder / "coffee.png") << "this is text, not pixels\n";
    result = IO::ReadImage(folder / "coffee.png");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error,
              (folder / "coffee.png").string() + ": not a PNG, JPEG, TIFF, WebP, AVIF, HEIC or OpenEXR file");

    std::ofstream(folder / "empty.tif").flush();
    result = IO::ReadImage(folder / "empty.tif");
    EXPECT_FALSE(result);
    EXPECT_TRUE(StartsWith(result.error, (folder / "empty.tif").string() + ": empty file")) << result.error;

    result = IO::ReadImage(folder / "missing.png");
    EXPECT_FALSE(result);
    EXPECT_TRUE(StartsWith(result.error, (folder / "missing.png").string() + ": cannot open"))
        << result.error;
}

TEST(HostileInput, FoldersAndDevicesAreCalledWhatTheyAre) {
    ScratchFolder folder;
    std::filesystem::create_directory(folder / "album.png");
    IO::ReadResult result = IO::ReadImage(folder / "album.png");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, (folder / "album.png").string() + ": is a folder, not a file");
    std::filesystem::create_directory_symlink(folder / "album.png", folder / "link.png");
    result = IO::ReadImage(folder / "link.png");
    EXPECT_EQ(result.error, (folder / "link.png").string() + ": is a folder, not a file");
    EXPECT_EQ(folder.Names(), (std::vector<std::string>{"album.png", "link.png"}));

    result = IO::ReadImage("/dev/null");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, "/dev/null: is not a regular file");
    ASSERT_EQ(mkfifo((folder / "pipe.tif").c_str(), 0600), 0);
    result = IO::ReadImage(folder / "pipe.tif"); // must not wait for a writer
    EXPECT_EQ(result.error, (folder / "pipe.tif").string() + ": is not a regular file");
}

TEST(HostileInput, OutputTypeComesFromTheExtensionAndUnknownOnesAreRefused) {
    ScratchFolder folder;
    auto image = Noise(PixelFormat::RGBA8, 4, 4, 8);
    for (const char* name : {"a.PNG", "b.Jpg", "c.jpeg", "d.TIF", "e.tiff"}) {
        ASSERT_TRUE(IO::WriteImage(folder / name, *image)) << name;
        const IO::ReadResult read = IO::ReadImage(folder / name);
        ASSERT_TRUE(read) << read.error;
        EXPECT_EQ(read.type, *IO::GetFileTypeForExtension(name)) << name;
    }
    const auto before = folder.Names();
    IO::WriteResult result = IO::WriteImage(folder / "out.bmp", *image);
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, (folder / "out.bmp").string() +
                                ": unknown image file extension \".bmp\"; use .png, .jpg, "
                                ".jpeg, .tif, .tiff, .webp, .avif, .heic, .heif or .exr");
    result = IO::WriteImage(folder / "out", *image);
    EXPECT_FALSE(result);
    EXPECT_TRUE(Contains(result.error, "no file extension")) << result.error;
    EXPECT_EQ(folder.Names(), before);
}

TEST(HostileInput, FormatsATypeCannotHoldAreRefusedWithTheConversionToMake) {
    auto mask = Noise(PixelFormat::MaskA16, 4, 4, 9);
    IO::EncodeResult result = IO::EncodeImage(*mask, IO::FileType::TIFF, "mask.tif");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, "mask.tif: TIFF cannot hold maska16 pixels; convert them to ia16 first");
    auto cmyk = Noise(PixelFormat::CMYKA8, 4, 4, 9);
    result = IO::EncodeImage(*cmyk, IO::FileType::PNG, "c.png");
    EXPECT_EQ(result.error, "c.png: PNG cannot hold cmyka8 pixels; convert them to rgba8 first");
    result = IO::EncodeImage(*Noise(PixelFormat::IA16, 4, 4, 9), IO::FileType::JPEG, "g.jpg");
    EXPECT_EQ(result.error, "g.jpg: JPEG cannot hold ia16 pixels; convert them to ia8 first");
    result =
        IO::EncodeImage(*Noise(PixelFormat::RGBA8, 4, 4, 9), IO::FileType::JPEG, "q.jpg", {.quality = 0});
    EXPECT_EQ(result.error, "q.jpg: JPEG quality 0 is outside 1..100");

    for (PixelFormat format :
         {PixelFormat::RGBAUF, PixelFormat::LabA16, PixelFormat::CMYKA8, PixelFormat::MaskAF}) {
        for (IO::FileType type : {IO::FileType::PNG, IO::FileType::JPEG, IO::FileType::TIFF}) {
            const PixelFormat target = IO::GetWritableFormat(type, format);
            EXPECT_TRUE(IO::CanWrite(type, target));
            EXPECT_EQ(IO::GetWritableFormat(type, target), target);
        }
    }
    EXPECT_EQ(IO::GetWritableFormat(IO::FileType::PNG, PixelFormat::RGBAUF), PixelFormat::RGBA16);
    EXPECT_EQ(IO::GetWritableFormat(IO::FileType::TIFF, PixelFormat::MaskAF), PixelFormat::RGBAUF);
}

TEST(HostileInput, FailedWritesLeaveTheOldFileAndNoTemporary) {
    ScratchFolder folder;
    const auto target = folder / "out.tif";
    std::ofstream(target) << "old contents";
    auto image = Noise(PixelFormat::RGBAUF, 256, 256, 10); // about 1 MB that deflate cannot shrink much

    // The disk "fills" half-way through: file size limited to 64 KiB for this process.
    std::signal(SIGXFSZ, SIG_IGN);
    rlimit saved{};
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &saved), 0);
    rlimit tight = saved;
    tight.rlim_cur = 64 << 10;
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &tight), 0);
    const IO::WriteResult result = IO::WriteImage(target, *image);
    setrlimit(RLIMIT_FSIZE, &saved);
    std::signal(SIGXFSZ, SIG_DFL);
    EXPECT_FALSE(result);
    EXPECT_TRUE(StartsWith(result.error, target.string() + ": ")) << result.error;
    std::string contents;
    std::getline(std::ifstream(target), contents);
    EXPECT_EQ(contents, "old contents");
    EXPECT_EQ(folder.Names(), std::vector<std::string>{"out.tif"});

    // The name is taken by a folder: the rename fails and the folder stays as it was.
    std::filesystem::create_directory(folder / "taken.png");
    std::ofstream(folder / "taken.png" / "inside.txt") << "keep";
    const IO::WriteResult blocked =
        IO::WriteImage(folder / "taken.png", *Noise(PixelFormat::RGBA8, 8, 8, 11));
    EXPECT_FALSE(blocked);
    EXPECT_TRUE(StartsWith(blocked.error, (folder / "taken.png").string() + ": ")) << blocked.error;
    EXPECT_EQ(folder.Names(), (std::vector<std::string>{"out.tif", "taken.png"}));
    EXPECT_TRUE(std::filesystem::exists(folder / "taken.png" / "inside.txt"));

    // A refused format never gets as far as the file.
    EXPECT_FALSE(IO::WriteImage(target, *Noise(PixelFormat::MaskA8, 8, 8, 12)));
    std::getline(std::ifstream(target), contents);
    EXPECT_EQ(contents, "old contents");

    const IO::WriteResult nowhere =
        IO::WriteImage(folder / "no" / "such" / "folder.png", *Noise(PixelFormat::RGBA8, 8, 8, 13));
    EXPECT_FALSE(nowhere);
    EXPECT_TRUE(StartsWith(nowhere.error, (folder / "no" / "such" / "folder.png").string() + ": "))
        << nowhere.error;
}

} // namespace
