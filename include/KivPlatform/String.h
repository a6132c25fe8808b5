#pragma once

/// @file
/// Owned, shared, reference-counted 8-bit and UTF-16 text.

#include "KivPlatform/Export.h"
#include "KivPlatform/StringView.h"
#include "KivPlatform/counted_ptr.h"

#include <array>
#include <cstdint>
#include <iosfwd>
#include <utility>

namespace KivPlatform {

/// One argument of `KivStringT::FormatInternal`: an integer or NUL-terminated text of the format's own code unit.
template <class C>
class FormatArgument {
public:
    explicit FormatArgument(const C* text) noexcept : text_(text) {}
    template <std::integral I>
    explicit FormatArgument(I value) noexcept : negative_(std::signed_integral<I> && value < I{}) {
        const auto bits = static_cast<std::uint64_t>(value);
        magnitude_ = negative_ ? std::uint64_t{0} - bits : bits;
    }

    [[nodiscard]] const C* Text() const noexcept { return text_; }
    [[nodiscard]] std::uint64_t Magnitude() const noexcept { return magnitude_; }
    [[nodiscard]] bool IsNegative() const noexcept { return negative_; }

private:
    const C* text_ = nullptr;
    std::uint64_t magnitude_ = 0;
    bool negative_ = false;
};

/// Immutable-when-shared text: copying shares the characters and allocates nothing; changing a shared text copies it
/// first.
///
/// The text is NUL-terminated and may contain NULs. Lengths and positions are signed 32-bit code unit counts; a text
/// that would be longer throws `std::length_error`. Everything that makes new text may throw `std::bad_alloc`.
///
/// Threads: the count is atomic, so distinct strings that share characters may be used from different threads; one
/// string is used like any value.
/// @tparam C `char` for 8-bit text, `char16_t` for UTF-16 text.
template <class C>
class KIVVCS_EXPORT KivStringT {
public:
    using View = KivStringViewT<C>;

    constexpr KivStringT() noexcept = default;
    KivStringT(View text);
    /// Copies NUL-terminated text; null gives the empty text.
    KivStringT(const C* text) : KivStringT(View(text)) {}
    /// Copies @p length code units; null or a negative length gives the empty text.
    KivStringT(const C* text, int length) : KivStringT(View(text, length)) {}
    /// Widens 8-bit text, each byte to the code unit of the same value 0 to 255. For ASCII such as identifiers; text in
    /// UTF-8 is decoded by `String::ToStringW`.
    template <std::same_as<char> Narrow>
        requires std::same_as<C, char16_t>
    KivStringT(KivStringT<Narrow> const& text)
        : KivStringT(Build(text.GetLength(), [&text](C* units) {
              for (char byte : KivStringViewT<char>(text))
                  *units++ = static_cast<unsigned char>(byte);
          })) {}

    template <StandardEightBitText T>
        requires std::same_as<C, char16_t>
    KivStringT(T const& text) = delete; // for UTF-16 text write u"..." or call FromUtf8(text)

    /// Replaces the text by @p format with its directives filled in from @p arguments in order, as printf does. After a
    /// percent sign, "s" takes NUL-terminated text (null counts as empty), ".*s" a length and text, "d", "u" and "lu"
    /// any integer; a width ("5d", "02d") pads with blanks or zeros; two percent signs write one. A directive without
    /// an argument writes nothing.
    template <class... Arguments>
    void FormatInternal(View format, Arguments const&... arguments) {
        const std::array<FormatArgument<C>, sizeof...(arguments)> list{FormatArgument<C>(arguments)...};
        FormatList(format, list.data(), list.size());
    }

    [[nodiscard]] int GetLength() const noexcept { return text_ ? text_->length : 0; }
    [[nodiscard]] bool IsEmpty() const noexcept { return GetLength() == 0; }

    /// The NUL-terminated text, never null; valid until the string is changed or destroyed.
    [[nodiscard]] const C* GetString() const noexcept { return text_ ? Characters() : &terminator; }
    operator const C*() const noexcept { return GetString(); }

    /// Whether both are copies of one text, and so equal without comparing characters.
    [[nodiscard]] bool IsSharedWith(KivStringT const& other) const noexcept { return text_ == other.text_; }

    /// @pre 0 <= @p index <= GetLength(); the terminating NUL is at GetLength().
    [[nodiscard]] C operator[](int index) const noexcept { return GetString()[index]; }
    [[nodiscard]] C GetAt(int index) const noexcept { return GetString()[index]; }

    /// Substrings, clipped to the text; a negative start counts as 0, a negative count gives the empty text.
    [[nodiscard]] KivStringT Mid(int start) const { return Slice(View(*this).Mid(start)); }
    [[nodiscard]] KivStringT Mid(int start, int count) const { return Slice(View(*this).Mid(start, count)); }
    [[nodiscard]] KivStringT Left(int count) const { return Slice(View(*this).Left(count)); }

    /// As the operations of the same name of `KivStringViewT`.
    [[nodiscard]] int Find(View needle, int start = 0, CompareCase compareCase = CompareCase::Exact) const noexcept {
        return View(*this).Find(needle, start, compareCase);
    }
    [[nodiscard]] bool StartsWith(View prefix, CompareCase compareCase = CompareCase::Exact) const noexcept {
        return View(*this).StartsWith(prefix, compareCase);
    }
    [[nodiscard]] int Compare(View other, CompareCase compareCase = CompareCase::Exact) const noexcept {
        return View(*this).Compare(other, compareCase);
    }

