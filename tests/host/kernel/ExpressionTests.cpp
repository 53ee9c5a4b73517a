// The expression language on the processor: values worked out by hand, messages for texts that must fail,
// hostile texts, span evaluation against single evaluation, and independent per-thread sessions.
#include "host/kernel/ExpressionMath.h"
#include "host/kernel/ExpressionParser.h"
#include "host/kernel/Simd.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <random>
#include <string>
#include <thread>
#include <vector>

namespace {

using Kernel::Counted;
using Ep = Kernel::ExpressionParser;

constexpr double Pi = 3.14159265358979323846;

// The table the tests compile against: volatile x and y, fixed w and h, and a fixed vector dir.
struct Table {
    Counted<Ep::Constants> constants{new Ep::Constants};
    Counted<Ep::Constant> x, y;
    Table(double xv = 50.0, double yv = 25.0) {
        x = constants->AddVolatile("x", xv);
        y = constants->AddVolatile("y", yv);
        constants->Add("w", 100.0);
        constants->Add("h", 200.0);
        const double dir[] = {0.5, -1.0, 2.0};
        constants->AddVector("dir", dir);
    }
};

struct Compiled {
    Counted<Ep::ByteCode> code;
    Ep::Error error;
};

Compiled Compile(const Table& table, const std::string& text, bool degrees = false,
                 const Ep::UnitConverter* converter = nullptr, bool physicalUnits = true,
                 bool ignoreCase = false) {
    Ep::ParseInfo parse(text, converter, table.constants, degrees);
    parse.SetUnitCategoryAllowed(Ep::PhysicalLengthUnits, physicalUnits);
    parse.SetIgnoreUnitTypeCase(ignoreCase);
    Compiled c{parse.Compile(), parse.GetError()};
    return c;
}

// Compiles, converts to a number and evaluates once; fails the test on any error.
Ep::Value Evaluate(const Table& table, const std::string& text, bool degrees = false,
                   const Ep::UnitConverter* converter = nullptr) {
    Ep::Value value;
    const auto compiled = Compile(table, text, degrees, converter);
    EXPECT_TRUE(compiled.code) << text << ": " << compiled.error.message;
    if (!compiled.code) return value;
    const auto info = Ep::ExecuteInfo::Create(table.constants);
    const auto numeric = compiled.code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
    EXPECT_TRUE(numeric) << text;
    if (!numeric) return value;
    auto session = Ep::ByteCode::Session::CreateForThread(numeric, info);
    EXPECT_TRUE(session && session->Execute(value)) << text;
    return value;
}

struct Case {
    const char* text;
    std::vector<double> expected;
    bool degrees = false;
};

void ExpectCases(const std::vector<Case>& cases, const Ep::UnitConverter* converter = nullptr) {
    Table table;
    for (const auto& c : cases) {
        const auto value = Evaluate(table, c.text, c.degrees, converter);
        ASSERT_EQ(value.components, static_cast<int>(c.expected.size())) << c.text;
        for (std::size_t k = 0; k < c.expected.size(); ++k) {
            const double e = c.expected[k];
            EXPECT_NEAR(value.values[k], e, 2e-6 * std::max(1.0, std::fabs(e)))
                << c.text << " component " << k << (c.degrees ? " (degrees)" : " (radians)");
        }
    }
}

TEST(ExpressionValues, OperatorsPrecedenceAndStatements) {
    // x = 50, y = 25, w = 100, h = 200
    ExpectCases({
        {"1 + 2 * 3", {7}},
        {"(1 + 2) * 3", {9}},
        {"10 - 4 - 3", {3}},
        {"2 ^ 3 ^ 2", {512}},
        {"-2 ^ 2", {-4}},
        {"2 ^ -1", {0.5}},
        {"7 % 3", {1}},
        {"-7 % 3", {2}},
        {"7 % -3", {-2}},
        {"mod(-1, 4)", {3}},
        {"1 < 2", {1}},
        {"2 <= 1", {0}},
        {"2 >= 2", {1}},
        {"1 == 1", {1}},
        {"1 != 1", {0}},
        {"1 && 0", {0}},
        {"1 || 0", {1}},
        {"!0", {1}},
        {"!3", {0}},
        {"1 < 2 == 1", {1}},
        {"x > 40 ? 10 : 20", {10}},
        {"x > 60 ? 10 : y > 20 ? 30 : 40", {30}},
        {"a = x / w; b = y / h; a * b", {0.0625}},
        {"a = 2; a = a * a; a + 1", {5}},
        {"a = 3;", {3}},
        {";; 4 ;", {4}},
        {"x / w + y / h", {0.625}},
        {"+x - -y", {75}},
        {"1e3 + .5 + 2.", {1002.5}},
        {"pi", {Pi}},
        {"tau / 2", {Pi}},
        {"log(e)", {1}},
    });
}

TEST(ExpressionValues, FunctionsInRadiansAndDegrees) {
    ExpectCases({
        {"sin(pi / 2)", {1}},
        {"sin(90)", {1}, true},
        {"cos(180)", {-1}, true},
        {"cos(pi)", {-1}},
        {"tan(45)", {1}, true},
        {"sin(-30)", {-0.5}, true},
        {"cos(7 * pi / 3)", {0.5}},
        {"asin(1)", {Pi / 2}},
        {"asin(0.5)", {30}, true},
        {"acos(0)", {90}, true},
        {"acos(-1)", {Pi}},
        {"atan(1)", {45}, true},
        {"atan2(1, 1)", {45}, true},
        {"atan(1, -1)", {135}, true},
        {"atan2(-1, -1)", {-3 * Pi / 4}},
        {"atan2(1, 0)", {90}, true},
        {"sqrt(16)", {4}},
        {"pow(2, 10)", {1024}},
        {"pow(-2, 3)", {-8}},
        {"pow(-2, 2)", {4}},
        {"pow(0, 0)", {1}},
        {"exp(0)", {1}},
        {"exp(1)", {2.718281828459045}},
        {"exp(-2)", {0.1353352832366127}},
        {"log(1)", {0}},
        {"log2(8)", {3}},
        {"log10(1000)", {3}},
        {"abs(-3)", {3}},
        {"sign(-2)", {-1}},
        {"sign(0)", {0}},
        {"floor(-1.5)", {-2}},
        {"ceil(-1.5)", {-1}},
        {"round(2.5)", {3}},
        {"round(-2.5)", {-3}},
        {"round(2.49)", {2}},
        {"trunc(-1.7)", {-1}},
        {"fract(-0.25)", {0.75}},
        {"min(3, 4)", {3}},
        {"max(3, 4)", {4}},
        {"clamp(5, 0, 1)", {1}},
        {"clamp(-5, 0, 1)", {0}},
        {"mix(2, 4, 0.25)", {2.5}},
        {"lerp(2, 4, 0.75)", {3.5}},
        {"step(0.5, 0.4)", {0}},
        {"step(0.5, 0.5)", {1}},
        {"smoothstep(0, 1, 0.5)", {0.5}},
        {"smoothstep(0, 2, 0.5)", {0.15625}},
        {"smoothstep(0, 1, 7)", {1}},
        {"hypot(3, 4)", {5}},
        {"hypot(3e30, 4e30)", {5e30}},
        {"noise(3, -4)", {0}},
    });
}

TEST(ExpressionValues, UnitsThroughTheConverter) {
    const Ep::UnitConverter at300(300.0);
    ExpectCases(
        {
            {"10px", {10}},
            {"1in", {300}},
            {"72pt", {300}},
            {"25.4mm", {300}},
            {"2.54cm", {300}},
            {"1in + 10px", {310}},
            {"30deg", {Pi / 6}},
            {"30\xC2\xB0", {Pi / 6}},
            {"45\xC2\xB0", {45}, true},
            {"1rad", {180 / Pi}, true},
            {"sin(30deg)", {0.5}},
            {"sin(30deg)", {0.5}, true},
            {"sin(pi/6 * 1rad)", {0.5}, true},
            {"50%", {0.5}},
            {"50% * 4", {2}},
            {"(50%)", {0.5}},
            {"7%2", {1}},
            {"7% - 2", {-1.93}},
            {"50% != 1", {1}},
            {"50%!=0.5", {0}},
            {"!50%", {0}},
        },
        &at300);
    // Without a converter, 72 pixels to the inch.
    ExpectCases({{"1in", {72}}, {"2pt", {2}}});
}

TEST(ExpressionValues, Vectors) {
    ExpectCases({
        {"vec3(1, 2, 3) + 1", {2, 3, 4}},
        {"vec2(1, 2) * vec2(3, 4)", {3, 8}},
        {"2 / vec2(4, 8)", {0.5, 0.25}},
        {"-vec2(1, -2)", {-1, 2}},
        {"vec3(2)", {2, 2, 2}},
        {"vec4(vec2(1, 2), 3, 4)", {1, 2, 3, 4}},
        {"vec6(1, 2, 3, 4, 5, 6)", {1, 2, 3, 4, 5, 6}},
        {"vec5(1, 2, 3, 4, 5)[4]", {5}},
        {"vec3(1, 2, 3)[2]", {3}},
        {"vec4(1, 2, 3, 4).wzyx", {4, 3, 2, 1}},
        {"vec3(1, 2, 3).xy", {1, 2}},
        {"dir", {0.5, -1, 2}},
        {"dir.x + dir.z", {2.5}},
        {"dir * 2", {1, -2, 4}},
        {"length(vec2(3, 4))", {5}},
        {"length(-3)", {3}},
        {"dot(vec3(1, 2, 3), vec3(4, 5, 6))", {32}},
        {"cross(vec3(1, 0, 0), vec3(0, 1, 0))", {0, 0, 1}},
        {"cross(vec3(1, 2, 3), vec3(4, 5, 6))", {-3, 6, -3}},
        {"normalize(vec2(3, 4))", {0.6, 0.8}},
        {"distance(vec2(1, 1), vec2(4, 5))", {5}},
        {"abs(vec2(-1, 2))", {1, 2}},
        {"min(vec3(1, 5, 3), 2)", {1, 2, 2}},
        {"clamp(vec3(-1, 0.5, 2), 0, 1)", {0, 0.5, 1}},
        {"mix(vec2(0, 10), vec2(10, 0), 0.5)", {5, 5}},
        {"x > 0 ? vec2(1, 2) : vec2(3, 4)", {1, 2}},
        {"v = vec3(x, y, 0) / 25; v.x + v.y", {3}},
        {"sin(vec2(0, 90))", {0, 1}, true},
    });
}

// IEEE results, never a trap: division by zero, square roots and logarithms of negatives.
TEST(ExpressionValues, NonFiniteResultsFollowIeee) {
    Table table;
    EXPECT_EQ(Evaluate(table, "1 / 0").values[0], INFINITY);
    EXPECT_EQ(Evaluate(table, "-1 / 0").values[0], -INFINITY);
    EXPECT_TRUE(std::isnan(Evaluate(table, "0 / 0").values[0]));
    EXPECT_TRUE(std::isnan(Evaluate(table, "sqrt(-1)").values[0]));
    EXPECT_TRUE(std::isnan(Evaluate(table, "log(-1)").values[0]));
    EXPECT_EQ(Evaluate(table, "log(0)").values[0], -INFINITY);
    EXPECT_EQ(Evaluate(table, "exp(1000)").values[0], INFINITY);
    EXPECT_EQ(Evaluate(table, "exp(-1000)").values[0], 0.0f);
    EXPECT_TRUE(std::isnan(Evaluate(table, "pow(-2, 0.5)").values[0]));
    EXPECT_TRUE(std::isnan(Evaluate(table, "sin(1 / 0)").values[0]));
    EXPECT_TRUE(std::isnan(Evaluate(table, "7 % 0").values[0]));
    EXPECT_TRUE(std::isnan(Evaluate(table, "asin(2)").values[0]));
    EXPECT_EQ(Evaluate(table, "x / 0 > 1e30 ? 1 : 2").values[0], 1.0f);
}

// The project's own transcendental functions, against the C library in double precision, over a dense
// sweep. The bounds are what the defining polynomials give; a wrong coefficient or reduction step misses
// them by orders of magnitude.
TEST(ExpressionMath, TranscendentalsAgreeWithTheCLibrary) {
    using namespace Kernel::ExpressionMath;
    auto ulps = [](float got, double want) {
        const double spacing = std::nextafter(static_cast<float>(std::fabs(want)), INFINITY) -
                               static_cast<float>(std::fabs(want));
        return std::fabs(static_cast<double>(got) - want) / std::max(spacing, 1e-45);
    };
    double worst[8] = {};
    for (int i = -200000; i <= 200000; ++i) {
        const float a = static_cast<float>(i) * 0.0005f; // -100 .. 100
        worst[0] = std::max(worst[0], std::fabs(ex_sin(a) - std::sin(double(a))));
        worst[1] = std::max(worst[1], std::fabs(ex_cos(a) - std::cos(double(a))));
        const float e = static_cast<float>(i) * 0.0004f; // -80 .. 80
        worst[2] = std::max(worst[2], ulps(ex_exp(e), std::exp(double(e))));
        const float l = std::ldexp(1.0f + static_cast<float>(i + 200000) / 400001.0f, i % 60);
        worst[3] = std::max(worst[3], ulps(ex_log(l), std::log(double(l))));
        worst[4] = std::max(worst[4], ulps(ex_atan(a), std::atan(double(a))));
        const float s = static_cast<float>(i) / 200000.0f; // -1 .. 1
        worst[5] = std::max(worst[5], std::fabs(ex_asin(s) - std::asin(double(s))));
        worst[6] = std::max(worst[6], std::fabs(ex_acos(s) - std::acos(double(s))));
        const float p = 0.5f + static_cast<float>(i + 200000) / 100000.0f; // 0.5 .. 4.5
        const double want = std::pow(double(p), 7.5);
        worst[7] = std::max(worst[7], std::fabs(ex_pow(p, 7.5f) - want) / want);
    }
    EXPECT_LT(worst[0], 2e-7) << "sin, absolute";
    EXPECT_LT(worst[1], 2e-7) << "cos, absolute";
    EXPECT_LE(worst[2], 2.0) << "exp, ulp";
    EXPECT_LE(worst[3], 2.0) << "log, ulp";
    EXPECT_LE(worst[4], 3.0) << "atan, ulp";
    EXPECT_LT(worst[5], 4e-7) << "asin, absolute";
    EXPECT_LT(worst[6], 4e-7) << "acos, absolute";
    EXPECT_LT(worst[7], 2e-6) << "pow, relative";
    // Angles in every quadrant and the signs of atan2.
    for (int deg = -720; deg <= 720; deg += 15) {
        const double r = deg * Pi / 180.0;
        EXPECT_NEAR(ex_atan2(float(std::sin(r)), float(std::cos(r))), std::atan2(std::sin(r), std::cos(r)),
                    3e-7)
            << deg;
    }
}

TEST(ExpressionMath, RandomAndNoiseAreDeterministicBoundedAndSmooth) {
    using namespace Kernel::ExpressionMath;
    double sum = 0.0;
    int buckets[10] = {};
    float low = 1.0f, high = -1.0f;
    for (int i = 0; i < 100000; ++i) {
        const float r = ex_rand(static_cast<float>(i % 317), static_cast<float>(i / 317));
        ASSERT_GE(r, 0.0f);
        ASSERT_LT(r, 1.0f);
        sum += r;
        ++buckets[static_cast<int>(r * 10.0f)];
        const float nx = static_cast<float>(i % 400) * 0.0731f - 13.0f;
        const float ny = static_cast<float>(i / 400) * 0.0917f - 7.0f;
        const float n = ex_noise(nx, ny);
        low = std::min(low, n);
        high = std::max(high, n);
        ASSERT_LE(std::fabs(n), 1.0f);
        // Continuous: a small step changes the value by at most a few times the step.
        ASSERT_LT(std::fabs(ex_noise(nx + 1e-3f, ny) - n), 5e-3f) << nx << "," << ny;
        ASSERT_LE(std::fabs(ex_fbm(nx, ny, 6.0f)), 1.0f);
    }
    EXPECT_NEAR(sum / 100000.0, 0.5, 0.01);
    for (int b : buckets)
        EXPECT_NEAR(b, 10000, 500);
    EXPECT_LT(low, -0.5f);
    EXPECT_GT(high, 0.5f);
    EXPECT_EQ(ex_rand(0.0f, 1.0f), ex_rand(-0.0f, 1.0f)) << "zero and negative zero hash alike";
    EXPECT_NE(ex_rand(1.0f, 2.0f), ex_rand(2.0f, 1.0f));
    EXPECT_EQ(ex_noise(5.0f, -2.0f), 0.0f) << "zero on the lattice";
    EXPECT_EQ(ex_noise(NAN, 1.0f), 0.0f);
    EXPECT_EQ(ex_fbm(1.5f, 2.5f, 1.0f), ex_noise(1.5f, 2.5f)) << "one octave is plain noise";
}

TEST(ExpressionCompile, FoldsConstantsAndSharesRepeatedWork) {
    Table table;
    auto info = Ep::ExecuteInfo::Create(table.constants);
    auto count = [&](const char* text) {
        const auto c = Compile(table, text);
        EXPECT_TRUE(c.code) << text;
        const auto numeric = c.code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
        return numeric ? numeric->GetInstructionCount() : 999u;
    };
    EXPECT_EQ(count("sin(pi / 2) * 2 + 1"), 0u);
    EXPECT_EQ(count("x * (2 + 3)"), 1u);
    EXPECT_EQ(count("x / w * h"), 2u) << "fixed constants are folded into literals";
    EXPECT_EQ(count("sin(x) + sin(x)"), 2u) << "the second sin(x) is the first";
    EXPECT_EQ(count("a = x * 2; b = 7; a"), 1u) << "unused statements cost nothing";
    EXPECT_EQ(count("length(vec3(x, y, 1))"), 5u) << "x*x, y*y, two adds, sqrt";
}

TEST(ExpressionCompile, ConvertsToTheRequestedUnitType) {
    Table table;
    auto info = Ep::ExecuteInfo::Create(table.constants);
    auto numeric = [&](const char* text, int unitType, bool plain) {
        const auto c = Compile(table, text);
        EXPECT_TRUE(c.code) << text;
        std::string error;
        return bool(c.code->ConvertToNumeric(*info, unitType, plain, &error));
    };
    EXPECT_TRUE(numeric("3mm + 2px", Ep::UnitTypePixels, false));
    EXPECT_FALSE(numeric("30deg", Ep::UnitTypePixels, true));
    EXPECT_FALSE(numeric("3", Ep::UnitTypePixels, false));
    EXPECT_TRUE(numeric("3", Ep::UnitTypePixels, true));
    EXPECT_TRUE(numeric("atan2(y, x)", Ep::UnitTypeAngle, false));
    EXPECT_FALSE(numeric("4px", Ep::UnitTypeAngle, true));
    EXPECT_TRUE(numeric("4px * 30deg", Ep::UnitTypeNumber, false));
    EXPECT_FALSE(numeric("1", 9, true));
    // Another table is refused everywhere it could be mixed up.
    Table other;
    auto otherInfo = Ep::ExecuteInfo::Create(other.constants);
    const auto c = Compile(table, "x + 1");
    EXPECT_FALSE(c.code->ConvertToNumeric(*otherInfo, Ep::UnitTypeNumber, true));
    EXPECT_FALSE(Ep::ByteCode::Session::CreateForThread(c.code, otherInfo));
    EXPECT_EQ(c.code->GetMetalFragment(*otherInfo, Ep::UnitTypeNumber), "");
}

// Texts that must fail, with the exact message: what is wrong and where.
TEST(ExpressionErrors, MessagesNameTheProblemAndItsColumn) {
    Table table;
    struct Failure {
        const char* text;
        const char* message;
    };
    const Failure failures[] = {
        {"foo + 1", "unknown name \"foo\" at column 1"},
        {"x + foo", "unknown name \"foo\" at column 5"},
        {"bar(1)", "unknown function \"bar\" at column 1"},
        {"sin(1, 2)", "sin takes 1 argument, got 2 at column 1"},
        {"1 + clamp(1, 2)", "clamp takes 3 arguments, got 2 at column 5"},
        {"fbm(1)", "fbm takes 2 or 3 arguments, got 1 at column 1"},
        {"noise()", "noise takes 2 arguments, got 0 at column 1"},
        {"(1 + 2", "expected \")\" at column 7"},
        {"sin(x, y", "expected \")\" at column 9"},
        {"vec3(1,2,3)[1", "expected \"]\" at column 14"},
        {"x > 1 ? 2", "expected \":\" at column 10"},
        {"1 +", "unexpected end of expression at column 4"},
        {"1 $ 2", "unexpected character \"$\" at column 3"},
        {"3 foo", "unexpected \"foo\" at column 3"},
        {"1 & 2", "expected \"&&\" at column 3"},
        {"3furlongs", "unknown unit \"furlongs\" at column 2"},
        {"3MM", "unknown unit \"MM\" at column 2"},
        {"1e999", "number \"1e999\" is out of range at column 1"},
        {"4e38", "number \"4e38\" is out of range at column 1"},
        {"x = 3", "cannot assign to constant \"x\" at column 1"},
        {"sin = 3", "cannot assign to \"sin\", a built-in name at column 1"},
        {"vec3(1, 2)", "vec3 takes 3 components, got 2 at column 1"},
        {"vec2(1, 2) + vec3(1, 2, 3)", "operands have 2 and 3 components at column 12"},
        {"vec2(1, 2).z", "component \".z\" of a value with 2 components at column 12"},
        {"vec2(1, 2).q", "unknown component \".q\" at column 12"},
        {"vec2(1, 2) < 1", "a comparison needs numbers, not vectors at column 12"},
        {"vec2(1, 2) ? 1 : 0", "a condition must be a number, not a vector at column 1"},
        {"vec3(1, 2, 3)[3]", "an index must be a whole number from 0 to 2 at column 15"},
        {"vec3(1, 2, 3)[x]", "an index must be a whole number from 0 to 2 at column 15"},
        {"cross(vec2(1, 2), vec2(3, 4))", "cross needs two 3-component vectors at column 1"},
        {"sin", "function \"sin\" needs arguments in parentheses at column 1"},
        {"", "empty expression at column 1"},
        {" ; ", "empty expression at column 4"},
        {"1;\n  foo", "unknown name \"foo\" at line 2, column 3"},
        {"x\xC3\xA9", "unexpected character 0xC3 at column 2"},
    };
    for (const auto& f : failures) {
        const auto c = Compile(table, f.text, false, nullptr, false);
        EXPECT_FALSE(c.code) << f.text;
        EXPECT_EQ(c.error.message, f.message) << f.text;
    }
    // A unit from a disallowed category, and unit case when it is told to be ignored.
    EXPECT_EQ(Compile(table, "3mm", false, nullptr, false).error.message,
              "unit \"mm\" is not allowed here at column 2");
    EXPECT_TRUE(Compile(table, "3mm", false, nullptr, true).code);
    EXPECT_TRUE(Compile(table, "3MM", false, nullptr, true, true).code);
    // The report shows the line with a caret under the column, in characters, not bytes.
    const auto c = Compile(table, "45\xC2\xB0 + nope");
    EXPECT_EQ(c.error.Report(), "unknown name \"nope\" at column 7\n45\xC2\xB0 + nope\n      ^");
}

// Hostile texts: refused with a message, within fixed bounds of stack and memory, never a crash.
TEST(ExpressionErrors, HostileTextsAreRefusedWithinBounds) {
    Table table;
    const std::string deep = std::string(5000, '(') + "1" + std::string(5000, ')');
    EXPECT_EQ(Compile(table, deep).error.message, "nesting deeper than 128 levels at column 129");
    EXPECT_EQ(Compile(table, std::string(5000, '-') + "1").error.message,
              "nesting deeper than 128 levels at column 128");
    std::string powers;
    for (int i = 0; i < 3000; ++i)
        powers += "2^";
    EXPECT_NE(Compile(table, powers + "1").error.message.find("nesting deeper"), std::string::npos);
    // 127 levels is within the limit.
    EXPECT_TRUE(Compile(table, std::string(126, '(') + "1" + std::string(126, ')')).code);

    const std::string tooLong(Ep::MaxTextLength + 1, '1');
    EXPECT_EQ(Compile(table, tooLong).error.message,
              "expression is longer than 16384 characters at column 16385");
    // A long flat sum is not nesting: it compiles (and folds to one literal).
    std::string sum = "1";
    for (int i = 0; i < 8000; ++i)
        sum += "+1";
    ASSERT_LE(sum.size(), Ep::MaxTextLength);
    const auto flat = Compile(table, sum);
    ASSERT_TRUE(flat.code) << flat.error.message;
    EXPECT_EQ(Evaluate(table, sum).values[0], 8001.0f);
    // Long sums of volatile values need instructions, within the operation limit.
    std::string xs = "x";
    while (xs.size() + 10 < Ep::MaxTextLength)
        xs += "*1.0001+x";
    EXPECT_TRUE(Compile(table, xs).code);
    // Vector work is bounded too: every component counts against the limit.
    std::string vectors = "v = vec6(x, y, x, y, x, y);";
    while (vectors.size() + 40 < Ep::MaxTextLength)
        vectors += "v = sin(v * 1.5 + v.yxzwxy);";
    const auto big = Compile(table, vectors + "v");
    EXPECT_TRUE(big.code || big.error.message.find("too large") != std::string::npos) << big.error.message;
    // Huge and tiny literals, long names.
    EXPECT_EQ(Evaluate(table, "1e-999").values[0], 0.0f);
    EXPECT_EQ(Evaluate(table, std::string(300, '9') + "e-300").values[0], 1.0f);
    EXPECT_EQ(Compile(table, std::string(5000, 'q')).error.message,
              "unknown name \"" + std::string(40, 'q') + "...\" at column 1");
    // A long line is shown around the column only.
    const auto far = Compile(table, std::string(3000, ' ') + "zap");
    EXPECT_EQ(far.error.column, 84);
    EXPECT_LT(far.error.sourceLine.size(), 200u);
}

// Random token soup: whatever compiles also converts, emits kernel text and executes; whatever does not
// says where.
TEST(ExpressionErrors, TokenSoupNeverCrashes) {
    Table table;
    const char* pieces[] = {"x",    "y",      "w",       "dir",    "1",    "2.5", "1e3", "(",  ")",
                            "+",    "-",      "*",       "/",      "%",    "^",   "<",   "==", "&&",
                            "||",   "!",      "?",       ":",      ",",    ";",   "=",   "a",  ".x",
                            "[0]",  "sin(",   "vec3(",   "noise(", "fbm(", "mm",  "deg", "°",  "pow(",
                            "max(", "cross(", "length(", "rand(",  "e",    "pi"};
    std::mt19937 random(1234);
    auto info = Ep::ExecuteInfo::Create(table.constants);
    int compiled = 0;
    for (int i = 0; i < 20000; ++i) {
        std::string text;
        const int n = 1 + static_cast<int>(random() % 14);
        for (int k = 0; k < n; ++k)
            text += pieces[random() % std::size(pieces)];
        const auto c = Compile(table, text);
        if (!c.code) {
            ASSERT_GE(c.error.column, 1) << text;
            ASSERT_NE(c.error.message.find("column"), std::string::npos) << text;
            continue;
        }
        ++compiled;
        const auto numeric = c.code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
        ASSERT_TRUE(numeric) << text;
        EXPECT_FALSE(numeric->GetMetalFragment(*info, Ep::UnitTypeNumber).empty()) << text;
        auto session = Ep::ByteCode::Session::CreateForThread(numeric, info);
        Ep::Value v;
        ASSERT_TRUE(session && session->Execute(v) && session->ExecuteSpan(32)) << text;
        EXPECT_EQ(v.components, numeric->GetComponentCount());
    }
    EXPECT_GT(compiled, 200);
}

// A span of 32 lanes gives, lane by lane, what 32 single evaluations give: registers reused within an
// instruction never leak one lane's value into another.
TEST(ExpressionExecution, SpansAgreeWithSingleEvaluation) {
    Table table;
    const char* texts[] = {
        "sin(x / 20) * 0.5 + 0.5",
        "a = x * y; b = a - x; c = b * b - a; vec3(a, b, c) / 7",
        "v = vec3(x, y, 1); n = normalize(v); cross(n, vec3(0, 0, 1)) * fbm(x / 9, y / 9, 5)",
        "x > y ? rand(x, y) : noise(x / 3, y / 3)",
        "fract(x / 10) < 0.5 != fract(y / 10) < 0.5",
    };
    auto info = Ep::ExecuteInfo::Create(table.constants);
    for (const char* text : texts) {
        const auto c = Compile(table, text);
        ASSERT_TRUE(c.code) << text << ": " << c.error.message;
        const auto numeric = c.code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
        auto span = Ep::ByteCode::Session::CreateForThread(numeric, info);
        for (int lane = 0; lane < Ep::Lanes; ++lane) {
            table.x->GetLanes()[lane] = static_cast<float>(lane) * 3.7f - 20.0f;
            table.y->GetLanes()[lane] = static_cast<float>(lane * lane) * 0.3f - 40.0f;
        }
        ASSERT_TRUE(span->ExecuteSpan(Ep::Lanes));
        auto single = Ep::ByteCode::Session::CreateForThread(numeric, info);
        std::vector<float> spanResults;
        for (int k = 0; k < numeric->GetComponentCount(); ++k)
            spanResults.insert(spanResults.end(), span->GetResultLanes(k),
                               span->GetResultLanes(k) + Ep::Lanes);
        for (int lane = 0; lane < Ep::Lanes; ++lane) {
            table.x->SetValue(static_cast<float>(lane) * 3.7f - 20.0f);
            table.y->SetValue(static_cast<float>(lane * lane) * 0.3f - 40.0f);
            Ep::Value v;
            ASSERT_TRUE(single->Execute(v));
            for (int k = 0; k < v.components; ++k)
                EXPECT_EQ(std::memcmp(&v.values[k], &spanResults[k * Ep::Lanes + lane], sizeof(float)), 0)
                    << text << " lane " << lane << " component " << k;
        }
    }
    auto session = Ep::ByteCode::Session::CreateForThread(Compile(table, "x").code, info);
    EXPECT_FALSE(session->ExecuteSpan(0));
    EXPECT_FALSE(session->ExecuteSpan(Ep::Lanes + 1));
    EXPECT_EQ(session->GetResultLanes(1), nullptr);
}

// Threads share one byte code and one table; each has its own copies of the volatile constants and its own
// session, and gets exactly what a lone thread gets. Run under the thread sanitiser too.
TEST(ExpressionExecution, ThreadSessionsAreIndependent) {
    Table table;
    Ep::ParseInfo parse("r = hypot(x - w / 2, y - h / 2); vec2(sin(r / 5) * fbm(x / 30, y / 30), rand(x, y))",
                        nullptr, table.constants, false);
    const auto code = parse.Compile();
    ASSERT_TRUE(code);
    const auto info = Ep::ExecuteInfo::Create(table.constants);
    const auto numeric = code->ConvertToNumeric(*info, Ep::UnitTypeNumber, true);
    ASSERT_TRUE(numeric);
    constexpr int Rows = 64, Width = 96;

    auto render = [&](int row, Ep::ByteCode::Session& session, Ep::Constant& x, Ep::Constant& y,
                      std::vector<float>& out) {
        for (int start = 0; start < Width; start += Ep::Lanes) {
            const int n = std::min(Ep::Lanes, Width - start);
            for (int i = 0; i < n; ++i) {
                x.GetLanes()[i] = static_cast<float>(start + i) + 0.5f;
                y.GetLanes()[i] = static_cast<float>(row) + 0.5f;
            }
            ASSERT_TRUE(session.ExecuteSpan(n));
            for (int k = 0; k < 2; ++k)
                for (int i = 0; i < n; ++i)
                    out[(std::size_t(row) * Width + start + i) * 2 + k] = session.GetResultLanes(k)[i];
        }
    };

    std::vector<float> expected(Rows * Width * 2);
    {
        auto session = Ep::ByteCode::Session::CreateForThread(numeric, info);
        for (int row = 0; row < Rows; ++row)
            render(row, *session, *table.x, *table.y, expected);
    }
    std::vector<float> got(expected.size(), -1.0f);
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([&, t] {
            auto x = table.x->CopyForThreadSession();
            auto y = table.y->CopyForThreadSession();
            const auto threadInfo = info->CopyForThreadSession({x, y});
            EXPECT_EQ(threadInfo->GetThreadConstant(*table.x), x);
            auto session = Ep::ByteCode::Session::CreateForThread(numeric, threadInfo);
            ASSERT_TRUE(session);
            for (int row = t; row < Rows; row += 4)
                render(row, *session, *x, *y, got);
        });
    }
    for (auto& thread : threads)
        thread.join();
    EXPECT_EQ(std::memcmp(expected.data(), got.data(), expected.size() * sizeof(float)), 0);
    // A thread copy does not change its original.
    auto copy = table.x->CopyForThreadSession();
    copy->SetValue(123.0);
    EXPECT_NE(table.x->GetValue(), 123.0);
    EXPECT_EQ(&copy->GetOriginal(), table.x.Get());
    // The convenience copy makes its own copies of every volatile constant.
    const auto own = info->CopyForThreadSession();
    EXPECT_NE(own->GetThreadConstant(*table.y), table.y);
    EXPECT_EQ(own->GetThreadConstant(*table.constants->Find("w")), table.constants->Find("w"));
}

