// Evaluation rate of the expression language over a 4096 × 4096 RGBA8 image: the bytecode on the processor
// with 1 and 2 threads (each thread its own session and constant copies, 32 pixels per instruction), and
// the kernel text on the OpenCL device. Reported as Mpix/s; bench/compare_expression.sh puts ImageMagick's
// -fx and a libvips chain beside it.
#include "host/kernel/ExpressionParser.h"
#include "host/raster/device/ExecuteKernel.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

namespace {

using Kernel::Counted;
using Ep = Kernel::ExpressionParser;

constexpr int Size = 4096;

// (a) one sine; (b) three components from about fifteen operations, one of them noise; (c) one division,
// which shows what a pixel costs besides its equation.
const char* const Expressions[] = {
    "sin(x / 20) * 0.5 + 0.5",
    "n = noise(x / 64, y / 64); r = hypot(x - w / 2, y - h / 2) / w; "
    "vec3(n * 0.5 + 0.5, fract(r * 8), (x + y) / (w + h) * (1 - abs(n)))",
    "x / w",
};

struct Compiled {
    Counted<Ep::Constants> constants{new Ep::Constants};
    Counted<Ep::Constant> x, y;
    Counted<Ep::ExecuteInfo> info;
    Counted<Ep::ByteCode> code;

