#pragma once

/// @file
/// Non-owning views of 8-bit and UTF-16 text.

#include "KivPlatform/Export.h"

#include <algorithm>
#include <compare>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <functional>
#include <limits>
#include <string_view>
#include <type_traits>

namespace KivPlatform {

template <class C>
class KIVVCS_EXPORT KivStringT;

/// How texts are compared. `Exact`, the default everywhere, orders by unsigned code unit, a prefix before the longer
/// text.
enum class CompareCase : std::int32_t { Exact = 0 };

/// 8-bit text of the standard library or the language: a literal, `std::string`, `std::string_view`.
///
/// UTF-16 texts and views are not made of such text, since it does not say its encoding: the constructors that would
/// take it are deleted and the operators assert, so that the compiler names the function to call, `FromUtf8`, right
/// away. Functions that a host overloads for `std::string_view` and for UTF-16 text take the latter by a template on
/// what converts to it.
template <class T>
concept StandardEightBitText =
    std::convertible_to<T const&, std::string_view> && !std::same_as<std::remove_cvref_t<T>, std::nullptr_t>;

/// A pointer and a length: text that somebody else owns. Lengths and positions are signed 32-bit code unit counts.
///
/// The text need not be NUL-terminated and may contain NULs. The owner must outlive the view. Nothing here allocates
/// but `ToString`, and nothing throws otherwise. Views are values: distinct views are independent between threads.
/// @tparam C `char` for 8-bit text, `char16_t` for UTF-16 text.
template <class C>
class KivStringViewT {
public:
    constexpr KivStringViewT() noexcept = default;

    /// Views NUL-terminated text; null gives the empty view.
    constexpr KivStringViewT(const C* text) noexcept
        : text_(text), length_(text == nullptr ? 0 : Clamp(std::char_traits<C>::length(text))) {}

    /// Views @p length code units; null or a negative length gives the empty view.
    constexpr KivStringViewT(const C* text, int length) noexcept
        : text_(text), length_(text == nullptr || length < 0 ? 0 : length) {}

    KivStringViewT(KivStringT<C> const& text) noexcept;

    template <StandardEightBitText T>
        requires std::same_as<C, char16_t>
    KivStringViewT(T const& text) = delete; // for UTF-16 text write u"..." or call FromUtf8(text)

    [[nodiscard]] constexpr int GetLength() const noexcept { return length_; }
    [[nodiscard]] constexpr bool IsEmpty() const noexcept { return length_ == 0; }

    /// The first code unit; not NUL-terminated, and null for a default view.
    [[nodiscard]] constexpr const C* GetString() const noexcept { return text_; }

    /// @pre 0 <= @p index < GetLength()
    [[nodiscard]] constexpr C operator[](int index) const noexcept { return text_[index]; }

    [[nodiscard]] constexpr const C* begin() const noexcept { return text_; }
    [[nodiscard]] constexpr const C* end() const noexcept { return text_ + length_; }

    /// An owned copy. @throws std::bad_alloc
    [[nodiscard]] KivStringT<C> ToString() const;

    /// The index of the first occurrence of @p needle at or after @p start, or -1. A negative start counts as 0; an
    /// empty needle is found at the start, as long as that is not past the end.
    [[nodiscard]] constexpr int Find(KivStringViewT needle, int start = 0,
                                     CompareCase = CompareCase::Exact) const noexcept {
        const auto found = Standard().find(needle.Standard(), static_cast<std::size_t>(std::max(start, 0)));
        return found == std::basic_string_view<C>::npos ? -1 : static_cast<int>(found);
    }

    [[nodiscard]] constexpr bool StartsWith(KivStringViewT prefix, CompareCase = CompareCase::Exact) const noexcept {
        return Standard().starts_with(prefix.Standard());
    }

    /// Negative, 0 or positive as this text comes before, equals or comes after @p other.
    [[nodiscard]] constexpr int Compare(KivStringViewT other, CompareCase = CompareCase::Exact) const noexcept {
        if (const int order = CompareUnits(text_, other.text_, std::min(length_, other.length_)); order != 0)
            return order;
        return length_ < other.length_ ? -1 : static_cast<int>(length_ > other.length_);
    }

    /// Whether `Compare` returns 0; does not read the texts if their lengths differ.
    [[nodiscard]] constexpr bool HasSameText(KivStringViewT other) const noexcept {
        return length_ == other.length_ && std::equal(begin(), end(), other.begin());
    }

    /// The text from @p start on; a negative start counts as 0, one past the end gives the empty view.
    [[nodiscard]] constexpr KivStringViewT Mid(int start) const noexcept { return Mid(start, length_); }