TEST(ExpressionConstants, TableRefusesBadNamesAndDuplicates) {
    Ep::Constants constants;
    EXPECT_TRUE(constants.Add("speed", 1.0));
    EXPECT_FALSE(constants.Add("speed", 2.0)) << "taken";
    EXPECT_FALSE(constants.Add("2fast", 1.0));
    EXPECT_FALSE(constants.Add("a b", 1.0));
    EXPECT_FALSE(constants.Add("", 1.0));
    const double one[] = {1.0};
    EXPECT_FALSE(constants.AddVector("v1", one)) << "a vector has two components or more";
    const double seven[] = {1, 2, 3, 4, 5, 6, 7};
    EXPECT_FALSE(constants.AddVector("v7", seven));
    EXPECT_TRUE(constants.AddVector("v6", std::span<const double>(seven, 6)));
    EXPECT_EQ(constants.IndexOf("v6"), 1);
    EXPECT_EQ(constants.Find("v6")->GetComponentCount(), 6);
    EXPECT_EQ(constants.Find("v6")->GetValue(5), 6.0);
}

// The kernel text reads constants by name (fixed ones too, so that a device is given their values at run
// time), and is refused where a name would not survive as a kernel parameter.
TEST(ExpressionKernelText, ReadsConstantsByNameAndRefusesReservedNames) {
    Table table;
    auto info = Ep::ExecuteInfo::Create(table.constants);
    const auto c = Compile(table, "x / w + dir.y");
    ASSERT_TRUE(c.code);
    const auto text = c.code->GetMetalFragment(*info, Ep::UnitTypeNumber);
    EXPECT_NE(text.find("(x / w)"), std::string::npos) << text;
    EXPECT_NE(text.find("dir.v[1]"), std::string::npos) << text;
    EXPECT_NE(text.find("return ex_t"), std::string::npos) << text;
    EXPECT_NE(Compile(table, "vec2(x, 1)")
                  .code->GetMetalFragment(*info, Ep::UnitTypeNumber)
                  .find("\treturn ex_make_vec2(x, 1.0f);\n"),
              std::string::npos)
        << "a vector is returned through its maker";
    for (const char* name : {"float", "int2", "vec3", "ex_t0", "Utils", "kernel", "__x", "double16"}) {
        Counted<Ep::Constants> constants(new Ep::Constants);
        ASSERT_TRUE(constants->Add(name, 1.0)) << name;
        Ep::ParseInfo parse(std::string(name) + " + 1", nullptr, constants, false);
        const auto code = parse.Compile();
        ASSERT_TRUE(code) << name;
        EXPECT_EQ(code->GetMetalFragment(*Ep::ExecuteInfo::Create(constants), Ep::UnitTypeNumber), "")
            << name;
        EXPECT_FALSE(Ep::IsDeviceName(name)) << name;
    }
    for (const char* name : {"R", "speed", "w", "float_scale", "vec", "vec7x"})
        EXPECT_TRUE(Ep::IsDeviceName(name)) << name;
    EXPECT_NE(Ep::GetDevicePrelude(0), nullptr);
    EXPECT_NE(Ep::GetDevicePrelude(1), nullptr);
    EXPECT_EQ(Ep::GetDevicePrelude(2), nullptr);
    EXPECT_NE(std::string(Ep::GetDevicePrelude(0)).find("namespace Expressions"), std::string::npos);
    EXPECT_EQ(std::string(Ep::GetDevicePrelude(1)).find("namespace"), std::string::npos);
}

} // namespace

