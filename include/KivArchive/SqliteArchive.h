#pragma once

/// @file
/// An archive in one SQLite database file.

#include "KivArchive/IArchive.h"

#include <memory>
#include <string>

namespace KivArchive {

class SqliteStore;

struct SqliteOptions {
    /// Whether to make the file if there is none. Only its owner may read and write it.
    bool create = true;
    /// How long to wait while somebody else writes.
    std::chrono::milliseconds wait{30000};
    /// Called once a call has waited for others for a quarter of a second, on its thread, so that a host can show this.
    /// It must not call the archive, nor throw. May be empty.
    std::function<void()> waiting;
    /// How many threads one call may use for compressing and hashing; 0 stands for as many as there are processors.
    unsigned workers = 0;
    /// About how many bytes of stored forms are cached, for the differences to them that are read next.
    std::uint64_t cacheBytes = std::uint64_t{32} * 1024 * 1024;
};

/// An archive in one file, beside which SQLite keeps its write-ahead log while the file is open (names ending in "-wal"
/// and "-shm"). docs/archive.md describes the schema and the stored forms.
///
/// Durable: what a call has stored when it returns outlives a crash or a power failure, as far as the disk keeps its
/// promises. Several processes may use one file on one machine, but not over a network file system. Readers and a
/// writer do not wait for each other; writers take turns, each for as long as it writes one transaction.
///
/// A file that does not have exactly this library's schema is refused before anything in it is used; triggers and views
/// in it never run. Whatever its pages hold is bounded, checked and verified when it is read.
class KIVARCHIVE_EXPORT SqliteArchive final : public IArchive {
public:
    /// Opens the file, or makes it.
    /// @param path in the encoding of the file system
    /// @throws ArchiveError of kind `Foreign` or `NewerFormat` if it is not an archive that this release can use, of
    /// kind `Unavailable` if there is none and none is to be made; and as every operation
    explicit SqliteArchive(std::string const& path, SqliteOptions const& options = {});
    SqliteArchive(SqliteArchive const&) = delete;
    SqliteArchive& operator=(SqliteArchive const&) = delete;
    /// @pre no call is running
    ~SqliteArchive() override;

    [[nodiscard]] std::vector<Id> FindMissing(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids) override;
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override;
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override;
    bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) override;
    ChangeOutcome Apply(Change const& change) override;
    [[nodiscard]] std::vector<Branch> ReadBranches() override;
    [[nodiscard]] std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) override;
    [[nodiscard]] std::vector<KivStringT<char16_t>> ListRecords() override;
    [[nodiscard]] std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                     std::size_t more) override;
    [[nodiscard]] std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) override;
    [[nodiscard]] std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) override;
    void Mark(std::span<const Id> ids) override;
    void Unmark(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) override;
    std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) override;
    std::uint64_t Compact(std::uint64_t bytes) override;
    [[nodiscard]] ArchiveStatistics GetStatistics() override;

    /// Copies the archive as it is at one moment to a new file, while others go on reading and writing.
    /// @throws ArchiveError, `Unavailable` if @p path exists; after a failure there is no new file
    void Backup(std::string const& path, IProgress* progress);

private:
    std::unique_ptr<SqliteStore> store_;
};

/// What `Salvage` has found.
struct SalvageReport {
    /// What was stored in the other archive.
    std::uint64_t objects = 0;
    std::uint64_t ancestries = 0;
    /// Segments that were found and are damaged, or hold differences to one that is, and objects that could not be read
    /// though their segments are sound.
    std::uint64_t damagedSegments = 0;
    std::uint64_t lostObjects = 0;
    /// The branches that were made.
    std::vector<Branch> branches;
    /// Those whose head is lost, or whose name another branch of the other archive has.
    std::vector<Branch> lostBranches;
    /// Commits that no other one leads to: among them are the heads of branches whose names are lost.
    std::vector<Id> lastCommits;
    std::uint64_t records = 0;
};

/// Stores in @p to whatever is sound in a damaged file. The file is only read, page by page and without SQLite, so that
/// this works even if its tables cannot be opened, or the pages that lead to others are lost. Every object stored
/// matches its identifier; a damaged page costs the segments on it and the versions that are differences to these,
/// nothing else.
///
/// Where the tables of branches, records or facts cannot be read to their ends, their rows are taken from whatever
/// pages show, which may be outdated: of several heads of a branch the one stored last is taken. `Verify` names what is
/// missing then; `Repair` takes it from another archive.
/// @param path a file that nobody else uses meanwhile
/// @param progress may be null
/// @throws ArchiveError of kind `Unavailable` if the file cannot be read, and from @p to
KIVARCHIVE_EXPORT SalvageReport Salvage(std::string const& path, IArchive& to, IProgress* progress);

} // namespace KivArchive