    /// At most @p count code units from @p start on; a negative count gives the empty view.
    [[nodiscard]] constexpr KivStringViewT Mid(int start, int count) const noexcept {
        const int first = std::clamp(start, 0, length_);
        return {text_ + first, std::clamp(count, 0, length_ - first)};
    }

    /// The first @p count code units, or all of them.
    [[nodiscard]] constexpr KivStringViewT Left(int count) const noexcept { return Mid(0, count); }

private:
    static constexpr int CompareUnits(const C* left, const C* right, int count) noexcept {
        // Equal beginnings are skipped a word at a time: names in one directory often have long ones.
        if (!std::is_constant_evaluated()) {
            constexpr int unitsOfWord = sizeof(std::uint64_t) / sizeof(C);
            for (; count >= unitsOfWord && std::memcmp(left, right, sizeof(std::uint64_t)) == 0; count -= unitsOfWord) {
                left += unitsOfWord;
                right += unitsOfWord;
            }
        }
        return std::char_traits<C>::compare(left, right, static_cast<std::size_t>(count));
    }

    static constexpr int Clamp(std::size_t length) noexcept {
        return static_cast<int>(std::min(length, static_cast<std::size_t>(std::numeric_limits<int>::max())));
    }

    [[nodiscard]] constexpr std::basic_string_view<C> Standard() const noexcept {
        return {text_, static_cast<std::size_t>(length_)};
    }

    const C* text_ = nullptr;
    int length_ = 0;
};

/// Two operands that compare as texts of @p C: at least one is a string or view of the library, the other converts to a
/// view.
template <class L, class R, class C>
concept TextPair =
    std::convertible_to<L const&, KivStringViewT<C>> && std::convertible_to<R const&, KivStringViewT<C>> &&
    (std::same_as<L, KivStringT<C>> || std::same_as<L, KivStringViewT<C>> || std::same_as<R, KivStringT<C>> ||
     std::same_as<R, KivStringViewT<C>>);

/// Equality of text, whatever the operands: strings, views, literals. Never of pointers.
template <class L, class R>
    requires TextPair<L, R, char>
[[nodiscard]] bool operator==(L const& left, R const& right) noexcept {
    return KivStringViewT<char>(left).HasSameText(KivStringViewT<char>(right));
}

template <class L, class R>
    requires TextPair<L, R, char16_t>
[[nodiscard]] bool operator==(L const& left, R const& right) noexcept {
    return KivStringViewT<char16_t>(left).HasSameText(KivStringViewT<char16_t>(right));
}

/// A UTF-16 text of the library and 8-bit text that it cannot be compared with or joined to.
template <class L, class R>
concept MixedTextPair =
    (StandardEightBitText<L> && (std::same_as<R, KivStringT<char16_t>> || std::same_as<R, KivStringViewT<char16_t>>)) ||
    (StandardEightBitText<R> && (std::same_as<L, KivStringT<char16_t>> || std::same_as<L, KivStringViewT<char16_t>>));

template <class L, class R>
    requires MixedTextPair<L, R>
bool operator==(L const&, R const&) {
    static_assert(sizeof(L) == 0, "for UTF-16 text write u\"...\" or call FromUtf8(text)");
    return false;
}

/// The order of `Compare`.
template <class L, class R>
    requires TextPair<L, R, char>
[[nodiscard]] std::strong_ordering operator<=>(L const& left, R const& right) noexcept {
    return KivStringViewT<char>(left).Compare(KivStringViewT<char>(right)) <=> 0;
}

template <class L, class R>
    requires TextPair<L, R, char16_t>
[[nodiscard]] std::strong_ordering operator<=>(L const& left, R const& right) noexcept {
    return KivStringViewT<char16_t>(left).Compare(KivStringViewT<char16_t>(right)) <=> 0;
}

/// The same order. Without this operator, `std::less<>` and `std::ranges::less` would compare the pointers that two
/// strings convert to.
template <class L, class R>
    requires TextPair<L, R, char>
[[nodiscard]] bool operator<(L const& left, R const& right) noexcept {
    return KivStringViewT<char>(left).Compare(KivStringViewT<char>(right)) < 0;
}

template <class L, class R>
    requires TextPair<L, R, char16_t>
[[nodiscard]] bool operator<(L const& left, R const& right) noexcept {
    return KivStringViewT<char16_t>(left).Compare(KivStringViewT<char16_t>(right)) < 0;
}

} // namespace KivPlatform

template <class C>
struct std::hash<KivPlatform::KivStringViewT<C>> {
    std::size_t operator()(KivPlatform::KivStringViewT<C> text) const noexcept {
        return std::hash<std::basic_string_view<C>>()({text.GetString(), static_cast<std::size_t>(text.GetLength())});
    }
};
