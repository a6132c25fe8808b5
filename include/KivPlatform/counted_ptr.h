#pragma once

/// @file
/// How objects are shared: each carries a count of its handles.

#include <atomic>
#include <cstdint>
#include <memory>
#include <type_traits>
#include <utility>

namespace KivPlatform {

/// The count of the handles that share an object, which derives from this class. Copying or assigning an object never
/// copies the count.
class reference_counted {
public:
    reference_counted() noexcept = default;
    reference_counted(reference_counted const&) noexcept {}
    reference_counted& operator=(reference_counted const&) noexcept { return *this; }

    void add_reference() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
    /// The same for an object that may be new. One without references is nobody else's, so that counting the first
    /// takes no atomic exchange.
    void add_first_reference() const noexcept {
        if (references_.load(std::memory_order_relaxed) == 0)
            references_.store(1, std::memory_order_relaxed);
        else
            add_reference();
    }

    /// The same for the only holder of an object, which no other thread knows of: it takes no atomic exchange either.
    void add_second_reference() const noexcept { references_.store(2, std::memory_order_relaxed); }

    /// True if that was the last reference; everything done through the other references happened before.
    [[nodiscard]] bool drop_reference() const noexcept {
        // A sole owner needs no atomic exchange: nobody else is left who could add a reference.
        return references_.load(std::memory_order_acquire) == 1 ||
               references_.fetch_sub(1, std::memory_order_acq_rel) == 1;
    }

    [[nodiscard]] std::uint32_t reference_count() const noexcept { return references_.load(std::memory_order_acquire); }

protected:
    ~reference_counted() = default;

private:
    mutable std::atomic<std::uint32_t> references_{0};
};

/// A handle that shares an object which counts its handles, and that may be null. The last one destroys the object by
/// @p Delete. As large as a raw pointer; texts, buffers and `KivUtils::cow_ptr` are layers over it.
///
/// Threads: distinct handles of one object may be used from different threads. One handle is used like any value.
template <class T, class Delete = std::default_delete<T>>
class counted_ptr {
public:
    constexpr counted_ptr() noexcept = default;

    /// Shares @p object, which may be new or have other handles; null gives null.
    explicit counted_ptr(T* object) noexcept : object_(object) {
        if (object_ != nullptr)
            object_->add_first_reference();
    }
    /// Takes over the share of a handle of a derived class.
    template <class Derived>
        requires(!std::is_same_v<Derived, T> && std::is_convertible_v<Derived*, T*>)
    counted_ptr(counted_ptr<Derived, Delete> other) noexcept : object_(other.detach()) {}

    counted_ptr(counted_ptr const& other) noexcept : object_(other.object_) {
        if (object_ != nullptr)
            object_->add_reference();
    }
    counted_ptr(counted_ptr&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
    counted_ptr& operator=(counted_ptr const& other) noexcept {
        counted_ptr(other).swap(*this);
        return *this;
    }
    counted_ptr& operator=(counted_ptr&& other) noexcept {
        counted_ptr(std::move(other)).swap(*this);
        return *this;
    }
    ~counted_ptr() {
        if (object_ != nullptr && object_->drop_reference())
            Delete()(object_);
    }

    [[nodiscard]] T* get() const noexcept { return object_; }
    T* operator->() const noexcept { return object_; }
    T& operator*() const noexcept { return *object_; }
    explicit operator bool() const noexcept { return object_ != nullptr; }
    friend bool operator==(counted_ptr const& left, counted_ptr const& right) noexcept {
        return left.object_ == right.object_;
    }

    /// The number of handles that share the object; 0 for null.
    [[nodiscard]] std::uint32_t use_count() const noexcept {
        return object_ == nullptr ? 0 : object_->reference_count();
    }

    void swap(counted_ptr& other) noexcept { std::swap(object_, other.object_); }

    /// Gives up the object without giving up the share, which `attach` takes over again.
    [[nodiscard]] T* detach() noexcept { return std::exchange(object_, nullptr); }
    [[nodiscard]] static counted_ptr attach(T* object) noexcept {
        counted_ptr handle;
        handle.object_ = object;
        return handle;
    }

    /// Gives up the share and hands the object over if that was the last one; null otherwise.
    [[nodiscard]] std::unique_ptr<T, Delete> release_if_last() noexcept {
        T* const object = detach();
        return std::unique_ptr<T, Delete>(object != nullptr && object->drop_reference() ? object : nullptr);
    }

private:
    T* object_ = nullptr;
};

} // namespace KivPlatform
