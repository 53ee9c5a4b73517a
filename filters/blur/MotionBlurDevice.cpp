// The motion blur's device steps. Every value is a function of intermediate coordinates alone, as on the
// processor: the device works out the whole box where the processor works out only the rows it reads, and
// both give the same pixels in every tiling.
#include "filters/blur/MotionBlurDevice.h"

#include "filters/blur/BlurKernelText.h"
#include "filters/blur/BlurMath.h"
#include "pipeline/DeviceSteps.h"

#include <string>

namespace RasterTools::MotionBlurDevice {

namespace {

// The rotation table's doubles, by index: the processor's enum and the kernel text's constants are both made
// from this list.
#define RT_TURN_INDICES(X)                                                                                   \
    X(TurnCosine, 0)                                                                                         \
    X(TurnSine, 1)                                                                                           \
    X(TurnPivotX, 2)                                                                                         \
    X(TurnPivotY, 3)                                                                                         \
    X(TurnCount, 4)
enum TurnIndex : int {
#define RT_TURN_ENUMERATOR(name, value) name = value,
    RT_TURN_INDICES(RT_TURN_ENUMERATOR)
#undef RT_TURN_ENUMERATOR
};

std::string TurnIndexText() {
    std::string text = "enum {";
#define RT_TURN_NAME(name, value) text += " " #name " = " #value ",";
    RT_TURN_INDICES(RT_TURN_NAME)
#undef RT_TURN_NAME
    text.back() = ' ';
    return text + "};\n";
}

constexpr const char* StepsText = R"(
// Pixel b of the rows of line j that a buffer holds from row first on, rows to a line.
inline rt_index rt_line_pixel(int j, int rows, int first, int b) {
    return ((rt_index)j * rows + (b - first)) * RT_N;
}

// Step 1: the source resampled along the rotated lines. Work item (r, j) is row q0 + r of line j0 + j.
KERNEL(motion_blur_resample_in)(GLOBAL const T* source, int sourceWidth, int sourceHeight, GLOBAL T* rotated,
                                GLOBAL const double* plan, int q0, int rows, int j0, int lines) {
    const int r = GLOBAL_X, j = GLOBAL_Y;
    if (r >= rows || j >= lines) return;
    double x, y;
    rt_turn_in(plan[TurnCosine], plan[TurnSine], plan[TurnPivotX], plan[TurnPivotY], j0 + j, q0 + r, &x, &y);
    T value[RT_N];
    rt_sample_bilinear(source, 0, 0, sourceWidth, sourceHeight, 1, sourceWidth, x, y, value);
    GLOBAL T* to = rotated + rt_line_pixel(j, rows, q0, q0 + r);
    for (int k = 0; k < RT_N; ++k)
        to[k] = value[k];
}

// Step 2: the running box sum down each line, one segment of period rows per work item (k, j). Float sums
// begin afresh at every multiple of period, as the processor's do; integer sums are exact wherever they
// begin.
KERNEL(motion_blur_lines)(GLOBAL const T* rotated, int q0, int rowsIn, GLOBAL T* blurred, int r0, int r1,
                          int lines, int s0, int period, int segments, int whole, float fraction,
                          float weight) {
    const int k = GLOBAL_X, j = GLOBAL_Y;
    if (k >= segments || j >= lines) return;
    const int segment = s0 + k * period;
#if RT_KIND == 2
    const int start = segment;
#else
    const int start = segment > r0 ? segment : r0;
#endif
    const int end = segment + period < r1 ? segment + period : r1;
    const int rowsOut = r1 - r0;
    ACC sum[RT_N];
    for (int c = 0; c < RT_N; ++c)
        sum[c] = 0;
    for (int m = start - whole; m <= start + whole; ++m)
        rt_accumulate(sum, rotated + rt_line_pixel(j, rowsIn, q0, m));
    const float inverse = 1.0f / weight;
    for (int b = start; b < end; ++b) {
        if (b != start) {
            rt_accumulate(sum, rotated + rt_line_pixel(j, rowsIn, q0, b + whole));
            rt_remove(sum, rotated + rt_line_pixel(j, rowsIn, q0, b - whole - 1));
        }
        if (b < r0) continue;
        float total[RT_N];
        for (int c = 0; c < RT_N; ++c)
            total[c] = (float)sum[c];
        if (fraction > 0.0f) {
            ACC outer[RT_N];
            for (int c = 0; c < RT_N; ++c)
                outer[c] = 0;
            rt_accumulate(outer, rotated + rt_line_pixel(j, rowsIn, q0, b - whole - 1));
            rt_accumulate(outer, rotated + rt_line_pixel(j, rowsIn, q0, b + whole + 1));
            for (int c = 0; c < RT_N; ++c)
                total[c] += fraction * (float)outer[c];
        }
        rt_resolve(total, inverse, blurred + rt_line_pixel(j, rowsOut, r0, b));
    }
}

// Step 3: the blurred lines resampled back through the inverse rotation into the rectangle, through the
// mask and the channel write mask; with copy (a box of one row), the source itself. Work item (x, y) is
// pixel (left + x, top + y).
KERNEL(motion_blur_resample_out)(GLOBAL const T* blurred, int j0, int lines, int r0, int rows,
                                 GLOBAL const T* source, GLOBAL T* dest, int width, GLOBAL const uchar* mask,
                                 int maskWidth, int hasMask, GLOBAL const double* plan, int left, int top,
                                 int rectWidth, int rectHeight, int channelMask, int copy) {
    const int gx = GLOBAL_X, gy = GLOBAL_Y;
    if (gx >= rectWidth || gy >= rectHeight) return;
    const int x = left + gx, y = top + gy;
    const rt_index at = ((rt_index)y * width + x) * RT_N;
    T value[RT_N];
    if (copy) {
        for (int k = 0; k < RT_N; ++k)
            value[k] = source[at + k];
    } else {
        double sx, sy;
        rt_turn_out(plan[TurnCosine], plan[TurnSine], plan[TurnPivotX], plan[TurnPivotY], x, y, &sx, &sy);
        rt_sample_bilinear(blurred, j0, r0, lines, rows, rows, 1, sx, sy, value);
    }
    rt_write_masked(value, source + at, hasMask ? (int)mask[(rt_index)y * maskWidth + x] : 255, channelMask,
                    dest + at);
}
)";

struct Kernels {
    DeviceKernelText resampleIn, lines, resampleOut;
};

Kernels Build(Raster::HardwareKernelLanguage language, Raster::PixelFormat format) {
    const std::string text = Blur::PixelsKernelText(language, format) + "\n" + Blur::GetBlurTurnText() +
                             "\n" + TurnIndexText() + StepsText;
    return {
        {text, "motion_blur_resample_in"}, {text, "motion_blur_lines"}, {text, "motion_blur_resample_out"}};
}

DeviceKernelTable<Kernels> Programs(Build);

} // namespace

