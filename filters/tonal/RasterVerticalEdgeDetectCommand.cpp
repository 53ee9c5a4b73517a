#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"

#include "frame/Registration.h"

namespace RasterTools {

const Kernel::ClassProperties RasterVerticalEdgeDetectCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RVEd"), &RasterVerticalEdgeDetectCommand::CreateObject, 1,
    RasterVerticalEdgeDetectCommand::__GetDefaultSerialisation(), &RasterCommand::GetTypeClassProperties());

namespace {
const FilterRegistration<VerticalEdgeDetectFilter> kRegistration;

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

} // namespace RasterTools