    /// Appends; amortized constant per code unit while the text is not shared.
    KivStringT& operator+=(View text);
    KivStringT& operator+=(const C* text) { return *this += View(text); }
    KivStringT& operator+=(KivStringT const& text) { return *this += View(text); }
    KivStringT& operator+=(C unit) { return *this += View(&unit, 1); }
    /// Appends an 8-bit character as the code unit of the same value 0 to 255.
    template <std::same_as<char> Narrow>
        requires std::same_as<C, char16_t>
    KivStringT& operator+=(Narrow character) {
        return *this += static_cast<C>(static_cast<unsigned char>(character));
    }

    template <StandardEightBitText T>
        requires std::same_as<C, char16_t>
    KivStringT& operator+=(T const&) {
        static_assert(sizeof(T) == 0, "for UTF-16 text write u\"...\" or call FromUtf8(text)");
        return *this;
    }

    void Swap(KivStringT& other) noexcept { text_.swap(other.text_); }

    /// Makes a text of @p length code units and lets @p fill write them through the pointer that it is given.
    template <class Fill>
    [[nodiscard]] static KivStringT Build(int length, Fill fill) {
        KivStringT result;
        if (length > 0) {
            result.text_ = Allocate(length);
            fill(result.Characters());
        }
        return result;
    }

private:
    struct Text : reference_counted {
        std::int32_t length = 0;
        std::int32_t capacity = 0;
    };
    struct DestroyText {
        void operator()(Text* text) const noexcept { Destroy(text); }
    };
    using Handle = counted_ptr<Text, DestroyText>;

    static constexpr C terminator{};

    /// Room for @p capacity code units and the terminator; the length is set to the capacity and terminated there.
    static Handle Allocate(int capacity);
    static void Destroy(Text* text) noexcept;

    [[nodiscard]] C* Characters() const noexcept { return reinterpret_cast<C*>(text_.get() + 1); }
    [[nodiscard]] KivStringT Slice(View part) const {
        return part.GetLength() == GetLength() ? *this : KivStringT(part);
    }
    void FormatList(View format, const FormatArgument<C>* arguments, std::size_t count);

    Handle text_;
};

template <class C>
KivStringViewT<C>::KivStringViewT(KivStringT<C> const& text) noexcept
    : text_(text.GetString()), length_(text.GetLength()) {}

template <class C>
KivStringT<C> KivStringViewT<C>::ToString() const {
    return KivStringT<C>(*this);
}

/// Joins two texts.
template <class L, class R>
    requires TextPair<L, R, char>
[[nodiscard]] KivStringT<char> operator+(L const& left, R const& right) {
    KivStringT<char> result{KivStringViewT<char>(left)};
    return result += KivStringViewT<char>(right);
}

template <class L, class R>
    requires TextPair<L, R, char16_t>
[[nodiscard]] KivStringT<char16_t> operator+(L const& left, R const& right) {
    KivStringT<char16_t> result{KivStringViewT<char16_t>(left)};
    return result += KivStringViewT<char16_t>(right);
}

template <class L, class R>
    requires MixedTextPair<L, R>
KivStringT<char16_t> operator+(L const&, R const&) {
    static_assert(sizeof(L) == 0, "for UTF-16 text write u\"...\" or call FromUtf8(text)");
    return {};
}

/// Writes a text: 8-bit text as it is, UTF-16 text in UTF-8. Width and fill of the stream count bytes.
/// @throws std::bad_alloc, and what the stream throws
KIVVCS_EXPORT std::ostream& operator<<(std::ostream& stream, KivStringT<char> const& text);
KIVVCS_EXPORT std::ostream& operator<<(std::ostream& stream, KivStringT<char16_t> const& text);
KIVVCS_EXPORT std::ostream& operator<<(std::ostream& stream, KivStringViewT<char> const& text);
KIVVCS_EXPORT std::ostream& operator<<(std::ostream& stream, KivStringViewT<char16_t> const& text);

// Not for DLLs, which export no inline members: every program instantiates its own.
#if !defined(_WIN32)
extern template class KivStringT<char>;
extern template class KivStringT<char16_t>;
#endif

} // namespace KivPlatform

// Both are transparent, so that tables of strings are searched for views and literals without making strings.

template <class C>
struct std::hash<KivPlatform::KivStringT<C>> {
    using is_transparent = void;

    std::size_t operator()(KivPlatform::KivStringT<C> const& text) const noexcept {
        return std::hash<KivPlatform::KivStringViewT<C>>()(text);
    }
    template <std::convertible_to<KivPlatform::KivStringViewT<C>> T>
    std::size_t operator()(T const& text) const noexcept {
        return std::hash<KivPlatform::KivStringViewT<C>>()(text);
    }
};

template <class C>
struct std::equal_to<KivPlatform::KivStringT<C>> {
    using is_transparent = void;

    bool operator()(KivPlatform::KivStringT<C> const& left, KivPlatform::KivStringT<C> const& right) const noexcept {
        return left == right;
    }
    template <class L, class R>
        requires KivPlatform::TextPair<L, R, C>
    bool operator()(L const& left, R const& right) const noexcept {
        return left == right;
    }
};
