#pragma once
// The Voronoi tool: a drag sets the cell size (its length in document units), a click clears it.

#include "filters/lighting/Voronoi.h"
#include "frame/FilterTool.h"

namespace RasterTools {

class VoronoiTool final : public FilterTool<VoronoiFilter> {
public:
    explicit VoronoiTool(Kernel::NonCounted<DocumentController> controller);

    double GetSize() const noexcept { return m_Params.size; }
    void SetSize(double size) noexcept { m_Params.size = size; }
    double GetLineWidth() const noexcept { return m_Params.lineWidth; }
    void SetLineWidth(double lineWidth) noexcept { m_Params.lineWidth = lineWidth; }

    // The end of a drag sets the size like every step of it.
    void OnEndDrag(const ToolPointSpread& point) override;
};

} // namespace RasterTools
