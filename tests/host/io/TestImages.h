#pragma once
// Helpers for the image file tests: scratch folders, test pictures, comparisons, and files written directly
// with libpng, libjpeg and libtiff so that the reader meets layouts its own writer never produces.

#include "host/io/ImageIO.h"

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

struct tiff;

namespace IOTest {

// A fresh empty folder, removed with everything in it when the object goes.
class ScratchFolder {
public:
    ScratchFolder();
    ~ScratchFolder();
    ScratchFolder(const ScratchFolder&) = delete;
    ScratchFolder& operator=(const ScratchFolder&) = delete;
    const std::filesystem::path& Path() const { return m_Path; }
    std::filesystem::path operator/(const std::string& name) const { return m_Path / name; }
    std::vector<std::string> Names() const; // sorted

private:
    std::filesystem::path m_Path;
};

// The folder with the repository's test fixtures.
std::filesystem::path DataFolder();

std::vector<std::byte> ReadBytes(const std::filesystem::path& path);
void WriteBytes(const std::filesystem::path& path, const std::vector<std::byte>& bytes);

// Every component pseudo-random over its whole range; float formats also get negatives, values above 1,
// signed zero, infinities and subnormals, which a bit-exact path must keep.
Kernel::Counted<Raster::DynamicBuffer> Noise(Raster::PixelFormat format, int width, int height,
                                             std::uint32_t seed);
// Smooth colour ramps with opaque alpha, in an 8-bit format: what lossy codecs are meant for.
Kernel::Counted<Raster::DynamicBuffer> Ramps(Raster::PixelFormat format, int width, int height);

// Empty when a and b have the same size, format and pixel bytes; otherwise where they first differ.
std::string Difference(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b);
// Largest absolute difference between components of two 8-bit images of the same size and format.
int MaxDifference8(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b);

// A PNG written by libpng from rows of raw samples (big-endian for 16 bits, packed for low depths).
struct PngSpec {
    int width = 0;
    int height = 0;
    int bitDepth = 8;
    int colorType = 0;
    bool interlaced = false;
    std::vector<std::vector<std::uint8_t>> rows;
    std::vector<std::uint8_t> palette;      // r, g, b triples
    std::vector<std::uint8_t> transparency; // tRNS for palettes
};
std::vector<std::byte> WritePngDirectly(const PngSpec& spec);

// A JPEG written by libjpeg from 8-bit samples with 1, 3 or 4 components.
std::vector<std::byte> WriteJpegDirectly(int width, int height, int components,
                                         const std::vector<std::uint8_t>& samples, bool adobeMarker,
                                         int quality = 100);

// A TIFF written by libtiff: setup sets the tags, then the contiguous sample rows (native byte order) are
// written through scanlines, or tiles when tileSize is non-zero, or planes when planar.
struct TiffSpec {
    int width = 0;
    int height = 0;
    int samples = 1;
    int bits = 8;
    bool bigEndian = false;
    bool planar = false;
    int tileSize = 0;
    std::function<void(tiff*)> setup;
    std::vector<std::byte> pixels; // width × height × samples components, interleaved
};
std::vector<std::byte> WriteTiffDirectly(const TiffSpec& spec);

// Serialises values in native order, for TiffSpec::pixels.
template <class T>
std::vector<std::byte> Samples(std::initializer_list<T> values) {
    std::vector<std::byte> bytes(values.size() * sizeof(T));
    std::size_t i = 0;
    for (T v : values) {
        std::memcpy(bytes.data() + i, &v, sizeof v);
        i += sizeof v;
    }
    return bytes;
}

template <class T>
T Component(const Raster::DynamicBuffer& image, int x, int y, int c) {
    T value;
    std::memcpy(&value,
                image.RowBytes(y) + std::size_t(x) * std::size_t(image.GetBytesPerPixel()) +
                    std::size_t(c) * sizeof(T),
                sizeof value);
    return value;
}

} // namespace IOTest
