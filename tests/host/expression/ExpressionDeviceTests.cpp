// The expression language's kernel text against its bytecode: a generated set of expressions, every
// function and operator among them, is compiled into one kernel per language and run over the same points.
// The tolerance is zero: every function is the project's own, written once for both paths, and the devices
// compile without contraction and with correctly rounded division and square root.
#include "host/kernel/ExpressionParser.h"
#include "host/raster/device/CudaCompiler.h"
#include "host/raster/device/ExecuteKernel.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <random>
#include <sstream>
#include <string>
#include <vector>

namespace {

using Kernel::Counted;
using Ep = Kernel::ExpressionParser;
using namespace Raster;

// Random expressions over x, y, w, h and the vector dir, covering every operator and function.
class Generator {
public:
    explicit Generator(unsigned seed)
        : m_Random(seed) {}

    std::string Scalar(int depth) {
        if (depth <= 0 || Pick(5) == 0) return Leaf();
        const int d = depth - 1;
        static const char* unary[] = {"-",    "!",     "sin",  "cos",   "tan",   "asin",  "acos",
                                      "atan", "sqrt",  "exp",  "log",   "log2",  "log10", "abs",
                                      "sign", "floor", "ceil", "round", "trunc", "fract"};
        static const char* infix[] = {"+",  "-", "*",  "/",  "%",  "^",  "<",
                                      "<=", ">", ">=", "==", "!=", "&&", "||"};
        static const char* binary[] = {"atan2", "mod",  "min",   "max", "step",
                                       "hypot", "rand", "noise", "pow", "atan"};
        static const char* ternary[] = {"clamp", "mix", "lerp", "smoothstep", "fbm"};
        switch (Pick(5)) {
        case 0: {
            const std::string f = unary[Pick(std::size(unary))];
            if (f == "-" || f == "!") return f + "(" + Scalar(d) + ")";
            if (f == "exp") return "exp(" + Scalar(d) + " / 40)";
            return f + "(" + Scalar(d) + ")";
        }
        case 1: {
            const std::string op = infix[Pick(std::size(infix))];
            if (op == "^") return "(" + Scalar(d) + " ^ " + Leaf() + ")";
            return "(" + Scalar(d) + " " + op + " " + Scalar(d) + ")";
        }
        case 2: {
            const std::string f = binary[Pick(std::size(binary))];
            if (f == "noise") return "noise(" + Scalar(d) + " / 7, " + Scalar(d) + " / 9)";
            if (f == "pow") return "pow(" + Scalar(d) + ", " + Leaf() + ")";
            return f + "(" + Scalar(d) + ", " + Scalar(d) + ")";
        }
        case 3: {
            const std::string f = ternary[Pick(std::size(ternary))];
            if (f == "fbm")
                return "fbm(" + Scalar(d) + " / 20, " + Scalar(d) + " / 20, " + std::to_string(1 + Pick(6)) +
                       ")";
            return f + "(" + Scalar(d) + ", " + Scalar(d) + ", " + Scalar(d) + ")";
        }
        default:
            return "(" + Scalar(d) + " > " + Scalar(d) + " ? " + Scalar(d) + " : " + Scalar(d) + ")";
        }
    }

