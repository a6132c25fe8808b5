#pragma once

/// @file
/// Looking after an archive of any kind: checking it, and collecting what nothing reaches.

#include "KivArchive/IArchive.h"

#include <string_view>

namespace KivArchive {

/// An object as another one names it.
struct Link {
    ObjectType type = ObjectType::Blob;
    Id id;
    /// An entry's name in UTF-8, within the data that it was read from; empty in a commit.
    std::string_view name;
};

/// What the data of a tree or a commit names: files and directories, or the root tree and the parent. A blob names
/// nothing.
/// @return false, with the links before it, at the first byte that is not as the packed form has it
[[nodiscard]] KIVARCHIVE_EXPORT bool ReadLinks(ObjectType type, std::span<const std::byte> data,
                                               std::vector<Link>& links);

/// An object that is named and not there.
struct MissingObject {
    Id id;
    /// One of those that name it.
    Id namedBy;
};

/// What is wrong with an archive; nothing if all lists are empty.
struct VerifyReport {
    /// How many objects were read.
    std::uint64_t objects = 0;
    /// Objects whose stored bytes are not theirs, or whose data is not of their type.
    std::vector<Id> damaged;
    /// Objects that sound ones name and that are not there, each once.
    std::vector<MissingObject> missing;
    /// Branches whose head is not a commit that is there and sound.
    std::vector<Branch> branches;
    /// Commits that are there and whose facts are missing, or name another parent or tree than they do.
    std::vector<Id> ancestry;

    [[nodiscard]] bool IsSound() const noexcept {
        return damaged.empty() && missing.empty() && branches.empty() && ancestry.empty();
    }
};

/// Reads every object, compares it with its identifier, and looks for all that it names. Goes on whatever it finds. What
/// others store meanwhile is seen or not.
///
/// Takes 32 bytes an object, and 120 bytes each for up to 262,144 of them, which are asked for at once: what an archive
/// keeps together it decompresses once for each of these batches.
/// @param progress may be null
/// @throws ArchiveError for what concerns the archive as a whole
[[nodiscard]] KIVARCHIVE_EXPORT VerifyReport Verify(IArchive& archive, IProgress* progress);

struct CollectOptions {
    /// How long an object stays after it was first found unreached, for those who are about to use it.
    std::chrono::seconds grace{std::chrono::hours{14 * 24}};
    /// Trees and commits that are kept with all that they reach, though no branch reaches them.
    std::vector<Id> kept;
    /// One transaction removes at most so many objects, or gives back about so many bytes at most.
    std::size_t slice = 1000;
    std::uint64_t sliceBytes = std::uint64_t{4} * 1024 * 1024;
    /// One call marks at most so many objects, those that name others first. For archives that have little room: a mark
    /// takes some 60 bytes, and is what makes room in a later call.
    std::size_t mostMarked = SIZE_MAX;
};

struct CollectReport {
    /// How many objects the branches reach.
    std::uint64_t reached = 0;
    std::uint64_t marked = 0;
    std::uint64_t unmarked = 0;
    std::uint64_t removed = 0;
};

/// Marks what neither branches nor `kept` reach, along parents, trees, contents and what was merged, nor the trees of the
/// heads last exchanged (`ReadExchangedHeads`), which later merges are made against; removes, those that
/// name others first, what has been marked for the grace time and is still unreached; and gives the space back. Facts of
/// ancestry stay.
///
/// May run while others read and publish, and may be interrupted at any point: what is present has all that it names at
/// every moment. A commit whose ancestry names a merged one that is gone already does not miss it.
///
/// Reads every tree and commit once. Takes 32 bytes an object that is reached, more for those that are not.
/// @param progress may be null
/// @throws ArchiveError, of kind `Damaged` before anything is removed if a tree or commit that is reached cannot be read
KIVARCHIVE_EXPORT CollectReport Collect(IArchive& archive, CollectOptions const& options, IProgress* progress);

/// A branch of one archive, and the name under which another one gets it.
struct SynchronizedBranch {
    KivStringT<char16_t> from;
    /// Empty if no branch is to be moved there.
    KivStringT<char16_t> to;
};

struct SynchronizeOptions {
    /// Those that the source does not have are left out.
    std::vector<SynchronizedBranch> branches;
    /// Records that are copied over what is there; likewise.
    std::vector<KivStringT<char16_t>> records;
    /// Says whether a host can have an entry of that name, which comes from the source and may be anything, such as "..",
    /// "/" or empty. Empty accepts all.
    std::function<bool(KivStringViewT<char16_t> name)> acceptsName;
};

struct SynchronizeReport {
    /// The branches asked for that the source has, under its names.
    std::vector<Branch> heads;
    /// What was stored.
    std::uint64_t objects = 0;
    std::uint64_t ancestries = 0;
};

/// The head of a branch when `Synchronize` last brought it.
struct ExchangedHead {
    /// As in `SynchronizedBranch::to`, or `from` if that is empty.
    KivStringT<char16_t> branch;
    Id commit;
    /// Null if the commit names none.
    Id tree;
};

/// What was last brought to @p archive of each branch, which its records that begin with "exchanged/" hold.
/// @throws ArchiveError
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<ExchangedHead> ReadExchangedHeads(IArchive& archive);

/// Copies what the branches of @p from reach and @p to lacks, along parents, trees, contents and what was merged; then all
/// facts of ancestry; and in the last transaction it moves the branches, whatever they stood at, and sets the records, also those of the heads exchanged.
///
/// Objects are stored children first, those of older commits before those of newer ones, so that an interrupted call is
/// gone on with by the next one. Everything is compared with its identifier, and read as what it is said to be, before it
/// is stored. Subtrees that @p to has are not entered.
///
/// Holds the identifiers of the commits that are missing, the trees that a hundred of them bring, and a few MiB.
/// @param progress may be null
/// @throws ArchiveError of kind `Damaged` if the source lacks something or has it damaged, and of kind
/// `Unrepresentable` for a name that is not accepted; of kind `Collected` if somebody collects in @p to meanwhile.
/// What has been stored until then stays, and no branch has moved
KIVARCHIVE_EXPORT SynchronizeReport Synchronize(IArchive& from, IArchive& to, SynchronizeOptions const& options,
                                                IProgress* progress);

/// What became of what was damaged or missing.
struct RepairReport {
    std::vector<Id> repaired;
    /// Not to be had from the source either.
    std::vector<Id> lost;
};

/// Verifies @p archive, and takes what is damaged or missing in it from @p source, as far as that has it and it is what
/// its identifier says. Whatever else is in @p archive stays as it is.
/// @param progress may be null
/// @throws ArchiveError for what concerns an archive as a whole
KIVARCHIVE_EXPORT RepairReport Repair(IArchive& archive, IArchive& source, IProgress* progress);

} // namespace KivArchive
