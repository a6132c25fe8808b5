#pragma once

/// @file
/// Reads the data of packed commits and trees exactly: whatever is accepted would be packed to the same bytes again.

#include "Digits.h"

#include <KivVcs/Id.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace KivArchive {

/// A commit; its texts are UTF-8 within the data that it was read from.
struct PackedCommit {
    /// Null if the commit names no tree.
    KivVcs::Id tree;
    /// Null for a root commit.
    KivVcs::Id parent;
    std::string_view authorName;
    std::string_view authorEmail;
    /// Since 1970; fits 32 bits.
    std::int64_t seconds = 0;
    /// Local time's offset from UTC.
    std::int64_t biasMinutes = 0;
    std::string_view description;
};

/// Reads the data of a commit.
/// @return nothing if no commit is packed to it: if the committer is not the author, if there are further lines, if
/// texts have zero bytes or are not UTF-8, or if the time or its offset is written otherwise
[[nodiscard]] std::optional<PackedCommit> ReadPackedCommit(std::span<const std::byte> data);

/// An entry of a tree, within the data that it was read from.
struct PackedEntry {
    bool isTree = false;
    /// In UTF-8.
    std::string_view name;
    /// The 64 digits of the identifier.
    std::string_view digits;

    [[nodiscard]] KivVcs::Id GetId() const noexcept {
        KivVcs::Id::Digest digest{};
        static_cast<void>(ReadDigits(digits.data(), std::as_writable_bytes(std::span(digest)).data()));
        return KivVcs::Id::FromDigest(digest);
    }
};

/// The entries of a tree, one after the other:
///
///     for (PackedEntries entries(data); entries.Next();)
///         Use(entries.Get());
class PackedEntries {
public:
    explicit PackedEntries(std::span<const std::byte> data) noexcept
        : rest_(reinterpret_cast<const char*>(data.data()), data.size()) {}

    /// Goes to the next entry. @return false after the last one, and at the first byte that no packed tree has there
    bool Next();
    [[nodiscard]] PackedEntry const& Get() const noexcept { return entry_; }
    /// After `Next` has returned false: whether that was the end of the data, and all names are UTF-8, in the order of
    /// trees, none twice, none empty and none with "/".
    [[nodiscard]] bool AreSound() const noexcept { return areSound_ && rest_.empty(); }

private:
    std::string_view rest_;
    PackedEntry entry_;
    bool areSound_ = true;
};

/// Less than, equal to or greater than zero as @p left comes before, equals or comes after @p right in trees, which
/// order names by their UTF-16 code units. Where names are not UTF-8, by their bytes.
[[nodiscard]] int CompareNames(std::string_view left, std::string_view right) noexcept;

/// Whether decoding the text and encoding it again gives the same bytes.
[[nodiscard]] bool IsExactText(std::string_view text);

} // namespace KivArchive