    explicit Compiled(const char* text) {
        // EXPRESSION in the environment replaces (c), to time any other text.
        if (text == Expressions[2] && std::getenv("EXPRESSION")) text = std::getenv("EXPRESSION");
        x = constants->AddVolatile("x", 0.0);
        y = constants->AddVolatile("y", 0.0);
        constants->Add("w", Size);
        constants->Add("h", Size);
        Ep::ParseInfo parse(text, nullptr, constants, false);
        const auto compiled = parse.Compile();
        if (!compiled) {
            std::fprintf(stderr, "%s\n", parse.GetError().Report().c_str());
            std::abort();
        }
        info = Ep::ExecuteInfo::Create(constants);
        code = compiled->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
    }
};

std::string Name(std::int64_t index) {
    return index == 0 ? "(a) " : index == 1 ? "(b) " : "(c) ";
}

inline std::uint8_t ToByte(float v) {
    const float s = v * 255.0f;
    return static_cast<std::uint8_t>(s >= 255.0f ? 255.0f : s > 0.0f ? s : 0.0f);
}

// Rows first to last, every `step`-th row from `first`, written as RGBA8 (a scalar into R, G and B).
void RenderRows(const Compiled& compiled, int first, int step, std::vector<std::uint8_t>& image) {
    auto x = compiled.x->CopyForThreadSession();
    auto y = compiled.y->CopyForThreadSession();
    auto session =
        Ep::ByteCode::Session::CreateForThread(compiled.code, compiled.info->CopyForThreadSession({x, y}));
    const int components = compiled.code->GetComponentCount();
    float* xs = x->GetLanes();
    float* ys = y->GetLanes();
    for (int row = first; row < Size; row += step) {
        std::fill_n(ys, Ep::Lanes, static_cast<float>(row) + 0.5f);
        std::uint8_t* out = image.data() + std::size_t(row) * Size * 4;
        for (int start = 0; start < Size; start += Ep::Lanes) {
            for (int i = 0; i < Ep::Lanes; ++i)
                xs[i] = static_cast<float>(start + i) + 0.5f;
            session->ExecuteSpan(Ep::Lanes);
            const float* c0 = session->GetResultLanes(0);
            const float* c1 = session->GetResultLanes(components > 1 ? 1 : 0);
            const float* c2 = session->GetResultLanes(components > 2 ? 2 : 0);
            for (int i = 0; i < Ep::Lanes; ++i) {
                std::uint8_t* p = out + std::size_t(start + i) * 4;
                p[0] = ToByte(c0[i]);
                p[1] = ToByte(c1[i]);
                p[2] = ToByte(c2[i]);
                p[3] = 255;
            }
        }
    }
}

void Processor(benchmark::State& state) {
    const Compiled compiled(Expressions[state.range(0)]);
    const int threads = static_cast<int>(state.range(1));
    std::vector<std::uint8_t> image(std::size_t(Size) * Size * 4);
    for (auto _ : state) {
        std::vector<std::thread> workers;
        for (int t = 1; t < threads; ++t)
            workers.emplace_back([&, t] { RenderRows(compiled, t, threads, image); });
        RenderRows(compiled, 0, threads, image);
        for (auto& worker : workers)
            worker.join();
        benchmark::DoNotOptimize(image.data());
    }
    state.counters["Mpix/s"] = benchmark::Counter(double(Size) * Size * double(state.iterations()) / 1e6,
                                                  benchmark::Counter::kIsRate);
    state.SetLabel(Name(state.range(0)) + std::to_string(compiled.code->GetInstructionCount()) +
                   " instructions, " + std::to_string(threads) + " thread" + (threads > 1 ? "s" : ""));
}

// The kernel text an equation filter pastes, in a loop kernel over the image.
void OpenCL(benchmark::State& state) {
    using namespace Raster;
    const auto device = Hardware::GetDevice("opencl");
    if (!device) {
        state.SkipWithError("no OpenCL device");
        return;
    }
    const Compiled compiled(Expressions[state.range(0)]);
    const int n = compiled.code->GetComponentCount();
    const std::string type = n == 1 ? "float" : "vec" + std::to_string(n);
    auto component = [&](int k) {
        return n == 1 ? std::string("res") : "res.v[" + std::to_string(std::min(k, n - 1)) + "]";
    };
    const std::string text = std::string(Ep::GetDevicePrelude(1)) + type +
                             " Process1(float x, float y, float w, float h)\n{\n" +
                             compiled.code->GetMetalFragment(*compiled.info, Ep::UnitTypeNumber) +
                             "}\n"
                             "kernel void expression_image(global uchar4* out, int width, int height)\n{\n"
                             "\tconst int px = get_global_id(0), py = get_global_id(1);\n"
                             "\tconst float x = px + 0.5f, y = py + 0.5f;\n"
                             "\tconst " +
                             type + " res = Process1(x, y, (float)width, (float)height);\n" +
                             "\tout[py * width + px] = (uchar4)(convert_uchar_sat(" + component(0) +
                             " * 255.0f), convert_uchar_sat(" + component(1) +
                             " * 255.0f), convert_uchar_sat(" + component(2) + " * 255.0f), 255);\n}\n";
    auto output = CreateHardwareBuffer(device.Get(), nullptr, Size * 4, Size, Size, 4);
    HardwareKernelDescriptor descriptor;
    static const std::string empty;
    for (auto& fragment : descriptor.fragments)
        fragment = empty.c_str();
    descriptor[HardwareKernelFragment::PerPixelLoop] = text.c_str();
    descriptor.entryPoint = "expression_image";
    HardwareKernelArguments arguments;
    arguments.AddBuffer(output).AddInt(Size).AddInt(Size);
    if (!ExecuteKernel(device.Get(), descriptor, Size, Size, arguments)) {
        state.SkipWithError(GetLastHardwareError().c_str());
        return;
    }
    for (auto _ : state)
        ExecuteKernel(device.Get(), descriptor, Size, Size, arguments);
    state.counters["Mpix/s"] = benchmark::Counter(double(Size) * Size * double(state.iterations()) / 1e6,
                                                  benchmark::Counter::kIsRate);
    state.SetLabel(Name(state.range(0)) + device->GetName());
}

} // namespace

BENCHMARK(Processor)->ArgsProduct({{0, 1, 2}, {1, 2}})->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(OpenCL)->Arg(0)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond)->UseRealTime();

BENCHMARK_MAIN();