    // A scalar, or now and then a vector of 2 to 6 components built from scalars.
    std::string Any(int depth) {
        const auto s = [&] { return Scalar(depth - 1); };
        switch (Pick(10)) {
        case 0:
            return "normalize(vec3(" + s() + ", " + s() + ", " + s() + "))";
        case 1:
            return "cross(vec3(" + s() + ", " + s() + ", " + s() + "), dir)";
        case 2:
            return "vec2(" + s() + ", " + s() + ") * " + s();
        case 3:
            return "v = vec4(" + s() + ", " + s() + ", dir.zy); v.wzyx - length(v)";
        case 4:
            return "vec6(" + s() + ", dir, " + s() + ", distance(dir, vec3(x, y, 1)))";
        case 5:
            return "vec5(sin(dir * " + s() + "), dot(dir, dir), " + s() + ")";
        default:
            return "a = " + s() + "; b = " + s() + "; " + Scalar(depth);
        }
    }

private:
    std::size_t Pick(std::size_t n) { return m_Random() % n; }
    std::string Leaf() {
        static const char* leaves[] = {"x",   "y",     "w", "h",   "dir.x", "dir.y", "dir.z",
                                       "0",   "1",     "2", "0.5", "-1.5",  "3.25",  "10",
                                       "100", "0.001", "7", "pi",  "45deg", "50%"};
        return leaves[Pick(std::size(leaves))];
    }
    std::mt19937 m_Random;
};

// The points every expression is evaluated at: lattice points, halves, zeros of both signs, tiny, large
// and random positions.
std::vector<float> SamplePoints() {
    std::vector<float> p = {0.0f,   0.0f, -0.0f, 1.0f,  1.0f,  -1.0f,  0.5f,   0.5f,   3.0f,   -4.0f,
                            1e-30f, 2.0f, 1e6f,  -3e5f, 90.0f, 180.0f, -45.0f, 360.0f, 255.5f, 17.25f};
    std::mt19937 random(99);
    std::uniform_real_distribution<float> position(-300.0f, 300.0f);
    while (p.size() < 2 * 96)
        p.push_back(position(random));
    return p;
}

struct Expression {
    std::string text;
    Counted<Ep::ByteCode> code;
    Counted<Ep::ExecuteInfo> info;
    Counted<Ep::Constant> x, y;
};

struct Table {
    Counted<Ep::Constants> constants{new Ep::Constants};
    Counted<Ep::Constant> x, y;
    Table() {
        x = constants->AddVolatile("x", 0.0);
        y = constants->AddVolatile("y", 0.0);
        constants->Add("w", 100.0);
        constants->Add("h", 200.0);
        const double dir[] = {0.5, -1.0, 2.0};
        constants->AddVector("dir", dir);
    }
};

constexpr int Stride = Ep::MaxComponents; // result floats per point

std::vector<Expression> Compile(const Table& table, int count) {
    std::vector<Expression> expressions;
    Generator generator(2024);
    // Every function and operator once on its own, then random combinations.
    const char* basics[] = {"sin(x / 30)",
                            "cos(y)",
                            "tan(x / 100)",
                            "asin(x / 300)",
                            "acos(y / 300)",
                            "atan(x)",
                            "atan2(y, x)",
                            "atan(y, x)",
                            "sqrt(x)",
                            "exp(y / 30)",
                            "log(x)",
                            "log2(y)",
                            "log10(x)",
                            "abs(x)",
                            "sign(y)",
                            "floor(x)",
                            "ceil(y)",
                            "round(x)",
                            "trunc(y)",
                            "fract(x)",
                            "mod(x, 7)",
                            "x % -3",
                            "pow(abs(x), 0.37)",
                            "x ^ 3",
                            "min(x, y)",
                            "max(x, y)",
                            "clamp(x, -10, 10)",
                            "mix(x, y, 0.3)",
                            "step(x, y)",
                            "smoothstep(-50, 50, x)",
                            "hypot(x, y)",
                            "rand(x, y)",
                            "rand(x)",
                            "noise(x / 13, y / 17)",
                            "fbm(x / 40, y / 40)",
                            "fbm(x / 40, y / 40, 8)",
                            "x < y",
                            "x <= y",
                            "x > y",
                            "x >= y",
                            "x == y",
                            "x != y",
                            "x && y",
                            "x || y",
                            "!x",
                            "-x",
                            "x / y",
                            "x > 0 ? y : -y",
                            "sin(x) * 0.5 + 0.5",
                            "vec3(x, y, 1) / 3",
                            "normalize(vec2(x, y))",
                            "cross(vec3(x, y, 1), dir)",
                            "length(dir * x)"};
    for (int i = 0; i < count; ++i) {
        Expression e;
        e.text = i < static_cast<int>(std::size(basics)) ? basics[i] : generator.Any(4);
        Ep::ParseInfo parse(e.text, nullptr, table.constants, i % 2 == 1);
        const auto compiled = parse.Compile();
        EXPECT_TRUE(compiled) << e.text << ": " << parse.GetError().message;
        if (!compiled) continue;
        e.info = Ep::ExecuteInfo::Create(table.constants);
        e.code = compiled->ConvertToNumeric(*e.info, Ep::UnitTypeNumber, true);
        expressions.push_back(std::move(e));
    }
    return expressions;
}

// The processor's results: [expression][point][component], unused components left at zero.
std::vector<float> RunOnProcessor(const Table& table, const std::vector<Expression>& expressions,
                                  const std::vector<float>& points) {
    const std::size_t count = points.size() / 2;
    std::vector<float> out(expressions.size() * count * Stride, 0.0f);
    for (std::size_t e = 0; e < expressions.size(); ++e) {
        auto session = Ep::ByteCode::Session::CreateForThread(expressions[e].code, expressions[e].info);
        for (std::size_t start = 0; start < count; start += Ep::Lanes) {
            const int n = static_cast<int>(std::min<std::size_t>(Ep::Lanes, count - start));
            for (int i = 0; i < n; ++i) {
                table.x->GetLanes()[i] = points[2 * (start + i)];
                table.y->GetLanes()[i] = points[2 * (start + i) + 1];
            }
            EXPECT_TRUE(session->ExecuteSpan(n));
            for (int k = 0; k < expressions[e].code->GetComponentCount(); ++k)
                for (int i = 0; i < n; ++i)
                    out[(e * count + start + i) * Stride + k] = session->GetResultLanes(k)[i];
        }
    }
    return out;
}

std::string ReturnType(int components) {
    return components == 1 ? "float" : "vec" + std::to_string(components);
}

// One kernel computing every expression at every point. Language 0 puts the functions into a local struct
// of static functions under "using namespace Expressions", as a generated sample stage does;
// language 1 defines them at file level.
std::string KernelText(int language, const std::vector<Expression>& expressions) {
    std::ostringstream text;
    text << Ep::GetDevicePrelude(language);
    std::ostringstream functions, calls;
    for (std::size_t e = 0; e < expressions.size(); ++e) {
        const auto& ex = expressions[e];
        const int n = ex.code->GetComponentCount();
        const std::string type = ReturnType(n);
        const std::string body = ex.code->GetMetalFragment(*ex.info, Ep::UnitTypeNumber);
        functions << (language == 0 ? "static " : "") << type << " Process" << e
                  << "(float x, float y, float w, float h, vec3 dir)\n{\n"
                  << body << "}\n";
        calls << "\t{ const " << type << " res = " << (language == 0 ? "Utils::" : "") << "Process" << e
              << "(x, y, w, h, dir);";
        for (int k = 0; k < n; ++k) {
            calls << " out[(" << e << " * count + i) * " << Stride << " + " << k << "] = ";
            if (n == 1)
                calls << "res;";
            else
                calls << (language == 0 ? "res[" + std::to_string(k) + "];"
                                        : "res.v[" + std::to_string(k) + "];");
        }
        calls << " }\n";
    }
    if (language == 1) {
        text << functions.str();
        text << "kernel void expression_check(global const float* points, global float* out, int count)\n{\n"
                "\tconst int i = get_global_id(0);\n"
                "\tif (i >= count) return;\n"
                "\tconst vec3 dir = ex_make_vec3(0.5f, -1.0f, 2.0f);\n";
    } else {
        text << "extern \"C\" __global__ void expression_check(const float* points, float* out, int "
                "count)\n{\n"
                "\tconst int i = blockIdx.x * blockDim.x + threadIdx.x;\n"
                "\tif (i >= count || blockIdx.y * blockDim.y + threadIdx.y > 0) return;\n"
                "\tusing namespace Expressions;\n"
                "\tstruct Utils\n\t{\n"
             << functions.str()
             << "\t};\n"
                "\tconst vec3 dir(0.5f, -1.0f, 2.0f);\n";
    }
    text << "\tconst float x = points[2 * i], y = points[2 * i + 1];\n"
            "\tconst float w = 100.0f, h = 200.0f;\n"
         << calls.str() << "}\n";
    return text.str();
}

std::vector<float> RunOnDevice(const HardwareDevice* device, int language, const std::string& text,
                               std::size_t expressions, const std::vector<float>& points) {
    const int count = static_cast<int>(points.size() / 2);
    const int width = count * Stride;
    const int height = static_cast<int>(expressions);
    std::vector<float> out(std::size_t(width) * height, 0.0f);
    auto input = CreateHardwareBuffer(device, points.data(), points.size() * sizeof(float),
                                      static_cast<int>(points.size()), 1, sizeof(float));
    auto output = CreateHardwareBuffer(device, out.data(), std::size_t(width) * sizeof(float), width, height,
                                       sizeof(float));
    EXPECT_TRUE(input && output) << GetLastHardwareError();
    if (!input || !output) return {};
    HardwareKernelDescriptor descriptor;
    const std::string empty;
    for (auto& fragment : descriptor.fragments)
        fragment = empty.c_str();
    descriptor[HardwareKernelFragment::PerPixelLoop] = text.c_str();
    descriptor.entryPoint = "expression_check";
    HardwareKernelArguments arguments;
    arguments.AddBuffer(input).AddBuffer(output).AddInt(count);
    const bool ran = ExecuteKernel(device, descriptor, count, 1, arguments);
    EXPECT_TRUE(ran) << "language " << language << ": " << GetLastHardwareError() << "\n"
                     << GetKernelBuildLog(device, descriptor);
    if (!ran) return {};
    EXPECT_TRUE(output->Download(out.data(), std::size_t(width) * sizeof(float)));
    return out;
}

// Bit for bit, NaN matching any NaN; a failure names the expression, the point and both values.
void ExpectSameBits(const std::vector<Expression>& expressions, const std::vector<float>& points,
                    const std::vector<float>& processor, const std::vector<float>& device, const char* what) {
    ASSERT_EQ(processor.size(), device.size());
    const std::size_t count = points.size() / 2;
    int reported = 0, differing = 0;
    for (std::size_t e = 0; e < expressions.size(); ++e)
        for (std::size_t i = 0; i < count; ++i)
            for (int k = 0; k < expressions[e].code->GetComponentCount(); ++k) {
                const float a = processor[(e * count + i) * Stride + k];
                const float b = device[(e * count + i) * Stride + k];
                if (std::memcmp(&a, &b, sizeof a) == 0 || (std::isnan(a) && std::isnan(b))) continue;
                ++differing;
                if (reported++ < 12)
                    ADD_FAILURE() << what << ": \"" << expressions[e].text << "\" at (" << points[2 * i]
                                  << ", " << points[2 * i + 1] << ") component " << k << ": processor "
                                  << std::hexfloat << a << ", device " << b << std::defaultfloat;
            }
    EXPECT_EQ(differing, 0) << what;
}

TEST(ExpressionDevice, OpenCLTextAgreesWithTheBytecodeBitForBit) {
    const auto device = Hardware::GetDevice("opencl");
    if (!device)
        GTEST_SKIP() << "no OpenCL device: the ICD loader found no platform (install pocl-opencl-icd)";
    Table table;
    const auto expressions = Compile(table, 400);
    ASSERT_GT(expressions.size(), 390u);
    const auto points = SamplePoints();
    const auto processor = RunOnProcessor(table, expressions, points);
    const auto text = KernelText(1, expressions);
    const auto onDevice = RunOnDevice(device.Get(), 1, text, expressions.size(), points);
    ASSERT_FALSE(onDevice.empty());
    ExpectSameBits(expressions, points, processor, onDevice, "OpenCL");
}

TEST(ExpressionDevice, CudaTextCompilesWithNvrtc) {
    if (!IsNvrtcAvailable())
        GTEST_SKIP() << "NVRTC is not installed, so language-0 text cannot be compiled here ("
                     << DescribeNvrtc() << ")";
    Table table;
    const auto expressions = Compile(table, 120);
    const auto ptx = CompileToPtx(KernelText(0, expressions), "expression_check");
    EXPECT_TRUE(ptx.ptx) << ptx.log;
}

TEST(ExpressionDevice, CudaTextAgreesWithTheBytecodeBitForBit) {
    const auto device = Hardware::GetDevice("cuda");
    if (!device)
        GTEST_SKIP() << "no CUDA device (needs libcuda, NVRTC and a GPU): the CUDA path is not run here";
    Table table;
    const auto expressions = Compile(table, 400);
    const auto points = SamplePoints();
    const auto processor = RunOnProcessor(table, expressions, points);
    const auto onDevice =
        RunOnDevice(device.Get(), 0, KernelText(0, expressions), expressions.size(), points);
    ASSERT_FALSE(onDevice.empty());
    ExpectSameBits(expressions, points, processor, onDevice, "CUDA");
}

// The prelude may be pasted into several fragments of one kernel: its guard keeps the second copy out.
TEST(ExpressionDevice, PreludeTwiceStillCompiles) {
    const auto device = Hardware::GetDevice("opencl");
    if (!device)
        GTEST_SKIP() << "no OpenCL device: the ICD loader found no platform (install pocl-opencl-icd)";
    Table table;
    auto expressions = Compile(table, 3);
    const std::string text = std::string(Ep::GetDevicePrelude(1)) + KernelText(1, expressions);
    const auto points = SamplePoints();
    const auto onDevice = RunOnDevice(device.Get(), 1, text, expressions.size(), points);
    ASSERT_FALSE(onDevice.empty());
    ExpectSameBits(expressions, points, RunOnProcessor(table, expressions, points), onDevice, "OpenCL");
}

} // namespace
