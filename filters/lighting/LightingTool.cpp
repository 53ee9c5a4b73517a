#include "filters/lighting/LightingTool.h"

#include "filters/lighting/RasterLightingCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<LightingTool> kRegistration;
}

LightingTool::LightingTool(Kernel::NonCounted<DocumentController> controller)
    : CentredTool(controller) {}

void LightingTool::Changed() {
    BoundParameters(m_Params, LightingFilter::kParameters);
    PostParametersChanged();
    Preview(false);
}

void LightingTool::SetAmbient(double ambient) {
    m_Params.ambient = ambient;
    Changed();
}

void LightingTool::SetDiffuse(double diffuse) {
    m_Params.diffuse = diffuse;
    Changed();
}

void LightingTool::SetSpecular(double specular) {
    m_Params.specular = specular;
    Changed();
}

void LightingTool::SetShininess(double shininess) {
    m_Params.shininess = shininess;
    Changed();
}

void LightingTool::SetDepth(double depth) {
    m_Params.depth = depth;
    Changed();
}

void LightingTool::SetBumpMapOpacity(double opacity) {
    m_Params.bumpOpacity = opacity;
    Changed();
}

} // namespace RasterTools
