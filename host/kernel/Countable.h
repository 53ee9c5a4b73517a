#pragma once
// Intrusive, thread-safe reference counting: Countable, Counted<T> and NonCounted<T>.

#include <atomic>
#include <cstddef>
#include <type_traits>
#include <utility>

namespace Kernel {

// Base of every reference-counted host object; inherit it virtually.
class Countable {
public:
    Countable() noexcept { s_Live.fetch_add(1, std::memory_order_relaxed); }
    Countable(const Countable&) noexcept
        : Countable() {}
    Countable& operator=(const Countable&) noexcept { return *this; }

    void Retain() const noexcept { m_Count.fetch_add(1, std::memory_order_relaxed); }
    void Release() const noexcept {
        if (m_Count.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
    }
    int GetReferenceCount() const noexcept { return m_Count.load(std::memory_order_relaxed); }

    // Number of countable objects alive in the process; lets tests prove that nothing was created.
    static long GetLiveObjectCount() noexcept { return s_Live.load(std::memory_order_relaxed); }

protected:
    virtual ~Countable() { s_Live.fetch_sub(1, std::memory_order_relaxed); }

private:
    mutable std::atomic<int> m_Count{0};
    static inline std::atomic<long> s_Live{0};
};

// Owning handle: retains on copy, releases on destruction.
template <class T>
class Counted {
public:
    Counted() noexcept = default;
    Counted(std::nullptr_t) noexcept {}
    explicit Counted(T* object) noexcept
        : m_Object(object) {
        Acquire();
    }
    Counted(const Counted& other) noexcept
        : m_Object(other.m_Object) {
        Acquire();
    }
    Counted(Counted&& other) noexcept
        : m_Object(std::exchange(other.m_Object, nullptr)) {}
    template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
    Counted(const Counted<U>& other) noexcept
        : m_Object(other.Get()) {
        Acquire();
    }
    template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
    Counted(Counted<U>&& other) noexcept
        : m_Object(other.Detach()) {}
    ~Counted() { Drop(); }

    Counted& operator=(Counted other) noexcept {
        std::swap(m_Object, other.m_Object);
        return *this;
    }

    T* Get() const noexcept { return m_Object; }
    T* operator->() const noexcept { return m_Object; }
    T& operator*() const noexcept { return *m_Object; }
    explicit operator bool() const noexcept { return m_Object != nullptr; }
    void Reset() noexcept { Counted().swap(*this); }
    void swap(Counted& other) noexcept { std::swap(m_Object, other.m_Object); }

    // Gives up ownership without releasing; the caller takes over the reference.
    T* Detach() noexcept { return std::exchange(m_Object, nullptr); }

    friend bool operator==(const Counted& a, const Counted& b) noexcept { return a.m_Object == b.m_Object; }
    friend bool operator==(const Counted& a, std::nullptr_t) noexcept { return a.m_Object == nullptr; }

private:
    void Acquire() const noexcept {
        if (m_Object) static_cast<const Countable*>(m_Object)->Retain();
    }
    void Drop() noexcept {
        if (m_Object) static_cast<const Countable*>(std::exchange(m_Object, nullptr))->Release();
    }

    T* m_Object = nullptr;
};

template <class T, class... Args>
Counted<T> MakeCounted(Args&&... args) {
    return Counted<T>(new T(std::forward<Args>(args)...));
}

// dynamic_cast for counted handles; null when the object is not a T.
template <class T, class U>
Counted<T> CountedCast(const Counted<U>& from) noexcept {
    return Counted<T>(dynamic_cast<T*>(from.Get()));
}

// Non-owning handle; the owner guarantees the lifetime.
template <class T>
class NonCounted {
public:
    NonCounted() noexcept = default;
    NonCounted(std::nullptr_t) noexcept {}
    NonCounted(T* object) noexcept
        : m_Object(object) {}
    template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
    NonCounted(const Counted<U>& owner) noexcept
        : m_Object(owner.Get()) {}

    T* Get() const noexcept { return m_Object; }
    T* operator->() const noexcept { return m_Object; }
    T& operator*() const noexcept { return *m_Object; }
    explicit operator bool() const noexcept { return m_Object != nullptr; }
    friend bool operator==(NonCounted a, NonCounted b) noexcept { return a.m_Object == b.m_Object; }

private:
    T* m_Object = nullptr;
};

} // namespace Kernel
