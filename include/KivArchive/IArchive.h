#pragma once

/// @file
/// The interface of archives, which keep versions durably: packed forms by identifier, branches, ancestry and small
/// named records.

#include "KivArchive/ArchiveError.h"
#include "KivArchive/Progress.h"

#include <KivVcs/Id.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <vector>

namespace KivArchive {

using KivVcs::Buffer;
using KivVcs::Id;
using KivVcs::KivStringT;
using KivVcs::KivStringViewT;
using KivVcs::StreamIO;

/// The three types of object.
enum class ObjectType : std::uint8_t { Blob, Tree, Commit };

/// Contents up to this many bytes are stored and read whole; larger ones are streamed. Trees and commits are always
/// whole.
inline constexpr std::uint64_t largestWholeContent = std::uint64_t{1024} * 1024;

/// An object to be stored.
struct NewObject {
    /// The digest of the packed form. The archive trusts its callers with it: whoever stores data from elsewhere checks
    /// it with `Identify` first.
    Id id;
    ObjectType type = ObjectType::Blob;
    /// The data of the packed form, without its header; of a blob at most `largestWholeContent` bytes.
    Buffer data;
    /// The object that this one replaces under its path, which makes it cheap to store; null if there is none or it is
    /// not known. A hint only.
    Id earlier;
};

/// An object as it is passed to a receiver; its members are valid during that call only.
struct ArchivedObject {
    Id const& id;
    ObjectType type;
    /// The size of its data.
    std::uint64_t size;
    /// The data of the packed form, without its header, verified against `id`. Empty for a content larger than
    /// `largestWholeContent`, which `ReadContent` reads.
    std::span<const std::byte> data;
};

/// Receives objects one at a time, on the thread of the call that it was passed to, with no lock held and no statement
/// open, so that it may call the archive. What it throws ends that call and passes through.
using ObjectReceiver = std::function<void(ArchivedObject const&)>;

/// What could not be read.
struct ReadOutcome {
    /// Asked for and not there, in the order asked.
    std::vector<Id> missing;
    /// There, but not as it was stored. Everything passed to the receiver is sound.
    std::vector<Id> damaged;
};

/// An object without its data.
struct ObjectInfo {
    Id id;
    ObjectType type = ObjectType::Blob;
    /// The size of its data.
    std::uint64_t size = 0;
};

/// How a commit contains another one that is not its parent.
enum class Containment : std::uint8_t {
    Merged,        ///< It merged that commit, which stays reachable, as a parent does.
    RewrittenFrom, ///< It stands for that commit on a rewritten history.
    FoundEqual,    ///< Both had the same tree when they were to be merged, and this one was taken.
};

struct ContainedCommit {
    Containment how = Containment::Merged;
    Id id;

