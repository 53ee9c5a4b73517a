#pragma once
// The twirl tool: a drag places the twirl's centre; the angle and radius come from the panel.

#include "filters/distort/CentredTool.h"
#include "filters/distort/Twirl.h"

namespace RasterTools {

class TwirlTool final : public CentredTool<TwirlFilter> {
public:
    explicit TwirlTool(Kernel::NonCounted<DocumentController> controller);

    double GetTwirl() const noexcept { return m_Params.angle; }
    void SetTwirl(double angle) noexcept { m_Params.angle = angle; }
    double GetRadius() const noexcept { return m_Params.radius; }
    void SetRadius(double radius) noexcept { m_Params.radius = radius; }
};

} // namespace RasterTools
