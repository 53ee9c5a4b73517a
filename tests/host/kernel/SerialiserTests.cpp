#include "AllocationTracker.h"
#include "TestObjects.h"

#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <cstring>
#include <limits>
#include <random>
#include <stdexcept>

using namespace Kernel;
using namespace Kernel::Literals;
using namespace KernelTests;

namespace {

using Bytes = std::vector<std::byte>;

Bytes Hex(std::initializer_list<int> values) {
    Bytes bytes;
    for (int v : values)
        bytes.push_back(std::byte(v));
    return bytes;
}

void Append(Bytes& out, const Bytes& more) {
    out.insert(out.end(), more.begin(), more.end());
}

void PutU16(Bytes& out, std::uint16_t v) {
    out.push_back(std::byte(v & 0xFF));
    out.push_back(std::byte(v >> 8));
}

void PutU32(Bytes& out, std::uint32_t v) {
    for (int i = 0; i < 4; ++i)
        out.push_back(std::byte((v >> (8 * i)) & 0xFF));
}

// One record, its size field given explicitly so that it can lie.
Bytes Record(FourCC code, std::uint16_t tag, std::uint32_t size, const Bytes& payload) {
    Bytes out;
    PutU32(out, code);
    PutU16(out, tag);
    PutU32(out, size);
    Append(out, payload);
    return out;
}

Bytes Record(FourCC code, TypeTag tag, const Bytes& payload) {
    return Record(code, std::uint16_t(tag), std::uint32_t(payload.size()), payload);
}

// A whole object block: class code, version, body size, body.
Bytes Block(FourCC classCode, std::uint16_t version, const Bytes& body) {
    Bytes out;
    PutU32(out, classCode);
    PutU16(out, version);
    PutU32(out, std::uint32_t(body.size()));
    Append(out, body);
    return out;
}

// An Object record's payload: class code, version, records.
Bytes ObjectPayload(FourCC classCode, std::uint16_t version, const Bytes& records) {
    Bytes out;
    PutU32(out, classCode);
    PutU16(out, version);
    Append(out, records);
    return out;
}

Bytes ArrayPayload(std::uint32_t count, TypeTag elementTag, const Bytes& elements) {
    Bytes out;
    PutU32(out, count);
    PutU16(out, std::uint16_t(elementTag));
    Append(out, elements);
    return out;
}

Counted<Sample> Deserialise(const Bytes& bytes, FileStore& store) {
    return CountedCast<Sample>(DeserialiseObject(bytes, store));
}

Counted<Sample> MakeRichSample() {
    auto sample = MakeCounted<Sample>();
    sample->flag = true;
    sample->amount = -1234.5678;
    sample->count = std::numeric_limits<std::int32_t>::min();
    sample->mask = 0xFFFFFFFEu;
    sample->origin = {0.1, -1e300};
    sample->name = "Caf\xC3\xA9 \xE2\x82\xAC"; // "Café €"
    sample->weights = {0.0, -0.5, 1e-310, 3.25};
    sample->path = {{1, 2}, {3, 4}, {-5, 6.5}};
    sample->data = Hex({0, 1, 0x7F, 0x80, 0xFF});
    auto child = MakeCounted<Sample>();
    child->name = "child";
    child->amount = 2.0;
    auto tiny = MakeCounted<Tiny>();
    tiny->value = 0.125;
    child->child = tiny;
    sample->child = child;
    return sample;
}

void ExpectSameFields(const Sample& a, const Sample& b) {
    EXPECT_EQ(a.flag, b.flag);
    EXPECT_EQ(std::bit_cast<std::uint64_t>(a.amount), std::bit_cast<std::uint64_t>(b.amount));
    EXPECT_EQ(a.count, b.count);
    EXPECT_EQ(a.mask, b.mask);
    EXPECT_EQ(a.origin, b.origin);
    EXPECT_EQ(a.name, b.name);
    EXPECT_EQ(a.weights, b.weights);
    EXPECT_EQ(a.path, b.path);
    EXPECT_EQ(a.data, b.data);
}

// Offsets at which a record of body begins or body ends: the only lengths at which a truncated body is valid.
std::vector<std::size_t> RecordBoundaries(const Bytes& body) {
    std::vector<std::size_t> boundaries{0};
    std::size_t offset = 0;
    while (offset < body.size()) {
        std::uint32_t size = 0;
        for (int i = 0; i < 4; ++i)
            size |= std::uint32_t(body[offset + 6 + std::size_t(i)]) << (8 * i);
        offset += 10 + size;
        boundaries.push_back(offset);
    }
    EXPECT_EQ(offset, body.size());
    return boundaries;
}

} // namespace

// ---- Exact bytes ----

