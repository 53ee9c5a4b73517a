#pragma once
// The command hierarchy: the serialisable, undoable records that history, documents and live layers keep.

#include "host/document/ToolID.h"
#include "host/kernel/ClassProperties.h"
#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/Reflection.h"
#include "host/kernel/Serialiser.h"
#include "host/kernel/String.h"

#include <cstdint>
#include <mutex>
#include <string>
#include <typeinfo>
#include <vector>

class Node;
class MutableRasterInterface;

// Anything the history can hold.
class Command : public virtual Kernel::Countable {
public:
    virtual Kernel::LocalisedString GetDescription() const = 0;
    // Folds other, enqueued right after this command, into this one; true when it did.
    virtual bool Merge(Kernel::Counted<const Command> other) { return (void)other, false; }
};

namespace DomainCommand {
// How the host shows progress for a command: 0 none, 1 indeterminate, 2 a fraction of the work.
enum class ProgressType : int { None = 0, Indeterminate = 1, Fraction = 2 };
} // namespace DomainCommand

// A command that acts on a document and can be copied.
class DocumentCommand : public Command {
public:
    virtual Kernel::Counted<DocumentCommand> Clone() const = 0;
    virtual DomainCommand::ProgressType GetProgressType() const { return DomainCommand::ProgressType::None; }
    virtual bool CanRepeat() const { return false; }
};

// A selected layer as a command remembers it: by identity, without keeping the layer alive (a live
// filter layer owns its command, so owning the layer back would make a cycle).
struct SelectedNode {
    std::uint64_t id = 0;
    bool isFilterLayer = false; // the layer is a live filter layer
    friend bool operator==(const SelectedNode&, const SelectedNode&) = default;
};

// The layers selected when a command was enqueued; the host sets it.
class SelectionCommandBase {
public:
    SelectionCommandBase();
    virtual ~SelectionCommandBase();

    void SetSelection(const std::vector<Kernel::Counted<Node>>& selection);
    const std::vector<SelectedNode>& GetSelection() const noexcept { return m_Selection; }
    bool HasSelection() const noexcept { return !m_Selection.empty(); }

    // True when both name the same layers, in any order.
    static bool IsSelectionEqualTo(const SelectionCommandBase* command,
                                   const std::vector<SelectedNode>& selection);

private:
    std::vector<SelectedNode> m_Selection;
};

// A command that changes the pixels of raster layers.
class RasterCommand : public DocumentCommand, public SelectionCommandBase, public Kernel::Serialisable {
public:
    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    virtual Kernel::ReflectedList EnumerateReflecteds() { return {}; }
    virtual ToolID GetAssociatedToolID() const { return ToolID::None; }
    virtual bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const { return false; }
    // Grows rect to the area read for the given output area.
    virtual void PrepareInputRectangle(Kernel::RectT<double>& rect) const { (void)rect; }
    virtual bool PrefersToProtectAlpha() const { return true; }
    virtual bool CanAffectAlpha() const { return true; }
    virtual bool CanRequireInflation() const { return true; }
    // Changes the raster's pixels directly, on the processor, and returns the rectangle it changed. The
    // host's default changes nothing.
    virtual Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
        return (void)raster, Kernel::RectT<int>{};
    }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

// A raster command that can render its preview on a compute device.
class RasterDevicePreviewableCommand : public RasterCommand {
public:
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    // Grows rect to the area written for the given input area; true when handled.
    virtual bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const { return (void)rect, false; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

// A previewable command that may also live as the filter of a live filter layer.
class RasterDevicePreviewableFilterLayerCommand : public RasterDevicePreviewableCommand {
public:
    explicit RasterDevicePreviewableFilterLayerCommand(bool liveEffect = false)
        : m_LiveEffect(liveEffect) {}

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    // True when the command is, or will become, the filter of a live filter layer.
    bool IsLiveEffect() const noexcept { return m_LiveEffect; }

    // The host's cached rendering of the live layer; Merge hands it over to the surviving command.
    Kernel::Counted<Kernel::Countable> GetRenderCache() const;
    void SetRenderCache(Kernel::Counted<Kernel::Countable> cache);

private:
    bool m_LiveEffect;
    mutable std::mutex m_CacheMutex;
    Kernel::Counted<Kernel::Countable> m_RenderCache;
    static const Kernel::ClassProperties ms_ClassProperties;
};

// Wraps a command that is shown as a transient preview rather than kept in history.
class PreviewCommand : public Command {
public:
    PreviewCommand(Kernel::Counted<Command> command, bool final, bool interactive)
        : m_Command(std::move(command))
        , m_Final(final)
        , m_Interactive(interactive) {}

    const Kernel::Counted<Command>& GetCommand() const noexcept { return m_Command; }
    bool IsFinal() const noexcept { return m_Final; }
    bool IsInteractive() const noexcept { return m_Interactive; }
    Kernel::LocalisedString GetDescription() const override;

private:
    Kernel::Counted<Command> m_Command;
    bool m_Final;
    bool m_Interactive;
};

// The list of command classes that a build offers, by type and by name.
class CommandCoverage {
public:
    struct Entry {
        const std::type_info* type;
        std::string name;
    };

    static CommandCoverage& Instance();
    void Register(const std::type_info& type, std::string name);
    std::vector<Entry> GetEntries() const;
    bool Contains(const std::string& name) const;

private:
    mutable std::mutex m_Mutex;
    std::vector<Entry> m_Entries;
};