namespace {

// The README's textures, in degrees, at points worked out by hand.
TEST(ExpressionValues, ReadmeTextures) {
    Table table(0.0, 0.0); // w = 100, h = 200
    auto at = [&](const char* text, double x, double y) {
        table.x->SetValue(x);
        table.y->SetValue(y);
        return Evaluate(table, text, true);
    };
    const char* stripes = "s = x * cos(30) + y * sin(30); fract(s / 32) < 0.5";
    EXPECT_EQ(at(stripes, 0.5, 0.5).values[0], 1.0f);
    EXPECT_EQ(at(stripes, 20.0, 0.0).values[0], 0.0f) << "s = 17.3: the second half of the period";
    EXPECT_EQ(at(stripes, 0.0, 20.0).values[0], 1.0f) << "s = 10";
    EXPECT_EQ(at(stripes, 0.0, 40.0).values[0], 0.0f) << "s = 20";
    const char* rings = "r = hypot(x - w / 2, y - h / 2); 0.5 + 0.5 * sin(r * 18)";
    EXPECT_FLOAT_EQ(at(rings, 50.0, 100.0).values[0], 0.5f);
    EXPECT_NEAR(at(rings, 55.0, 100.0).values[0], 1.0f, 1e-6) << "r = 5: 90 degrees";
    EXPECT_NEAR(at(rings, 50.0, 115.0).values[0], 0.0f, 1e-6) << "r = 15: 270 degrees";
    const char* checker = "(floor(x / 32) + floor(y / 32)) % 2";
    EXPECT_EQ(at(checker, 16.0, 16.0).values[0], 0.0f);
    EXPECT_EQ(at(checker, 48.0, 16.0).values[0], 1.0f);
    EXPECT_EQ(at(checker, -16.0, 16.0).values[0], 1.0f) << "squares continue across zero";
    EXPECT_EQ(at(checker, 48.0, 40.0).values[0], 0.0f);
    const char* marble = "t = fbm(x / 120, y / 120, 6); v = 0.5 + 0.5 * sin(x * 0.9 + 400 * t); "
                         "vec3(0.9, 0.85, 0.8) * (0.35 + 0.65 * v)";
    for (double x : {0.0, 13.5, 77.25, 512.0}) {
        const auto v = at(marble, x, x * 0.7);
        ASSERT_EQ(v.components, 3);
        EXPECT_GE(v.values[0], 0.9f * 0.35f - 1e-6f);
        EXPECT_LE(v.values[0], 0.9f + 1e-6f);
        EXPECT_NEAR(v.values[1] / v.values[0], 0.85f / 0.9f, 1e-6f);
    }
    const char* spot = "d = distance(vec2(x, y), vec2(w, h) / 2) / w; 1 - smoothstep(0.1, 0.4, d)";
    EXPECT_EQ(at(spot, 50.0, 100.0).values[0], 1.0f);
    EXPECT_EQ(at(spot, 50.0, 150.0).values[0], 0.0f) << "d = 0.5";
    EXPECT_NEAR(at(spot, 50.0, 125.0).values[0], 0.5f, 1e-6) << "d = 0.25, halfway";
}

} // namespace

