#pragma once
// The motion blur's processor render of one rectangle: the geometry the command works out once, and the
// per-format routine (instantiated in instances/, one file per layer format).

#include "host/kernel/Geometry.h"
#include "host/raster/PixelFormat.h"
#include "pipeline/Pipeline.h"

#include <vector>

namespace RasterTools::MotionBlurRender {

// Rotating by theta about a fixed pivot turns the motion onto the columns of an intermediate image, where
// the blur runs: intermediate = R (source - pivot) + pivot with R = [cos, sin; -sin, cos].
struct Plan {
    double cosine = 1.0;
    double sine = 0.0;
    double pivotX = 0.0; // whole numbers, so that quarter turns map pixel centres onto pixel centres
    double pivotY = 0.0;
    int whole = 0;          // rows of weight 1 on each side of a pixel
    float fraction = 0.0f;  // weight of the row beyond them (0: the running-sum blur alone)
    Kernel::RectT<int> box; // the blurred rows in intermediate pixels that the resample out reads
    int Reach() const noexcept { return whole + (fraction > 0.0f ? 1 : 0); }
};

// Float sums round, so a running sum's value at a row would depend on where it began: float windows are
// summed afresh at every multiple of this many intermediate rows, which makes each row's value the same in
// every tiling. Integer sums are exact and need no restart.
inline int RestartPeriod(int whole) noexcept {
    return 64 * ((2 * whole + 1 + 63) / 64);
}

// Non-negative remainder of value by period.
inline int FloorMod(int value, int period) noexcept {
    const int r = value % period;
    return r < 0 ? r + period : r;
}

// The enclosing whole-pixel rectangle of rect (pixel edges) under the rotation of plan, with a tolerance of
// 1e-6 so that edges that land on whole numbers stay there.
Kernel::RectT<int> RotatedBounds(const Kernel::RectT<int>& rect, double cosine, double sine, double pivotX,
                                 double pivotY) noexcept;

// The rows of the blurred intermediate image (rows of plan.box, from 0) that the resample out of rect reads
// in each column of the box: [first, last), empty where it reads none. Worked out from the parallelogram
// that rect's pixel centres turn into, with a row to spare on each side for rounding.
struct RowRange {
    int first = 0;
    int last = 0;
};
std::vector<RowRange> NeededRows(const Kernel::RectT<int>& rect, const Plan& plan);

// Renders rect of the target's destination (same format as its source). Processor, Aborted, or Failed when
// the scratch buffers cannot be had.
template <Raster::PixelFormat F>
RenderPath Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const Plan& plan);

#define RT_DECLARE_MOTION_BLUR(FORMAT)                                                                       \
    extern template RenderPath Run<Raster::PixelFormat::FORMAT>(const RenderTarget&,                         \
                                                                const Kernel::RectT<int>&, const Plan&);
RT_DECLARE_MOTION_BLUR(RGBA8)
RT_DECLARE_MOTION_BLUR(RGBA16)
RT_DECLARE_MOTION_BLUR(RGBAUF)
RT_DECLARE_MOTION_BLUR(IA8)
RT_DECLARE_MOTION_BLUR(IA16)
RT_DECLARE_MOTION_BLUR(CMYKA8)
RT_DECLARE_MOTION_BLUR(LabA16)
#undef RT_DECLARE_MOTION_BLUR

} // namespace RasterTools::MotionBlurRender