std::vector<DeviceKernelText> GetKernelTexts(Raster::HardwareKernelLanguage language,
                                             Raster::PixelFormat format) {
    const Kernels kernels = Build(language, format);
    return {kernels.resampleIn, kernels.lines, kernels.resampleOut};
}

bool KernelsReady(const RenderTarget& target, bool wait) {
    const Kernels* kernels = Programs.Find(target);
    return kernels && DeviceKernelsReady(target.device.Get(),
                                         {&kernels->resampleIn, &kernels->lines, &kernels->resampleOut}, wait,
                                         target.abort);
}

bool Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const MotionBlurRender::Plan& plan) {
    if (!Raster::ShouldExecuteKernel(rect) || !KernelsReady(target, false)) return false;
    const Kernels& kernels = *Programs.Find(target);
    const Raster::PixelFormat format = target.destination.pixels->GetFormat();
    const bool floats = Raster::IsFloatFormat(format);

    // Lines j0.. of the box, its rows r0..r1 blurred; the rotated samples reach beyond them by the blur's
    // reach, and float sums back to the restart before r0.
    const int j0 = plan.box.left, lines = plan.box.Width();
    const int r0 = plan.box.top, r1 = plan.box.bottom;
    const int reach = plan.Reach();
    const int period = floats ? MotionBlurRender::RestartPeriod(plan.whole) : 64;
    const int s0 = r0 - MotionBlurRender::FloorMod(r0, period);
    const int segments = (r1 - s0 + period - 1) / period;
    const int q0 = (floats ? s0 : r0) - reach;
    const int rowsIn = r1 + reach - q0;
    const float weight = float(double(2 * plan.whole + 1) + 2.0 * double(plan.fraction));

    DeviceSteps steps(target, rect);
    if (!steps) return false;
    double turn[TurnCount];
    turn[TurnCosine] = plan.cosine;
    turn[TurnSine] = plan.sine;
    turn[TurnPivotX] = plan.pivotX;
    turn[TurnPivotY] = plan.pivotY;
    const auto turnTable = steps.Table(turn, TurnCount);
    if (!turnTable) return false;
    const Raster::DynamicBuffer& source = *target.source.pixels;

    // A box of one row is the source itself; the resample out copies it.
    const bool copy = plan.whole == 0 && plan.fraction == 0.0f;
    Kernel::Counted<Raster::HardwareBuffer> blurred = turnTable;
    if (!copy) {
        const int bytes = Raster::GetBytesPerPixel(format);
        const auto rotated = steps.Scratch(rowsIn, lines, bytes);
        blurred = steps.Scratch(r1 - r0, lines, bytes);
        if (!rotated || !blurred) return false;

        Raster::HardwareKernelArguments in;
        in.AddBuffer(steps.Source()).AddInt(source.GetWidth()).AddInt(source.GetHeight()).AddBuffer(rotated);
        in.AddBuffer(turnTable).AddInt(q0).AddInt(rowsIn).AddInt(j0).AddInt(lines);
        if (!steps.Run(kernels.resampleIn, rowsIn, lines, in)) return false;

        Raster::HardwareKernelArguments along;
        along.AddBuffer(rotated).AddInt(q0).AddInt(rowsIn).AddBuffer(blurred).AddInt(r0).AddInt(r1);
        along.AddInt(lines).AddInt(s0).AddInt(period).AddInt(segments).AddInt(plan.whole);
        along.AddFloat(plan.fraction).AddFloat(weight);
        if (!steps.Run(kernels.lines, segments, lines, along)) return false;
    }

    const int maskWidth = target.mask ? target.mask.pixels->GetWidth() : 0;
    Raster::HardwareKernelArguments out;
    out.AddBuffer(blurred).AddInt(j0).AddInt(lines).AddInt(r0).AddInt(r1 - r0);
    out.AddBuffer(steps.Source()).AddBuffer(steps.Destination()).AddInt(source.GetWidth());
    out.AddBuffer(steps.Mask()).AddInt(maskWidth).AddInt(target.mask ? 1 : 0).AddBuffer(turnTable);
    out.AddInt(rect.left).AddInt(rect.top).AddInt(rect.Width()).AddInt(rect.Height());
    out.AddInt(target.channelMask).AddInt(copy ? 1 : 0);
    return steps.Run(kernels.resampleOut, rect.Width(), rect.Height(), out) && steps.Finish();
}

} // namespace RasterTools::MotionBlurDevice
