#pragma once

/// @file
/// `cow_ptr`: a shared, reference-counted pointer with copy-on-write access.

#include "KivPlatform/counted_ptr.h"

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <stdexcept>
#include <type_traits>
#include <utility>

namespace KivUtils {

/// Selects the constructor of `cow_ptr` that makes a new object in place.
struct emplace_t {
    explicit emplace_t() = default;
};
inline constexpr emplace_t emplace{};

/// The count of the `cow_ptr`s that hold an object. A class that derives from it carries its own count and is held
/// without a control block; any other type gets one.
using KivPlatform::reference_counted;

/// The control block of an object that does not count itself.
class object_holder : public reference_counted {
public:
    object_holder() noexcept = default;
    object_holder(object_holder const&) = delete;
    object_holder& operator=(object_holder const&) = delete;
    virtual ~object_holder() = default;

    [[nodiscard]] virtual void* object() noexcept = 0;
};

/// Holds an object that was made in place.
template <class T>
class in_place_holder final : public object_holder {
public:
    template <class... Arguments>
    explicit in_place_holder(Arguments&&... arguments) : object_(std::forward<Arguments>(arguments)...) {}

    [[nodiscard]] void* object() noexcept override { return std::addressof(object_); }

private:
    T object_;
};

/// Holds an object that was made elsewhere.
template <class T>
class adopting_holder final : public object_holder {
public:
    explicit adopting_holder(std::unique_ptr<T> object) noexcept : object_(std::move(object)) {}

    [[nodiscard]] void* object() noexcept override { return object_.get(); }

private:
    std::unique_ptr<T> object_;
};

/// A pointer that shares its object with its copies and gives write access only to a sole owner, copying the object
/// otherwise.
///
/// Reading (`->`, `*`, `get`) never copies. The pointer may be null. It is as large as a raw pointer; an object is one
/// allocation.
///
/// Threads: the count is atomic, so that distinct pointers to one object may be copied, read through and dropped from
/// different threads. One pointer is used like any value: `write` must not race with another use of the same pointer.
template <class T>
class cow_ptr {
public:
    using element_type = T;

    constexpr cow_ptr() noexcept = default;
    constexpr cow_ptr(std::nullptr_t) noexcept {}

    /// Makes a new `T(arguments...)` and owns it alone.
    template <class... Arguments>
    explicit cow_ptr(emplace_t, Arguments&&... arguments) {
        if constexpr (is_self_counted())
            counted_ = handle(new T(std::forward<Arguments>(arguments)...));
        else
            counted_ = handle(new in_place_holder<T>(std::forward<Arguments>(arguments)...));
    }

    /// Takes over an object made elsewhere; null gives null.
    explicit cow_ptr(std::unique_ptr<T> object) {
        if (object == nullptr)
            return;
        if constexpr (is_self_counted())
            counted_ = handle(object.release());
        else
            counted_ = handle(new adopting_holder<T>(std::move(object)));
    }

    /// Another pointer to an object that a `cow_ptr` holds already; null gives null. Self-counted types only.
    [[nodiscard]] static cow_ptr share(T const* object) noexcept {
        cow_ptr pointer;
        pointer.counted_ = handle(object);
        return pointer;
    }

    /// Another pointer to the object, in less time than a copy if this is the only one. @pre it is not null, and no other
    /// thread uses this pointer meanwhile. Self-counted types only.
    [[nodiscard]] cow_ptr share_from_sole_owner() const noexcept {
        if (use_count() != 1)
            return *this;
        counted_->add_second_reference();
        return attach(object());
    }

    /// Gives up the object without dropping the reference, which `attach` takes over again. Self-counted types only.
    [[nodiscard]] T const* detach() noexcept { return static_cast<T const*>(counted_.detach()); }
    [[nodiscard]] static cow_ptr attach(T const* object) noexcept {
        cow_ptr pointer;
        pointer.counted_ = handle::attach(object);
        return pointer;
    }

