#include "host/brush/BrushEngine.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>

namespace Raster {

namespace {
Kernel::PointT<double> Limit(Kernel::PointT<double> p) {
    return {std::clamp(p.x, -BrushEngine::kCoordinateLimit, BrushEngine::kCoordinateLimit),
            std::clamp(p.y, -BrushEngine::kCoordinateLimit, BrushEngine::kCoordinateLimit)};
}
double LimitPressure(double pressure) {
    return std::isnan(pressure) ? 1.0 : std::clamp(pressure, 0.0, 1.0);
}
} // namespace

void BrushEngine::SetSymmetry(bool enabled, double axis) noexcept {
    m_Symmetry = enabled && std::isfinite(axis);
    m_Axis = m_Symmetry ? std::clamp(axis, -kCoordinateLimit, kCoordinateLimit) : 0.0;
}

void BrushEngine::SetDabSettings(float opacity, float strength, int mode) noexcept {
    m_Opacity = std::isnan(opacity) ? 1.0f : std::clamp(opacity, 0.0f, 1.0f);
    m_Strength = std::isnan(strength) ? 1.0f : std::clamp(strength, 0.0f, 1.0f);
    m_Mode = mode;
}

double BrushEngine::GetDabSide() const noexcept {
    const double size = m_Brush ? m_Brush->GetSize() : 1.0;
    // Pixel-mode dabs are whole pixels wide.
    return m_PixelMode == 1 ? std::max(1.0, std::round(size)) : size;
}

void BrushEngine::AddNozzle(const BrushNozzle& nozzle) {
    if (m_StrokeNozzles >= kMaxNozzlesPerStroke) return;
    ++m_StrokeNozzles;
    if (m_Bounds.IsEmpty())
        m_Bounds = nozzle.rect;
    else
        m_Bounds = {std::min(m_Bounds.left, nozzle.rect.left), std::min(m_Bounds.top, nozzle.rect.top),
                    std::max(m_Bounds.right, nozzle.rect.right),
                    std::max(m_Bounds.bottom, nozzle.rect.bottom)};
    m_Pending.push_back(nozzle);
}

void BrushEngine::AddDab(Kernel::PointT<double> centre, double pressure) {
    BrushNozzle nozzle;
    const double side = GetDabSide();
    if (m_PixelMode == 1) {
        // centre is a pixel's top-left corner; odd sides centre on it, even ones extend right and down.
        const double left = centre.x - std::floor((side - 1.0) / 2.0);
        const double top = centre.y - std::floor((side - 1.0) / 2.0);
        nozzle.rect = {left, top, left + side, top + side};
    } else {
        nozzle.rect = {centre.x - side / 2.0, centre.y - side / 2.0, centre.x + side / 2.0,
                       centre.y + side / 2.0};
    }
    nozzle.opacity = m_Opacity;
    nozzle.strength = m_Strength;
    nozzle.mode = m_Mode;
    nozzle.pressure = float(pressure);
    AddNozzle(nozzle);
    if (m_Symmetry) {
        BrushNozzle mirror = nozzle;
        mirror.rect.left = 2.0 * m_Axis - nozzle.rect.right;
        mirror.rect.right = 2.0 * m_Axis - nozzle.rect.left;
        if (mirror.rect != nozzle.rect) AddNozzle(mirror);
    }
}

void BrushEngine::BeginStroke(Kernel::PointT<double> point, double pressure) {
    if (std::isnan(point.x) || std::isnan(point.y)) return;
    point = Limit(point);
    pressure = LimitPressure(pressure);
    m_Stroking = true;
    m_StrokeNozzles = 0;
    m_Bounds = {};
    m_Travelled = 0.0;
    if (m_PixelMode == 1) point = {std::floor(point.x), std::floor(point.y)};
    m_Last = point;
    m_LastPressure = pressure;
    AddDab(point, pressure);
}

void BrushEngine::StrokeTo(Kernel::PointT<double> point, double pressure) {
    if (!m_Stroking) return BeginStroke(point, pressure);
    if (std::isnan(point.x) || std::isnan(point.y)) return;
    point = Limit(point);
    pressure = LimitPressure(pressure);
    if (m_PixelMode == 1) {
        // An 8-connected line from the last dab's pixel: every step moves at most one pixel on each axis.
        const long long x0 = (long long)m_Last.x, y0 = (long long)m_Last.y;
        const long long x1 = (long long)std::floor(point.x), y1 = (long long)std::floor(point.y);
        const long long dx = std::llabs(x1 - x0), dy = -std::llabs(y1 - y0);
        const long long sx = x0 < x1 ? 1 : -1, sy = y0 < y1 ? 1 : -1;
        const long long steps = std::max(dx, -dy);
        long long error = dx + dy, x = x0, y = y0;
        for (long long i = 1; i <= steps && m_StrokeNozzles < kMaxNozzlesPerStroke; ++i) {
            const long long twice = 2 * error;
            if (twice >= dy) {
                error += dy;
                x += sx;
            }
            if (twice <= dx) {
                error += dx;
                y += sy;
            }
            const double t = double(i) / double(steps);
            AddDab({double(x), double(y)}, m_LastPressure + (pressure - m_LastPressure) * t);
        }
        m_Last = {double(x1), double(y1)};
        m_LastPressure = pressure;
        return;
    }
    const double spacing = std::max(0.5, GetDabSide() * (m_Brush ? m_Brush->GetSpacing() : 0.25));
    const double length = std::hypot(point.x - m_Last.x, point.y - m_Last.y);
    double along = spacing - m_Travelled;
    for (; along <= length && m_StrokeNozzles < kMaxNozzlesPerStroke; along += spacing) {
        const double t = along / length;
        AddDab({m_Last.x + (point.x - m_Last.x) * t, m_Last.y + (point.y - m_Last.y) * t},
               m_LastPressure + (pressure - m_LastPressure) * t);
    }
    m_Travelled = length - (along - spacing);
    m_Last = point;
    m_LastPressure = pressure;
}

std::vector<BrushNozzle> BrushEngine::TakeNozzles() {
    return std::exchange(m_Pending, {});
}

} // namespace Raster
