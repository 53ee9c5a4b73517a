#pragma once
// Serialisable classes registered for the kernel tests.

#include "host/kernel/ClassProperties.h"
#include "host/kernel/Serialiser.h"

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace KernelTests {

using Kernel::FourCC;
using Kernel::MakeFourCC;

// Codes of Sample's properties.
inline constexpr FourCC kFlag = MakeFourCC("Flag");
inline constexpr FourCC kAmount = MakeFourCC("Amnt");
inline constexpr FourCC kCount = MakeFourCC("Cont");
inline constexpr FourCC kMask = MakeFourCC("Mask");
inline constexpr FourCC kOrigin = MakeFourCC("Orig");
inline constexpr FourCC kName = MakeFourCC("Name");
inline constexpr FourCC kWeights = MakeFourCC("Wght");
inline constexpr FourCC kPath = MakeFourCC("Path");
inline constexpr FourCC kData = MakeFourCC("Data");
inline constexpr FourCC kChild = MakeFourCC("Chld");
inline constexpr FourCC kFail = MakeFourCC("Fail");

// A class with one property of every kind. Fields missing from a stream keep their values, so the
// constructor's values are recognisable sentinels.
class Sample : public Kernel::Serialisable {
public:
    static constexpr FourCC kClassCode = MakeFourCC("Smpl");
    static constexpr unsigned short kVersion = 4;
    static const Kernel::ClassProperties s_Properties;

    enum SaveBits : unsigned {
        SaveFlag = 1u << 0,
        SaveAmount = 1u << 1,
        SaveCount = 1u << 2,
        SaveMask = 1u << 3,
        SaveOrigin = 1u << 4,
        SaveName = 1u << 5,
        SaveWeights = 1u << 6,
        SavePath = 1u << 7,
        SaveData = 1u << 8,
        SaveAll = 0x1FFu,
    };

    bool flag = false;
    double amount = 7.5;
    std::int32_t count = -3;
    std::uint32_t mask = 0xDEADBEEF;
    Kernel::PointT<double> origin{-1.0, -2.0};
    std::string name = "default";
    std::vector<double> weights{9.0};
    std::vector<Kernel::PointT<double>> path{{9.0, 9.0}};
    std::vector<std::byte> data{std::byte{9}};
    Kernel::Counted<Kernel::Serialisable> child;

    unsigned saveBits = SaveAll;
    // Appended after the regular records (wrong tags, duplicates, a 'Fail' record...).
    std::function<void(Kernel::OutSerialiser&)> saveExtra;
    // What the last Load saw.
    unsigned short loadedVersion = 0;
    Kernel::FileStore* loadedStore = nullptr;

    void Save(Kernel::OutSerialiser& out) const override;
    // Fails when a child record is present but does not load, or when a 'Fail' record is present.
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return s_Properties; }
};

// The object of the hand-worked byte test: 'Inte' = 0.25 (Double), then 'Flag' = true (Bool).
class Tiny : public Kernel::Serialisable {
public:
    static constexpr FourCC kClassCode = MakeFourCC("Tiny");
    static const Kernel::ClassProperties s_Properties;

    double value = 0.25;
    bool flag = true;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return s_Properties; }
};

// A small hierarchy for the registry: an abstract base (code 0, not registered), a shape and a circle.
struct Hierarchy {
    static const Kernel::ClassProperties s_Abstract;
    static const Kernel::ClassProperties s_Shape;
    static const Kernel::ClassProperties s_Circle;
};

} // namespace KernelTests
