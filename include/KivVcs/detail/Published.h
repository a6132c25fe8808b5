#pragma once

#include "KivUtils/cow_ptr.h"
#include "KivVcs/detail/PublishedWord.h"

#include <memory>
#include <type_traits>
#include <utility>

namespace KivVcs::detail {

/// Holds nothing, or a complete value: it is built aside and published in one step, so that an exception while building
/// leaves nothing behind, and racing first readers agree on one value. A copy has a value of its own, or shares one that
/// counts its references.
///
/// Threads: `Get` and `GetOrMake` may run concurrently, and copies be made. Everything else needs exclusive use.
template <class T>
class Published {
public:
    Published() noexcept = default;
    Published(Published const& other) noexcept(isShared()) {
        if (const T* const value = other.Get())
            value_.Set(Copy(*value));
    }
    Published(Published&& other) noexcept { Swap(other); }
    Published& operator=(Published other) noexcept {
        Swap(other);
        return *this;
    }
    ~Published() { Drop(value_.Get()); }

    /// The value, or null if there is none yet.
    [[nodiscard]] const T* Get() const noexcept { return value_.Get(); }

    /// The value, made by @p make if there is none yet; the reference is valid until `Reset`, assignment or
    /// destruction.
    template <class Make>
    T const& GetOrMake(Make make) const {
        if (const T* value = Get())
            return *value;
        const T* known = nullptr;
        const T* const made = New(make());
        if (value_.Replace(known, made))
            return *made;
        Drop(made);
        return *known;
    }

    void Swap(Published& other) noexcept { value_.Set(other.value_.Take(value_.Get())); }
    void Reset() noexcept { Drop(value_.Take()); }

private:
    [[nodiscard]] static constexpr bool isShared() noexcept {
        return std::is_base_of_v<KivUtils::reference_counted, T>;
    }
    [[nodiscard]] static const T* New(T value) {
        if constexpr (isShared())
            return KivUtils::immu::make<T>(std::move(value)).detach();
        else
            return std::make_unique<T>(std::move(value)).release();
    }
    [[nodiscard]] static const T* Copy(T const& value) noexcept(isShared()) {
        if constexpr (isShared())
            return KivUtils::cow_ptr<T>::share(&value).detach();
        else
            return New(value);
    }
    static void Drop(const T* value) noexcept {
        if constexpr (isShared())
            static_cast<void>(KivUtils::cow_ptr<T>::attach(value));
        else
            std::default_delete<const T>()(value);
    }

    PublishedWord<const T*> value_;
};

} // namespace KivVcs::detail
