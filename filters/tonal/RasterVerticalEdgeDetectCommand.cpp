#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"

#include "filters/tonal/EdgeDetectStages.h"
#include "frame/Registration.h"

namespace RasterTools {

const Kernel::ClassProperties RasterVerticalEdgeDetectCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RVEd"), &RasterVerticalEdgeDetectCommand::CreateObject, 1,
    RasterVerticalEdgeDetectCommand::__GetDefaultSerialisation(), &RasterCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterVerticalEdgeDetectCommand> kRegistration("RasterVerticalEdgeDetectCommand");

// Calls f with the stages for the target's format, with or without a mask; Failed for another format.
template <class Function>
RenderPath WithStages(const RenderTarget& target, Function&& f) {
    if (!target.source) return RenderPath::Failed;
    RenderPath path = RenderPath::Failed;
    LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        path = target.mask ? f(EdgeDetectStages::Masked<F>{}) : f(EdgeDetectStages::Plain<F>{});
        return true;
    });
    return path;
}

} // namespace

RasterVerticalEdgeDetectCommand::RasterVerticalEdgeDetectCommand(bool,
                                                                 const VerticalEdgeDetectParameters& params)
    : m_Params(params) {}

Kernel::LocalisedString RasterVerticalEdgeDetectCommand::GetDescription() const {
    return Kernel::LocalisedString(std::string(VerticalEdgeDetectFilter::kDescription),
                                   "Command description");
}

Kernel::Counted<DocumentCommand> RasterVerticalEdgeDetectCommand::Clone() const {
    return Kernel::Counted<DocumentCommand>(new RasterVerticalEdgeDetectCommand(false, m_Params));
}

Kernel::Counted<Kernel::Serialisable> RasterVerticalEdgeDetectCommand::CreateObject() {
    return Kernel::Counted<Kernel::Serialisable>(new RasterVerticalEdgeDetectCommand());
}

const Kernel::ClassPropertiesBase::DefaultItem* RasterVerticalEdgeDetectCommand::__GetDefaultSerialisation() {
    static const Kernel::ClassPropertiesBase::DefaultItem items[] = {{}};
    return items;
}

RenderPath RasterVerticalEdgeDetectCommand::Render(const RenderTarget& target) const {
    return WithStages(target, [&](auto stages) {
        return RasterTools::Render<decltype(stages)>(target, typename decltype(stages)::Params{});
    });
}

bool RasterVerticalEdgeDetectCommand::PrepareDevice(const RenderTarget& target) const {
    return WithStages(target, [&](auto stages) {
               return WaitForKernel<decltype(stages)>(target) ? RenderPath::Device : RenderPath::Failed;
           }) == RenderPath::Device;
}

Kernel::RectT<int>
RasterVerticalEdgeDetectCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    if (!raster) return {};
    return RenderDirectly(*raster);
}

} // namespace RasterTools
