#pragma once

/// @file
/// Looking after an archive of any kind: checking it, and collecting what nothing reaches.

#include "KivArchive/IArchive.h"

namespace KivArchive {

/// An object as another one names it.
struct Link {
    ObjectType type = ObjectType::Blob;
    Id id;
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
    /// Commits that are there and whose facts are missing, or tell another parent or tree than they do.
    std::vector<Id> ancestry;

    [[nodiscard]] bool IsSound() const noexcept {
        return damaged.empty() && missing.empty() && branches.empty() && ancestry.empty();
    }
};

/// Reads every object, compares it with its identifier, and looks for all that it names. Goes on whatever it finds. What
/// others store meanwhile is seen or not.
///
/// Takes 32 bytes an object, beside a window of data. Reads everything once.
/// @param progress may be null
/// @throws ArchiveError for what concerns the archive as a whole
[[nodiscard]] KIVARCHIVE_EXPORT VerifyReport Verify(IArchive& archive, IProgress* progress);

struct CollectOptions {
    /// How long an object stays after it was first found unreached, for those who are about to use it.
    std::chrono::seconds grace{std::chrono::hours{14 * 24}};
    /// Trees and commits that are kept with all that they reach, though no branch reaches them.
    std::vector<Id> kept;
    /// The most objects removed in one transaction, and about the most bytes given back in one.
    std::size_t slice = 1000;
    std::uint64_t sliceBytes = std::uint64_t{4} * 1024 * 1024;
};

struct CollectReport {
    /// How many objects the branches reach.
    std::uint64_t reached = 0;
    std::uint64_t marked = 0;
    std::uint64_t unmarked = 0;
    std::uint64_t removed = 0;
};

/// Marks what neither branches nor `kept` reach, along parents, trees, contents and what was merged; removes, those that
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

} // namespace KivArchive
