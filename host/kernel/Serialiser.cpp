#include "host/kernel/Serialiser.h"

#include "host/kernel/ClassProperties.h"

#include <bit>
#include <cstring>
#include <limits>
#include <stdexcept>
#include <utility>

namespace Kernel {

namespace {

// Record header: u32 code, u16 tag, u32 payload size.
constexpr std::size_t kHeaderSize = 10;
// Object payload prefix: u32 class code, u16 version. Array payload prefix: u32 count, u16 element tag.
constexpr std::size_t kObjectPrefixSize = 6;
constexpr std::size_t kArrayPrefixSize = 6;
// A whole object block: u32 class code, u16 version, u32 body size.
constexpr std::size_t kBlockHeaderSize = 10;

constexpr std::uint32_t kMaxU32 = std::numeric_limits<std::uint32_t>::max();

// ---- Little-endian encoding, independent of the host's byte order ----

void PutU16(std::vector<std::byte>& out, std::uint16_t value) {
    out.push_back(std::byte(value & 0xFF));
    out.push_back(std::byte(value >> 8));
}

void PutU32(std::vector<std::byte>& out, std::uint32_t value) {
    for (int shift = 0; shift < 32; shift += 8)
        out.push_back(std::byte((value >> shift) & 0xFF));
}

void PutU64(std::vector<std::byte>& out, std::uint64_t value) {
    for (int shift = 0; shift < 64; shift += 8)
        out.push_back(std::byte((value >> shift) & 0xFF));
}

void PutDouble(std::vector<std::byte>& out, double value) {
    PutU64(out, std::bit_cast<std::uint64_t>(value));
}

void PatchU32(std::vector<std::byte>& out, std::size_t at, std::uint32_t value) {
    for (std::size_t i = 0; i < 4; ++i)
        out[at + i] = std::byte((value >> (8 * i)) & 0xFF);
}

std::uint16_t GetU16(const std::byte* p) {
    return std::uint16_t(std::uint16_t(p[0]) | (std::uint16_t(p[1]) << 8));
}

std::uint32_t GetU32(const std::byte* p) {
    return std::uint32_t(p[0]) | (std::uint32_t(p[1]) << 8) | (std::uint32_t(p[2]) << 16) |
           (std::uint32_t(p[3]) << 24);
}

std::uint64_t GetU64(const std::byte* p) {
    return std::uint64_t(GetU32(p)) | (std::uint64_t(GetU32(p + 4)) << 32);
}

double GetDouble(const std::byte* p) {
    return std::bit_cast<double>(GetU64(p));
}

// Size as a u32 payload size, or throws: the format cannot describe more.
std::uint32_t CheckedSize(std::size_t size) {
    if (size > kMaxU32) throw std::length_error("Kernel::OutSerialiser: value too large for a record");
    return std::uint32_t(size);
}

// Element size of the tags an Array may hold; 0 for any other tag.
std::size_t ArrayElementSize(TypeTag tag) {
    switch (tag) {
    case TypeTag::Byte:
        return 1;
    case TypeTag::Double:
        return 8;
    case TypeTag::Point:
        return 16;
    default:
        return 0;
    }
}

// Array payload size for count elements of elementSize bytes, or throws.
std::uint32_t ArrayPayloadSize(std::size_t count, std::size_t elementSize) {
    if (count > kMaxU32 || count > (kMaxU32 - kArrayPrefixSize) / elementSize)
        throw std::length_error("Kernel::OutSerialiser: array too large for a record");
    return std::uint32_t(kArrayPrefixSize + count * elementSize);
}

// ---- Validation ----

// Walks the record headers of bytes, calling visit(code, tag, payload) for each; false as soon as a header
// or a payload does not fit, or visit returns false.
template <class Visit>
bool ParseRecords(std::span<const std::byte> bytes, Visit&& visit) {
    std::size_t offset = 0;
    while (offset < bytes.size()) {
        if (bytes.size() - offset < kHeaderSize) return false;
        const std::byte* header = bytes.data() + offset;
        const FourCC code = GetU32(header);
        const auto tag = TypeTag(GetU16(header + 4));
        const std::uint32_t size = GetU32(header + 6);
        offset += kHeaderSize;
        if (size > bytes.size() - offset) return false;
        if (!visit(code, tag, bytes.subspan(offset, size))) return false;
        offset += size;
    }
    return true;
}

bool ValidateBody(std::span<const std::byte> bytes, int depth);

// The structure of one payload: nested objects are valid at depth + 1, arrays are exactly count elements.
// Scalars are only checked when loaded, so that a record of another size is skipped, not fatal.
bool ValidatePayload(TypeTag tag, std::span<const std::byte> payload, int depth) {
    switch (tag) {
    case TypeTag::Object:
        if (payload.size() < kObjectPrefixSize) return false;
        return ValidateBody(payload.subspan(kObjectPrefixSize), depth + 1);
    case TypeTag::Array: {
        if (payload.size() < kArrayPrefixSize) return false;
        const std::uint32_t count = GetU32(payload.data());
        const std::size_t elementSize = ArrayElementSize(TypeTag(GetU16(payload.data() + 4)));
        if (elementSize == 0) return false;
        const std::size_t dataSize = payload.size() - kArrayPrefixSize;
        // Division, not count * elementSize: no overflow whatever the count says.
        return dataSize % elementSize == 0 && dataSize / elementSize == count;
    }
    default:
        return true;
    }
}

bool ValidateBody(std::span<const std::byte> bytes, int depth) {
    if (depth < 0 || depth > InSerialiser::kMaxDepth) return false;
    return ParseRecords(bytes, [depth](FourCC, TypeTag tag, std::span<const std::byte> payload) {
        return ValidatePayload(tag, payload, depth);
    });
}

// Creates an object of classCode and loads it from body (its records) at the given depth.
Counted<Serialisable> CreateAndLoad(FourCC classCode, unsigned short version, std::span<const std::byte> body,
                                    int depth, FileStore& store) {
    const ClassProperties* properties = ClassProperties::Find(classCode);
    if (!properties) return {};
    const InSerialiser in(body, depth);
    if (!in.IsValid()) return {};
    Counted<Serialisable> object = properties->CreateObject();
    if (!object || !object->Load(in, store, version)) return {};
    return object;
}

void Decode(const std::byte* p, double& value) {
    value = GetDouble(p);
}
void Decode(const std::byte* p, PointT<double>& value) {
    value = {GetDouble(p), GetDouble(p + 8)};
}
void Decode(const std::byte* p, std::byte& value) {
    value = *p;
}

} // namespace

// ---- FileStore ----

std::uint32_t FileStore::AddBlock(std::vector<std::byte> block) {
    if (m_Blocks.size() >= kMaxU32) throw std::length_error("Kernel::FileStore: too many blocks");
    m_Blocks.push_back(std::move(block));
    return std::uint32_t(m_Blocks.size() - 1);
}

std::span<const std::byte> FileStore::GetBlock(std::uint32_t index) const {
    if (index >= m_Blocks.size()) return {};
    return m_Blocks[index];
}

// ---- OutSerialiser ----

void OutSerialiser::WriteHeader(FourCC code, TypeTag tag, std::uint32_t size) {
    PutU32(m_Bytes, code);
    PutU16(m_Bytes, std::uint16_t(tag));
    PutU32(m_Bytes, size);
}

void OutSerialiser::SaveTypeI(FourCC code, TypeTag tag, const void* data, std::uint32_t size) {
    WriteHeader(code, tag, size);
    if (size == 0) return;
    const auto* bytes = static_cast<const std::byte*>(data);
    m_Bytes.insert(m_Bytes.end(), bytes, bytes + size);
}

void OutSerialiser::SaveType(FourCC code, bool value) {
    WriteHeader(code, TypeTag::Bool, 1);
    m_Bytes.push_back(std::byte(value ? 1 : 0));
}

void OutSerialiser::SaveType(FourCC code, double value) {
    WriteHeader(code, TypeTag::Double, 8);
    PutDouble(m_Bytes, value);
}

void OutSerialiser::SaveType(FourCC code, std::int32_t value) {
    WriteHeader(code, TypeTag::Int32, 4);
    PutU32(m_Bytes, std::uint32_t(value));
}

void OutSerialiser::SaveType(FourCC code, std::uint32_t value) {
    WriteHeader(code, TypeTag::UInt32, 4);
    PutU32(m_Bytes, value);
}

void OutSerialiser::SaveType(FourCC code, PointT<double> value) {
    WriteHeader(code, TypeTag::Point, 16);
    PutDouble(m_Bytes, value.x);
    PutDouble(m_Bytes, value.y);
}

void OutSerialiser::SaveType(FourCC code, std::string_view value) {
    SaveTypeI(code, TypeTag::String, value.data(), CheckedSize(value.size()));
}

void OutSerialiser::SaveObject(FourCC code, const Serialisable& object) {
    const ClassProperties& properties = object.GetObjectClassProperties();
    const std::size_t start = m_Bytes.size();
    try {
        // The object writes its records straight after the prefix; the size is patched in afterwards.
        WriteHeader(code, TypeTag::Object, 0);
        PutU32(m_Bytes, properties.GetClassCode());
        PutU16(m_Bytes, properties.GetVersion());
        object.Save(*this);
        PatchU32(m_Bytes, start + 6, CheckedSize(m_Bytes.size() - start - kHeaderSize));
    } catch (...) {
        m_Bytes.resize(start); // no half-written record
        throw;
    }
}

void OutSerialiser::SaveArray(FourCC code, std::span<const double> values) {
    WriteHeader(code, TypeTag::Array, ArrayPayloadSize(values.size(), 8));
    PutU32(m_Bytes, std::uint32_t(values.size()));
    PutU16(m_Bytes, std::uint16_t(TypeTag::Double));
    for (double value : values)
        PutDouble(m_Bytes, value);
}

void OutSerialiser::SaveArray(FourCC code, std::span<const PointT<double>> values) {
    WriteHeader(code, TypeTag::Array, ArrayPayloadSize(values.size(), 16));
    PutU32(m_Bytes, std::uint32_t(values.size()));
    PutU16(m_Bytes, std::uint16_t(TypeTag::Point));
    for (const PointT<double>& value : values) {
        PutDouble(m_Bytes, value.x);
        PutDouble(m_Bytes, value.y);
    }
}

void OutSerialiser::SaveArray(FourCC code, std::span<const std::byte> values) {
    WriteHeader(code, TypeTag::Array, ArrayPayloadSize(values.size(), 1));
    PutU32(m_Bytes, std::uint32_t(values.size()));
    PutU16(m_Bytes, std::uint16_t(TypeTag::Byte));
    m_Bytes.insert(m_Bytes.end(), values.begin(), values.end());
}

// ---- InSerialiser ----

InSerialiser::InSerialiser(std::span<const std::byte> bytes, int depth)
    : m_Depth(depth) {
    if (depth < 0 || depth > kMaxDepth) return;
    std::vector<Record> records;
    const bool valid =
        ParseRecords(bytes, [&records, depth](FourCC code, TypeTag tag, std::span<const std::byte> payload) {
            if (!ValidatePayload(tag, payload, depth)) return false;
            records.push_back({code, tag, payload});
            return true;
        });
    if (!valid) return;
    m_Records = std::move(records);
    m_Valid = true;
}

const InSerialiser::Record* InSerialiser::Find(FourCC code) const {
    if (!m_Valid) return nullptr;
    for (const Record& record : m_Records)
        if (record.code == code) return &record; // the first record with the code wins
    return nullptr;
}

bool InSerialiser::Has(FourCC code) const {
    return Find(code) != nullptr;
}

bool InSerialiser::LoadTypeI(FourCC code, TypeTag tag, void* data, std::uint32_t size) const {
    const Record* record = Find(code);
    if (!record || record->tag != tag || record->payload.size() != size) return false;
    if (size != 0) std::memcpy(data, record->payload.data(), size);
    return true;
}

bool InSerialiser::LoadType(FourCC code, bool& value) const {
    std::byte raw{};
    if (!LoadTypeI(code, TypeTag::Bool, &raw, 1)) return false;
    if (raw != std::byte(0) && raw != std::byte(1)) return false;
    value = raw == std::byte(1);
    return true;
}

bool InSerialiser::LoadType(FourCC code, double& value) const {
    std::byte raw[8];
    if (!LoadTypeI(code, TypeTag::Double, raw, sizeof raw)) return false;
    value = GetDouble(raw);
    return true;
}

bool InSerialiser::LoadType(FourCC code, std::int32_t& value) const {
    std::byte raw[4];
    if (!LoadTypeI(code, TypeTag::Int32, raw, sizeof raw)) return false;
    value = std::int32_t(GetU32(raw)); // two's complement (C++20)
    return true;
}

bool InSerialiser::LoadType(FourCC code, std::uint32_t& value) const {
    std::byte raw[4];
    if (!LoadTypeI(code, TypeTag::UInt32, raw, sizeof raw)) return false;
    value = GetU32(raw);
    return true;
}

bool InSerialiser::LoadType(FourCC code, PointT<double>& value) const {
    std::byte raw[16];
    if (!LoadTypeI(code, TypeTag::Point, raw, sizeof raw)) return false;
    Decode(raw, value);
    return true;
}

bool InSerialiser::LoadType(FourCC code, std::string& value) const {
    const Record* record = Find(code);
    if (!record || record->tag != TypeTag::String) return false;
    value.assign(reinterpret_cast<const char*>(record->payload.data()), record->payload.size());
    return true;
}

Counted<Serialisable> InSerialiser::LoadObject(FourCC code, FileStore& store) const {
    const Record* record = Find(code);
    if (!record || record->tag != TypeTag::Object) return {};
    // The constructor checked that the payload holds at least the prefix.
    const std::span<const std::byte> payload = record->payload;
    return CreateAndLoad(GetU32(payload.data()), GetU16(payload.data() + 4),
                         payload.subspan(kObjectPrefixSize), m_Depth + 1, store);
}

template <class T>
bool InSerialiser::LoadFixedArray(FourCC code, TypeTag elementTag, std::vector<T>& values) const {
    const Record* record = Find(code);
    if (!record || record->tag != TypeTag::Array) return false;
    const std::span<const std::byte> payload = record->payload;
    if (TypeTag(GetU16(payload.data() + 4)) != elementTag) return false;
    // The constructor checked that count elements fill the payload exactly, so the allocation below is
    // bounded by the input.
    const std::size_t count = GetU32(payload.data());
    const std::size_t elementSize = ArrayElementSize(elementTag);
    std::vector<T> loaded(count);
    const std::byte* p = payload.data() + kArrayPrefixSize;
    for (std::size_t i = 0; i < count; ++i, p += elementSize)
        Decode(p, loaded[i]);
    values = std::move(loaded);
    return true;
}

bool InSerialiser::LoadArray(FourCC code, std::vector<double>& values) const {
    return LoadFixedArray(code, TypeTag::Double, values);
}

bool InSerialiser::LoadArray(FourCC code, std::vector<PointT<double>>& values) const {
    return LoadFixedArray(code, TypeTag::Point, values);
}

bool InSerialiser::LoadArray(FourCC code, std::vector<std::byte>& values) const {
    return LoadFixedArray(code, TypeTag::Byte, values);
}

// ---- Whole objects ----

std::vector<std::byte> SerialiseObject(const Serialisable& object) {
    const ClassProperties& properties = object.GetObjectClassProperties();
    OutSerialiser body;
    object.Save(body);
    const std::vector<std::byte>& records = body.GetBytes();

    std::vector<std::byte> bytes;
    bytes.reserve(kBlockHeaderSize + records.size());
    PutU32(bytes, properties.GetClassCode());
    PutU16(bytes, properties.GetVersion());
    PutU32(bytes, CheckedSize(records.size()));
    bytes.insert(bytes.end(), records.begin(), records.end());
    return bytes;
}

Counted<Serialisable> DeserialiseObject(std::span<const std::byte> bytes, FileStore& store) {
    if (bytes.size() < kBlockHeaderSize) return {};
    const FourCC classCode = GetU32(bytes.data());
    const std::uint16_t version = GetU16(bytes.data() + 4);
    const std::uint32_t size = GetU32(bytes.data() + 6);
    // The body must fill the rest exactly: neither truncated nor followed by anything.
    if (size != bytes.size() - kBlockHeaderSize) return {};
    return CreateAndLoad(classCode, version, bytes.subspan(kBlockHeaderSize), 0, store);
}

} // namespace Kernel
