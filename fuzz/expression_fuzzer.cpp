// Feeds arbitrary text to the expression language: parse and compile, then every conversion, the kernel
// text and evaluation, single and over a span. No text may crash it or run away with the stack or memory,
// a refusal must say where, and a compiled program must evaluate.

#include "host/kernel/ExpressionParser.h"

#include <cstdint>
#include <cstdlib>
#include <string>

using Ep = Kernel::ExpressionParser;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) return 0;
    // The first byte picks the settings, the rest is the text.
    const std::uint8_t flags = data[0];
    const std::string text(reinterpret_cast<const char*>(data + 1), size - 1);

    static const Kernel::Counted<Ep::Constants> constants = [] {
        Kernel::Counted<Ep::Constants> table(new Ep::Constants);
        table->AddVolatile("x", 12.5);
        table->AddVolatile("y", -3.0);
        table->Add("w", 640.0);
        table->Add("h", 480.0);
        const double dir[] = {0.0, 0.6, 0.8};
        table->AddVector("dir", dir);
        const double wide[] = {1, 2, 3, 4, 5, 6};
        table->AddVector("wide", wide, true);
        return table;
    }();
    static const Ep::UnitConverter converter(300.0);

    Ep::ParseInfo parse(text, (flags & 1) ? &converter : nullptr, constants, (flags & 2) != 0);
    parse.SetUnitCategoryAllowed(Ep::PhysicalLengthUnits, (flags & 4) == 0);
    parse.SetUnitCategoryAllowed(Ep::PercentUnits, (flags & 8) == 0);
    parse.SetIgnoreUnitTypeCase((flags & 16) != 0);
    const auto code = parse.Compile();
    if (!code) {
        const auto& error = parse.GetError();
        if (!error || error.column < 1 || error.message.find("column") == std::string::npos) std::abort();
        (void)error.Report();
        return 0;
    }
    const int components = code->GetComponentCount();
    if (components < 1 || components > Ep::MaxComponents) std::abort();

    const auto info = Ep::ExecuteInfo::Create(constants);
    for (const int unitType : {int(Ep::UnitTypePixels), int(Ep::UnitTypeAngle), int(Ep::UnitTypeNumber), 0}) {
        const auto numeric = code->ConvertToNumeric(*info, unitType, (flags & 32) != 0);
        if (unitType == Ep::UnitTypeNumber && !numeric) std::abort();
        if (!numeric) continue;
        if (numeric->GetComponentCount() != components) std::abort();
        const std::string fragment = numeric->GetMetalFragment(*info, unitType);
        if (fragment.empty()) std::abort(); // every name in the table is fit for kernel text
    }
    const auto numeric = code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
    const auto threadInfo = info->CopyForThreadSession();
    auto session = Ep::ByteCode::Session::CreateForThread(numeric, threadInfo);
    if (!session) std::abort();
    Ep::Value value;
    if (!session->Execute(value) || value.components != components) std::abort();
    const auto x = threadInfo->GetThreadConstant(*constants->Find("x"));
    for (int i = 0; i < Ep::Lanes; ++i)
        x->GetLanes()[i] = static_cast<float>(i) * 7.25f - 100.0f;
    if (!session->ExecuteSpan(Ep::Lanes) || !session->ExecuteSpan(5)) std::abort();
    return 0;
}
