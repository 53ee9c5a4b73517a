#pragma once
// The pixel tool: a hard-edged brush whose dabs set whole pixels, with an alternate behaviour (erase, paint
// with the other colour, restore from a snapshot) on the secondary modifier or a latch.

#include "host/brush/RasterBrushTool.h"
#include "host/document/DocumentController.h"

#include <cstdint>
#include <utility>
#include <vector>

namespace RasterTools {

class RasterPixelTool final : public RasterBrushTool {
public:
    enum AlternateMode : std::int32_t { Erase = 0, BackgroundColour = 1, UndoFromSnapshot = 2 };

    static void CreateTool(Kernel::NonCounted<DocumentController> controller);
    explicit RasterPixelTool(Kernel::NonCounted<DocumentController> controller);

    ToolID GetToolID() const override { return ToolID::Pixel; }
    void Start(Kernel::Counted<Tool> previousTool) override;
    bool AllowInstantColourPicking() const noexcept { return true; }
    bool SupportsSymmetry() const noexcept { return true; }
    bool AllowColourPicker() const noexcept;

    AlternateMode GetAlternateMode() const noexcept { return m_AlternateMode; }
    void SetAlternateMode(AlternateMode mode);
    static std::vector<std::pair<int, Kernel::LocalisedString>> GetAlternateModes();
    bool GetAlternateLatch() const noexcept { return m_AlternateLatch; }
    void SetAlternateLatch(bool latch) noexcept { m_AlternateLatch = latch; }

    // The colour of the selected colour context: foreground for the primary one, else background.
    Renderer::ConsolidatedColour GetColour() const;
    void SetColour(const Renderer::ConsolidatedColour& colour);
    // One pixel larger for a factor above 1, else one smaller, within 1..4096.
    void ChangeBrushSizeByFactor(double factor);

    Kernel::ReflectedList EnumerateReflecteds() override;
    Kernel::ReflectedList EnumerateQuickActions() override;
    void UpdateHintline() override;
    void OnMouseDown(const ToolPointSpread& point, const Raster::AffineTransform::Params& view) override;
    Kernel::Counted<Command> GenerateCommand(const std::vector<Raster::BrushNozzle>& nozzles, bool generated,
                                             bool final) override;

private:
    bool IsAlternateActive() const noexcept;

    AlternateMode m_AlternateMode = Erase;
    bool m_AlternateLatch = false;
};

} // namespace RasterTools
