#include "filters/Catalogue.h"

#include <algorithm>

namespace RasterTools {

namespace {

// Filled by the filters' registration objects while the library loads; read once, when the catalogue is
// first built.
std::vector<FilterInfo (*)()>& Describers() {
    static std::vector<FilterInfo (*)()> describers;
    return describers;
}

} // namespace

void RegisterFilter(FilterInfo (*describe)()) {
    Describers().push_back(describe);
}

const std::vector<FilterInfo>& GetFilterCatalogue() {
    // Built on first use: the entries read class properties that other units initialise at load. The order
    // of registration follows the link order, so the catalogue is sorted by name.
    static const std::vector<FilterInfo> catalogue = [] {
        std::vector<FilterInfo> filters;
        for (auto* describe : Describers())
            filters.push_back(describe());
        std::sort(filters.begin(), filters.end(),
                  [](const FilterInfo& a, const FilterInfo& b) { return a.name < b.name; });
        return filters;
    }();
    return catalogue;
}

const FilterInfo* FindFilter(std::string_view name) {
    const auto& catalogue = GetFilterCatalogue();
    auto it =
        std::find_if(catalogue.begin(), catalogue.end(), [&](const FilterInfo& f) { return f.name == name; });
    return it == catalogue.end() ? nullptr : &*it;
}

const FilterInfo* FindFilter(ToolID tool) {
    const auto& catalogue = GetFilterCatalogue();
    auto it = std::find_if(catalogue.begin(), catalogue.end(),
                           [&](const FilterInfo& f) { return f.toolID == tool; });
    return it == catalogue.end() ? nullptr : &*it;
}

const FilterInfo* FindFilterOf(const Command& command) {
    for (const auto& info : GetFilterCatalogue())
        if (info.isCommand(command)) return &info;
    return nullptr;
}

} // namespace RasterTools
