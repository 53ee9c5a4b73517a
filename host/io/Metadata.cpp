// EXIF, XMP and IPTC through libexiv2. Its 0.27 headers still name std::auto_ptr, which the compiler flags as
// deprecated; the flag is off for this file only.

#include "host/io/Codecs.h"

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>

#include <mutex>

namespace IO::Detail {

namespace {

// The XMP toolkit must be set up once before any thread parses XMP; libexiv2's own messages would go to
// standard error, where they mean nothing to the user: every problem here is reported or deliberately
// skipped.
void InitialiseExiv2() {
    static std::once_flag once;
    std::call_once(once, [] {
        Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
        Exiv2::XmpParser::initialize();
    });
}

std::vector<std::byte> EncodeExif(const Exiv2::ExifData& exif, Exiv2::ByteOrder order) {
    Exiv2::Blob blob;
    Exiv2::ExifParser::encode(blob, order == Exiv2::invalidByteOrder ? Exiv2::littleEndian : order, exif);
    const auto* bytes = reinterpret_cast<const std::byte*>(blob.data());
    return std::vector<std::byte>(bytes, bytes + blob.size());
}

// The tags that describe how a TIFF stores its pixels: the encoded file's own must stand, whatever the source
// image's EXIF said; and the TIFF homes of XMP and IPTC.
bool IsStorageTag(const std::string& key) {
    static const char* const tags[] = {"ImageWidth",
                                       "ImageLength",
                                       "BitsPerSample",
                                       "Compression",
                                       "PhotometricInterpretation",
                                       "StripOffsets",
                                       "SamplesPerPixel",
                                       "RowsPerStrip",
                                       "StripByteCounts",
                                       "PlanarConfiguration",
                                       "Predictor",
                                       "ExtraSamples",
                                       "SampleFormat",
                                       "TileWidth",
                                       "TileLength",
                                       "TileOffsets",
                                       "TileByteCounts",
                                       "InterColorProfile",
                                       "InkSet",
                                       "FillOrder",
                                       "NewSubfileType",
                                       "SubIFDs",
                                       "JPEGTables",
                                       "YCbCrSubSampling",
                                       "Orientation",
                                       "XMLPacket",
                                       "IPTCNAA",
                                       "ImageResources"};
    const std::string prefix = "Exif.Image.";
    if (key.compare(0, prefix.size(), prefix) != 0) return false;
    const std::string tag = key.substr(prefix.size());
    for (const char* name : tags)
        if (tag == name) return true;
    return false;
}

} // namespace

bool HoldsIptc(FileType type) {
    return type == FileType::PNG || type == FileType::JPEG || type == FileType::TIFF;
}

std::string MirrorIptcIntoXmp(const Raster::ImageMetadata& metadata) {
    if (metadata.iptc.empty()) return metadata.xmp;
    InitialiseExiv2();
    try {
        Exiv2::IptcData iptc;
        if (Exiv2::IptcParser::decode(iptc, reinterpret_cast<const Exiv2::byte*>(metadata.iptc.data()),
                                      std::uint32_t(metadata.iptc.size())) != 0)
            return metadata.xmp;
        Exiv2::XmpData mirrored;
        Exiv2::copyIptcToXmp(iptc, mirrored);
        Exiv2::XmpData xmp;
        // A packet that cannot be read is kept as it stands rather than replaced.
        if (!metadata.xmp.empty() && Exiv2::XmpParser::decode(xmp, metadata.xmp) != 0) return metadata.xmp;
        bool added = false;
        for (const auto& datum : mirrored)
            if (xmp.findKey(Exiv2::XmpKey(datum.key())) == xmp.end()) {
                xmp.add(datum);
                added = true;
            }
        std::string packet;
        if (!added || Exiv2::XmpParser::encode(packet, xmp) != 0) return metadata.xmp;
        return packet;
    } catch (const std::bad_alloc&) {
        throw;
    } catch (...) {
        return metadata.xmp;
    }
}

void ReadMetadata(std::span<const std::byte> data, FileType type, Raster::ImageMetadata& metadata) {
    InitialiseExiv2();
    try {
        auto image =
            Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(data.data()), long(data.size()));
        if (!image.get()) return;
        image->readMetadata();
        const Exiv2::ExifData& exif = image->exifData();
        if (!exif.empty()) {
            Exiv2::ExifData kept;
            for (const auto& datum : exif)
                // A TIFF's own storage tags describe that file, not the image; they are the writer's to set.
                if (type != FileType::TIFF || !IsStorageTag(datum.key()) ||
                    datum.key() == "Exif.Image.Orientation")
                    kept.add(datum);
            if (!kept.empty()) metadata.exif = EncodeExif(kept, image->byteOrder());
        }
        if (!image->xmpPacket().empty()) metadata.xmp = image->xmpPacket();
        if (!image->iptcData().empty()) {
            const Exiv2::DataBuf iptc = Exiv2::IptcParser::encode(image->iptcData());
            const auto* bytes = reinterpret_cast<const std::byte*>(iptc.pData_);
            metadata.iptc.assign(bytes, bytes + iptc.size_);
        }
    } catch (const std::bad_alloc&) {
        throw;
    } catch (...) {
        // Metadata libexiv2 cannot make sense of is left behind; the pixels are what was asked for.
    }
}