    /// Shares the object as one of its base class. A write through the result copies, if it has to, as the base class
    /// does.
    /// @throws std::invalid_argument if the classes do not count themselves and the base is not at the object's
    /// beginning
    template <class Derived>
        requires(!std::is_same_v<Derived, T> && std::is_convertible_v<Derived*, T*>)
    cow_ptr(cow_ptr<Derived> other) noexcept(is_self_counted()) {
        static_assert(is_self_counted() == cow_ptr<Derived>::is_self_counted(), "both count themselves, or neither");
        if constexpr (!is_self_counted()) {
            T const* const base = other.get();
            if (static_cast<void const*>(base) != static_cast<void const*>(other.get()))
                throw std::invalid_argument("this base class is not at the beginning of the object");
        }
        counted_ = handle::attach(other.counted_.detach());
    }

    [[nodiscard]] T const* get() const noexcept { return object(); }
    T const* operator->() const noexcept { return object(); }
    T const& operator*() const noexcept { return *object(); }
    explicit operator bool() const noexcept { return static_cast<bool>(counted_); }

    /// The number of pointers that hold the object; 0 for null.
    [[nodiscard]] std::uint32_t use_count() const noexcept { return counted_.use_count(); }

    void reset() noexcept { cow_ptr().swap(*this); }
    void swap(cow_ptr& other) noexcept { counted_.swap(other.counted_); }

    /// The object for writing: null for null; the object itself for a sole owner; otherwise a copy, which this pointer
    /// then owns alone, the other owners keeping the unchanged object. It is made by `CopyOf(T const&)` if there is such
    /// a function beside `T`, otherwise by the copy constructor of `T`.
    /// @throws what copying throws; the pointer is unchanged then.
    T* write_if_there() {
        if (!counted_)
            return nullptr;
        if (counted_->reference_count() != 1)
            copy(*object()).swap(*this);
        return object();
    }

    /// As `write_if_there`, but a null pointer first receives a new default-constructed `T`; never null.
    T* write() {
        if (!counted_)
            cow_ptr(emplace).swap(*this);
        return write_if_there();
    }

    /// Gives up this pointer's share and hands the object over if it was the last one; null otherwise. Lets an owner
    /// take an object apart before it dies. Self-counted types only.
    [[nodiscard]] std::unique_ptr<T> release_if_last() noexcept {
        static_assert(std::is_base_of_v<reference_counted, T>);
        const auto* const last = counted_.release_if_last().release();
        return std::unique_ptr<T>(static_cast<T*>(const_cast<reference_counted*>(last)));
    }

    /// Identity of the object, not equality of content.
    friend bool operator==(cow_ptr const& left, cow_ptr const& right) noexcept {
        return left.counted_ == right.counted_;
    }
    friend bool operator==(cow_ptr const& pointer, std::nullptr_t) noexcept { return !pointer.counted_; }

private:
    template <class>
    friend class cow_ptr;

    struct deleter {
        void operator()(reference_counted const* counted) const noexcept {
            if constexpr (is_self_counted())
                delete static_cast<T const*>(counted);
            else
                delete static_cast<object_holder const*>(counted);
        }
    };
    using handle = KivPlatform::counted_ptr<reference_counted const, deleter>;

    // Not a constant: T may be incomplete where the class is named.
    [[nodiscard]] static constexpr bool is_self_counted() noexcept { return std::is_base_of_v<reference_counted, T>; }

    [[nodiscard]] static cow_ptr copy(T const& object) {
        if constexpr (requires {
                          { CopyOf(object) } -> std::same_as<cow_ptr>;
                      })
            return CopyOf(object);
        else
            return cow_ptr(emplace, object);
    }

    [[nodiscard]] T* object() const noexcept {
        auto* const counted = const_cast<reference_counted*>(counted_.get());
        if constexpr (is_self_counted())
            return static_cast<T*>(counted);
        else
            return counted == nullptr ? nullptr : static_cast<T*>(static_cast<object_holder*>(counted)->object());
    }

    handle counted_;
};

/// Makers of objects that are only read from then on.
namespace immu {

/// A pointer that solely owns a new `T(arguments...)`.
template <class T, class... Arguments>
[[nodiscard]] cow_ptr<T> make(Arguments&&... arguments) {
    return cow_ptr<T>(emplace, std::forward<Arguments>(arguments)...);
}

} // namespace immu

} // namespace KivUtils

template <class T>
struct std::hash<KivUtils::cow_ptr<T>> {
    std::size_t operator()(KivUtils::cow_ptr<T> const& pointer) const noexcept {
        return std::hash<T const*>()(pointer.get());
    }
};
