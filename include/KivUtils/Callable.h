#pragma once

/// @file
/// Callables, optional values and views of contiguous elements, under the names that the library uses for them.

#include <functional>
#include <iterator>
#include <optional>
#include <span>
#include <utility>

namespace KivUtils {

/// A value or nothing.
template <class T>
using optional = std::optional<T>;

/// A non-owning view of contiguous elements.
template <class T>
using array_view = std::span<T>;

/// A callable that ignores its arguments and returns one stored value.
template <class T>
class always_return_t {
public:
    constexpr explicit always_return_t(T value) : value_(std::move(value)) {}

    template <class... Arguments>
    [[nodiscard]] constexpr T operator()(Arguments const&...) const {
        return value_;
    }

private:
    T value_;
};

namespace PortableVersion {

/// A possibly empty callable.
template <class Signature>
using Delegate = std::function<Signature>;

} // namespace PortableVersion

namespace helpers {

/// Removes from @p container, a map or set, every element for which @p predicate holds; elements are visited in
/// iteration order, each once. @throws what the predicate throws; the elements visited before stay removed.
template <class Container, class Predicate>
void remove_erase_if_helper(Container& container, Predicate predicate) {
    for (auto element = container.begin(); element != container.end();)
        element = predicate(*element) ? container.erase(element) : std::next(element);
}

} // namespace helpers

} // namespace KivUtils
