#pragma once
// The pixel tool's painting command: every dab sets whole pixels to one solid colour.

#include "host/brush/RasterBrushCommand.h"
#include "host/renderer/Colour.h"

namespace RasterTools {

class RasterPixelBrushCommand final : public RasterPaintBrushCommand {
public:
    RasterPixelBrushCommand() = default;
    // documentFormat: the document's colour format when the stroke was made (DocumentController::GetFormat).
    RasterPixelBrushCommand(const Renderer::ConsolidatedColour& colour,
                            std::vector<Raster::BrushNozzle> nozzles, const StrokeInfo& info,
                            Kernel::Counted<Raster::RasterBrush> brush, int documentFormat = 0);

    static Kernel::Counted<Kernel::Serialisable> CreateObject();
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    const Renderer::ConsolidatedColour& GetColour() const noexcept { return m_Colour; }
    void SetColour(const Renderer::ConsolidatedColour& colour) noexcept { m_Colour = colour; }

    void PerformNozzle(Raster::BrushNozzle& nozzle) const override;
    Kernel::Counted<RasterBrushCommand> Copy() const override;
    Kernel::LocalisedString GetDescription() const override;
    ToolID GetAssociatedToolID() const override { return ToolID::Pixel; }
    Kernel::ReflectedList EnumerateReflecteds() override;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;

private:
    Renderer::ConsolidatedColour m_Colour{0.0f, 0.0f, 0.0f, 1.0f};
    int m_DocumentFormat = 0;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
