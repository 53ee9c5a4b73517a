#pragma once
// Shared by the colour tests: pixel types, the sample grids, one-pixel calls into the colour manager, and a
// double-precision Lab reference written out from the defining formulas.

#include "host/raster/ICCManager.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <random>
#include <vector>

namespace ColourTest {

using LabPixel = std::array<std::uint16_t, 4>; // L, a, b, alpha as stored
using RGBPixel = std::array<float, 4>;         // working red, green, blue, alpha

inline LabPixel ToLab(RGBPixel rgb) {
    LabPixel lab{};
    Raster::ICCManager::GetInstance().DoRGBAFToLABA16Transform(
        reinterpret_cast<unsigned char*>(rgb.data()), reinterpret_cast<unsigned char*>(lab.data()), 1);
    return lab;
}

inline RGBPixel ToRGB(LabPixel lab) {
    RGBPixel rgb{};
    Raster::ICCManager::GetInstance().DoLABA16ToRGBAFTransform(
        reinterpret_cast<unsigned char*>(lab.data()), reinterpret_cast<unsigned char*>(rgb.data()), 1);
    return rgb;
}

// Largest difference between two stored pixels, over the colour channels or all four.
inline int MaxStepDifference(const LabPixel& x, const LabPixel& y, int channels = 4) {
    int worst = 0;
    for (int c = 0; c < channels; ++c)
        worst = std::max(worst, std::abs(int(x[c]) - int(y[c])));
    return worst;
}

// Stored values per channel: a coarse sweep plus the extremes, the values next to them, and the neutral
// point of a and b with its neighbours.
inline std::vector<std::uint16_t> Sweep(int step) {
    std::vector<std::uint16_t> values{0, 1, 2, 255, 256, 32767, 32768, 32769, 65279, 65280, 65534, 65535};
    for (int v = step; v < 65535; v += step)
        values.push_back(static_cast<std::uint16_t>(v));
    return values;
}

// Every combination of the sweeps, with alpha running through its own sequence.
inline std::vector<LabPixel> LabGrid(int lightnessStep = 1489, int opponentStep = 2731) {
    std::vector<LabPixel> grid;
    const auto lightness = Sweep(lightnessStep);
    const auto opponent = Sweep(opponentStep);
    std::uint16_t alpha = 0;
    for (auto l : lightness)
        for (auto a : opponent)
            for (auto b : opponent) {
                grid.push_back({l, a, b, alpha});
                alpha = static_cast<std::uint16_t>(alpha + 4099);
            }
    return grid;
}

// Working colours: a grid over -1 .. 4 with the curve's break points, and seeded random colours mostly
// inside 0..1 and some well outside it.
inline std::vector<RGBPixel> RGBGrid() {
    const float levels[] = {-1.0f, -0.5f, -0.2f, -0.01f, 0.0f, 0.002f, 0.0031308f, 0.01f, 0.04045f,
                            0.05f, 0.1f,  0.2f,  0.3f,   0.4f, 0.5f,   0.6f,       0.7f,  0.8f,
                            0.9f,  0.99f, 1.0f,  1.01f,  1.2f, 1.5f,   2.0f,       4.0f};
    std::vector<RGBPixel> grid;
    for (float r : levels)
        for (float g : levels)
            for (float b : levels)
                grid.push_back({r, g, b, 1.0f});
    std::mt19937 random(20240611);
    std::uniform_real_distribution<float> inside(0.0f, 1.0f), around(-0.6f, 1.6f);
    for (int i = 0; i < 20000; ++i) {
        auto& d = i % 4 == 0 ? around : inside;
        grid.push_back({d(random), d(random), d(random), inside(random)});
    }
    return grid;
}

// Working colours no conversion should ever see, and does: NaN, infinities, beyond the 2^20 limit, denormal.
inline std::vector<RGBPixel> HostileColours() {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    const float values[] = {nan, inf, -inf, 3e38f, -3e38f, 2e6f, 1048576.0f, -1048576.0f, 1e-40f, 0.5f};
    std::vector<RGBPixel> colours;
    for (float r : values)
        for (float g : values)
            for (float b : values)
                colours.push_back({r, g, b, g});
    return colours;
}

// The Lab conversion in double, worked from the defining formulas independently of the code under test:
// sRGB decoding, primaries and white to XYZ, Bradford adaptation D65 -> D50, CIE Lab.
struct LabReference {
    double toXYZ[3][3];