TEST(Serialiser, HandWorkedBytesOfASmallObject) {
    const Tiny tiny;
    const Bytes expected = Hex({
        0x79, 0x6E, 0x69, 0x54,                         // class code "Tiny" = 0x54696E79, little-endian
        0x03, 0x00,                                     // version 3
        0x1D, 0x00, 0x00, 0x00,                         // body size 29 = (10 + 8) + (10 + 1)
        0x65, 0x74, 0x6E, 0x49,                         // "Inte" = 0x496E7465
        0x0A, 0x00,                                     // tag Double (10)
        0x08, 0x00, 0x00, 0x00,                         // size 8
        0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0xD0, 0x3F, // 0.25 = 0x3FD0000000000000
        0x67, 0x61, 0x6C, 0x46,                         // "Flag" = 0x466C6167
        0x02, 0x00,                                     // tag Bool (2)
        0x01, 0x00, 0x00, 0x00,                         // size 1
        0x01,                                           // true
    });
    EXPECT_EQ(SerialiseObject(tiny), expected);

    FileStore store;
    auto loaded = CountedCast<Tiny>(DeserialiseObject(expected, store));
    ASSERT_TRUE(loaded);
    EXPECT_EQ(loaded->value, 0.25);
    EXPECT_TRUE(loaded->flag);
}

TEST(Serialiser, RecordLayoutOfEveryType) {
    OutSerialiser out;
    out.SaveType("bool"_4cc, false);
    EXPECT_EQ(out.GetBytes(), Record("bool"_4cc, TypeTag::Bool, Hex({0})));

    out = {};
    out.SaveType("i32 "_4cc, std::int32_t(-2));
    EXPECT_EQ(out.GetBytes(), Record("i32 "_4cc, TypeTag::Int32, Hex({0xFE, 0xFF, 0xFF, 0xFF})));

    out = {};
    out.SaveType("u32 "_4cc, std::uint32_t(0x01020304));
    EXPECT_EQ(out.GetBytes(), Record("u32 "_4cc, TypeTag::UInt32, Hex({4, 3, 2, 1})));

    out = {};
    out.SaveType("pnt "_4cc, PointT<double>{1.0, -2.0});
    EXPECT_EQ(out.GetBytes(), Record("pnt "_4cc, TypeTag::Point,
                                     Hex({0, 0, 0, 0, 0, 0, 0xF0, 0x3F, 0, 0, 0, 0, 0, 0, 0, 0xC0})));

    out = {};
    out.SaveType("str "_4cc, std::string_view("h\xC3\xA9"));
    EXPECT_EQ(out.GetBytes(), Record("str "_4cc, TypeTag::String, Hex({'h', 0xC3, 0xA9})));

    // A string literal is saved as a string, not converted to bool.
    out = {};
    out.SaveType("str "_4cc, "h\xC3\xA9");
    EXPECT_EQ(out.GetBytes(), Record("str "_4cc, TypeTag::String, Hex({'h', 0xC3, 0xA9})));

    out = {};
    const double doubles[] = {1.0};
    out.SaveArray("arrd"_4cc, doubles);
    EXPECT_EQ(out.GetBytes(), Record("arrd"_4cc, TypeTag::Array,
                                     ArrayPayload(1, TypeTag::Double, Hex({0, 0, 0, 0, 0, 0, 0xF0, 0x3F}))));

    out = {};
    const std::byte raw[] = {std::byte{7}, std::byte{8}};
    out.SaveArray("arrb"_4cc, raw);
    EXPECT_EQ(out.GetBytes(),
              Record("arrb"_4cc, TypeTag::Array, ArrayPayload(2, TypeTag::Byte, Hex({7, 8}))));

    out = {};
    out.SaveArray("arrp"_4cc, std::span<const PointT<double>>());
    EXPECT_EQ(out.GetBytes(), Record("arrp"_4cc, TypeTag::Array, ArrayPayload(0, TypeTag::Point, {})));

    out = {};
    const Tiny tiny;
    out.SaveObject("obj "_4cc, tiny);
    Bytes tinyRecords;
    Append(tinyRecords, Record("Inte"_4cc, TypeTag::Double, Hex({0, 0, 0, 0, 0, 0, 0xD0, 0x3F})));
    Append(tinyRecords, Record("Flag"_4cc, TypeTag::Bool, Hex({1})));
    EXPECT_EQ(out.GetBytes(),
              Record("obj "_4cc, TypeTag::Object, ObjectPayload(Tiny::kClassCode, 3, tinyRecords)));
}

