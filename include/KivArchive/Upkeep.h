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

/// Appends to @p links what the data of a tree or a commit names: files and directories, or the root tree and the
/// parent. A blob names nothing.
/// @return false, with the links up to there, at the first byte that does not fit the packed form
[[nodiscard]] KIVARCHIVE_EXPORT bool ReadLinks(ObjectType type, std::span<const std::byte> data,
                                               std::vector<Link>& links);

/// An object that others name and that is not there.
struct MissingObject {
    Id id;
    /// One of the objects that name it.
    Id namedBy;
};

/// What is wrong with an archive; nothing if all lists are empty.
struct VerifyReport {
    /// How many objects were read.
    std::uint64_t objects = 0;
    /// Objects whose bytes do not match their identifier, or whose data is not that of their type.
    std::vector<Id> damaged;
    /// Objects that sound ones name and that are not there, each once.
    std::vector<MissingObject> missing;
    /// Branches whose head is not a commit that is there and sound.
    std::vector<Branch> branches;
    /// Commits that are there and whose facts are missing, or have another parent or tree than the commits name.
    std::vector<Id> ancestry;

    [[nodiscard]] bool IsSound() const noexcept {
        return damaged.empty() && missing.empty() && branches.empty() && ancestry.empty();
    }
};

/// Reads every object, compares it with its identifier, and looks for all that it names. Goes on whatever it finds.
/// What others store meanwhile may be read or not.
///
/// Takes 32 bytes of memory for each object, and 120 bytes more for each of up to 262,144 that it reads at once, so
/// that an archive seldom decompresses twice what it keeps together.
/// @param progress may be null
/// @throws ArchiveError for what concerns the archive as a whole
[[nodiscard]] KIVARCHIVE_EXPORT VerifyReport Verify(IArchive& archive, IProgress* progress);

struct CollectOptions {
    /// How long an object stays after it was first found unreached, for hosts that are about to use it.
    std::chrono::seconds grace{std::chrono::hours{14 * 24}};
    /// Trees and commits that are kept with all that they reach, though no branch reaches them.
    std::vector<Id> kept;
    /// One transaction removes at most this many objects, or gives back at most about this many bytes.
    std::size_t slice = 1000;
    std::uint64_t sliceBytes = std::uint64_t{4} * 1024 * 1024;
    /// One call marks at most this many objects, those that name others first. For archives with little space left: a
    /// mark takes some 60 bytes, and space is freed only by a later call.
    std::size_t mostMarked = SIZE_MAX;
};

struct CollectReport {
    /// How many objects the branches reach.
    std::uint64_t reached = 0;
    std::uint64_t marked = 0;
    std::uint64_t unmarked = 0;
    std::uint64_t removed = 0;
};

/// Marks what is not reached, along parents, trees, contents and merged commits, from branches, from `kept`, or from
/// the trees of the heads last exchanged (`ReadExchangedHeads`), which later merges are made against; removes what has
/// been marked for the grace time and is still unreached, each object before those that it names; and gives the space
/// back. Facts stay.
///
/// May run while others read and publish, and may be interrupted at any point: at every moment, what is present has all
/// that it names. Only a merged commit that the facts of another one name may be gone.
///
/// Reads every tree and commit once. Takes 32 bytes of memory for each object that is reached, more for the others.
/// @param progress may be null
/// @throws ArchiveError, of kind `Damaged` before anything is removed if a tree or commit that is reached cannot be
/// read
KIVARCHIVE_EXPORT CollectReport Collect(IArchive& archive, CollectOptions const& options, IProgress* progress);

/// A branch of one archive, and the name that it gets in another.
struct SynchronizedBranch {
    KivStringT<char16_t> from;
    /// Empty if no branch is to be moved there.
    KivStringT<char16_t> to;
};

struct SynchronizeOptions {
    /// Those that the source does not have are left out.
    std::vector<SynchronizedBranch> branches;
    /// The records that are copied, replacing what is there. Those that the source does not have are left out.
    std::vector<KivStringT<char16_t>> records;
    /// Returns whether the host accepts an entry with that name, which comes from the source and may be anything, such
    /// as "..", "/" or empty. An empty function accepts all.
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

/// The heads that `Synchronize` last brought to @p archive, which keeps them in records whose names begin with
/// "exchanged/".
/// @throws ArchiveError
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<ExchangedHead> ReadExchangedHeads(IArchive& archive);

/// Copies what the branches of @p from reach and @p to lacks, along parents, trees, contents and merged commits; then
/// all facts. In the last transaction it moves the branches, whatever their heads were, and sets the records, including
/// those of the heads exchanged.
///
/// Each object is stored after those that it names, and older commits before newer ones, so that the next call
/// continues where an interrupted one stopped. Everything is compared with its identifier and parsed before it is
/// stored. Subtrees that @p to has are not entered.
///
/// Holds the identifiers of the commits that are missing, the trees that a hundred of them bring, and a few MiB.
/// @param progress may be null
/// @throws ArchiveError of kind `Damaged` if the source lacks something or has it damaged, of kind `Unrepresentable`
/// for a name that is not accepted, and of kind `Collected` if somebody collects in @p to meanwhile. What has been
/// stored until then stays, and no branch has moved
KIVARCHIVE_EXPORT SynchronizeReport Synchronize(IArchive& from, IArchive& to, SynchronizeOptions const& options,
                                                IProgress* progress);

/// The commits that @p heads reach in @p from, and that @p to has forgotten: their facts are in it, they are not. What
/// `Synchronize` would bring back, to ask somebody about. In the order in which `ReadAncestry` gives them.
[[nodiscard]] KIVARCHIVE_EXPORT std::vector<Id> FindForgotten(IArchive& from, IArchive& to, std::span<const Id> heads);

/// What was repaired, and what could not be.
struct RepairReport {
    std::vector<Id> repaired;
    /// What the source does not have either.
    std::vector<Id> lost;
};

/// Verifies @p archive, and copies what is damaged or missing in it from @p source, as far as the source has it and it
/// matches its identifier. Whatever else is in @p archive stays as it is.
/// @param progress may be null
/// @throws ArchiveError for what concerns either archive as a whole
KIVARCHIVE_EXPORT RepairReport Repair(IArchive& archive, IArchive& source, IProgress* progress);

} // namespace KivArchive
