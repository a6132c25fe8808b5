#pragma once

/// @file
/// An archive in a database that speaks the PostgreSQL protocol, for many machines.

#include "KivArchive/IArchive.h"

#include <memory>
#include <string>

namespace KivArchive {

namespace Postgres {
class Store;
} // namespace Postgres

struct PostgresOptions {
    /// Whether to make the tables if there are none, which takes a role that may.
    bool create = true;
    /// Whether the first call connects in the constructor's place, and throws what that would have thrown: for hosts that go
    /// on with a cache while the server is away.
    bool connectsLater = false;
    /// The schema that holds the tables; each holds one archive.
    std::string schema = "kivarchive";
    /// How long to wait for the server's next answer, and to try again where transactions get into each other's way.
    std::chrono::milliseconds wait{30000};
    /// How long to try to connect anew when a connection has been lost. The first connection is tried once.
    std::chrono::milliseconds reconnect{5000};
    /// How many threads one call may use for compressing; 0 stands for as many as there are processors.
    unsigned workers = 0;
};

/// An archive in a database, which any number of hosts on any machines may use at once. docs/team.md describes tables,
/// grants and costs.
///
/// Durable as far as the database is set up to be: a call that stores returns when the server has committed. Readers and
/// writers do not wait for each other; of two who move one branch at once, one loses the race.
///
/// A lost connection and a transaction that the server could not bring in line with others are tried again, with growing
/// pauses; a change whose answer was lost is looked up first, so that it is stored once. Marks are made at the server's
/// time. Everything read is compared with its identifier.
///
/// Threads: calls that run at once use connections of their own, up to eight of which are kept for later ones.
/// A process that forks gives the child no use of the archive.
class KIVARCHIVE_EXPORT PostgresArchive final : public IArchive {
public:
    /// Opens the archive, or makes it.
    /// @param address a connection string of libpq: "postgresql://user@host/database" or "host=... dbname=...". What it
    /// leaves open comes from the service file, the password file and the environment, also how the connection is
    /// encrypted. No sentence of a failure shows the password
    /// @throws ArchiveError of kind `Foreign` or `NewerFormat` if there is something else in the schema, of kind
    /// `Unavailable` if the server cannot be reached, or if there is no archive and none is to be made; of kind
    /// `ReadOnly` if the role may not make one. None of that while `PostgresOptions::connectsLater`
    explicit PostgresArchive(std::string const& address, PostgresOptions const& options = {});
    PostgresArchive(PostgresArchive const&) = delete;
    PostgresArchive& operator=(PostgresArchive const&) = delete;
    /// @pre no call is running
    ~PostgresArchive() override;

    /// One or two round trips, whatever the number of objects; more for those of more than a few MiB altogether.
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override;
    /// One round trip where the change names no earlier versions, otherwise two; beyond a few MiB of earlier versions more.
    ChangeOutcome Apply(Change const& change) override;
    /// One round trip, if the commits have not merged many others.
    [[nodiscard]] std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                     std::size_t more) override;
    [[nodiscard]] std::vector<Id> FindMissing(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids) override;
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override;
    bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) override;
    [[nodiscard]] std::vector<Branch> ReadBranches() override;
    [[nodiscard]] std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) override;
    [[nodiscard]] std::vector<KivStringT<char16_t>> ListRecords() override;
    [[nodiscard]] std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) override;
    [[nodiscard]] std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) override;
    void Mark(std::span<const Id> ids) override;
    void Unmark(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) override;
    std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) override;
    std::uint64_t Compact(std::uint64_t bytes) override;
    [[nodiscard]] ArchiveStatistics GetStatistics() override;

    /// How often the archive has waited for an answer of the server, apart from making connections.
    [[nodiscard]] std::uint64_t GetRoundTrips() const noexcept;

private:
    std::unique_ptr<Postgres::Store> store_;
};

} // namespace KivArchive