    // The published sRGB chromaticities, the D65 white, the ICC D50 white and the Bradford cone matrix,
    // written out here rather than taken from the code under test.
    static constexpr double White50[3] = {0.9642, 1.0, 0.8249};
    static constexpr double Bradford[3][3] = {
        {0.8951, 0.2664, -0.1614}, {-0.7502, 1.7135, 0.0367}, {0.0389, -0.0685, 1.0296}};

    LabReference() {
        const double xy[4][2] = {{0.64, 0.33}, {0.30, 0.60}, {0.15, 0.06}, {0.3127, 0.3290}};
        double xyz[4][3];
        for (int i = 0; i < 4; ++i) {
            xyz[i][0] = xy[i][0] / xy[i][1];
            xyz[i][1] = 1.0;
            xyz[i][2] = (1.0 - xy[i][0] - xy[i][1]) / xy[i][1];
        }
        // Scale of each primary so that the three add up to the white: Cramer's rule on P s = W.
        double p[3][3];
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c)
                p[r][c] = xyz[c][r];
        const double det = Determinant(p);
        double s[3];
        for (int c = 0; c < 3; ++c) {
            double q[3][3];
            for (int r = 0; r < 3; ++r)
                for (int k = 0; k < 3; ++k)
                    q[r][k] = k == c ? xyz[3][r] : p[r][k];
            s[c] = Determinant(q) / det;
        }
        // Bradford: cone responses of both whites, von Kries gains, back to XYZ.
        double from[3], to[3];
        for (int r = 0; r < 3; ++r) {
            from[r] = to[r] = 0.0;
            for (int k = 0; k < 3; ++k) {
                from[r] += Bradford[r][k] * xyz[3][k];
                to[r] += Bradford[r][k] * White50[k];
            }
        }
        double inverse[3][3];
        Invert(Bradford, inverse);
        double adapt[3][3];
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c) {
                adapt[r][c] = 0.0;
                for (int k = 0; k < 3; ++k)
                    adapt[r][c] += inverse[r][k] * (to[k] / from[k]) * Bradford[k][c];
            }
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c) {
                toXYZ[r][c] = 0.0;
                for (int k = 0; k < 3; ++k)
                    toXYZ[r][c] += adapt[r][k] * p[k][c] * s[c];
            }
    }

    static double Determinant(const double m[3][3]) {
        return m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
               m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
               m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]);
    }
    static void Invert(const double m[3][3], double out[3][3]) {
        const double det = Determinant(m);
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c) {
                // Cofactor of m[c][r], by cyclic indices.
                const int r1 = (c + 1) % 3, r2 = (c + 2) % 3, c1 = (r + 1) % 3, c2 = (r + 2) % 3;
                out[r][c] = (m[r1][c1] * m[r2][c2] - m[r1][c2] * m[r2][c1]) / det;
            }
    }

    static double Decode(double v) { return v >= 0.04045 ? std::pow((v + 0.055) / 1.055, 2.4) : v / 12.92; }
    static double F(double t) {
        const double e = 216.0 / 24389.0; // (6/29)^3
        return t > e ? std::cbrt(t) : (24389.0 / 27.0 * t + 16.0) / 116.0;
    }

    // L*, a*, b* of a working colour.
    std::array<double, 3> Lab(double r, double g, double b) const {
        const double lin[3] = {Decode(r), Decode(g), Decode(b)};
        double f[3];
        for (int i = 0; i < 3; ++i)
            f[i] = F((toXYZ[i][0] * lin[0] + toXYZ[i][1] * lin[1] + toXYZ[i][2] * lin[2]) / White50[i]);
        return {116.0 * f[1] - 16.0, 500.0 * (f[0] - f[1]), 200.0 * (f[1] - f[2])};
    }

    // The same as stored LabA16 values, unrounded: L * 65535/100 and a, b as (value + 128) * 256.
    std::array<double, 3> Stored(double r, double g, double b) const {
        const auto lab = Lab(r, g, b);
        return {lab[0] * 655.35, (lab[1] + 128.0) * 256.0, (lab[2] + 128.0) * 256.0};
    }
};

} // namespace ColourTest
