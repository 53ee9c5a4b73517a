// The Lab conversions as kernel text: each language's spelling of the four RT_LAB_ names, then the shared
// source. The constants of the source are checked here against their closed-form derivation.
#include "host/raster/LabFragments.h"

#include "host/raster/ICCManager.h"
#include "host/raster/KernelText.h"
#include "host/raster/LabMath.h"
#include "host/raster/PixelFormat.h"

#include <array>
#include <string>

namespace Raster {

namespace {

namespace Space = WorkingColourSpace;

using Vector = std::array<double, 3>;
using Matrix = std::array<Vector, 3>;

constexpr Matrix Multiply(const Matrix& a, const Matrix& b) {
    Matrix m{};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            for (int k = 0; k < 3; ++k)
                m[i][j] += a[i][k] * b[k][j];
    return m;
}

constexpr Vector Apply(const Matrix& m, const Vector& v) {
    Vector r{};
    for (int i = 0; i < 3; ++i)
        r[i] = m[i][0] * v[0] + m[i][1] * v[1] + m[i][2] * v[2];
    return r;
}

constexpr Matrix Inverse(const Matrix& m) {
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

constexpr Vector XYZFromChromaticity(double x, double y) {
    return {x / y, 1.0, (1.0 - x - y) / y};
}

// Linear working RGB to X/Xn, Y/Yn, Z/Zn of the Lab white: the primaries scaled so that RGB 1 is the D65
// white, Bradford-adapted to D50, each row divided by the D50 white.
constexpr Matrix LinearRGBToRelativeXYZ() {
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
    const Vector labWhite{Space::LabWhiteX, Space::LabWhiteY, Space::LabWhiteZ};
    const Vector from = Apply(bradford, white);
    const Vector to = Apply(bradford, labWhite);
    const Matrix gain{
        {{to[0] / from[0], 0.0, 0.0}, {0.0, to[1] / from[1], 0.0}, {0.0, 0.0, to[2] / from[2]}}};
    Matrix relative = Multiply(Multiply(Inverse(bradford), Multiply(gain, bradford)), toXYZ);
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            relative[i][j] /= labWhite[i];
    return relative;
}

constexpr Matrix ToRelative = LinearRGBToRelativeXYZ();
constexpr Matrix FromRelative = Inverse(ToRelative);

// The literals of RT_LAB_SOURCE's two matrices, each the float nearest its derivation.
constexpr bool Rounds(double exact, float literal) {
    return static_cast<float>(exact) == literal;
}
static_assert(Rounds(ToRelative[0][0], 0.45223114f) && Rounds(ToRelative[0][1], 0.39941186f) &&
              Rounds(ToRelative[0][2], 0.14835702f));
static_assert(Rounds(ToRelative[1][0], 0.22248454f) && Rounds(ToRelative[1][1], 0.71690506f) &&
              Rounds(ToRelative[1][2], 0.06061038f));
static_assert(Rounds(ToRelative[2][0], 0.016875f) && Rounds(ToRelative[2][1], 0.11767152f) &&
              Rounds(ToRelative[2][2], 0.8654535f));
static_assert(Rounds(FromRelative[0][0], 3.0219824f) && Rounds(FromRelative[0][1], -1.617209f) &&
              Rounds(FromRelative[0][2], -0.40477353f));
static_assert(Rounds(FromRelative[1][0], -0.9437093f) && Rounds(FromRelative[1][1], 1.9161301f) &&
              Rounds(FromRelative[1][2], 0.02757921f));
static_assert(Rounds(FromRelative[2][0], 0.06938762f) && Rounds(FromRelative[2][1], -0.22899388f) &&
              Rounds(FromRelative[2][2], 1.1596062f));

// The curve's and Lab's scalars.
constexpr double Gamma = Space::Gamma, Offset = Space::Offset, Slope = Space::LinearSlope;
static_assert(Rounds(1.0 / (1.0 + Offset), 0.9478673f) && Rounds(Offset / (1.0 + Offset), 0.0521327f));
static_assert(Rounds(Space::Break, 0.04045f) && Rounds(1.0 / Slope, 0.07739938f) && Rounds(Gamma, 2.4f));
static_assert(Rounds(Space::Break / Slope, 0.003130805f) && Rounds(1.0 / Gamma, 0.41666666f));
static_assert(Rounds(1.0 + Offset, 1.055f) && Rounds(Offset, 0.055f) && Rounds(Slope, 12.92f));
constexpr double Delta = 6.0 / 29.0;
static_assert(Rounds(Delta * Delta * Delta, 0.008856452f) && Rounds(1.0 / (3.0 * Delta * Delta), 7.787037f));
static_assert(Rounds(4.0 / 29.0, 0.13793103f) && Rounds(Delta, 0.20689656f) &&
              Rounds(3.0 * Delta * Delta, 0.12841855f) && Rounds(1.0 / 3.0, 0.33333334f));
// LabA16's scale as the traits hand it over: L / 100, and a or b as (value + 128) 256 / 65535.
constexpr double Neutral = LabA16Encoding::OpponentNeutral / 65535.0;
constexpr double AStep = LabA16Encoding::OpponentScale / 65535.0 * 500.0;
constexpr double BStep = LabA16Encoding::OpponentScale / 65535.0 * 200.0;
static_assert(LabA16Encoding::LightnessScale * 100.0 == 65535.0);
static_assert(Rounds(116.0 / 100.0, 1.16f) && Rounds(16.0 / 100.0, 0.16f) && Rounds(Neutral, 0.5000076f));
static_assert(Rounds(AStep, 1.9531548f) && Rounds(BStep, 0.7812619f));
static_assert(Rounds(100.0 / 116.0, 0.86206895f) && Rounds(1.0 / AStep, 0.5119922f) &&
              Rounds(1.0 / BStep, 1.2799804f));
static_assert(static_cast<float>(LabA16Encoding::OpponentNeutral) / 65535.0f == 0.5000076f,
              "a neutral stored value divided in float is the neutral literal");

std::string Text(HardwareKernelLanguage language) {
    std::string t = "\n// Lab conversions (working RGB: sRGB-encoded, D65; Lab: D50)\n";
    if (language == HardwareKernelLanguage::OpenCLC)
        t += "#define RT_LAB_FUNCTION inline\n#define RT_LAB_AS_INT(x) as_int(x)\n"
             "#define RT_LAB_AS_FLOAT(i) as_float(i)\n"
             "#define RT_LAB_FLOAT4(a, b, c, d) ((float4)((a), (b), (c), (d)))\n";
    else if (language == HardwareKernelLanguage::CudaCpp)
        t += "#define RT_LAB_FUNCTION inline\n#define RT_LAB_AS_INT(x) __float_as_int(x)\n"
             "#define RT_LAB_AS_FLOAT(i) __int_as_float(i)\n#define RT_LAB_FLOAT4 make_float4\n";
    else
        return {};
    t += LabMath::GetSourceText();
    t += "\n#undef RT_LAB_FLOAT4\n#undef RT_LAB_AS_FLOAT\n#undef RT_LAB_AS_INT\n#undef RT_LAB_FUNCTION\n";
    return t;
}

} // namespace

const char* LabMath::GetSourceText() {
    static const char* const text = RASTER_KERNEL_STRINGIFY(RT_LAB_SOURCE);
    return text;
}

const char* GetLabConversionFragment(int language) {
    switch (language) {
    case 0: {
        static const std::string text = Text(HardwareKernelLanguage::CudaCpp);
        return text.c_str();
    }
    case 1: {
        static const std::string text = Text(HardwareKernelLanguage::OpenCLC);
        return text.c_str();
    }
    default:
        return nullptr;
    }
}

} // namespace Raster
