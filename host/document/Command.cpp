#include "host/document/Command.h"

#include "host/document/Document.h"

#include <algorithm>

using namespace Kernel::Literals;

SelectionCommandBase::SelectionCommandBase() = default;
SelectionCommandBase::~SelectionCommandBase() = default;

void SelectionCommandBase::SetSelection(const std::vector<Kernel::Counted<Node>>& selection) {
    m_Selection.clear();
    for (const auto& node : selection)
        if (node)
            m_Selection.push_back(
                {node->GetId(), dynamic_cast<const FilterRasterNode*>(node.Get()) != nullptr});
}

bool SelectionCommandBase::IsSelectionEqualTo(const SelectionCommandBase* command,
                                              const std::vector<SelectedNode>& selection) {
    if (!command || command->m_Selection.size() != selection.size()) return false;
    auto ids = [](const std::vector<SelectedNode>& nodes) {
        std::vector<std::uint64_t> result;
        for (const auto& node : nodes)
            result.push_back(node.id);
        std::sort(result.begin(), result.end());
        return result;
    };
    return ids(command->m_Selection) == ids(selection);
}

// Abstract bases take part in the class hierarchy but cannot be created from a stream.
const Kernel::ClassProperties RasterCommand::ms_ClassProperties(0, nullptr, 1, nullptr, nullptr);
const Kernel::ClassProperties
    RasterDevicePreviewableCommand::ms_ClassProperties(0, nullptr, 1, nullptr,
                                                       &RasterCommand::GetTypeClassProperties());
const Kernel::ClassProperties RasterDevicePreviewableFilterLayerCommand::ms_ClassProperties(
    0, nullptr, 1, nullptr, &RasterDevicePreviewableCommand::GetTypeClassProperties());

void RasterCommand::Save(Kernel::OutSerialiser&) const {}

bool RasterCommand::Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) {
    return in.IsValid();
}

void RasterDevicePreviewableFilterLayerCommand::Save(Kernel::OutSerialiser& out) const {
    out.SaveType("Live"_4cc, m_LiveEffect);
    RasterDevicePreviewableCommand::Save(out);
}

bool RasterDevicePreviewableFilterLayerCommand::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store,
                                                     unsigned short version) {
    in.LoadType("Live"_4cc, m_LiveEffect);
    return RasterDevicePreviewableCommand::Load(in, store, version);
}

Kernel::Counted<Kernel::Countable> RasterDevicePreviewableFilterLayerCommand::GetRenderCache() const {
    std::lock_guard lock(m_CacheMutex);
    return m_RenderCache;
}

void RasterDevicePreviewableFilterLayerCommand::SetRenderCache(Kernel::Counted<Kernel::Countable> cache) {
    Kernel::Counted<Kernel::Countable> previous;
    {
        std::lock_guard lock(m_CacheMutex);
        previous = std::exchange(m_RenderCache, std::move(cache));
    }
    // previous is released outside the lock: its destructor may be arbitrary.
}

Kernel::LocalisedString PreviewCommand::GetDescription() const {
    return m_Command ? m_Command->GetDescription()
                     : Kernel::LocalisedString("Preview", "Command description");
}

CommandCoverage& CommandCoverage::Instance() {
    static CommandCoverage instance;
    return instance;
}

void CommandCoverage::Register(const std::type_info& type, std::string name) {
    std::lock_guard lock(m_Mutex);
    m_Entries.push_back({&type, std::move(name)});
}

std::vector<CommandCoverage::Entry> CommandCoverage::GetEntries() const {
    std::lock_guard lock(m_Mutex);
    return m_Entries;
}

bool CommandCoverage::Contains(const std::string& name) const {
    std::lock_guard lock(m_Mutex);
    return std::any_of(m_Entries.begin(), m_Entries.end(), [&](const Entry& e) { return e.name == name; });
}