namespace {

// Fractal noise runs octave by octave across a span, each lane with its own octave count; every lane must
// still be exactly the shared function's value.
TEST(ExpressionExecution, FractalNoiseSpansMatchTheSharedFunction) {
    Table table;
    const auto c = Compile(table, "fbm(x / 9, y / 9, 1 + fract(x / 17) * 12)");
    ASSERT_TRUE(c.code);
    auto info = Ep::ExecuteInfo::Create(table.constants);
    auto session = Ep::ByteCode::Session::CreateForThread(c.code, info);
    for (int n : {Ep::Lanes, 7}) {
        for (int lane = 0; lane < Ep::Lanes; ++lane) {
            table.x->GetLanes()[lane] = static_cast<float>(lane) * 5.3f - 40.0f;
            table.y->GetLanes()[lane] = static_cast<float>(lane) * -2.1f + 3.0f;
        }
        ASSERT_TRUE(session->ExecuteSpan(n));
        for (int lane = 0; lane < n; ++lane) {
            using namespace Kernel::ExpressionMath;
            const float x = table.x->GetLanes()[lane], y = table.y->GetLanes()[lane];
            const float expected = ex_fbm(x / 9.0f, y / 9.0f, 1.0f + ex_fract(x / 17.0f) * 12.0f);
            EXPECT_EQ(session->GetResultLanes(0)[lane], expected) << "lane " << lane << " of " << n;
        }
    }
}

} // namespace