    friend bool operator==(ContainedCommit const& left, ContainedCommit const& right) noexcept = default;
};

/// The facts of a commit. An archive only ever adds facts, and keeps them when the commit itself is collected.
struct Ancestry {
    Id commit;
    /// Null for a root commit. Where the archive has facts of the commit already, their parent and tree stay.
    Id parent;
    /// Null if the commit names no tree.
    Id tree;
    /// In no particular order, each once.
    std::vector<ContainedCommit> contains;
};

/// Which links `ReadAncestry` follows.
enum class Follow : std::uint8_t {
    Parents,    ///< To parents only.
    Reachable,  ///< To parents and to merged commits.
    Everything, ///< To parents and to all that is contained.
};

struct Branch {
    KivStringT<char16_t> name;
    Id head;
};

/// Moves a branch if it still has the head that the caller expects.
struct BranchMove {
    KivStringT<char16_t> name;
    /// Null: there must be no such branch.
    Id expected;
    /// Null: the branch is removed.
    Id head;
};

/// A small named value of the host's, such as settings or an index; at most 16 MiB.
struct Record {
    KivStringT<char16_t> name;
    std::optional<Buffer> value;
};

/// Sets a record, or removes it if there is no value.
struct RecordChange {
    Record record;
    /// Whether the record must still have the value `expected`, or be missing if that is none.
    bool compared = false;
    std::optional<Buffer> expected;
};

/// What one transaction stores: all of it or nothing.
struct Change {
    /// Each after the objects that it names; apart from that in the order of their paths, since neighbours are
    /// compressed together. Objects that the archive has already are skipped.
    std::vector<NewObject> objects;
    /// Objects that `objects` name, that are not among them, and that the archive was found to have. A tree vouches for
    /// all that it reaches: a new version of a directory relies on the earlier version, and on what that does not name.
    /// Commits that one of `objects` has merged belong here, too.
    std::vector<Id> relied;
    /// The facts of every commit among `objects`, and any further ones.
    std::vector<Ancestry> ancestry;
    std::vector<BranchMove> branches;
    std::vector<RecordChange> records;
    /// Objects that would belong to `relied`, and earlier versions, where a head that `branches` expects or something
    /// in `relied` reaches them and so keeps them: an archive need not look for these.
    std::vector<Id> inherited = {};
};

/// How a transaction ended.
struct ChangeOutcome {
    /// False if the race was lost: nothing has been stored then.
    bool applied = false;
    /// The branches that had another head than expected, with their heads now; null for none.
    std::vector<Branch> movedBranches;
    /// The records that had another value than expected, with their values now.
    std::vector<Record> changedRecords;
};

/// What an archive holds, and how much space it takes.
struct ArchiveStatistics {
    std::uint64_t blobs = 0;
    std::uint64_t trees = 0;
    std::uint64_t commits = 0;
    /// The commits that have facts.
    std::uint64_t ancestries = 0;
    std::uint64_t branches = 0;
    std::uint64_t records = 0;
    /// The objects that `Collect` has marked.
    std::uint64_t marked = 0;
    /// How many bytes the archive takes where it is stored, and how many of these `Compact` can give back.
    std::uint64_t bytes = 0;
    std::uint64_t unusedBytes = 0;
};

/// An archive: keeps objects, branches, ancestry and records, as durably as its kind promises.
///
/// Every call is complete in itself: nothing stays open between calls, and calls take batches, so that an archive may
/// be on the other side of a network. Callers keep one rule, on which everything else rests: whatever is present has
/// all that it names. Objects may be stored ahead, each after those that it names, by any number of changes without
/// branches; the last change moves branches and records. What was stored ahead and is never reached by a branch stays
/// invisible until `Collect` removes it.
///
/// All identifiers passed are digests (`Id::GetDigest` is not null), except where null is allowed. An empty batch is
/// allowed everywhere. Where no order is stated, none is promised.
///
/// Threads: all operations may run concurrently on one archive, which several repositories may share.
/// @throws ArchiveError from every operation, for what concerns the archive as a whole; std::bad_alloc;
/// std::invalid_argument for an identifier that is no digest
class KIVARCHIVE_EXPORT IArchive {
public:
    virtual ~IArchive();

    /// Those of @p ids that the archive does not have, in the order given.
    [[nodiscard]] virtual std::vector<Id> FindMissing(std::span<const Id> ids) = 0;

    /// Types and sizes of those of @p ids that are there and readable.
    [[nodiscard]] virtual std::vector<ObjectInfo> Describe(std::span<const Id> ids) = 0;

    /// Passes those of @p ids that are there to @p receiver, each at least once, in the order that is cheapest. Damage
    /// is local: it is reported in the outcome, and everything else is read.
    virtual ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) = 0;

