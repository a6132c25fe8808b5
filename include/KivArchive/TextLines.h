#pragma once

/// @file
/// Texts compared and merged line by line.
///
/// A line includes its line feed, and a carriage return before it; only the last line may lack one. A content that has
/// a zero byte, or more bytes than allowed, is no text.
///
/// Threads: any number of calls may run concurrently.
///
/// Cost: proportional to the contents if they differ in few places, and never more than proportional to the number of
/// lines times its square root: where very much differs, more changes may be found than are needed. Takes at most some
/// dozen bytes of memory for each line.

#include "KivArchive/Export.h"

#include <KivVcs/Foundation.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace KivArchive {

inline constexpr std::uint64_t largestText = std::uint64_t{64} * 1024 * 1024;

/// Lines that were replaced by others, removed (nothing on the new side), or added (nothing on the old side). Lines are
/// counted from 0; the ends are one past the last.
struct LineChange {
    std::size_t oldBegin = 0;
    std::size_t oldEnd = 0;
    std::size_t newBegin = 0;
    std::size_t newEnd = 0;

    friend bool operator==(LineChange const&, LineChange const&) noexcept = default;
};

/// The changes that turn one text into another, in order, with equal lines between them:
///
///     for (auto const& change : DiffTextLines(before, after))
struct TextDifferences {
    /// False if one of the contents is no text; there are no changes then.
    bool areTexts = false;
    std::vector<LineChange> changes;

    [[nodiscard]] std::vector<LineChange>::const_iterator begin() const noexcept { return changes.begin(); }
    [[nodiscard]] std::vector<LineChange>::const_iterator end() const noexcept { return changes.end(); }
};

[[nodiscard]] KIVARCHIVE_EXPORT TextDifferences DiffTextLines(KivVcs::Buffer const& before, KivVcs::Buffer const& after,
                                                              std::uint64_t maximumBytes = largestText);

struct UnifiedTextOptions {
    /// What follows "---" and "+++".
    KivVcs::KivStringT<char> oldLabel = "old";
    KivVcs::KivStringT<char> newLabel = "new";
    /// How many equal lines are shown around changes.
    std::size_t context = 3;
    std::uint64_t maximumBytes = largestText;
};

/// The differences as text for people and for `patch`; empty if nothing differs.
/// @return nothing if one of the contents is no text
[[nodiscard]] KIVARCHIVE_EXPORT std::optional<KivVcs::Buffer>
UnifiedText(KivVcs::Buffer const& before, KivVcs::Buffer const& after, UnifiedTextOptions const& options = {});

enum class TextMergeResult : std::uint8_t {
    Merged,    ///< There is no conflict.
    Conflicts, ///< Both sides changed the same lines, or lines beside each other, differently.
    GaveUp,    ///< One of the contents is no text.
};

struct TextMergeOptions {
    /// Whether a merge with conflicts gives a text that shows them:
    ///
    ///     <<<<<<< left
    ///     what the left side has
    ///     ||||||| base
    ///     what both started from
    ///     =======
    ///     what the right side has
    ///     >>>>>>> right
    bool showConflicts = false;
    KivVcs::KivStringT<char> leftLabel = "left";
    KivVcs::KivStringT<char> baseLabel = "base";
    KivVcs::KivStringT<char> rightLabel = "right";
    std::uint64_t maximumBytes = largestText;
};

struct TextMerge {
    TextMergeResult result = TextMergeResult::GaveUp;
    /// The merged text. If there are conflicts, the text that shows them, or empty.
    KivVcs::Buffer text;
    std::size_t conflicts = 0;
};

/// Brings what @p left and @p right changed of @p base together, as `diff3` does: changes in different places are taken
/// from both, equal changes once, and everything else that overlaps or touches is a conflict.
[[nodiscard]] KIVARCHIVE_EXPORT TextMerge MergeTextLines(KivVcs::Buffer const& base, KivVcs::Buffer const& left,
                                                         KivVcs::Buffer const& right,
                                                         TextMergeOptions const& options = {});

} // namespace KivArchive