std::optional<std::string> WriteMetadata(std::vector<std::byte>& bytes, FileType type,
                                         const Raster::ImageMetadata& metadata) {
    InitialiseExiv2();
    if (type == FileType::EXR || type == FileType::AVIF || type == FileType::HEIC) return std::nullopt;
    try {
        auto image =
            Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(bytes.data()), long(bytes.size()));
        if (!image.get()) return "cannot add metadata (libexiv2 does not know the encoded file)";
        // Reading first keeps what the encoder wrote, the profile among it, through the rewrite.
        image->readMetadata();
        if (!metadata.exif.empty()) {
            Exiv2::ExifData exif;
            Exiv2::ExifParser::decode(exif, reinterpret_cast<const Exiv2::byte*>(metadata.exif.data()),
                                      std::uint32_t(metadata.exif.size()));
            if (type == FileType::TIFF) {
                // A TIFF's first directory is its EXIF IFD0 too: the encoder's tags (the profile among them)
                // stay, and the image's own tags join them.
                Exiv2::ExifData merged = image->exifData();
                for (const auto& datum : exif) {
                    if (IsStorageTag(datum.key()) && datum.key() != "Exif.Image.Orientation") continue;
                    const auto old = merged.findKey(Exiv2::ExifKey(datum.key()));
                    if (old != merged.end()) merged.erase(old);
                    merged.add(datum);
                }
                exif = merged;
            }
            image->setExifData(exif);
        }
        if (!metadata.xmp.empty()) {
            image->setXmpPacket(metadata.xmp);
            image->writeXmpFromPacket(true);
        }
        if (!metadata.iptc.empty() && HoldsIptc(type)) {
            Exiv2::IptcData iptc;
            if (Exiv2::IptcParser::decode(iptc, reinterpret_cast<const Exiv2::byte*>(metadata.iptc.data()),
                                          std::uint32_t(metadata.iptc.size())) == 0)
                image->setIptcData(iptc);
        }
        image->writeMetadata();
        Exiv2::BasicIo& io = image->io();
        if (io.open() != 0) return "cannot add metadata (libexiv2 cannot reopen the file)";
        const long size = io.size();
        std::vector<std::byte> written(std::size_t(size > 0 ? size : 0));
        const long got = written.empty() ? 0 : io.read(reinterpret_cast<Exiv2::byte*>(written.data()), size);
        io.close();
        if (got != size || written.empty()) return "cannot add metadata (libexiv2 gave back no file)";
        bytes = std::move(written);
        return std::nullopt;
    } catch (const std::bad_alloc&) {
        throw;
    } catch (const std::exception& e) {
        return std::string("cannot add metadata (") + e.what() + ")";
    }
}

int GetExifOrientation(std::span<const std::byte> exif) {
    if (exif.empty()) return 1;
    InitialiseExiv2();
    try {
        Exiv2::ExifData data;
        Exiv2::ExifParser::decode(data, reinterpret_cast<const Exiv2::byte*>(exif.data()),
                                  std::uint32_t(exif.size()));
        const auto found = data.findKey(Exiv2::ExifKey("Exif.Image.Orientation"));
        if (found == data.end() || found->count() < 1) return 1;
        const long value = found->toLong();
        return value >= 1 && value <= 8 ? int(value) : 1;
    } catch (const std::bad_alloc&) {
        throw;
    } catch (...) {
        return 1;
    }
}

std::vector<std::byte> ResetExifOrientation(std::span<const std::byte> exif) {
    std::vector<std::byte> same(exif.begin(), exif.end());
    if (exif.empty()) return same;
    InitialiseExiv2();
    try {
        Exiv2::ExifData data;
        const Exiv2::ByteOrder order = Exiv2::ExifParser::decode(
            data, reinterpret_cast<const Exiv2::byte*>(exif.data()), std::uint32_t(exif.size()));
        const auto found = data.findKey(Exiv2::ExifKey("Exif.Image.Orientation"));
        if (found == data.end()) return same;
        found->setValue("1");
        return EncodeExif(data, order);
    } catch (const std::bad_alloc&) {
        throw;
    } catch (...) {
        return same;
    }
}

} // namespace IO::Detail

#pragma GCC diagnostic pop