    /// The bytes of a content from @p offset on, @p size of them or as many as there are; nothing if there is no blob
    /// with that identifier. Each stored piece is verified when it is read; `ContentStream` verifies the whole content.
    ///
    /// Holds a few pieces of 1 MiB each, beside the result.
    /// @throws ArchiveError of kind `Damaged`
    [[nodiscard]] virtual std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) = 0;

    /// Stores the blob @p id, whose data is the rest of @p content, in short transactions and in pieces; meant for
    /// contents above `largestWholeContent`, but takes any. Nothing is stored twice. The pieces of an interrupted call
    /// are used by the next one, or collected.
    /// @param earlier as in `NewObject`
    /// @param progress may be null
    /// @return false, storing no blob, if reading fails, or if the data read is not that of @p id, as when it has
    /// changed since it was identified
    virtual bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) = 0;

    /// Applies @p change in one transaction, and returns once it is durable. Reading and compressing come before the
    /// transaction, so that it holds its locks only while it writes.
    ///
    /// Branches and records are compared first. If any of them is not as expected the race is lost: the outcome says
    /// so, and nothing is stored. Objects that are stored, relied on or made a head lose their marks.
    /// @throws ArchiveError of kind `Collected`, storing nothing, if an object relied on or a new head is not there;
    /// of kind `Unrepresentable` for a blob or record that is too large
    virtual ChangeOutcome Apply(Change const& change) = 0;

    /// All branches, ordered by name.
    [[nodiscard]] virtual std::vector<Branch> ReadBranches() = 0;

    /// The records of these names that exist, ordered by name.
    [[nodiscard]] virtual std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) = 0;

    /// The names of all records, ordered.
    [[nodiscard]] virtual std::vector<KivStringT<char16_t>> ListRecords() = 0;

    /// The facts of those of @p commits that have any, and then of up to @p more commits that these lead to, nearest
    /// first, each once.
    [[nodiscard]] virtual std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                             std::size_t more) = 0;

    /// The facts of up to @p limit commits, in ascending order of their digests, from the first one after @p after on;
    /// null begins with the first.
    [[nodiscard]] virtual std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) = 0;

    /// Up to @p limit objects, in the same manner. An object whose size cannot be read, since it is damaged, has size
    /// 0.
    [[nodiscard]] virtual std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) = 0;

    /// Marks objects as unreached, with the time of the archive's own clock. An object that is marked already keeps its
    /// mark; identifiers of objects that are not there are ignored.
    virtual void Mark(std::span<const Id> ids) = 0;

    /// Takes marks away.
    virtual void Unmark(std::span<const Id> ids) = 0;

    /// Up to @p limit objects that were marked at least @p grace ago, ordered and begun as `ListObjects` does.
    [[nodiscard]] virtual std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after,
                                                     std::size_t limit) = 0;

    /// Removes objects that were marked at least @p grace ago, in one transaction. If any of them was not, none is
    /// removed, since somebody has used that one meanwhile. Their facts stay.
    /// @return those that were not marked so; empty if all have been removed
    virtual std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) = 0;

    /// Gives up to about @p bytes of the space that removed objects took back to the disk or server, in short
    /// transactions.
    /// @return how many bytes are left to be given back; to be called until that is 0
    virtual std::uint64_t Compact(std::uint64_t bytes) = 0;

    /// Counts everything. @complexity proportional to the number of objects
    [[nodiscard]] virtual ArchiveStatistics GetStatistics() = 0;

protected:
    IArchive() = default;
    IArchive(IArchive const&) = default;
    IArchive& operator=(IArchive const&) = default;
};

/// The identifier of the object with this type and data.
[[nodiscard]] KIVARCHIVE_EXPORT Id Identify(ObjectType type, std::span<const std::byte> data);
[[nodiscard]] KIVARCHIVE_EXPORT Id Identify(ObjectType type, Buffer const& data);

/// The data of the blob @p id as a stream that fetches pieces as it is read. Reading its last bytes fails unless the
/// whole data matches @p id. Not valid if there is no such blob. The archive must outlive the stream; reading passes
/// its `ArchiveError`s on.
[[nodiscard]] KIVARCHIVE_EXPORT StreamIO ContentStream(IArchive& archive, Id const& id);

} // namespace KivArchive
