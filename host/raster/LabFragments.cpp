#include "host/raster/LabFragments.h"

#include "host/raster/ICCManager.h"
#include "host/raster/PixelFormat.h"

#include <array>
#include <charconv>
#include <string>

namespace Raster {

namespace {

namespace Space = WorkingColourSpace;

using Vector = std::array<double, 3>;
using Matrix = std::array<Vector, 3>;

Matrix Multiply(const Matrix& a, const Matrix& b) {
    Matrix m{};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            for (int k = 0; k < 3; ++k)
                m[i][j] += a[i][k] * b[k][j];
    return m;
}

Vector Apply(const Matrix& m, const Vector& v) {
    Vector r{};
    for (int i = 0; i < 3; ++i)
        r[i] = m[i][0] * v[0] + m[i][1] * v[1] + m[i][2] * v[2];
    return r;
}

Matrix Inverse(const Matrix& m) {
    const double c00 = m[1][1] * m[2][2] - m[1][2] * m[2][1];
    const double c01 = m[1][2] * m[2][0] - m[1][0] * m[2][2];
    const double c02 = m[1][0] * m[2][1] - m[1][1] * m[2][0];
    const double det = m[0][0] * c00 + m[0][1] * c01 + m[0][2] * c02;
    return {{
        {c00 / det, (m[0][2] * m[2][1] - m[0][1] * m[2][2]) / det,
         (m[0][1] * m[1][2] - m[0][2] * m[1][1]) / det},
        {c01 / det, (m[0][0] * m[2][2] - m[0][2] * m[2][0]) / det,
         (m[0][2] * m[1][0] - m[0][0] * m[1][2]) / det},
        {c02 / det, (m[0][1] * m[2][0] - m[0][0] * m[2][1]) / det,
         (m[0][0] * m[1][1] - m[0][1] * m[1][0]) / det},
    }};
}

Vector XYZFromChromaticity(double x, double y) {
    return {x / y, 1.0, (1.0 - x - y) / y};
}

// Linear working RGB to XYZ relative to the Lab white: the primaries scaled so that RGB 1 is the D65 white,
// then Bradford-adapted to D50. ICCManager's profile is built from the same constants by lcms2, which follows
// the same steps.
Matrix LinearRGBToXYZ() {
    const Vector r = XYZFromChromaticity(Space::RedX, Space::RedY);
    const Vector g = XYZFromChromaticity(Space::GreenX, Space::GreenY);
    const Vector b = XYZFromChromaticity(Space::BlueX, Space::BlueY);
    const Vector white = XYZFromChromaticity(Space::WhiteX, Space::WhiteY);
    const Matrix primaries{{{r[0], g[0], b[0]}, {r[1], g[1], b[1]}, {r[2], g[2], b[2]}}};
    const Vector scale = Apply(Inverse(primaries), white);
    Matrix toXYZ{};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            toXYZ[i][j] = primaries[i][j] * scale[j];

    Matrix bradford{};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            bradford[i][j] = Space::Bradford[i][j];
    const Vector from = Apply(bradford, white);
    const Vector to = Apply(bradford, {Space::LabWhiteX, Space::LabWhiteY, Space::LabWhiteZ});
    const Matrix gain{
        {{to[0] / from[0], 0.0, 0.0}, {0.0, to[1] / from[1], 0.0}, {0.0, 0.0, to[2] / from[2]}}};
    const Matrix adapt = Multiply(Inverse(bradford), Multiply(gain, bradford));
    return Multiply(adapt, toXYZ);
}

// A double rounded to the nearest float and written as a float literal that reads back as exactly that float.
std::string Literal(double value) {
    char text[64];
    const auto result = std::to_chars(text, text + sizeof text, static_cast<float>(value));
    std::string literal(text, result.ptr);
    if (literal.find_first_of(".e") == std::string::npos) literal += ".0";
    return literal + "f";
}

// "c0 * v0 + c1 * v1 + c2 * v2" with the signs folded into the operators.
std::string Row(const Vector& coefficients, const char* v0, const char* v1, const char* v2) {
    const char* names[3] = {v0, v1, v2};
    std::string text;
    for (int i = 0; i < 3; ++i) {
        const double c = coefficients[i];
        if (i == 0)
            text += (c < 0.0 ? "-" : "");
        else
            text += (c < 0.0 ? " - " : " + ");
        text += Literal(c < 0.0 ? -c : c) + " * " + names[i];
    }
    return text;
}

// The arithmetic on scalars, the same text for both languages: only rt_lab_pow and rt_lab_cbrt differ, and
// each language's prelude defines them. Written for float evaluation; no step relies on contraction.
std::string SharedBody() {
    const Matrix toXYZ = LinearRGBToXYZ();
    const Vector white{Space::LabWhiteX, Space::LabWhiteY, Space::LabWhiteZ};
    // Rows divided by the white give X/Xn, Y/Yn, Z/Zn directly; the inverse takes them back.
    Matrix toRelative = toXYZ;
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            toRelative[i][j] /= white[i];
    const Matrix fromRelative = Inverse(toRelative);

    const double a = 1.0 / (1.0 + Space::Offset), b = Space::Offset / (1.0 + Space::Offset);
    const double linearBreak = Space::Break / Space::LinearSlope;
    const double epsilon = (24.0 / 116.0) * (24.0 / 116.0) * (24.0 / 116.0);
    const double neutral = LabA16Encoding::OpponentNeutral / 65535.0;
    // Stored a/65535 to a*/500 and b/65535 to b*/200, and back.
    const double aScale = 65535.0 / LabA16Encoding::OpponentScale / 500.0;
    const double bScale = 65535.0 / LabA16Encoding::OpponentScale / 200.0;

    std::string t;
    t += "typedef struct { float c0; float c1; float c2; } rt_lab_triple;\n\n";
    t += "float rt_lab_clamp01(float v)\n{\n    return v > 0.0f ? (v < 1.0f ? v : 1.0f) : 0.0f;\n}\n\n";
    // The sRGB curve, continued linearly below the break and as a power above 1.
    t += "float rt_lab_decode(float v)\n{\n    return v >= " + Literal(Space::Break) + " ? rt_lab_pow(v * " +
         Literal(a) + " + " + Literal(b) + ", " + Literal(Space::Gamma) + ") : v * " +
         Literal(1.0 / Space::LinearSlope) + ";\n}\n\n";
    t += "float rt_lab_encode(float v)\n{\n    return v >= " + Literal(linearBreak) + " ? rt_lab_pow(v, " +
         Literal(1.0 / Space::Gamma) + ") * " + Literal(1.0 + Space::Offset) + " - " +
         Literal(Space::Offset) + " : v * " + Literal(Space::LinearSlope) + ";\n}\n\n";
    // CIE f(t) and its inverse, linear near zero (and so for negative values too).
    t += "float rt_lab_f(float t)\n{\n    return t > " + Literal(epsilon) + " ? rt_lab_cbrt(t) : t * " +
         Literal(841.0 / 108.0) + " + " + Literal(16.0 / 116.0) + ";\n}\n\n";
    t += "float rt_lab_finv(float t)\n{\n    return t > " + Literal(24.0 / 116.0) + " ? t * t * t : (t - " +
         Literal(16.0 / 116.0) + ") * " + Literal(108.0 / 841.0) + ";\n}\n\n";

    // Working RGB to L, a, b as stored / 65535, clamped to what LabA16 holds.
    t += "rt_lab_triple rt_lab_from_rgb(float r, float g, float b)\n{\n";
    t += "    const float lr = rt_lab_decode(r);\n    const float lg = rt_lab_decode(g);\n"
         "    const float lb = rt_lab_decode(b);\n";
    t += "    const float fx = rt_lab_f(" + Row(toRelative[0], "lr", "lg", "lb") + ");\n";
    t += "    const float fy = rt_lab_f(" + Row(toRelative[1], "lr", "lg", "lb") + ");\n";
    t += "    const float fz = rt_lab_f(" + Row(toRelative[2], "lr", "lg", "lb") + ");\n";
    t += "    rt_lab_triple lab;\n";
    t +=
        "    lab.c0 = rt_lab_clamp01(fy * " + Literal(116.0 / 100.0) + " - " + Literal(16.0 / 100.0) + ");\n";
    t += "    lab.c1 = rt_lab_clamp01((fx - fy) * " + Literal(1.0 / aScale) + " + " + Literal(neutral) +
         ");\n";
    t += "    lab.c2 = rt_lab_clamp01((fy - fz) * " + Literal(1.0 / bScale) + " + " + Literal(neutral) +
         ");\n";
    t += "    return lab;\n}\n\n";

    // L, a, b as stored / 65535 to working RGB, unbounded. The neutral literal is the same float that
    // 32768 / 65535 rounds to, so a neutral stored value gives exactly zero chroma.
    t += "rt_lab_triple rt_lab_to_rgb(float l, float a, float b)\n{\n";
    t += "    const float fy = l * " + Literal(100.0 / 116.0) + " + " + Literal(16.0 / 116.0) + ";\n";
    t += "    const float fx = fy + (a - " + Literal(neutral) + ") * " + Literal(aScale) + ";\n";
    t += "    const float fz = fy - (b - " + Literal(neutral) + ") * " + Literal(bScale) + ";\n";
    t += "    const float x = rt_lab_finv(fx);\n    const float y = rt_lab_finv(fy);\n"
         "    const float z = rt_lab_finv(fz);\n";
    t += "    rt_lab_triple rgb;\n";
    t += "    rgb.c0 = rt_lab_encode(" + Row(fromRelative[0], "x", "y", "z") + ");\n";
    t += "    rgb.c1 = rt_lab_encode(" + Row(fromRelative[1], "x", "y", "z") + ");\n";
    t += "    rgb.c2 = rt_lab_encode(" + Row(fromRelative[2], "x", "y", "z") + ");\n";
    t += "    return rgb;\n}\n\n";
    return t;
}

std::string OpenCLText() {
    std::string t = "\n// Lab conversions (working RGB: sRGB-encoded, D65; Lab: D50)\n";
    t += "float rt_lab_pow(float x, float y)\n{\n    return pow(x, y);\n}\n\n";
    t += "float rt_lab_cbrt(float x)\n{\n    return cbrt(x);\n}\n\n";
    t += SharedBody();
    t += "float4 labaf_to_rgbauf(float4 lab)\n{\n"
         "    const rt_lab_triple rgb = rt_lab_to_rgb(lab.x, lab.y, lab.z);\n"
         "    return (float4)(rgb.c0, rgb.c1, rgb.c2, lab.w);\n}\n\n";
    t += "float4 rgbauf_to_labaf(float4 rgb)\n{\n"
         "    const rt_lab_triple lab = rt_lab_from_rgb(rgb.x, rgb.y, rgb.z);\n"
         "    return (float4)(lab.c0, lab.c1, lab.c2, rt_lab_clamp01(rgb.w));\n}\n\n";
    return t;
}

// Plain C++: NVRTC compiles it as device code, and the tests compile it on the host.
std::string CppText() {
    std::string t = "\n// Lab conversions (working RGB: sRGB-encoded, D65; Lab: D50)\n";
    t += "float rt_lab_pow(float x, float y)\n{\n    return powf(x, y);\n}\n\n";
    t += "float rt_lab_cbrt(float x)\n{\n    return cbrtf(x);\n}\n\n";
    t += SharedBody();
    t += "float4 labaf_to_rgbauf(float4 lab)\n{\n"
         "    const rt_lab_triple rgb = rt_lab_to_rgb(lab.x, lab.y, lab.z);\n"
         "    float4 result;\n"
         "    result.x = rgb.c0;\n    result.y = rgb.c1;\n    result.z = rgb.c2;\n    result.w = lab.w;\n"
         "    return result;\n}\n\n";
    t += "float4 rgbauf_to_labaf(float4 rgb)\n{\n"
         "    const rt_lab_triple lab = rt_lab_from_rgb(rgb.x, rgb.y, rgb.z);\n"
         "    float4 result;\n"
         "    result.x = lab.c0;\n    result.y = lab.c1;\n    result.z = lab.c2;\n"
         "    result.w = rt_lab_clamp01(rgb.w);\n"
         "    return result;\n}\n\n";
    return t;
}

} // namespace

const char* GetLabConversionFragment(int language) {
    switch (language) {
    case 0: {
        static const std::string text = CppText();
        return text.c_str();
    }
    case 1: {
        static const std::string text = OpenCLText();
        return text.c_str();
    }
    default:
        return nullptr;
    }
}

} // namespace Raster
