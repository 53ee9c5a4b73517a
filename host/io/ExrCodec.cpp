// OpenEXR through its C++ library: single-part scanline or tiled images, every channel read as 32-bit float
// (half and unsigned channels converted by the library), written as float so that RGBAUF round-trips exactly.

#include "host/io/Codecs.h"

#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfIO.h>
#include <ImfInputFile.h>
#include <ImfOutputFile.h>

#include <cstring>
#include <exception>
#include <mutex>

namespace IO::Detail {

using Raster::PixelFormat;

namespace {

class MemoryInput : public Imf::IStream {
public:
    explicit MemoryInput(std::span<const std::byte> data)
        : Imf::IStream("memory")
        , m_Data(data) {}
    bool read(char c[], int n) override {
        if (n < 0 || std::uint64_t(n) > m_Data.size() - std::min<std::uint64_t>(m_Position, m_Data.size()))
            throw std::runtime_error("unexpected end of data");
        std::memcpy(c, m_Data.data() + m_Position, std::size_t(n));
        m_Position += std::uint64_t(n);
        return m_Position < m_Data.size();
    }
    std::uint64_t tellg() override { return m_Position; }
    void seekg(std::uint64_t position) override { m_Position = position; }

private:
    std::span<const std::byte> m_Data;
    std::uint64_t m_Position = 0;
};

class MemoryOutput : public Imf::OStream {
public:
    explicit MemoryOutput(std::vector<std::byte>& out)
        : Imf::OStream("memory")
        , m_Out(out) {}
    void write(const char c[], int n) override {
        if (n < 0) throw std::runtime_error("negative write");
        const std::size_t end = std::size_t(m_Position) + std::size_t(n);
        if (end > m_Out.size()) m_Out.resize(end);
        std::memcpy(m_Out.data() + m_Position, c, std::size_t(n));
        m_Position = end;
    }
    std::uint64_t tellp() override { return m_Position; }
    void seekp(std::uint64_t position) override { m_Position = position; }

private:
    std::vector<std::byte>& m_Out;
    std::uint64_t m_Position = 0;
};

// The library's own guard against absurd headers, set once to the host's side limit.
void LimitSizes() {
    static std::once_flag once;
    std::call_once(once, [] {
        Imf::Header::setMaxImageSize(Raster::DynamicBuffer::MaxSide, Raster::DynamicBuffer::MaxSide);
        Imf::Header::setMaxTileSize(Raster::DynamicBuffer::MaxSide, Raster::DynamicBuffer::MaxSide);
    });
}

// OpenEXR allocates each header attribute at the size the file claims before reading it (2 GiB for a
// 466-byte file), so the headers are walked here first: every attribute must lie within the file. Empty when
// they do, else the reason.
std::string CheckHeaders(std::span<const std::byte> data) {
    if (data.size() < 8) return "no header";
    const bool multipart = (std::uint8_t(data[5]) & 0x10) != 0; // version field, byte 1: the multi-part flag
    std::size_t at = 8;
    auto word = [&](std::string& out) {
        out.clear();
        while (at < data.size() && data[at] != std::byte{0} && out.size() < 256)
            out.push_back(char(data[at++]));
        if (at >= data.size() || out.size() >= 256) return false;
        ++at; // the terminating zero
        return true;
    };
    std::string name, type;
    for (int headers = 0;; ++headers) {
        for (;;) {
            if (!word(name)) return "a header runs past the end";
            if (name.empty()) break; // the end of this header
            if (!word(type)) return "a header runs past the end";
            if (data.size() - at < 4) return "a header runs past the end";
            std::uint32_t size = 0;
            for (int i = 3; i >= 0; --i)
                size = (size << 8) | std::uint32_t(data[at + std::size_t(i)]);
            at += 4;
            if (size > data.size() - at)
                return "attribute \"" + name + "\" claims more bytes than the file holds";
            at += size;
        }
        if (!multipart) return {};
        // Multi-part files list their headers one after another, ended by an empty one.
        if (at < data.size() && data[at] == std::byte{0}) return {};
        if (headers > 10000) return "too many parts";
    }
}

} // namespace

ReadResult DecodeExr(std::span<const std::byte> data, std::string_view name) {
    ReadResult result;
    LimitSizes();
    if (std::string reason = CheckHeaders(data); !reason.empty()) {
        result.error = Describe(name, "truncated or damaged OpenEXR data (" + reason + ")");
        return result;
    }
    try {
        MemoryInput input(data);
        Imf::InputFile file(input);
        const Imath::Box2i window = file.header().dataWindow();
        const std::int64_t width = std::int64_t(window.max.x) - window.min.x + 1;
        const std::int64_t height = std::int64_t(window.max.y) - window.min.y + 1;
        result.error = CheckImageSize(name, std::uint64_t(std::max<std::int64_t>(width, 0)),
                                      std::uint64_t(std::max<std::int64_t>(height, 0)), PixelFormat::RGBAUF);
        if (!result.error.empty()) return result;
        const Imf::ChannelList& channels = file.header().channels();
        for (auto it = channels.begin(); it != channels.end(); ++it)
            if (it.channel().xSampling != 1 || it.channel().ySampling != 1) {
                result.error = Describe(name, "unsupported OpenEXR layout (subsampled channels)");
                return result;
            }
        const bool colour =
            channels.findChannel("R") && channels.findChannel("G") && channels.findChannel("B");
        const bool luminance = !colour && channels.findChannel("Y");
        if (!colour && !luminance) {
            result.error = Describe(name, "unsupported OpenEXR layout (no R, G, B or Y channel)");
            return result;
        }
        result.image = Raster::DynamicBuffer::Create(int(width), int(height), PixelFormat::RGBAUF);
        if (!result.image) {
            result.error = Describe(name, "out of memory");
            return result;
        }
        Raster::DynamicBuffer& image = *result.image;
        // The slices address pixel (x, y) of the data window, which may start anywhere.
        const std::ptrdiff_t stride = image.Stride();
        char* origin = reinterpret_cast<char*>(image.RowBytes(0)) - std::ptrdiff_t(window.min.x) * 16 -
                       std::ptrdiff_t(window.min.y) * stride;
        Imf::FrameBuffer frame;
        const char* names[] = {"R", "G", "B"};
        for (int c = 0; c < (colour ? 3 : 1); ++c)
            frame.insert(colour ? names[c] : "Y",
                         Imf::Slice(Imf::FLOAT, origin + c * 4, 16, std::size_t(stride), 1, 1, 0.0));
        frame.insert("A", Imf::Slice(Imf::FLOAT, origin + 12, 16, std::size_t(stride), 1, 1, 1.0));
        file.setFrameBuffer(frame);
        file.readPixels(window.min.y, window.max.y);
        if (luminance)
            for (int y = 0; y < image.GetHeight(); ++y) {
                float* row = image.Row<float>(y);
                for (int x = 0; x < image.GetWidth(); ++x)
                    row[x * 4 + 1] = row[x * 4 + 2] = row[x * 4];
            }
    } catch (const std::bad_alloc&) {
        result.image.Reset();
        result.error = Describe(name, "out of memory");
    } catch (const std::exception& e) {
        result.image.Reset();
        result.error = Describe(name, std::string("truncated or damaged OpenEXR data (") + e.what() + ")");
    }
    return result;
}

EncodeResult EncodeExr(const Raster::DynamicBuffer& image, std::string_view name,
                       const EncodeRequest& request) {
    EncodeResult result;
    LimitSizes();
    try {
        Imf::Header header(image.GetWidth(), image.GetHeight());
        header.compression() = Imf::ZIP_COMPRESSION;
        const char* names[] = {"R", "G", "B", "A"};
        const int channels = request.alpha ? 4 : 3;
        for (int c = 0; c < channels; ++c)
            header.channels().insert(names[c], Imf::Channel(Imf::FLOAT));
        MemoryOutput output(result.bytes);
        Imf::OutputFile file(output, header);
        Imf::FrameBuffer frame;
        char* base = const_cast<char*>(reinterpret_cast<const char*>(image.RowBytes(0)));
        for (int c = 0; c < channels; ++c)
            frame.insert(names[c], Imf::Slice(Imf::FLOAT, base + c * 4, 16, std::size_t(image.Stride())));
        file.setFrameBuffer(frame);
        file.writePixels(image.GetHeight());
    } catch (const std::bad_alloc&) {
        result.bytes.clear();
        result.error = Describe(name, "out of memory");
    } catch (const std::exception& e) {
        result.bytes.clear();
        result.error = Describe(name, std::string("cannot encode OpenEXR (") + e.what() + ")");
    }
    return result;
}

} // namespace IO::Detail