TEST(Serialiser, SaveTypeIWritesExactlyWhatItIsGiven) {
    OutSerialiser out;
    const unsigned char payload[] = {1, 2, 3};
    out.SaveTypeI("raw "_4cc, TypeTag(999), payload, 3);
    out.SaveTypeI("none"_4cc, TypeTag::Bytes, nullptr, 0);
    Bytes expected = Record("raw "_4cc, 999, 3, Hex({1, 2, 3}));
    Append(expected, Record("none"_4cc, TypeTag::Bytes, {}));
    EXPECT_EQ(out.GetBytes(), expected);

    const InSerialiser in(out.GetBytes());
    ASSERT_TRUE(in.IsValid());
    unsigned char back[3] = {};
    EXPECT_TRUE(in.LoadTypeI("raw "_4cc, TypeTag(999), back, 3));
    EXPECT_EQ(std::memcmp(back, payload, 3), 0);
    EXPECT_TRUE(in.LoadTypeI("none"_4cc, TypeTag::Bytes, nullptr, 0));
}

// ---- Round trips ----

TEST(Serialiser, RoundTripOfEveryValueType) {
    const long live = Countable::GetLiveObjectCount();
    {
        const Counted<Sample> original = MakeRichSample();
        const Bytes bytes = SerialiseObject(*original);
        FileStore store;
        const Counted<Sample> loaded = Deserialise(bytes, store);
        ASSERT_TRUE(loaded);
        ExpectSameFields(*original, *loaded);
        EXPECT_EQ(loaded->loadedVersion, Sample::kVersion);
        EXPECT_EQ(loaded->loadedStore, &store);

        const auto child = CountedCast<Sample>(loaded->child);
        ASSERT_TRUE(child);
        ExpectSameFields(*CountedCast<Sample>(original->child), *child);
        const auto tiny = CountedCast<Tiny>(child->child);
        ASSERT_TRUE(tiny);
        EXPECT_EQ(tiny->value, 0.125);

        // Saving what was loaded gives the same bytes.
        EXPECT_EQ(SerialiseObject(*loaded), bytes);
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Serialiser, RoundTripOfSpecialValues) {
    const double specials[] = {0.0,
                               -0.0,
                               std::numeric_limits<double>::infinity(),
                               -std::numeric_limits<double>::infinity(),
                               std::numeric_limits<double>::denorm_min(),
                               std::numeric_limits<double>::max(),
                               std::numeric_limits<double>::lowest(),
                               std::bit_cast<double>(0x7FF8000000000123ull)}; // a NaN with a payload
    for (double value : specials) {
        Sample sample;
        sample.amount = value;
        sample.weights = {value, -value};
        sample.origin = {value, value};
        FileStore store;
        const auto loaded = Deserialise(SerialiseObject(sample), store);
        ASSERT_TRUE(loaded);
        EXPECT_EQ(std::bit_cast<std::uint64_t>(loaded->amount), std::bit_cast<std::uint64_t>(value));
        EXPECT_EQ(std::bit_cast<std::uint64_t>(loaded->weights[1]), std::bit_cast<std::uint64_t>(-value));
        EXPECT_EQ(std::bit_cast<std::uint64_t>(loaded->origin.y), std::bit_cast<std::uint64_t>(value));
    }
    for (std::int32_t value :
         {0, 1, -1, std::numeric_limits<std::int32_t>::max(), std::numeric_limits<std::int32_t>::min()}) {
        Sample sample;
        sample.count = value;
        sample.mask = std::uint32_t(value);
        FileStore store;
        const auto loaded = Deserialise(SerialiseObject(sample), store);
        ASSERT_TRUE(loaded);
        EXPECT_EQ(loaded->count, value);
        EXPECT_EQ(loaded->mask, std::uint32_t(value));
    }
    // Strings: empty, embedded NUL, long.
    for (const std::string& text : {std::string(), std::string("a\0b", 3), std::string(100000, 'x')}) {
        Sample sample;
        sample.name = text;
        FileStore store;
        const auto loaded = Deserialise(SerialiseObject(sample), store);
        ASSERT_TRUE(loaded);
        EXPECT_EQ(loaded->name, text);
    }
}

TEST(Serialiser, RoundTripOfArrays) {
    Sample sample;
    sample.weights.clear();
    sample.path.clear();
    sample.data.clear();
    FileStore store;
    auto loaded = Deserialise(SerialiseObject(sample), store);
    ASSERT_TRUE(loaded);
    EXPECT_TRUE(loaded->weights.empty()); // an empty array replaces the constructor's values
    EXPECT_TRUE(loaded->path.empty());
    EXPECT_TRUE(loaded->data.empty());

    for (int i = 0; i < 10000; ++i) {
        sample.weights.push_back(i * 0.5);
        sample.path.push_back({double(i), -double(i)});
        sample.data.push_back(std::byte(i * 7));
    }
    loaded = Deserialise(SerialiseObject(sample), store);
    ASSERT_TRUE(loaded);
    ExpectSameFields(sample, *loaded);
}

TEST(Serialiser, RoundTripOfNestedObjects) {
    // A chain of samples, each with its own name.
    Counted<Sample> top = MakeCounted<Sample>();
    Sample* last = top.Get();
    for (int i = 1; i < 10; ++i) {
        auto next = MakeCounted<Sample>();
        next->count = i;
        next->name = "level " + std::to_string(i);
        last->child = next;
        last = next.Get();
    }
    FileStore store;
    const auto loaded = Deserialise(SerialiseObject(*top), store);
    ASSERT_TRUE(loaded);
    const Sample* node = loaded.Get();
    for (int i = 1; i < 10; ++i) {
        node = dynamic_cast<const Sample*>(node->child.Get());
        ASSERT_NE(node, nullptr);
        EXPECT_EQ(node->count, i);
        EXPECT_EQ(node->name, "level " + std::to_string(i));
        EXPECT_EQ(node->loadedStore, &store);
    }
    EXPECT_FALSE(node->child);
}

TEST(Serialiser, LoadObjectThroughAnInSerialiser) {
    OutSerialiser out;
    Tiny tiny;
    tiny.value = -8.0;
    out.SaveObject("kid "_4cc, tiny);
    out.SaveType("nota"_4cc, 1.0);
    const InSerialiser in(out.GetBytes());
    ASSERT_TRUE(in.IsValid());
    FileStore store;
    const auto loaded = CountedCast<Tiny>(in.LoadObject("kid "_4cc, store));
    ASSERT_TRUE(loaded);
    EXPECT_EQ(loaded->value, -8.0);
    EXPECT_FALSE(in.LoadObject("nota"_4cc, store)); // not an object
    EXPECT_FALSE(in.LoadObject("none"_4cc, store)); // absent
}

// ---- Missing, mistyped and repeated values ----

TEST(Serialiser, MissingPropertyKeepsTheField) {
    Sample saved;
    saved.saveBits = Sample::SaveAmount | Sample::SaveName;
    saved.amount = 1.0;
    saved.name = "saved";
    saved.count = 100;

    FileStore store;
    const auto loaded = Deserialise(SerialiseObject(saved), store);
    ASSERT_TRUE(loaded);
    EXPECT_EQ(loaded->amount, 1.0);
    EXPECT_EQ(loaded->name, "saved");
    const Sample fresh;
    EXPECT_EQ(loaded->count, fresh.count); // not in the stream: the constructor's value
    EXPECT_EQ(loaded->mask, fresh.mask);
    EXPECT_EQ(loaded->origin, fresh.origin);
    EXPECT_EQ(loaded->weights, fresh.weights);

    // Loading into an object that already has values changes only what the stream holds.
    OutSerialiser out;
    saved.Save(out);
    Sample target;
    target.count = 55;
    target.weights = {1, 2, 3};
    const InSerialiser in(out.GetBytes());
    ASSERT_TRUE(target.Load(in, store, 1));
    EXPECT_EQ(target.count, 55);
    EXPECT_EQ((target.weights), (std::vector<double>{1, 2, 3}));
    EXPECT_EQ(target.name, "saved");

    double untouched = 3.0;
    EXPECT_FALSE(in.LoadType("none"_4cc, untouched));
    EXPECT_EQ(untouched, 3.0);
    EXPECT_FALSE(in.Has("none"_4cc));
    EXPECT_TRUE(in.Has(kName));
}

TEST(Serialiser, WrongTagOrSizeIsRefusedAndLeavesTheField) {
    OutSerialiser out;
    const unsigned char four[4] = {1, 2, 3, 4};
    const unsigned char sixteen[16] = {};
    const unsigned char two = 2;
    out.SaveTypeI("dbl4"_4cc, TypeTag::Double, four, 4);   // a double of 4 bytes
    out.SaveType("asdb"_4cc, 1.5);                         // a double where other types are asked for
    out.SaveTypeI("bool"_4cc, TypeTag::Bool, &two, 1);     // a bool byte other than 0 or 1
    out.SaveTypeI("bol2"_4cc, TypeTag::Bool, four, 2);     // a bool of 2 bytes
    out.SaveTypeI("pnt8"_4cc, TypeTag::Point, sixteen, 8); // a point of 8 bytes
    out.SaveTypeI("i32w"_4cc, TypeTag::UInt32, four, 4);   // unsigned where signed is asked for
    out.SaveTypeI("i32s"_4cc, TypeTag::Int32, four, 3);    // an int of 3 bytes
    out.SaveTypeI("strb"_4cc, TypeTag::Bytes, four, 4);    // bytes where a string is asked for
    const double doubles[] = {1.0, 2.0};
    out.SaveArray("arrd"_4cc, doubles);

    const InSerialiser in(out.GetBytes());
    ASSERT_TRUE(in.IsValid());

    double d = 7.0;
    EXPECT_FALSE(in.LoadType("dbl4"_4cc, d));
    EXPECT_EQ(d, 7.0);
    EXPECT_TRUE(in.LoadType("asdb"_4cc, d));
    EXPECT_EQ(d, 1.5);

    bool b = true;
    EXPECT_FALSE(in.LoadType("bool"_4cc, b));
    EXPECT_FALSE(in.LoadType("bol2"_4cc, b));
    EXPECT_FALSE(in.LoadType("asdb"_4cc, b));
    EXPECT_TRUE(b);

    std::int32_t i = 42;
    EXPECT_FALSE(in.LoadType("asdb"_4cc, i));
    EXPECT_FALSE(in.LoadType("i32w"_4cc, i));
    EXPECT_FALSE(in.LoadType("i32s"_4cc, i));
    EXPECT_EQ(i, 42);

    std::uint32_t u = 43;
    EXPECT_FALSE(in.LoadType("asdb"_4cc, u));
    EXPECT_EQ(u, 43u);
    EXPECT_TRUE(in.LoadType("i32w"_4cc, u));
    EXPECT_EQ(u, 0x04030201u);

    PointT<double> p{5, 6};
    EXPECT_FALSE(in.LoadType("pnt8"_4cc, p));
    EXPECT_FALSE(in.LoadType("asdb"_4cc, p));
    EXPECT_EQ(p, (PointT<double>{5, 6}));

    std::string s = "keep";
    EXPECT_FALSE(in.LoadType("strb"_4cc, s));
    EXPECT_FALSE(in.LoadType("asdb"_4cc, s));
    EXPECT_EQ(s, "keep");

    // LoadTypeI: tag and size must both match; the destination is untouched otherwise.
    unsigned char buffer[8];
    std::memset(buffer, 0xAA, sizeof buffer);
    EXPECT_FALSE(in.LoadTypeI("asdb"_4cc, TypeTag::Double, buffer, 4));
    EXPECT_FALSE(in.LoadTypeI("asdb"_4cc, TypeTag::Int32, buffer, 8));
    for (unsigned char c : buffer)
        EXPECT_EQ(c, 0xAA);

    // Arrays: the element tag must match.
    std::vector<double> dv{9};
    std::vector<PointT<double>> pv{{9, 9}};
    std::vector<std::byte> bv{std::byte{9}};
    EXPECT_FALSE(in.LoadArray("arrd"_4cc, pv));
    EXPECT_FALSE(in.LoadArray("arrd"_4cc, bv));
    EXPECT_FALSE(in.LoadArray("asdb"_4cc, dv));
    EXPECT_EQ(dv, std::vector<double>{9});
    EXPECT_EQ(pv.size(), 1u);
    EXPECT_EQ(bv.size(), 1u);
    EXPECT_TRUE(in.LoadArray("arrd"_4cc, dv));
    EXPECT_EQ(dv, (std::vector<double>{1, 2}));
}

TEST(Serialiser, FirstRecordWithACodeWins) {
    OutSerialiser out;
    out.SaveType("dup "_4cc, 1.0);
    out.SaveType("dup "_4cc, 2.0);
    out.SaveType("dup2"_4cc, std::int32_t(3)); // the first has another type than asked for: no fallback
    out.SaveType("dup2"_4cc, 4.0);
    const InSerialiser in(out.GetBytes());
    double d = 0;
    EXPECT_TRUE(in.LoadType("dup "_4cc, d));
    EXPECT_EQ(d, 1.0);
    EXPECT_FALSE(in.LoadType("dup2"_4cc, d));
    EXPECT_EQ(d, 1.0);
}

TEST(Serialiser, UnknownTagsAreSkipped) {
    Sample sample;
    sample.amount = 6.0;
    sample.saveExtra = [](OutSerialiser& out) {
        const unsigned char junk[5] = {1, 2, 3, 4, 5};
        out.SaveTypeI("new "_4cc, TypeTag(777), junk, 5); // a record of a later version
    };
    FileStore store;
    const auto loaded = Deserialise(SerialiseObject(sample), store);
    ASSERT_TRUE(loaded);
    EXPECT_EQ(loaded->amount, 6.0);
}

// ---- Malformed streams ----

TEST(Serialiser, InvalidStreamLoadsNothing) {
    OutSerialiser out;
    out.SaveType("dbl "_4cc, 1.0);
    out.SaveType("str "_4cc, std::string_view("text"));
    const double doubles[] = {1.0};
    out.SaveArray("arr "_4cc, doubles);
    out.SaveObject("obj "_4cc, Tiny());
    Bytes bytes = out.GetBytes();
    bytes.pop_back(); // the last record no longer fits

    const InSerialiser in(bytes);
    EXPECT_FALSE(in.IsValid());
    EXPECT_FALSE(in.Has("dbl "_4cc));
    double d = 5;
    std::string s = "keep";
    std::vector<double> v{5};
    FileStore store;
    EXPECT_FALSE(in.LoadType("dbl "_4cc, d));
    EXPECT_FALSE(in.LoadType("str "_4cc, s));
    EXPECT_FALSE(in.LoadArray("arr "_4cc, v));
    EXPECT_FALSE(in.LoadObject("obj "_4cc, store));
    EXPECT_FALSE(in.LoadTypeI("dbl "_4cc, TypeTag::Double, &d, 8));
    EXPECT_EQ(d, 5);
    EXPECT_EQ(s, "keep");
    EXPECT_EQ(v, std::vector<double>{5});

    EXPECT_TRUE(InSerialiser(std::span<const std::byte>()).IsValid()); // empty is valid: no records
}

TEST(Serialiser, TruncatedAtEveryLengthIsRefused) {
    const long live = Countable::GetLiveObjectCount();
    const Bytes bytes = SerialiseObject(*MakeRichSample());
    ASSERT_GT(bytes.size(), 200u);
    FileStore store;
    for (std::size_t length = 0; length < bytes.size(); ++length) {
        const Bytes truncated(bytes.begin(), bytes.begin() + std::ptrdiff_t(length));
        EXPECT_FALSE(DeserialiseObject(truncated, store)) << length;
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
    EXPECT_TRUE(DeserialiseObject(bytes, store));
}

TEST(Serialiser, TruncatedBodyIsValidOnlyAtRecordBoundaries) {
    const Bytes block = SerialiseObject(*MakeRichSample());
    const Bytes body(block.begin() + 10, block.end());
    const auto boundaries = RecordBoundaries(body);
    FileStore store;
    for (std::size_t length = 0; length <= body.size(); ++length) {
        const Bytes part(body.begin(), body.begin() + std::ptrdiff_t(length));
        const bool atBoundary = std::find(boundaries.begin(), boundaries.end(), length) != boundaries.end();
        EXPECT_EQ(InSerialiser(part).IsValid(), atBoundary) << length;
        // The same through DeserialiseObject, with the size field telling the truth about the shorter body.
        EXPECT_EQ(bool(DeserialiseObject(Block(Sample::kClassCode, 1, part), store)), atBoundary) << length;
    }
}

TEST(Serialiser, TrailingGarbageIsRefused) {
    Bytes bytes = SerialiseObject(Tiny());
    FileStore store;
    ASSERT_TRUE(DeserialiseObject(bytes, store));
    bytes.push_back(std::byte{0});
    EXPECT_FALSE(DeserialiseObject(bytes, store));

    // A body size smaller than what follows is trailing garbage too.
    Bytes shorter = SerialiseObject(Tiny());
    shorter[6] = std::byte(std::to_integer<int>(shorter[6]) - 11); // drop the Flag record from the count
    EXPECT_FALSE(DeserialiseObject(shorter, store));
}

TEST(Serialiser, OversizedSizeFieldsAreRefusedWithoutAllocating) {
    const long live = Countable::GetLiveObjectCount();
    const Bytes doubleRecord = Record("dbl "_4cc, TypeTag::Double, Hex({0, 0, 0, 0, 0, 0, 0, 0}));

    std::vector<Bytes> inputs;
    // The block's body size.
    Bytes block = Block(Sample::kClassCode, 1, doubleRecord);
    block[6] = block[7] = block[8] = block[9] = std::byte{0xFF};
    inputs.push_back(block);
    // A record's size.
    inputs.push_back(Block(Sample::kClassCode, 1, Record(kName, 20, 0xFFFFFFFFu, Hex({'a', 'b'}))));
    inputs.push_back(Block(Sample::kClassCode, 1, Record(kName, 20, 0x7FFFFFFFu, Hex({'a', 'b'}))));
    // A nested object record larger than the space left.
    inputs.push_back(
        Block(Sample::kClassCode, 1,
              Record(kChild, 40, 0xFFFFFFF0u, ObjectPayload(Tiny::kClassCode, 3, doubleRecord))));
    // A record inside a nested object larger than the object.
    {
        Bytes inner = Record("dbl "_4cc, 10, 0xFFFFFFFFu, Hex({0, 0, 0, 0, 0, 0, 0, 0}));
        inputs.push_back(Block(Sample::kClassCode, 1,
                               Record(kChild, TypeTag::Object, ObjectPayload(Sample::kClassCode, 1, inner))));
    }
    // Array counts: huge, overflowing 32 bits when multiplied (0x10000000 * 16 = 2^32), one too many,
    // one too few, an element tag without a fixed size, no room for the count.
    inputs.push_back(Block(Sample::kClassCode, 1,
                           Record(kWeights, TypeTag::Array, ArrayPayload(0xFFFFFFFFu, TypeTag::Double, {}))));
    inputs.push_back(Block(Sample::kClassCode, 1,
                           Record(kPath, TypeTag::Array, ArrayPayload(0x10000000u, TypeTag::Point, {}))));
    inputs.push_back(
        Block(Sample::kClassCode, 1,
              Record(kData, TypeTag::Array, ArrayPayload(0x80000000u, TypeTag::Byte, Hex({1})))));
    inputs.push_back(Block(Sample::kClassCode, 1,
                           Record(kData, TypeTag::Array, ArrayPayload(3, TypeTag::Byte, Hex({1, 2})))));
    inputs.push_back(Block(Sample::kClassCode, 1,
                           Record(kData, TypeTag::Array, ArrayPayload(1, TypeTag::Byte, Hex({1, 2})))));
    inputs.push_back(Block(Sample::kClassCode, 1,
                           Record(kName, TypeTag::Array, ArrayPayload(1, TypeTag::String, Hex({'a'})))));
    inputs.push_back(Block(Sample::kClassCode, 1, Record(kData, TypeTag::Array, Hex({0, 0, 0, 0, 1}))));
    // An object payload without room for its class code and version.
    inputs.push_back(
        Block(Sample::kClassCode, 1, Record(kChild, TypeTag::Object, Hex({'y', 'n', 'i', 'T', 3}))));

    std::vector<bool> results;
    std::size_t largest = 0;
    {
        AllocationScope scope;
        FileStore store;
        for (const Bytes& input : inputs) {
            results.push_back(bool(DeserialiseObject(input, store)));
            // The body on its own too (except the first's, whose fault is in the block header).
            if (&input != &inputs.front())
                results.push_back(InSerialiser(std::span(input).subspan(10)).IsValid());
        }
        largest = scope.GetLargestRequest();
    }
    for (std::size_t i = 0; i < results.size(); ++i)
        EXPECT_FALSE(results[i]) << "check " << i;
    EXPECT_LT(largest, 1024u) << "an allocation larger than the inputs imply";
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Serialiser, LoadAllocatesNoMoreThanTheInputImplies) {
    Sample sample;
    sample.weights.assign(1000, 1.0);
    const Bytes bytes = SerialiseObject(sample);
    std::size_t largest = 0;
    {
        AllocationScope scope;
        FileStore store;
        EXPECT_TRUE(DeserialiseObject(bytes, store));
        largest = scope.GetLargestRequest();
    }
    EXPECT_GE(largest, 1000 * sizeof(double)); // the tracker sees the array being loaded
    EXPECT_LE(largest, bytes.size());
}

Bytes NestedChain(int levels) {
    // levels samples, each the child of the one before.
    Counted<Sample> top = MakeCounted<Sample>();
    Sample* last = top.Get();
    for (int i = 1; i < levels; ++i) {
        auto next = MakeCounted<Sample>();
        next->saveBits = 0;
        last->child = next;
        last = next.Get();
    }
    return SerialiseObject(*top);
}

TEST(Serialiser, NestingDeeperThanTheLimitIsRefused) {
    const long live = Countable::GetLiveObjectCount();
    FileStore store;
    // The top object's records are at depth 0, its child's at 1, ...: kMaxDepth + 1 objects in all.
    EXPECT_TRUE(DeserialiseObject(NestedChain(InSerialiser::kMaxDepth + 1), store));
    EXPECT_FALSE(DeserialiseObject(NestedChain(InSerialiser::kMaxDepth + 2), store));
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);

    const Bytes body = NestedChain(InSerialiser::kMaxDepth + 1);
    const std::span records = std::span(body).subspan(10);
    EXPECT_TRUE(InSerialiser(records, 0).IsValid());
    EXPECT_FALSE(InSerialiser(records, 1).IsValid());
    EXPECT_TRUE(InSerialiser(std::span<const std::byte>(), InSerialiser::kMaxDepth).IsValid());
    EXPECT_FALSE(InSerialiser(std::span<const std::byte>(), InSerialiser::kMaxDepth + 1).IsValid());
    EXPECT_FALSE(InSerialiser(std::span<const std::byte>(), -1).IsValid());
}

TEST(Serialiser, VeryDeepNestingIsRefusedWithoutExhaustingTheStack) {
    // 200000 nested object records, written front to back (each level adds a 10-byte header and a 6-byte
    // prefix), far more than any recursion could take.
    constexpr std::uint32_t kLevels = 200000;
    Bytes body;
    body.reserve(std::size_t(kLevels) * 16);
    for (std::uint32_t i = 0; i < kLevels; ++i) {
        PutU32(body, kChild);
        PutU16(body, std::uint16_t(TypeTag::Object));
        PutU32(body, 6 + 16 * (kLevels - 1 - i));
        PutU32(body, Sample::kClassCode);
        PutU16(body, 1);
    }
    EXPECT_FALSE(InSerialiser(body).IsValid());
    FileStore store;
    EXPECT_FALSE(DeserialiseObject(Block(Sample::kClassCode, 1, body), store));
}

TEST(Serialiser, UnknownClassCodeIsRefused) {
    const long live = Countable::GetLiveObjectCount();
    FileStore store;
    Bytes bytes = SerialiseObject(Tiny());
    bytes[0] = std::byte{'X'}; // "TinX"
    EXPECT_FALSE(DeserialiseObject(bytes, store));

    // Code 0 (an abstract base) is never registered.
    Bytes zero = SerialiseObject(Tiny());
    zero[0] = zero[1] = zero[2] = zero[3] = std::byte{0};
    EXPECT_FALSE(DeserialiseObject(zero, store));

    // A nested object of an unknown class: LoadObject gives null, and Sample then fails.
    const Bytes nested =
        Block(Sample::kClassCode, 1, Record(kChild, TypeTag::Object, ObjectPayload("Nope"_4cc, 1, {})));
    EXPECT_FALSE(DeserialiseObject(nested, store));
    const InSerialiser in{std::span(nested).subspan(10)};
    ASSERT_TRUE(in.IsValid());
    EXPECT_FALSE(in.LoadObject(kChild, store));

    // A class that has no factory.
    EXPECT_FALSE(DeserialiseObject(Block("Circ"_4cc, 1, {}), store));
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Serialiser, FailingLoadIsRefused) {
    const long live = Countable::GetLiveObjectCount();
    {
        Sample sample;
        sample.saveExtra = [](OutSerialiser& out) { out.SaveType(kFail, true); };
        FileStore store;
        EXPECT_FALSE(DeserialiseObject(SerialiseObject(sample), store));

        // The failure of a nested object fails its parent.
        Sample parent;
        parent.child = MakeCounted<Sample>(sample);
        EXPECT_FALSE(DeserialiseObject(SerialiseObject(parent), store));
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Serialiser, ThrowingSaveLeavesNoPartialRecord) {
    OutSerialiser out;
    out.SaveType("one "_4cc, 1.0);
    const Bytes before = out.GetBytes();
    Sample thrower;
    thrower.saveExtra = [](OutSerialiser&) { throw std::runtime_error("disk full"); };
    EXPECT_THROW(out.SaveObject(kChild, thrower), std::runtime_error);
    EXPECT_EQ(out.GetBytes(), before);
    EXPECT_THROW(SerialiseObject(thrower), std::runtime_error);
}

TEST(Serialiser, MutatedStreamsNeverCrash) {
    const long live = Countable::GetLiveObjectCount();
    const Bytes original = SerialiseObject(*MakeRichSample());
    std::mt19937 random(12345);
    FileStore store;
    int loaded = 0;
    for (int iteration = 0; iteration < 20000; ++iteration) {
        Bytes bytes = original;
        const int changes = 1 + int(random() % 4);
        for (int c = 0; c < changes; ++c) {
            const std::size_t at = random() % bytes.size();
            switch (random() % 3) {
            case 0:
                bytes[at] = std::byte(random() & 0xFF);
                break;
            case 1:
                bytes[at] ^= std::byte(1u << (random() % 8));
                break;
            default:
                bytes[at] = std::byte{0xFF};
                break;
            }
        }
        if (auto object = DeserialiseObject(bytes, store)) {
            ++loaded;
            // Whatever loads saves and loads again.
            EXPECT_TRUE(DeserialiseObject(SerialiseObject(*object), store));
        }
    }
    EXPECT_GT(loaded, 0); // some changes only touch values
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

// ---- FileStore ----

TEST(FileStore, AddsAndReturnsBlocks) {
    FileStore store;
    EXPECT_EQ(store.GetBlockCount(), 0u);
    EXPECT_TRUE(store.GetBlock(0).empty());
    EXPECT_EQ(store.AddBlock(Hex({1, 2, 3})), 0u);
    EXPECT_EQ(store.AddBlock({}), 1u);
    EXPECT_EQ(store.AddBlock(Hex({4})), 2u);
    EXPECT_EQ(store.GetBlockCount(), 3u);
    const auto first = store.GetBlock(0);
    EXPECT_EQ(Bytes(first.begin(), first.end()), Hex({1, 2, 3}));
    EXPECT_TRUE(store.GetBlock(1).empty());
    EXPECT_EQ(store.GetBlock(2).size(), 1u);
    EXPECT_TRUE(store.GetBlock(3).empty());
    EXPECT_TRUE(store.GetBlock(0xFFFFFFFFu).empty());
}
