#pragma once
// The host's brush engine: turns a pointer stroke (points with pressure) into nozzles, one per dab.

#include "host/brush/RasterBrush.h"

#include <vector>

namespace Raster {

class BrushEngine {
public:
    // A stroke stops producing dabs beyond this many, so that a hostile stroke cannot exhaust memory.
    static constexpr std::size_t kMaxNozzlesPerStroke = std::size_t(1) << 18;
    // Points are held within this distance of the origin.
    static constexpr double kCoordinateLimit = double(1 << 24);

    void SetRasterBrush(Kernel::Counted<RasterBrush> brush) { m_Brush = std::move(brush); }
    const Kernel::Counted<RasterBrush>& GetRasterBrush() const noexcept { return m_Brush; }
    // 1: dabs sit on whole pixels and successive dabs touch (an 8-connected line of dabs); 0: dabs sit at
    // the stroke's own positions, spaced by the brush's spacing times its size.
    void SetPixelMode(int mode) noexcept { m_PixelMode = mode; }
    int GetPixelMode() const noexcept { return m_PixelMode; }
    // Mirror symmetry about the vertical line x = axis: every dab gets its mirror image.
    void SetSymmetry(bool enabled, double axis = 0.0) noexcept;
    bool HasSymmetry() const noexcept { return m_Symmetry; }
    // The opacity, strength and mode of the dabs to come.
    void SetDabSettings(float opacity, float strength, int mode) noexcept;

    void BeginStroke(Kernel::PointT<double> point, double pressure = 1.0);
    void StrokeTo(Kernel::PointT<double> point, double pressure = 1.0);
    bool IsStroking() const noexcept { return m_Stroking; }
    void EndStroke() noexcept { m_Stroking = false; }
    // The dabs made since the last call (a segment of the stroke).
    std::vector<BrushNozzle> TakeNozzles();
    // The bounds of every dab of the current stroke so far, in document coordinates.
    Kernel::RectT<double> GetStrokeBounds() const noexcept { return m_Bounds; }

private:
    void AddDab(Kernel::PointT<double> centre, double pressure);
    void AddNozzle(const BrushNozzle& nozzle);
    double GetDabSide() const noexcept;

    Kernel::Counted<RasterBrush> m_Brush;
    int m_PixelMode = 0;
    bool m_Symmetry = false;
    double m_Axis = 0.0;
    float m_Opacity = 1.0f;
    float m_Strength = 1.0f;
    int m_Mode = 0;

    bool m_Stroking = false;
    Kernel::PointT<double> m_Last;
    double m_LastPressure = 1.0;
    double m_Travelled = 0.0; // distance since the last dab, outside pixel mode
    std::size_t m_StrokeNozzles = 0;
    Kernel::RectT<double> m_Bounds;
    std::vector<BrushNozzle> m_Pending;
};

} // namespace Raster
