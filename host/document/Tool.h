#pragma once
// The tool hierarchy: what the host calls when the user works on the canvas with a tool.

#include "host/document/Command.h"
#include "host/document/ToolID.h"
#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/Notification.h"
#include "host/kernel/Reflection.h"
#include "host/kernel/Schedulable.h"
#include "host/raster/AffineTransform.h"

#include <cstddef>
#include <vector>

class DocumentController;

// A pointer position as the canvas reports it.
struct ToolPointSpread {
    Kernel::PointT<double> spread; // document (spread) coordinates
    Kernel::PointT<double> GetSpreadPoint() const noexcept { return spread; }
};

// Optional cursor bitmap data; empty means the cursor's own hot spot.
struct CursorHotSpot {
    std::vector<std::byte> data;
};

// Base of every tool. The default operations do nothing but keep the host informed.
class Tool : public virtual Kernel::Countable, public Kernel::Schedulable, public Kernel::Reflectable {
public:
    explicit Tool(Kernel::NonCounted<DocumentController> controller);

    virtual void Start(Kernel::Counted<Tool> previousTool);
    virtual bool AutoCommitIfRequired(bool userInitiated);
    virtual void OnNotify(Kernel::Counted<Kernel::Notification> notification);
    virtual ToolID GetToolID() const = 0;
    virtual void UpdateHintline() {}
    virtual void UpdateCursor() {}
    virtual bool OnClicked(const ToolPointSpread& point, const Raster::AffineTransform::Params& view);
    virtual void OnBeginDrag(const ToolPointSpread& point);
    virtual void OnDrag(const ToolPointSpread& point);
    virtual void OnEndDrag(const ToolPointSpread& point);
    virtual void Commit() {}
    virtual void Preview(bool final) { (void) final; }
    virtual void Reset() {}
    virtual void MouseEntered() {}
    virtual void MouseExited() {}
    virtual void OnCancel() {}

    bool IsDragging() const noexcept { return m_Dragging; }

protected:
    // Hands a command to the host; transient commands are shown, the others go to history.
    void EnqueueCommand(Kernel::Counted<Command> command, bool transient);
    void Notify(Kernel::Counted<Kernel::Notification> notification);
    // Keeps the controller alive for the caller's scope.
    Kernel::Counted<DocumentController> GetSafeDocumentController() const;
    Kernel::NonCounted<DocumentController> GetUnsafeDocumentController() const noexcept {
        return m_Controller;
    }
    void ChangeCursor(int cursor, float scale, const CursorHotSpot& hotSpot, int flags);
    void ChangeHintline(const Kernel::LocalisedString& hint, int flags);

private:
    Kernel::NonCounted<DocumentController> m_Controller;
    bool m_Dragging = false;
};

// A tool that produces an effect command and previews it while the user adjusts it.
class EffectTool : public Tool {
public:
    using Tool::Tool;

    void Start(Kernel::Counted<Tool> previousTool) override;
    void Commit() override;
    void OnNotify(Kernel::Counted<Kernel::Notification> notification) override;
    // Drops the preview and leaves any live-effect edit.
    void OnCancel() override;
    // True while the tool edits the filter of an existing live filter layer instead of pixels.
    bool GetEditingLiveEffect() const;
};

// An effect tool whose commands can also live as filter layers.
class FilterLayerEffectTool : public EffectTool {
public:
    using EffectTool::EffectTool;

    // Commits the current effect; the tool decides beforehand whether there is one.
    bool AutoCommitIfRequired(bool userInitiated) override;
    // The host's own properties of every filter tool, before the tool's.
    Kernel::ReflectedList EnumerateReflecteds() override;
};
