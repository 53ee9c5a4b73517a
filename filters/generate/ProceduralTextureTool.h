#pragma once
// The procedural texture tool: edits the equations, inputs and origin of a texture with its own undo
// history, whole-config presets and input presets, and previews the command after every change.

#include "filters/generate/ProceduralTextureCommand.h"
#include "host/document/Tool.h"

#include <string>
#include <vector>

namespace RasterTools {

class ProceduralTextureTool final : public FilterLayerEffectTool {
public:
    using Config = ProceduralTextureConfig;

    // What one history item restores.
    struct State {
        Config::Handle config;
        Kernel::Counted<const ExpressionConstantValues> values;
        Kernel::PointT<double> origin{};
        int inputsPreset = -1;
    };
    // The labels of the editing steps, in the context "Procedural Texture tool history item".
    enum HistoryMessage : int {
        ResetToEmpty = 0,
        AddEquationMessage,
        DeleteEquationMessage,
        ChangeEquation,
        ChangeEquationChannelMask,
        AddInput,
        DeleteInput,
        RenameInput,
        ChangeInputDescription,
        ChangeInputRangeMinimum,
        ChangeInputRangeMaximum,
        ChangeInputValue,
        ApplyPresetMessage,
        ApplyInputsPreset,
        UseDegrees,
        UseRadians,
    };
    static constexpr int HistoryMessageCount = 16;
    static const char* GetHistoryLabel(int message);

    static void CreateTool(Kernel::NonCounted<DocumentController> controller);
    explicit ProceduralTextureTool(Kernel::NonCounted<DocumentController> controller);

    const State& GetState() const noexcept { return m_State; }
    ProceduralTextureConfigProperty& GetConfigProperty() noexcept { return m_Property; }

    // Editing; each returns false when nothing changed.
    bool AddEquation();
    bool DeleteEquation(std::size_t index);
    bool ReplaceEquation(std::size_t index, const ProceduralTextureEquation& equation, bool maskOnly);
    bool SetAnglesInRadians(bool radians);
    // The inputs (names, kinds, ranges) replaced, labelled by message.
    bool ReplaceConstantSet(Kernel::Counted<const ExpressionConstantSet> set, HistoryMessage message);
    // One input's value; pushHistory false while a slider is still moving.
    bool SetConstantValue(std::size_t index, ExpressionConstantValue value, bool pushHistory);
    bool ConstantValueChanged(bool pushHistory);
    bool CaptureConstantSet(int message);
    bool ApplyPreset(const ProceduralTextureConfigProperty& property);
    bool BeginBlank();
    bool SetOrigin(Kernel::PointT<double> origin, bool pushHistory);

    // Input presets, kept in the config property.
    bool AddInputsPreset(const std::string& name);
    bool ReplaceInputsPreset(int index);
    bool DeleteInputsPreset();
    bool RenameInputsPreset(const std::string& name);
    bool SelectInputsPreset(int index);
    bool CanAddInputsPreset() const { return m_Property.HasConstants(); }
    bool CanReplaceInputsPreset() const { return m_State.inputsPreset >= 0; }
    bool CanDeleteInputsPreset() const { return m_State.inputsPreset >= 0; }
    bool CanRenameInputsPreset() const { return m_State.inputsPreset >= 0; }
    int GetCurrentInputsPresetIndex() const { return m_State.inputsPreset; }
    std::string GetInputsPresetDisplayString() const;

    // Whole-config presets: "Default" then the starter set.
    static const std::vector<std::pair<std::string, ProceduralTextureConfigProperty>>& GetPresets();
    Kernel::Counted<ProceduralTextureConfigProperty> CreatePresetProperty() const;
    bool ApplyPresetProperty(const Kernel::Serialisable& property);
    static bool PropertyIsCompatible(const Kernel::Serialisable& property);
    static const char* GetPresetsFilter() { return "Procedural texture presets"; }
    std::string GetPresetDisplayString() const;

    // History.
    bool CanUndo() const { return m_HistoryIndex > 0; }
    bool CanRedo() const { return m_HistoryIndex + 1 < int(m_History.size()); }
    bool Undo();
    bool Redo();
    int GetHistoryIndex() const { return m_HistoryIndex; }
    bool SetHistoryIndex(int index);
    int GetNumberOfHistoryStates() const { return int(m_History.size()); }
    std::string GetHistoryDescription(int index) const;
    std::string GetUndoDescription() const { return CanUndo() ? GetHistoryDescription(m_HistoryIndex) : ""; }
    std::string GetRedoDescription() const {
        return CanRedo() ? GetHistoryDescription(m_HistoryIndex + 1) : "";
    }

    // Tool.
    void Start(Kernel::Counted<Tool> previousTool) override;
    ToolID GetToolID() const override { return ToolID::ProceduralTexture; }
    void UpdateHintline() override;
    void UpdateCursor() override { ChangeCursor(85, 1.0f, CursorHotSpot{}, 0); }
    bool OnClicked(const ToolPointSpread& point, const Raster::AffineTransform::Params& view) override;
    void OnBeginDrag(const ToolPointSpread& point) override;
    void OnDrag(const ToolPointSpread& point) override;
    void OnEndDrag(const ToolPointSpread& point) override;
    bool OnDoubleClicked(const ToolPointSpread& point);
    bool AutoCommitIfRequired(bool userInitiated) override;
    void Commit() override;
    void Preview(bool final) override;
    void Reset() override;
    Kernel::ReflectedList EnumerateReflecteds() override;

private:
    struct HistoryItem {
        State state;
        std::string label;
    };
    // Makes state current, records it under label and previews.
    void Push(State state, std::string label);
    void Restore(int index);
    void Changed();
    Kernel::Counted<Command> MakeCommand() const;
    Kernel::Counted<ProceduralTextureCommand> FindSelectedLiveFilter() const;

    State m_State;
    ProceduralTextureConfigProperty m_Property;
    std::vector<HistoryItem> m_History;
    int m_HistoryIndex = -1;
    bool m_OriginMoved = false;
};

} // namespace RasterTools
