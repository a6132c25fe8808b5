#pragma once

/// @file
/// What keeps versions durably: packed forms by identifier, branches, ancestry and small named records.

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

/// The three types of object, by the type words of their packed forms.
enum class ObjectType : std::uint8_t { Blob, Tree, Commit };

/// Contents up to this many bytes are stored and given whole; larger ones are streamed. Trees and commits are always
/// whole.
inline constexpr std::uint64_t largestWholeContent = std::uint64_t{1024} * 1024;

/// An object to be stored.
struct NewObject {
    /// The digest of the packed form. The archive trusts whoever stores; what comes from elsewhere is compared with
    /// `Identify` first.
    Id id;
    ObjectType type = ObjectType::Blob;
    /// The data of the packed form, without its header; of a blob at most `largestWholeContent` bytes.
    Buffer data;
    /// The object that this one replaces under its path, which makes it cheap to store; null if there is none or it is
    /// not known. A hint only.
    Id earlier;
};

/// An object as it is given to a receiver; its members are valid during that call only.
struct ArchivedObject {
    Id const& id;
    ObjectType type;
    /// The size of its data.
    std::uint64_t size;
    /// The data of the packed form, without its header, verified against `id`. Empty for a content larger than
    /// `largestWholeContent`, which `ReadContent` gives.
    std::span<const std::byte> data;
};

/// Takes objects one after the other. It is called on the thread of the call that it was given to, without a lock or a
/// statement open, so that it may call the archive; what it throws ends that call and passes through.
using ObjectReceiver = std::function<void(ArchivedObject const&)>;

/// What a reading call could not give.
struct ReadOutcome {
    /// Asked for and not there, in the order asked.
    std::vector<Id> missing;
    /// There, but not what was stored; everything else is sound.
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
    Merged,        ///< It merged that commit's tree. What was merged stays reachable, as a parent does.
    RewrittenFrom, ///< It stands for that commit on a rewritten history.
    FoundEqual,    ///< Both had one tree when they met, and this one was taken.
};

struct ContainedCommit {
    Containment how = Containment::Merged;
    Id id;

    friend bool operator==(ContainedCommit const& left, ContainedCommit const& right) noexcept = default;
};

/// The facts of a commit. An archive only ever adds facts, and keeps them when the commit is dropped or collected.
struct Ancestry {
    Id commit;
    /// Null for a root commit. Of a commit that is known already, the parent and tree known stay.
    Id parent;
    /// Null if the commit names no tree.
    Id tree;
    /// In no particular order, each once.
    std::vector<ContainedCommit> contains;
};

/// Along which links `ReadAncestry` goes on.
enum class Follow : std::uint8_t {
    Parents,    ///< To parents only.
    Reachable,  ///< To parents and to what was merged.
    Everything, ///< To parents and to all that is contained.
};

struct Branch {
    KivStringT<char16_t> name;
    Id head;
};

/// Moves a branch, if it still stands where the mover saw it.
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

/// Sets, or without a value removes, a record.
struct RecordChange {
    Record record;
    /// Whether the record must still have the value `expected`, or be missing if that is none.
    bool compared = false;
    std::optional<Buffer> expected;
};

/// What one transaction stores: all of it or nothing.
struct Change {
    /// Children before the objects that name them; apart from that in the order of their paths, since neighbours are
    /// compressed together. Identifiers that the archive has already are skipped.
    std::vector<NewObject> objects;
    /// Objects that `objects` name, that are not among them, and that the archive was found to have. A tree relied on
    /// vouches for all that it reaches, so that a new version of a directory relies on the earlier one and on what that
    /// one does not name. Commits that one among `objects` has merged belong here, too.
    std::vector<Id> relied;
    /// The facts of every commit among `objects`, and any further ones.
    std::vector<Ancestry> ancestry;
    std::vector<BranchMove> branches;
    std::vector<RecordChange> records;
    /// Earlier versions and what would be relied on, if they are reached from a head that `branches` expects or from what
    /// is relied on: these keep them, so that an archive need not look at them.
    std::vector<Id> inherited = {};
};

/// How a transaction ended.
struct ChangeOutcome {
    /// False if the race was lost: nothing has been stored then.
    bool applied = false;
    /// The branches that stood elsewhere than expected, with their heads now; null for none.
    std::vector<Branch> movedBranches;
    /// The records that had another value than expected, with their values now.
    std::vector<Record> changedRecords;
};

/// What an archive holds and takes.
struct ArchiveStatistics {
    std::uint64_t blobs = 0;
    std::uint64_t trees = 0;
    std::uint64_t commits = 0;
    /// The commits whose ancestry is known.
    std::uint64_t ancestries = 0;
    std::uint64_t branches = 0;
    std::uint64_t records = 0;
    /// The objects that `Collect` has marked.
    std::uint64_t marked = 0;
    /// Bytes that the archive takes where it lives, and how many of them can be given back.
    std::uint64_t bytes = 0;
    std::uint64_t unusedBytes = 0;
};

