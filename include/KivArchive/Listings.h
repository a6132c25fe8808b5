#pragma once

/// @file
/// What hosts show of an archive: histories, graphs, files and differences, as plain values that are read from packed
/// forms without making objects.

#include "KivArchive/IArchive.h"

#include <KivVcs/Differences.h>

#include <limits>
#include <string_view>

namespace KivArchive {

/// Whether a commit could be read. Its links come from its facts in any case, so that a history goes on after a damaged
/// commit.
enum class CommitState : std::uint8_t {
    Sound,
    Missing,         ///< Only its facts are there.
    Damaged,         ///< There, but not as it was stored.
    Unrepresentable, ///< As it was stored, but not in the packed form of a commit.
};

/// A commit in a history or a graph. The texts are empty and the time is zero unless its state is `Sound`.
struct CommitRecord {
    Id id;
    CommitState state = CommitState::Missing;
    /// Null for a root commit, and for no tree.
    Id parent;
    Id tree;
    /// What it merged, in no particular order.
    std::vector<Id> merged;
    KivStringT<char16_t> authorName;
    KivStringT<char16_t> authorEmail;
    KivStringT<char16_t> description;
    KivVcs::Time time;
    KivVcs::TimeDelta bias;
};

struct CommitListOptions {
    /// `Parents` lists the line of history of each head, and reads no further than is asked for. Otherwise the listing
    /// is a graph: no commit comes before one that leads to it, for which the facts of all commits are read first.
    Follow follow = Follow::Parents;
    std::uint64_t atMost = std::numeric_limits<std::uint64_t>::max();
    /// Only commits in which this path differs from their parent: a file or directory was added, was removed or has
    /// another identifier. A root commit adds all that it holds. The path without components is the whole tree.
    std::optional<KivStringT<char16_t>> changing;
};

/// Receives commits one at a time. @return false to end the listing
using CommitReceiver = std::function<bool(CommitRecord const&)>;

/// Passes to @p receiver @p heads and all commits that they lead to, each once, newest first along each line of
/// history. Null identifiers are skipped.
///
/// Calls the archive twice for every 500 commits, for their facts and for their texts, and if `changing` is set once
/// more for each component of the path. Holds 500 commits; for a graph also 200 bytes for each commit reached.
/// @param progress may be null
/// @throws ArchiveError; of kind `Damaged` or `Collected` for a tree that `changing` needs
KIVARCHIVE_EXPORT void ListCommits(IArchive& archive, std::span<const Id> heads, CommitListOptions const& options,
                                   CommitReceiver const& receiver, IProgress* progress);

/// The same for these commits only, in the order given. Those without facts have the links of their packed form.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<CommitRecord> ReadCommits(IArchive& archive, std::span<const Id> commits);

/// The commits whose identifiers begin with @p digits, hexadecimal digits of either case as people type them; at most
/// @p atMost, ordered by identifier. None if @p digits is empty or no beginning of an identifier. Commits of which only
/// the facts are left are among them; `ReadCommits` shows which. One call of the archive.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindCommits(IArchive& archive, std::string_view digits,
                                                            std::size_t atMost);

/// What a directory holds under a name, or a version under a path: a file, or a directory.
struct EntryRecord {
    KivStringT<char16_t> path;
    Id id;
    bool isDirectory = false;
};

/// The entries of one directory, ordered by name. The null identifier is an empty directory.
/// @throws ArchiveError of kind `Collected` if the tree is not there, of kind `Damaged` or `Unrepresentable` if it
/// cannot be read; so do all functions below
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<EntryRecord> ListDirectory(IArchive& archive, Id const& tree);

/// An entry, and the tree in which its path leads to it.
struct FoundEntry {
    Id tree;
    EntryRecord entry;
};

/// The entries that a path leads to in each of @p trees: the tree itself for the path without components, no element
/// for a tree in which there is none.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<FoundEntry> FindEntries(IArchive& archive, std::span<const Id> trees,
                                                                    KivStringT<char16_t> const& path);

/// The files that differ between two versions.
struct DifferenceList {
    /// Ordered by path, each path once.
    std::vector<KivVcs::Difference> differences;
    /// False if `DifferenceOptions::atMost` ended the search.
    bool isComplete = true;
};

/// What `KivVcs::Differences` gives for the trees of these identifiers, null for an empty one.
///
/// Subtrees with equal identifiers are not entered; each pair of subtrees is compared once, in however many places it
/// is. Reads the directories that differ level by level, 500 at a time; no content is read.
/// @param progress may be null
[[nodiscard]] KIVARCHIVE_EXPORT DifferenceList ListDifferences(IArchive& archive, Id const& before, Id const& after,
                                                               KivVcs::DifferenceOptions const& options,
                                                               IProgress* progress);

/// The files of a version.
struct FileList {
    /// Ordered by path.
    std::vector<EntryRecord> files;
    /// False if there are more.
    bool isComplete = true;
};

/// All files below @p tree, at most @p atMost. A subtree that occurs in many places is read once.
/// @param progress may be null
[[nodiscard]] KIVARCHIVE_EXPORT FileList ListFiles(IArchive& archive, Id const& tree, std::size_t atMost,
                                                   IProgress* progress);

} // namespace KivArchive
