// libFuzzer target for Kernel::DeserialiseObject.
//
// Whatever the bytes, deserialising must not crash, read out of bounds, allocate more than the input
// implies, or leave objects alive; and an object that does load must save to bytes that load again and
// save to the very same bytes.
//
// Build (the lead wires it into CMake): clang++ -std=c++20 -fsanitize=fuzzer,address,undefined -I<root>
//   fuzz/kernel_deserialise_fuzzer.cpp host/kernel/{Kernel,ClassProperties,Serialiser}.cpp
// (or link HostKernel built with the same sanitizers). A useful seed is any SerialiseObject output of
// the classes below; the fuzzer finds the format quickly from nothing, too.

#include "host/kernel/ClassProperties.h"
#include "host/kernel/Serialiser.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>
#include <vector>

namespace {

using namespace Kernel;

// A node with a property of every kind and two children, so that every loader and nested objects are
// reached. Its Save is a pure function of its fields, which the round-trip check relies on.
class FuzzNode : public Serialisable {
public:
    static const ClassProperties s_Properties;

    bool flag = false;
    double amount = 0.0;
    std::int32_t count = 0;
    std::uint32_t mask = 0;
    PointT<double> origin{};
    std::string name;
    std::vector<double> weights;
    std::vector<PointT<double>> path;
    std::vector<std::byte> data;
    std::vector<std::byte> raw; // a 'Bytes' record loaded through LoadTypeI when it is 8 bytes long
    Counted<Serialisable> first;
    Counted<Serialisable> second;

    void Save(OutSerialiser& out) const override {
        out.SaveType(MakeFourCC("Flag"), flag);
        out.SaveType(MakeFourCC("Amnt"), amount);
        out.SaveType(MakeFourCC("Cont"), count);
        out.SaveType(MakeFourCC("Mask"), mask);
        out.SaveType(MakeFourCC("Orig"), origin);
        out.SaveType(MakeFourCC("Name"), std::string_view(name));
        out.SaveArray(MakeFourCC("Wght"), std::span<const double>(weights));
        out.SaveArray(MakeFourCC("Path"), std::span<const PointT<double>>(path));
        out.SaveArray(MakeFourCC("Data"), std::span<const std::byte>(data));
        if (!raw.empty())
            out.SaveTypeI(MakeFourCC("Raw "), TypeTag::Bytes, raw.data(), std::uint32_t(raw.size()));
        if (first) out.SaveObject(MakeFourCC("Fst "), *first);
        if (second) out.SaveObject(MakeFourCC("Snd "), *second);
    }

    bool Load(const InSerialiser& in, FileStore& store, unsigned short version) override {
        in.LoadType(MakeFourCC("Flag"), flag);
        in.LoadType(MakeFourCC("Amnt"), amount);
        in.LoadType(MakeFourCC("Cont"), count);
        in.LoadType(MakeFourCC("Mask"), mask);
        in.LoadType(MakeFourCC("Orig"), origin);
        in.LoadType(MakeFourCC("Name"), name);
        in.LoadArray(MakeFourCC("Wght"), weights);
        in.LoadArray(MakeFourCC("Path"), path);
        in.LoadArray(MakeFourCC("Data"), data);
        std::byte eight[8];
        if (in.LoadTypeI(MakeFourCC("Raw "), TypeTag::Bytes, eight, sizeof eight))
            raw.assign(eight, eight + 8);
        // A child that is present but does not load fails the node; an absent one is fine.
        if (in.Has(MakeFourCC("Fst ")) && !(first = in.LoadObject(MakeFourCC("Fst "), store))) return false;
        if (in.Has(MakeFourCC("Snd ")) && !(second = in.LoadObject(MakeFourCC("Snd "), store))) return false;
        // Versions from the future are refused, as a real class would.
        return version <= s_Properties.GetVersion();
    }

    const ClassProperties& GetObjectClassProperties() const override { return s_Properties; }
};

// A leaf that insists on its one property.
class FuzzLeaf : public Serialisable {
public:
    static const ClassProperties s_Properties;
    double value = 0.0;

    void Save(OutSerialiser& out) const override { out.SaveType(MakeFourCC("Valu"), value); }
    bool Load(const InSerialiser& in, FileStore&, unsigned short) override {
        return in.LoadType(MakeFourCC("Valu"), value);
    }
    const ClassProperties& GetObjectClassProperties() const override { return s_Properties; }
};

const ClassProperties FuzzNode::s_Properties(
    MakeFourCC("FzNd"), [] { return Counted<Serialisable>(MakeCounted<FuzzNode>()); }, 2, nullptr, nullptr);
const ClassProperties FuzzLeaf::s_Properties(
    MakeFourCC("FzLf"), [] { return Counted<Serialisable>(MakeCounted<FuzzLeaf>()); }, 1, nullptr, nullptr);

[[noreturn]] void Fail() {
    std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const long live = Countable::GetLiveObjectCount();
    {
        const std::span<const std::byte> bytes(reinterpret_cast<const std::byte*>(data), size);
        FileStore store;
        const Counted<Serialisable> object = DeserialiseObject(bytes, store);

        // The same bytes, seen as a bare record list, must validate without trouble either way.
        const InSerialiser records(bytes);
        if (records.IsValid()) {
            for (FourCC code :
                 {MakeFourCC("Flag"), MakeFourCC("Name"), MakeFourCC("Wght"), MakeFourCC("Fst ")}) {
                std::string text;
                std::vector<double> values;
                records.LoadType(code, text);
                records.LoadArray(code, values);
                records.LoadObject(code, store);
            }
        }

        if (object) {
            const std::vector<std::byte> saved = SerialiseObject(*object);
            const Counted<Serialisable> again = DeserialiseObject(saved, store);
            if (!again) Fail();
            if (SerialiseObject(*again) != saved) Fail();
        }
    }
    if (Countable::GetLiveObjectCount() != live) Fail();
    return 0;
}
