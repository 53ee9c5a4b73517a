#pragma once
// The host's brush-tool frame: a tool that collects pointer strokes through the brush engine and asks its
// subclass for the command that paints each finished segment.

#include "host/brush/BrushEngine.h"
#include "host/brush/RasterBrushCommand.h"
#include "host/document/Tool.h"
#include "host/document/VeyraController.h"
#include "host/renderer/Colour.h"

#include <cstdint>
#include <string>
#include <vector>

namespace Kernel {
// The modifier keys held at a moment.
struct KeyState {
    bool primary = false;
    bool secondary = false;
    bool tertiary = false;
    bool IsModifierDownPrimary() const noexcept { return primary; }
    bool IsModifierDownSecondary() const noexcept { return secondary; }
    bool IsModifierDownTertiary() const noexcept { return tertiary; }
};
} // namespace Kernel

// The assistant's answers on the settings store: what happens when a brush paints where there is nothing to
// paint on.
class AssistantOptions {
public:
    static constexpr const char* kEnableKey = "assistant.enabled";
    static constexpr const char* kNoSelectionKey = "assistant.paint_on_no_selection";
    static constexpr const char* kVectorSelectionKey = "assistant.paint_on_vector_selection";

    explicit AssistantOptions(VeyraController& settings)
        : m_Settings(settings) {}
    bool GetGlobalEnable() const { return m_Settings.GetBoolForKey(kEnableKey, true); }
    // 0: add a raster layer; anything else: do nothing.
    int GetPaintOnNoSelectionAction() const { return m_Settings.GetIntForKey(kNoSelectionKey, 0); }
    // 0: add a raster sub-layer; 1: rasterise the vector layer; anything else: do nothing.
    int GetPaintOnVectorSelectionAction() const { return m_Settings.GetIntForKey(kVectorSelectionKey, 0); }

private:
    VeyraController& m_Settings;
};

// What brush tools share beyond strokes: the brush panel's lock and its display.
class BrushToolHelper {
public:
    virtual ~BrushToolHelper() = default;
    bool IsBrushPanelLocked() const noexcept { return m_PanelLocked; }
    void SetBrushPanelLocked(bool locked) noexcept { m_PanelLocked = locked; }
    // How often the brush display was redrawn (panels redraw on each call).
    int GetBrushDisplayRefreshCount() const noexcept { return m_Refreshes; }

protected:
    void RefreshBrushDisplay() noexcept { ++m_Refreshes; }

private:
    bool m_PanelLocked = false;
    int m_Refreshes = 0;
};

class RasterBrushTool : public Tool, public BrushToolHelper {
public:
    // The tool's state: idle, painting a stroke, and two states in which the tool picks colours or moves
    // the brush cursor and must not paint or pick.
    enum State : int { Idle = 0, Painting = 1, PickingColour = 2, Adjusting = 3 };
    enum class AssistantStep { AddRasterLayer, AddRasterSubLayer, Rasterise };

    explicit RasterBrushTool(Kernel::NonCounted<DocumentController> controller);

    // The pointer pressed: runs the queued assistant steps. Subclasses queue steps first, then call this.
    virtual void OnMouseDown(const ToolPointSpread& point, const Raster::AffineTransform::Params& view);
    void OnBeginDrag(const ToolPointSpread& point) override;
    void OnDrag(const ToolPointSpread& point) override;
    void OnEndDrag(const ToolPointSpread& point) override;
    // A stroke through several points, pressed at the first and released at the last.
    void Stroke(const std::vector<Kernel::PointT<double>>& points);
    // The pressure of the points to come, 0..1.
    void SetPressure(double pressure) noexcept { m_Pressure = pressure; }

    // The command that paints a finished segment of nozzles; null paints nothing.
    virtual Kernel::Counted<Command> GenerateCommand(const std::vector<Raster::BrushNozzle>& nozzles,
                                                     bool generated, bool final) = 0;

    Kernel::KeyState GetKeyState() const noexcept { return m_Keys; }
    void SetKeyState(const Kernel::KeyState& keys) noexcept { m_Keys = keys; }
    int GetBrushToolState() const noexcept { return m_State; }
    void SetBrushToolState(int state) noexcept { m_State = state; }

    const Kernel::Counted<Raster::RasterBrush>& GetCurrentBrush() const noexcept { return m_Brush; }
    const Kernel::Counted<Raster::RasterBrush>& GetDefaultBrush() const noexcept { return m_DefaultBrush; }
    Raster::BrushEngine& GetBrushEngine() noexcept { return m_Engine; }
    // The brush-replacement operation: the brush becomes the current one, in the engine too.
    void ReplaceBrush(Kernel::Counted<Raster::RasterBrush> brush);

    // The host brush tool's properties: size, opacity, strength and dab mode.
    Kernel::ReflectedList EnumerateReflecteds() override;
    // The host's quick action: back to the default brush.
    Kernel::ReflectedList EnumerateQuickActions() override;

    const std::vector<AssistantStep>& GetQueuedAssistantSteps() const noexcept { return m_Assistant; }

protected:
    void SetCurrentBrush(Kernel::Counted<Raster::RasterBrush> brush) { m_Brush = std::move(brush); }
    void SetDefaultBrush(Kernel::Counted<Raster::RasterBrush> brush) { m_DefaultBrush = std::move(brush); }
    void EnqueueAssistantAddRasterLayer() { m_Assistant.push_back(AssistantStep::AddRasterLayer); }
    void EnqueueAssistantAddRasterSubLayer() { m_Assistant.push_back(AssistantStep::AddRasterSubLayer); }
    void EnqueueAssistantRasterise() { m_Assistant.push_back(AssistantStep::Rasterise); }
    // The tool's flag bytes and the stroke's bounds and brush size, for the commands it makes.
    RasterBrushCommand::StrokeInfo MakeStrokeInfo(bool generated) const;

private:
    void FinishSegment(bool final);
    void RunAssistantSteps();

    Raster::BrushEngine m_Engine;
    Kernel::Counted<Raster::RasterBrush> m_Brush;
    Kernel::Counted<Raster::RasterBrush> m_DefaultBrush;
    Kernel::KeyState m_Keys;
    int m_State = Idle;
    double m_Pressure = 1.0;
    float m_Opacity = 1.0f;
    float m_Strength = 1.0f;
    int m_DabMode = 0;
    std::uint8_t m_Flags[2] = {0, 0};
    std::vector<AssistantStep> m_Assistant;
};