/// An archive: keeps objects, branches, ancestry and records, as durably as its kind promises.
///
/// Every call is complete in itself: nothing stays open between calls, and calls take batches, so that an archive may
/// live behind a network. Whoever stores keeps one rule, on which everything else stands: whatever is present has all
/// that it names. Objects may be stored ahead, by any number of changes without branches, children before parents;
/// branches and records move in the last one. What was stored ahead and never reached by a branch is invisible and
/// becomes `Collect`'s.
///
/// All identifiers given are digests (`Id::GetDigest` is not null), except where null is allowed. An empty batch is
/// allowed everywhere. Where no order is given there is none.
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

    /// Hands those of @p ids that are there to @p receiver, each at least once, in the order that is cheapest. The
    /// identifiers may stay in use by the receiver's copies only. Damage is local: it is reported in the outcome, and the
    /// rest is given.
    virtual ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) = 0;

    /// The bytes of a content from @p offset on, @p size of them or as many as there are; a null value if there is no
    /// blob of that identifier. Each stored piece that is read is verified; a content read to its end is verified as a
    /// whole by `ContentStream`.
    /// Holds a few pieces, 1 MiB each, beside the result.
    /// @throws ArchiveError of kind `Damaged`
    [[nodiscard]] virtual std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) = 0;

    /// Stores the blob @p id, whose data is the rest of @p content, in short transactions and in pieces; meant for
    /// contents above `largestWholeContent`, and right for all. Nothing is stored twice. The pieces of an interrupted
    /// call are used by the next one, or collected.
    /// @param earlier as in `NewObject`
    /// @param progress may be null
    /// @return false, storing no blob, if reading failed or the data read is not that of @p id: it has changed since it
    /// was identified
    virtual bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) = 0;

    /// Applies @p change in one transaction, at the end of which it is durable. Compressing and reading what it needs
    /// for that come before the transaction, which holds its locks for as long as writing takes.
    ///
    /// Branches and records are compared first; if any of them is not as expected the race is lost, which is an answer
    /// and stores nothing. Marks of `Collect` on objects that are stored, relied on or made a head are taken away.
    /// @throws ArchiveError of kind `Collected`, storing nothing, if an object relied on or a new head is not there;
    /// of kind `Unrepresentable` for a blob or record that is too large
    virtual ChangeOutcome Apply(Change const& change) = 0;

    /// All branches, ordered by name.
    [[nodiscard]] virtual std::vector<Branch> ReadBranches() = 0;

    /// The records of these names that exist, ordered by name.
    [[nodiscard]] virtual std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) = 0;

    /// The names of all records, ordered.
    [[nodiscard]] virtual std::vector<KivStringT<char16_t>> ListRecords() = 0;

    /// The facts of those of @p commits that are known, and then those of up to @p more commits that they lead to,
    /// nearest first, each once.
    [[nodiscard]] virtual std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                             std::size_t more) = 0;

    /// Up to @p limit commits with known facts, in ascending order of their digests, from the first one behind
    /// @p after on; null begins with the first.
    [[nodiscard]] virtual std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) = 0;

    /// Up to @p limit objects, in the same manner. Objects that are damaged so that their size is not known have
    /// size 0.
    [[nodiscard]] virtual std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) = 0;

    /// Marks objects as unreached, as of now by the archive's own clock; a mark that is there stays as it is, and so
    /// does what is not there.
    virtual void Mark(std::span<const Id> ids) = 0;

    /// Takes marks away.
    virtual void Unmark(std::span<const Id> ids) = 0;

    /// Up to @p limit objects that were marked at least @p grace ago, ordered and begun as `ListObjects` does.
    [[nodiscard]] virtual std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after,
                                                     std::size_t limit) = 0;

    /// Removes objects that were marked at least @p grace ago, in one transaction. If any of them is not, none is
    /// removed: a host has used it meanwhile. Their ancestry stays.
    /// @return those that are not marked so; empty if all are gone
    virtual std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) = 0;

    /// Gives up to about @p bytes of what removed objects took back to where the archive lives, in short transactions;
    /// called until it gives 0. @return how many bytes there still are to be given back
    virtual std::uint64_t Compact(std::uint64_t bytes) = 0;

    /// Counts; proportional to the number of objects.
    [[nodiscard]] virtual ArchiveStatistics GetStatistics() = 0;

protected:
    IArchive() = default;
    IArchive(IArchive const&) = default;
    IArchive& operator=(IArchive const&) = default;
};

/// The identifier of the object with this type and data.
[[nodiscard]] KIVARCHIVE_EXPORT Id Identify(ObjectType type, std::span<const std::byte> data);
[[nodiscard]] KIVARCHIVE_EXPORT Id Identify(ObjectType type, Buffer const& data);

/// The data of the blob @p id as a stream that fetches pieces as it is read and fails to read its last bytes if the
/// whole is not what @p id says. Not valid if there is no such blob. The archive must outlive the stream. Failures of
/// the archive pass through reading as `ArchiveError`.
[[nodiscard]] KIVARCHIVE_EXPORT StreamIO ContentStream(IArchive& archive, Id const& id);

} // namespace KivArchive
