#pragma once

#include <atomic>
#include <memory>
#include <utility>

namespace KivVcs::detail {

/// Holds nothing, or a complete value: it is built aside and published in one step, so that an exception while building
/// leaves nothing behind, and racing first readers agree on one value.
///
/// Threads: `Get` and `GetOrMake` may run concurrently. `Reset` and assignment need exclusive use.
template <class T>
class Published {
public:
    Published() noexcept = default;
    Published(Published const& other) : Published() {
        if (const T* value = other.Get())
            value_.store(new T(*value), std::memory_order_relaxed);
    }
    Published(Published&& other) noexcept : value_(other.value_.exchange(nullptr, std::memory_order_relaxed)) {}
    Published& operator=(Published const& other) {
        *this = Published(other);
        return *this;
    }
    Published& operator=(Published&& other) noexcept {
        T* const taken = other.value_.exchange(nullptr, std::memory_order_relaxed);
        delete value_.exchange(taken, std::memory_order_relaxed);
        return *this;
    }
    ~Published() { delete value_.load(std::memory_order_acquire); }

    /// The value, or null if there is none yet.
    [[nodiscard]] const T* Get() const noexcept { return value_.load(std::memory_order_acquire); }

    /// The value, made by @p make if there is none yet; the reference is valid until `Reset`, assignment or
    /// destruction.
    template <class Make>
    T const& GetOrMake(Make make) const {
        if (const T* value = Get())
            return *value;
        auto made = std::make_unique<T>(make());
        T* expected = nullptr;
        if (value_.compare_exchange_strong(expected, made.get(), std::memory_order_acq_rel, std::memory_order_acquire))
            return *made.release();
        return *expected;
    }

    void Reset() noexcept {
        delete value_.load(std::memory_order_relaxed);
        value_.store(nullptr, std::memory_order_relaxed);
    }

private:
    mutable std::atomic<T*> value_{nullptr};
};

} // namespace KivVcs::detail
