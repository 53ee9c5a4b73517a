#pragma once
// The base of commands that render in one pass of the pixel pipeline. The command names its stage kinds
// (PlainStages<F> and MaskedStages<F>, one per layer format) and fills their parameter blocks
// (FillStageParams); this base renders them on the device or the processor, dispatches over the layer
// formats with and without a mask, applies the command directly, and answers the area questions when the
// command declares how far it reads (Margin).

#include "frame/FilterCommand.h"
#include "pipeline/PipelineCommand.h"

#include <cmath>
#include <type_traits>

namespace RasterTools {

// Command declares static double Margin(const Params&): a pixel reads neighbours up to that many pixels away.
template <class Command, class Params>
concept DeclaresMargin = requires(const Params& params) {
    { Command::Margin(params) } -> std::convertible_to<double>;
};

namespace Detail {

// PrepareOutputRectangle exists only on previewable commands: the written area grows by the margin,
// unrounded, and a single pass writes nothing else.
template <class Filter, class Base, bool = std::is_base_of_v<RasterDevicePreviewableCommand, Base>>
class SinglePassOutput : public Base {
public:
    using Base::Base;
};

template <class Filter, class Base>
class SinglePassOutput<Filter, Base, true> : public Base {
public:
    using Base::Base;
    bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const override {
        using Derived = typename Filter::Command;
        if constexpr (DeclaresMargin<Derived, typename Filter::Params>)
            rect = rect.Inflated(Derived::Margin(static_cast<const Derived&>(*this).GetParameters()));
        return true;
    }
};

} // namespace Detail

// Filter is the filter's table; Filter::Command derives from SinglePassCommand<Filter, Base> and provides:
//   template <Raster::PixelFormat F> using PlainStages = ...;  (and MaskedStages, the same with a mask)
//   template <class StageParams> void FillStageParams(StageParams&, const Kernel::RectT<double>& bounds,
//                                                     const Raster::AffineTransform::Params& view) const;
// Base is the host command base (FilterCommand<Filter> for filters with a parameter table and live layers).
template <class Filter, class Base = FilterCommand<Filter>>
class SinglePassCommand : public Detail::SinglePassOutput<Filter, Base>, public PipelineCommand {
    using Output = Detail::SinglePassOutput<Filter, Base>;

public:
    using Output::Output;

    // A declared margin grows every side, rounded up to whole pixels; otherwise the base's answer.
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override {
        if constexpr (DeclaresMargin<Derived, typename Filter::Params>)
            rect = rect.Inflated(std::ceil(Derived::Margin(Self().GetParameters())));
        else
            Base::PrepareInputRectangle(rect);
    }

    // Renders on the device or the processor, for every layer format (source and destination alike).
    RenderPath Render(const RenderTarget& target) const override {
        return WithStages(target, [&](auto stages) {
            using Stages = decltype(stages);
            typename Stages::Params params{};
            Self().FillStageParams(params, target.bounds, target.transform);
            return RasterTools::Render<Stages>(target, params);
        });
    }

    bool PrepareDevice(const RenderTarget& target) const override {
        return WithStages(target, [&](auto stages) {
                   return WaitForKernel<decltype(stages)>(target) ? RenderPath::Device : RenderPath::Failed;
               }) == RenderPath::Device;
    }

    // The whole raster (cut to the selection) on the processor.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override {
        if (!raster) return {};
        return RenderDirectly(*raster);
    }

protected:
    using Derived = typename Filter::Command;
    const Derived& Self() const noexcept { return static_cast<const Derived&>(*this); }

private:
    // Calls f with the stages for the target's format, with or without a mask; Failed for another format.
    template <class Function>
    static RenderPath WithStages(const RenderTarget& target, Function&& f) {
        if (!target.source) return RenderPath::Failed;
        RenderPath path = RenderPath::Failed;
        LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
            constexpr Raster::PixelFormat F = decltype(format)::value;
            path = target.mask ? f(typename Derived::template MaskedStages<F>{})
                               : f(typename Derived::template PlainStages<F>{});
            return true;
        });
        return path;
    }
};

} // namespace RasterTools
