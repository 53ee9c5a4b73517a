#pragma once
// The host's brush commands: a stroke's nozzles run against the selected layers, one per-nozzle step at a
// time, kept in history with exactly the pixels the stroke changed.

#include "host/brush/RasterBrush.h"
#include "host/document/Command.h"
#include "host/document/RasterInterface.h"

#include <cstdint>
#include <vector>

// A command that paints a stroke: its nozzles, the brush they were made with, and what the tool told it.
class RasterBrushCommand : public RasterCommand {
public:
    // Loading refuses more nozzles than a stroke can have.
    static constexpr std::size_t kMaxNozzles = std::size_t(1) << 20;
    // Nozzle coordinates beyond this are held to it before rounding.
    static constexpr double kCoordinateLimit = double(1 << 30);

    // What GenerateCommand hands over besides the nozzles.
    struct StrokeInfo {
        bool generated = false;         // the bool passed to GenerateCommand
        std::uint8_t flags[2] = {0, 0}; // the brush tool's flag bytes
        Kernel::RectT<double> rect;     // the stroke's bounds
        double extra = 0.0;             // the brush size the stroke was made with
    };

    RasterBrushCommand() = default;
    RasterBrushCommand(std::vector<Raster::BrushNozzle> nozzles, const StrokeInfo& info,
                       Kernel::Counted<Raster::RasterBrush> brush);

    const std::vector<Raster::BrushNozzle>& GetNozzles() const noexcept { return m_Nozzles; }
    const StrokeInfo& GetStrokeInfo() const noexcept { return m_Info; }
    const Kernel::Counted<Raster::RasterBrush>& GetBrush() const noexcept { return m_Brush; }
    // A finished command is done with; copying it yields nothing.
    bool IsFinished() const noexcept { return m_Finished; }
    void SetFinished(bool finished) noexcept { m_Finished = finished; }

    // The per-dab step. The nozzle comes with its target, its rect in target pixels (clipped to the target)
    // and its coverage (limited by the document's pixel selection).
    virtual void PerformNozzle(Raster::BrushNozzle& nozzle) const = 0;
    // A new command of the same class and content; null when finished.
    virtual Kernel::Counted<RasterBrushCommand> Copy() const = 0;

    Kernel::Counted<DocumentCommand> Clone() const override;
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

protected:
    // Called before PerformNozzle for each nozzle, with the raster it targets.
    virtual void PrepareNozzle(Raster::BrushNozzle& nozzle, const MutableRasterInterface& raster) const {
        (void)nozzle, (void)raster;
    }
    // Copies the stroke (nozzles, info, brush) into a new command of a subclass.
    void CopyStrokeInto(RasterBrushCommand& other) const;

private:
    std::vector<Raster::BrushNozzle> m_Nozzles;
    StrokeInfo m_Info;
    Kernel::Counted<Raster::RasterBrush> m_Brush;
    bool m_Finished = false;
    static const Kernel::ClassProperties ms_ClassProperties;
};

// The host's base of brush commands that paint colour.
class RasterPaintBrushCommand : public RasterBrushCommand {
public:
    using RasterBrushCommand::RasterBrushCommand;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }
    // The host paint command's own properties: the number of dabs, read only.
    Kernel::ReflectedList EnumerateReflecteds() override;

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

// The nozzle rect rounded to whole pixels (half away from zero) and cut to a width × height target; empty
// when nothing is left or a coordinate is not a number.
Kernel::RectT<int> RoundNozzleRect(const Kernel::RectT<double>& rect, int width, int height);
