#pragma once

/// @file
/// Merging again and again: where histories meet by the facts that outlive commits, and merges of trees against all the
/// places where they do.
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

/// Gives facts as `IArchive::ReadAncestry` does, following everything.
using AncestryReader = std::function<std::vector<Ancestry>(std::span<const Id> commits, std::size_t more)>;

/// The best common ancestors of two commits: those that both contain, and that no other one of them contains, in the order
/// of their identifiers. A commit contains itself, its parent, what it merged, what it was rewritten from and what it was
/// found equal to, and what these contain; nothing but facts is looked at, so that it does not matter which of the commits
/// still exist. Where commits contain each other, since they were rewritten there and back, the smallest identifier stands
/// for all of them.
///
/// Empty if the commits have nothing in common. One of the two alone if the other contains it.
///
/// Reads facts in batches, twice as large each time, until nothing that is unread can make a difference: with one base, as
/// many commits as lie between the base and the farther one, on each side, and at most as many again; with several, until the
/// histories of the bases have met, too. All of it only if the commits have nothing in common. Takes some 200 bytes of
/// memory a commit read, and at most time proportional to what was read times the number of bases.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindMergeBases(IArchive& archive, Id const& left, Id const& right);
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindMergeBases(AncestryReader const& read, Id const& left,
                                                               Id const& right);

/// The contents of a file that both sides changed differently.
struct DisputedContents {
    /// None if there was no such file before, or it is not known what was there.
    std::optional<Buffer> base;
    Buffer left;
    Buffer right;
};

/// Merges contents; nothing if it gives up. The path is the file's, as components.
using ContentResolver = std::function<std::optional<Buffer>(KivVcs::array_view<KivStringViewT<char16_t> const> path,
                                                            DisputedContents const&)>;

/// A resolver that merges texts line by line with `MergeTextLines`, and gives up if that finds conflicts, or if there is
/// no base.
[[nodiscard]] KIVARCHIVE_EXPORT ContentResolver MergeTexts(std::uint64_t maximumBytes = largestText);

/// What becomes of a name that is a file on one side and a directory on the other.
struct KindDecision {
    enum class Keep : std::uint8_t {
        Undecided, ///< The blob resolver is asked, whose answers take the entry of a side whatever it is.
        File,
        Directory,
        Both, ///< The directory keeps the name, the file goes beside it as `fileName`.
        None,
    };
    Keep keep = Keep::Undecided;
    /// A name that neither side has in this directory; anything else counts as undecided.
    KivStringT<char16_t> fileName;
};

/// Asked about a name that is a file on one side and a directory on the other, where that is for somebody to decide.
using KindResolver =
    std::function<KindDecision(KivVcs::array_view<KivStringViewT<char16_t> const> path, KivVcs::MergeTrees const&)>;

/// Who is asked by a merge. `choices` is all that has to be there; it is as `KivVcs::ThreeWayMerge` takes it.
struct MergeResolvers {
    KivVcs::Resolvers choices;
    /// Asked first where both sides hold a file. May be empty.
    ContentResolver contents;
    /// Asked first where one side holds a file and the other a directory. May be empty.
    KindResolver kinds;
};

/// Where a merge gets what it looks at.
struct MergeSources {
    AncestryReader ancestry;
    /// The tree of that identifier; null if it is gone.
    std::function<KivVcs::cow_ptr<KivVcs::Tree>(Id const& tree)> tree;
    /// The content of a file, for content resolvers. Empty stands for `Blob::GetData`.
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
    /// What resolvers were asked about, in the order of asking, and how it was settled; after giving up also all that is
    /// left, undecided. `rootId` is null where it is not known what was there.
    std::vector<KivVcs::MergeConflict> conflicts;
    /// Common ancestors whose tree is gone. What they had is not known: whatever differs is asked about then, also what only
    /// one side has.
    std::vector<Id> lostBases;
};

/// Merges what two versions did since their histories met, against all of `FindMergeBases`, entry by entry.
///
/// What only one side changed is taken over, what both changed alike is taken once, everything else is asked about.
/// Several bases, which are there if merges have crossed, are brought together for each entry that they disagree about: what
/// both sides had when they had brought the bases together is the base, if they had the same; then what is left of the
/// bases' entries when each that another base has changed, by the same rule, is left out; then what both sides made of
/// these. If none of that gives one entry there is no base, and the resolvers are asked unless both sides are equal.
/// Of commits that contain each other all that a side has been at are bases.
///
/// Resolvers are asked as by `KivVcs::ThreeWayMerge`, but for this: nothing vanishes without a question. A name that is a
/// file on one side and a directory on the other is asked about if both sides changed it; an answer is followed whatever
/// kind of entry it takes; and directories that the merge leaves without entries go. `MergeTrees::root`, which resolvers are
/// shown, has for every entry that is asked about what its base has, and nothing where there is no base: `Root` counts as
/// undecided there. Once one has not decided, none is asked again.
///
/// Unchanged subtrees are shared with the sides, and new trees are stored in @p repo as they are made. Contents are asked
/// for only to give them to a content resolver.
/// @complexity proportional to the entries that differ and to the directories that hold them, times the number of bases;
/// at most some hundred steps for an entry that many bases disagree about
/// @param progress may be null; asked for each directory that is merged
/// @throws what the sources, resolvers and @p repo throw
[[nodiscard]] KIVARCHIVE_EXPORT TreeMerge MergeAgain(KivVcs::IRepository& repo, MergeSources const& sources,
                                                     MergeSide const& left, MergeSide const& right,
                                                     MergeResolvers const& resolvers, IProgress* progress = nullptr);

/// What a merge of a repository over an archive did.
struct MergeReport {
    KivVcs::MergeResult result = KivVcs::MergeResult::NothingToCommit;
    /// As `TreeMerge` has them.
    std::vector<KivVcs::MergeConflict> conflicts;
    std::vector<Id> lostBases;

    /// Whether the branch has the commit's changes now.
    [[nodiscard]] bool Succeeded() const noexcept { return result <= KivVcs::MergeResult::Merged; }
};

} // namespace KivArchive
