#pragma once

/// @file
/// What every object is known by.

#include "KivVcs/Foundation.h"
#include "KivVcs/detail/Published.h"
#include "KivVcs/detail/PublishedWord.h"

#include <array>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iosfwd>
#include <string_view>
#include <utility>

namespace KivVcs {

/// The identifier of an object: the hexadecimal text of the SHA-256 digest of its packed form, 64 lowercase digits. The
/// empty text is the null identifier: no object.
///
/// A value that holds the digest itself: copying it allocates nothing, comparing and hashing it visits no other memory.
/// Identifiers are equal when their texts are. Any number of threads may read one identifier.
class KIVVCS_EXPORT Id {
public:
    using Digest = std::array<std::uint8_t, 32>;

    /// The null identifier.
    Id() noexcept = default;
    /// The identifier of a packed form: hashes it.
    Id(Buffer const& packed);
    /// The identifier with the given text, whatever it is. @throws std::bad_alloc
    explicit Id(KivStringT<char16_t> const& text);
    /// The identifier whose text stands for @p digest.
    [[nodiscard]] static Id FromDigest(Digest const& digest) noexcept { return Id(digest); }

    /// The identifier that 64 hexadecimal digits, of either case, spell; nothing for any other text.
    [[nodiscard]] static optional<Id> Parse(std::string_view digits) noexcept;

    Id(Id const& other) noexcept : digest_(other.digest_), text_(other.text_), isDigest_(other.isDigest_) {
        hash_.Set(other.hash_.Get());
    }
    Id(Id&& other) noexcept
        : digest_(other.digest_), text_(std::move(other.text_)), isDigest_(std::exchange(other.isDigest_, false)) {
        hash_.Set(other.hash_.Take());
    }
    Id& operator=(Id other) noexcept {
        digest_ = other.digest_;
        hash_.Set(other.hash_.Get());
        isDigest_ = other.isDigest_;
        text_.Swap(other.text_);
        return *this;
    }
    ~Id() = default;

    /// The text, made on first use; valid as long as this identifier, or a copy made of it afterwards, lives.
    /// @throws std::bad_alloc
    [[nodiscard]] KivStringT<char16_t> const& GetText() const;

    [[nodiscard]] bool IsEmpty() const noexcept { return !isDigest_ && text_.Get() == nullptr; }

    /// A hash over a sample of the text, the same on every platform that has 64-bit `std::size_t`.
    [[nodiscard]] std::size_t Hash() const noexcept {
        const std::size_t known = hash_.Get();
        return known != 0 ? known : ComputeHash();
    }

    /// The digest that the text stands for; null if it is not 64 lowercase hexadecimal digits.
    [[nodiscard]] Digest const* GetDigest() const noexcept { return isDigest_ ? &digest_ : nullptr; }

    friend bool operator==(Id const& left, Id const& right) noexcept {
        // A text that stands for a digest is always kept as one, so that the two kinds never have the same text.
        if (left.isDigest_ != right.isDigest_)
            return false;
        return left.isDigest_ ? left.digest_ == right.digest_ : HaveSameText(left, right);
    }

    /// The order of the texts.
    friend std::strong_ordering operator<=>(Id const& left, Id const& right) noexcept { return Compare(left, right); }

private:
    explicit Id(Digest const& digest) noexcept : digest_(digest), isDigest_(true) {}

    /// Spelled out only when somebody asks for it, since a repository holds an identifier for every object.
    struct Text final : KivUtils::reference_counted {
        explicit Text(KivStringT<char16_t> value) noexcept : text(std::move(value)) {}

        KivStringT<char16_t> text;
    };

    template <class Use>
    auto WithUnits(Use const& use) const noexcept;
    std::size_t ComputeHash() const noexcept;
    static bool HaveSameText(Id const& left, Id const& right) noexcept;
    static std::strong_ordering Compare(Id const& left, Id const& right) noexcept;

    Digest digest_{};
    /// 0 until somebody asks for it: the library's own tables do not.
    detail::PublishedWord<std::size_t> hash_;
    detail::Published<Text> text_;
    bool isDigest_ = false;
};

/// Writes the text of an identifier. @throws std::bad_alloc, and what the stream throws
KIVVCS_EXPORT std::ostream& operator<<(std::ostream& stream, Id const& id);

} // namespace KivVcs

template <>
struct std::hash<KivVcs::Id> {
    std::size_t operator()(KivVcs::Id const& id) const noexcept { return id.Hash(); }
};
