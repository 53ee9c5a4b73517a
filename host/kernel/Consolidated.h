#pragma once
// Consolidated<T>: a handle to an immutable value kept once per process, so that two handles of equal values
// point at the same object and pointer identity is value identity.

#include "host/kernel/Countable.h"

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <mutex>
#include <unordered_map>

namespace Kernel {

// T is Countable, copyable, compares with == and has std::size_t Hash() const. The handle is cheap to copy;
// the value behind it never changes.
template <class T>
class Consolidated {
public:
    Consolidated() noexcept = default;
    Consolidated(std::nullptr_t) noexcept {}

    // The one object equal to value, made now if none is alive.
    static Consolidated Make(const T& value) { return Consolidated(Registry::Instance().Intern(value)); }

    const T* Get() const noexcept { return m_Object.Get(); }
    const T* operator->() const noexcept { return m_Object.Get(); }
    const T& operator*() const noexcept { return *m_Object; }
    explicit operator bool() const noexcept { return bool(m_Object); }
    const Counted<const T>& GetCounted() const noexcept { return m_Object; }

    friend bool operator==(const Consolidated& a, const Consolidated& b) noexcept {
        return a.m_Object == b.m_Object;
    }

    // Objects kept alive only by the registry (for tests).
    static std::size_t GetRegistrySize() { return Registry::Instance().Size(); }

private:
    explicit Consolidated(Counted<const T> object) noexcept
        : m_Object(std::move(object)) {}

    // The registry holds one reference to each value. An entry whose count is 1 is held by nobody else, and
    // since a handle can only be had from a live handle or from here (under the lock), it can be dropped
    // without racing a new holder.
    class Registry {
    public:
        static Registry& Instance() {
            static Registry* registry = new Registry; // outlives every static handle
            return *registry;
        }

        Counted<const T> Intern(const T& value) {
            const std::size_t hash = value.Hash();
            std::lock_guard lock(m_Mutex);
            auto [first, last] = m_Entries.equal_range(hash);
            for (auto it = first; it != last;) {
                if (it->second->GetReferenceCount() == 1) {
                    it = m_Entries.erase(it);
                    continue;
                }
                if (*it->second == value) return it->second;
                ++it;
            }
            if (m_Entries.size() >= m_SweepAt) Sweep();
            Counted<const T> made(new T(value));
            m_Entries.emplace(hash, made);
            return made;
        }

        std::size_t Size() {
            std::lock_guard lock(m_Mutex);
            Sweep();
            return m_Entries.size();
        }

    private:
        void Sweep() {
            for (auto it = m_Entries.begin(); it != m_Entries.end();)
                it = it->second->GetReferenceCount() == 1 ? m_Entries.erase(it) : std::next(it);
            m_SweepAt = std::max<std::size_t>(64, m_Entries.size() * 2);
        }

        std::mutex m_Mutex;
        std::unordered_multimap<std::size_t, Counted<const T>> m_Entries;
        std::size_t m_SweepAt = 64;
    };

    Counted<const T> m_Object;
};

} // namespace Kernel
