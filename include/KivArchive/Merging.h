#pragma once

/// @file
/// Merging again and again: finds where histories meet, from the facts, which outlive commits, and merges trees against
/// all of these places.
///
/// Threads: any number of calls may run at once, each with trees, readers and resolvers of its own.

#include "KivArchive/IArchive.h"
#include "KivArchive/TextLines.h"

#include <KivVcs/IRepository.h>
#include <KivVcs/MergeOutcome.h>

#include <functional>
#include <optional>
#include <span>
#include <vector>

namespace KivArchive {

/// Returns facts as `IArchive::ReadAncestry` does with `Follow::Everything`.
using AncestryReader = std::function<std::vector<Ancestry>(std::span<const Id> commits, std::size_t more)>;

/// The best common ancestors of two commits: those that both contain, and that no other one of them contains, in the
/// order of their identifiers. A commit contains itself, its parent, what it merged, what it was rewritten from and
/// what it was found equal to, and what these contain. Only facts are read, so that it does not matter which of the
/// commits still exist. Where commits contain each other, since they were rewritten there and back, the smallest
/// identifier stands for all of them.
///
/// Empty if the commits have nothing in common. One of the two alone if the other contains it.
///
/// Reads facts in batches, each twice as large as the one before, until nothing unread can make a difference: with one
/// base, as many commits on each side as lie between the base and the farther of the two, and at most as many again;
/// with several, until the histories of the bases have met, too. Reads everything only if the commits have nothing in
/// common. Takes some 200 bytes of memory for each commit read, and at most time proportional to what was read times
/// the number of bases.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindMergeBases(IArchive& archive, Id const& left, Id const& right);
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindMergeBases(AncestryReader const& read, Id const& left,
                                                               Id const& right);

/// The contents of a file that both sides changed differently.
struct DisputedContents {
    /// Nothing if there was no such file before, or if it is not known what was there.
    std::optional<Buffer> base;
    Buffer left;
    Buffer right;
};

/// Merges the contents of the file with that path, which is given as components. Returns nothing to give up.
using ContentResolver = std::function<std::optional<Buffer>(KivVcs::array_view<KivStringViewT<char16_t> const> path,
                                                            DisputedContents const&)>;

/// A resolver that merges texts with `MergeTextLines`, and gives up if that finds conflicts or there is no base.
[[nodiscard]] KIVARCHIVE_EXPORT ContentResolver MergeTexts(std::uint64_t maximumBytes = largestText);

/// What becomes of a name that is a file on one side and a directory on the other.
struct KindDecision {
    enum class Keep : std::uint8_t {
        Undecided, ///< The blob resolver is asked. Its answers take a side's entry, be it a file or a directory.
        File,
        Directory,
        Both, ///< The directory keeps the name, the file goes beside it as `fileName`.
        None,
    };
    Keep keep = Keep::Undecided;
    /// A name that neither side has in this directory; with any other the decision counts as undecided.
    KivStringT<char16_t> fileName;
};

/// Asked about a name that is a file on one side and a directory on the other, where both sides changed it or there is
/// no base.
using KindResolver =
    std::function<KindDecision(KivVcs::array_view<KivStringViewT<char16_t> const> path, KivVcs::MergeTrees const&)>;

/// Whom a merge asks. Only `choices` is needed; it is what `KivVcs::ThreeWayMerge` takes.
struct MergeResolvers {
    KivVcs::Resolvers choices;
    /// Asked first where both sides hold a file. May be empty.
    ContentResolver contents;
    /// Asked first where one side holds a file and the other a directory. May be empty.
    KindResolver kinds;
};

/// What a merge reads from.
struct MergeSources {
    AncestryReader ancestry;
    /// Returns the tree with that identifier; null if it is gone.
    std::function<KivVcs::cow_ptr<KivVcs::Tree>(Id const& tree)> tree;
    /// Returns the content of a file, for content resolvers. Empty stands for `Blob::GetData`.
    std::function<Buffer(KivVcs::Blob const& blob)> content;
};

/// A version that takes part in a merge.
struct MergeSide {
    Id commit;
    /// May be null.
    KivVcs::cow_ptr<KivVcs::Tree> tree;
};

struct TreeMerge {
    /// Whether something was left undecided; there is no tree then.
    bool gaveUp = false;
    /// The merged tree; null also if neither side has one.
    KivVcs::cow_ptr<KivVcs::Tree> tree;
    /// What resolvers were asked about, in the order of asking, and how it was settled; after giving up also all that
    /// is left, undecided. `rootId` is null where it is not known what was there.
    std::vector<KivVcs::MergeConflict> conflicts;
    /// The bases whose trees are gone. It is not known what they held, so that resolvers are asked about whatever
    /// differs, also about what only one side has.
    std::vector<Id> lostBases;
};

/// Merges what changed in two versions since their histories met, against all of `FindMergeBases`, entry by entry.
///
/// What only one side changed is taken over, what both changed alike is taken once, and resolvers are asked about
/// everything else. If merges have crossed there are several bases. For an entry that these disagree about, the base
/// is, of the following, the first that yields one entry:
/// - what both sides had when each first contained all of the bases, if they had the same;
/// - the entry of those bases whose entry no other base has changed, which is found out by the same rules;
/// - what both sides had when each first contained all of these, if they had the same.
///
/// Otherwise there is no base, and the resolvers are asked unless both sides are equal. Where commits contain each
/// other, each of them that a side has been at is a base.
///
/// Resolvers are asked as by `KivVcs::ThreeWayMerge`, except that nothing vanishes without a question: they are asked
/// about a name that is a file on one side and a directory on the other if both sides changed it; an answer is followed
/// whatever kind of entry it takes; and directories that the merge leaves without entries are removed. For every entry
/// that a resolver is asked about, `MergeTrees::root` has what the entry's base has, and nothing if there is no base:
/// `Root` counts as undecided then. Once a resolver has not decided, none is asked again.
///
/// Unchanged subtrees are shared with the sides, and new trees are stored in @p repo as they are made. Contents are
/// read only for content resolvers.
/// @complexity proportional to the entries that differ and to the directories that hold them, times the number of
/// bases; at most some hundred steps for an entry that many bases disagree about
/// @param progress may be null; reported to for each directory that is merged
/// @throws what the sources, resolvers and @p repo throw
[[nodiscard]] KIVARCHIVE_EXPORT TreeMerge MergeAgain(KivVcs::IRepository& repo, MergeSources const& sources,
                                                     MergeSide const& left, MergeSide const& right,
                                                     MergeResolvers const& resolvers, IProgress* progress = nullptr);

/// What a merge of a repository over an archive did.
struct MergeReport {
    KivVcs::MergeResult result = KivVcs::MergeResult::NothingToCommit;
    /// As in `TreeMerge`.
    std::vector<KivVcs::MergeConflict> conflicts;
    std::vector<Id> lostBases;

    /// Whether the branch has the commit's changes now.
    [[nodiscard]] bool Succeeded() const noexcept { return result <= KivVcs::MergeResult::Merged; }
};

} // namespace KivArchive
