#pragma once
// Points and rectangles in document or pixel coordinates, with the host's unbounded sentinel.

#include <algorithm>
#include <limits>

namespace Kernel {

template <class T>
struct PointT {
    T x{};
    T y{};
    friend bool operator==(const PointT&, const PointT&) = default;
};

// Half-open rectangle [left, right) × [top, bottom).
template <class T>
struct RectT {
    T left{};
    T top{};
    T right{};
    T bottom{};

    // All four coordinates at the largest negative value: an area without bounds.
    static constexpr RectT Unbounded() noexcept {
        constexpr T v = std::numeric_limits<T>::lowest();
        return {v, v, v, v};
    }
    constexpr bool IsUnbounded() const noexcept { return *this == Unbounded(); }

    constexpr T Width() const noexcept { return right - left; }
    constexpr T Height() const noexcept { return bottom - top; }
    constexpr bool IsEmpty() const noexcept { return !(right > left) || !(bottom > top); }

    constexpr RectT Intersect(const RectT& o) const noexcept {
        return {std::max(left, o.left), std::max(top, o.top), std::min(right, o.right),
                std::min(bottom, o.bottom)};
    }
    // Grows every side by margin, except the unbounded sentinel, which stays as it is.
    constexpr RectT Inflated(T margin) const noexcept {
        if (IsUnbounded()) return *this;
        return {left - margin, top - margin, right + margin, bottom + margin};
    }

    friend bool operator==(const RectT&, const RectT&) = default;
};

} // namespace Kernel
