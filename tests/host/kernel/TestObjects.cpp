#include "TestObjects.h"

namespace KernelTests {

using namespace Kernel;

const ClassProperties Sample::s_Properties(
    Sample::kClassCode, [] { return Counted<Serialisable>(MakeCounted<Sample>()); }, Sample::kVersion,
    nullptr, nullptr);

void Sample::Save(OutSerialiser& out) const {
    if (saveBits & SaveFlag) out.SaveType(kFlag, flag);
    if (saveBits & SaveAmount) out.SaveType(kAmount, amount);
    if (saveBits & SaveCount) out.SaveType(kCount, count);
    if (saveBits & SaveMask) out.SaveType(kMask, mask);
    if (saveBits & SaveOrigin) out.SaveType(kOrigin, origin);
    if (saveBits & SaveName) out.SaveType(kName, std::string_view(name));
    if (saveBits & SaveWeights) out.SaveArray(kWeights, std::span<const double>(weights));
    if (saveBits & SavePath) out.SaveArray(kPath, std::span<const PointT<double>>(path));
    if (saveBits & SaveData) out.SaveArray(kData, std::span<const std::byte>(data));
    if (child) out.SaveObject(kChild, *child);
    if (saveExtra) saveExtra(out);
}

bool Sample::Load(const InSerialiser& in, FileStore& store, unsigned short version) {
    loadedVersion = version;
    loadedStore = &store;
    in.LoadType(kFlag, flag);
    in.LoadType(kAmount, amount);
    in.LoadType(kCount, count);
    in.LoadType(kMask, mask);
    in.LoadType(kOrigin, origin);
    in.LoadType(kName, name);
    in.LoadArray(kWeights, weights);
    in.LoadArray(kPath, path);
    in.LoadArray(kData, data);
    if (in.Has(kChild)) {
        child = in.LoadObject(kChild, store);
        if (!child) return false;
    }
    return !in.Has(kFail);
}

const ClassProperties Tiny::s_Properties(
    Tiny::kClassCode, [] { return Counted<Serialisable>(MakeCounted<Tiny>()); }, 3, nullptr, nullptr);

void Tiny::Save(OutSerialiser& out) const {
    out.SaveType(MakeFourCC("Inte"), value);
    out.SaveType(MakeFourCC("Flag"), flag);
}

bool Tiny::Load(const InSerialiser& in, FileStore&, unsigned short) {
    return in.LoadType(MakeFourCC("Inte"), value) && in.LoadType(MakeFourCC("Flag"), flag);
}

const ClassProperties Hierarchy::s_Abstract(0, nullptr, 1, nullptr, nullptr);
const ClassProperties Hierarchy::s_Shape(MakeFourCC("Shap"), nullptr, 1, nullptr, &Hierarchy::s_Abstract);
const ClassProperties Hierarchy::s_Circle(MakeFourCC("Circ"), nullptr, 2, nullptr, &Hierarchy::s_Shape);

} // namespace KernelTests