namespace {

// The AVX2 build of every operation gives the bits of the portable build (both round as the kernel text).
TEST(ExpressionExecution, Avx2AndPortableBuildsAgree) {
    Table table;
    auto info = Ep::ExecuteInfo::Create(table.constants);
    const char* texts[] = {
        "sin(x / 7) + cos(y / 3) * tan(x / 50)", "exp(x / 40) + log(abs(y) + 1) + pow(abs(x), 0.3)",
        "atan2(y, x) + asin(x / 400) + acos(y / 400) + hypot(x, y)",
        "noise(x / 5, y / 5) + fbm(x / 30, y / 30, 1 + fract(y / 11) * 12) + rand(x, y)",
        "round(x / 3) + fract(y / 3) + x % 7 + smoothstep(-9, 9, y) + sign(x) * sqrt(abs(y))"};
    for (const char* text : texts) {
        const auto c = Compile(table, text);
        ASSERT_TRUE(c.code) << text;
        for (int lane = 0; lane < Ep::Lanes; ++lane) {
            table.x->GetLanes()[lane] = static_cast<float>(lane) * 13.7f - 200.0f;
            table.y->GetLanes()[lane] = static_cast<float>(lane * lane) * 0.41f - 150.0f;
        }
        std::vector<float> results[2];
        for (int simd = 0; simd < 2; ++simd) {
            Kernel::SetSimdEnabled(simd == 1);
            auto session = Ep::ByteCode::Session::CreateForThread(c.code, info);
            ASSERT_TRUE(session->ExecuteSpan(Ep::Lanes));
            results[simd].assign(session->GetResultLanes(0), session->GetResultLanes(0) + Ep::Lanes);
        }
        Kernel::SetSimdEnabled(true);
        EXPECT_EQ(std::memcmp(results[0].data(), results[1].data(), Ep::Lanes * sizeof(float)), 0) << text;
    }
}

} // namespace
