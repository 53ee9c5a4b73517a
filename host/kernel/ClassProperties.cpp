#include "host/kernel/ClassProperties.h"

#include <cstdio>
#include <map>
#include <mutex>

namespace Kernel {

namespace {

struct Registry {
    std::mutex mutex;
    std::map<FourCC, const ClassProperties*> classes;
};

// Created on first use, so that classes in other shared libraries can register during their static
// initialisation whatever the order, and deliberately never destroyed, so that a ClassProperties destroyed
// late at exit (or when its library is unloaded) still finds it.
Registry& GetRegistry() {
    static Registry* const registry = new Registry();
    return *registry;
}

} // namespace

ClassProperties::ClassProperties(FourCC classCode, Factory factory, unsigned short version,
                                 const DefaultItem* defaults, const ClassProperties* base)
    : m_ClassCode(classCode)
    , m_Factory(factory)
    , m_Version(version)
    , m_Defaults(defaults)
    , m_Base(base) {
    if (classCode == 0) return; // an abstract base: identity only
    Registry& registry = GetRegistry();
    std::lock_guard lock(registry.mutex);
    const auto [it, inserted] = registry.classes.try_emplace(classCode, this);
    if (!inserted)
        std::fprintf(
            stderr,
            "Kernel::ClassProperties: class code '%s' (0x%08X) is already registered; keeping the first\n",
            FourCCToString(classCode).c_str(), unsigned(classCode));
}

ClassProperties::~ClassProperties() {
    if (m_ClassCode == 0) return;
    Registry& registry = GetRegistry();
    std::lock_guard lock(registry.mutex);
    // Only the registered one unregisters; a refused duplicate leaves the first in place.
    const auto it = registry.classes.find(m_ClassCode);
    if (it != registry.classes.end() && it->second == this) registry.classes.erase(it);
}

bool ClassProperties::IsKindOf(const ClassProperties& other) const noexcept {
    for (const ClassProperties* c = this; c; c = c->GetBase())
        if (c == &other) return true;
    return false;
}

const ClassProperties* ClassProperties::Find(FourCC classCode) {
    if (classCode == 0) return nullptr;
    Registry& registry = GetRegistry();
    std::lock_guard lock(registry.mutex);
    const auto it = registry.classes.find(classCode);
    return it == registry.classes.end() ? nullptr : it->second;
}

std::vector<const ClassProperties*> ClassProperties::GetRegistered() {
    Registry& registry = GetRegistry();
    std::lock_guard lock(registry.mutex);
    std::vector<const ClassProperties*> classes;
    classes.reserve(registry.classes.size());
    for (const auto& entry : registry.classes)
        classes.push_back(entry.second); // the map is sorted by code
    return classes;
}

} // namespace Kernel
