#pragma once
// Tagged little-endian serialisation: each value is a four-character code, a type tag, a size and its bytes.

#include "host/kernel/Countable.h"
#include "host/kernel/FourCC.h"
#include "host/kernel/Geometry.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace Kernel {

class ClassProperties;
class InSerialiser;
class FileStore;

// Type tags written before each value. The numbers are part of the file format.
enum class TypeTag : std::uint16_t {
    Byte = 1,    // one byte
    Bool = 2,    // one byte, 0 or 1
    Int32 = 7,   // signed 32-bit integer
    UInt32 = 9,  // unsigned 32-bit value
    Double = 10, // 64-bit IEEE float
    String = 20, // UTF-8 bytes, no terminator
    Bytes = 21,  // raw bytes
    Point = 36,  // two 64-bit floats (x, y)
    Object = 40, // a nested serialisable object: class code, version, its records
    Array = 41,  // a count and that many values of one tag
};

// An object that writes itself as tagged values and reads itself back.
class Serialisable : public virtual Countable {
public:
    virtual void Save(class OutSerialiser& out) const = 0;
    virtual bool Load(const InSerialiser& in, FileStore& store, unsigned short version) = 0;
    virtual const ClassProperties& GetObjectClassProperties() const = 0;
};

// Out-of-line data that a document keeps beside its serialised objects (pixels and other large blocks).
class FileStore {
public:
    std::uint32_t AddBlock(std::vector<std::byte> block);
    // Empty when the index is unknown.
    std::span<const std::byte> GetBlock(std::uint32_t index) const;
    std::size_t GetBlockCount() const noexcept { return m_Blocks.size(); }

private:
    std::vector<std::vector<std::byte>> m_Blocks;
};

// Writes tagged values into a growing byte buffer.
class OutSerialiser {
public:
    void SaveTypeI(FourCC code, TypeTag tag, const void* data, std::uint32_t size);
    void SaveType(FourCC code, bool value);
    void SaveType(FourCC code, double value);
    void SaveType(FourCC code, std::int32_t value);
    void SaveType(FourCC code, std::uint32_t value);
    void SaveType(FourCC code, PointT<double> value);
    void SaveType(FourCC code, std::string_view value);
    // Without this overload a string literal converts to bool (a standard conversion beats the
    // user-defined one to std::string_view) and is silently saved as a Bool.
    void SaveType(FourCC code, const char* value) {
        SaveType(code, value ? std::string_view(value) : std::string_view());
    }
    // A nested object, written with its class code and version so that it can be created on load.
    void SaveObject(FourCC code, const Serialisable& object);
    void SaveArray(FourCC code, std::span<const double> values);
    void SaveArray(FourCC code, std::span<const PointT<double>> values);
    void SaveArray(FourCC code, std::span<const std::byte> values);

    const std::vector<std::byte>& GetBytes() const noexcept { return m_Bytes; }

private:
    void WriteHeader(FourCC code, TypeTag tag, std::uint32_t size);
    std::vector<std::byte> m_Bytes;
};

// Reads tagged values by code from a validated byte range. A value that is absent, or present with
// another tag or size, is not loaded and the caller's field keeps its value.
class InSerialiser {
public:
    static constexpr int kMaxDepth = 32;

    // Validates the whole range (every record inside it, nested objects and arrays included) first;
    // IsValid() is false for a truncated, oversized or malformed stream, and then nothing loads.
    explicit InSerialiser(std::span<const std::byte> bytes, int depth = 0);

    bool IsValid() const noexcept { return m_Valid; }
    bool Has(FourCC code) const;

    bool LoadTypeI(FourCC code, TypeTag tag, void* data, std::uint32_t size) const;
    bool LoadType(FourCC code, bool& value) const;
    bool LoadType(FourCC code, double& value) const;
    bool LoadType(FourCC code, std::int32_t& value) const;
    bool LoadType(FourCC code, std::uint32_t& value) const;
    bool LoadType(FourCC code, PointT<double>& value) const;
    bool LoadType(FourCC code, std::string& value) const;
    // Creates the nested object from its class code through the class registry and loads it.
    Counted<Serialisable> LoadObject(FourCC code, FileStore& store) const;
    bool LoadArray(FourCC code, std::vector<double>& values) const;
    bool LoadArray(FourCC code, std::vector<PointT<double>>& values) const;
    bool LoadArray(FourCC code, std::vector<std::byte>& values) const;

private:
    struct Record {
        FourCC code;
        TypeTag tag;
        std::span<const std::byte> payload;
    };
    const Record* Find(FourCC code) const;
    template <class T>
    bool LoadFixedArray(FourCC code, TypeTag elementTag, std::vector<T>& values) const;

    std::vector<Record> m_Records;
    int m_Depth = 0;
    bool m_Valid = false;
};

// A whole object as one self-describing block: class code, version, size, then its records.
std::vector<std::byte> SerialiseObject(const Serialisable& object);
// Null when the block is malformed, names an unknown class, or the object's Load fails.
Counted<Serialisable> DeserialiseObject(std::span<const std::byte> bytes, FileStore& store);

} // namespace Kernel
