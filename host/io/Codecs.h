#pragma once
// Internal to HostIO: the per-format decoders and encoders behind ImageIO.h, and what they share.

#include "host/io/ImageIO.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace IO::Detail {

// "<name>: <reason>", the shape of every message.
std::string Describe(std::string_view name, std::string_view reason);

// Empty when DynamicBuffer accepts a width × height image of format, else the message refusing it. Called
// with the file's claimed size before anything is allocated.
std::string CheckImageSize(std::string_view name, std::uint64_t width, std::uint64_t height,
                           Raster::PixelFormat format);

// Appends to a byte vector without throwing; false when memory runs out. Encoders call it from C callbacks.
bool AppendBytes(std::vector<std::byte>& out, const void* data, std::size_t size) noexcept;

// Each decoder is handed data already recognised as its type; result.type is set by the caller.
ReadResult DecodePng(std::span<const std::byte> data, std::string_view name,
                     std::optional<Raster::PixelFormat> requested);
ReadResult DecodeJpeg(std::span<const std::byte> data, std::string_view name,
                      std::optional<Raster::PixelFormat> requested);
ReadResult DecodeTiff(std::span<const std::byte> data, std::string_view name);

// Each encoder is handed an image in a format that CanWrite accepts for its type.
EncodeResult EncodePng(const Raster::DynamicBuffer& image, std::string_view name);
EncodeResult EncodeJpeg(const Raster::DynamicBuffer& image, std::string_view name, int quality);
EncodeResult EncodeTiff(const Raster::DynamicBuffer& image, std::string_view name);

} // namespace IO::Detail
