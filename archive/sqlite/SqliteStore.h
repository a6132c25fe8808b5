#pragma once

/// @file
/// What the operations of `SqliteArchive` share.

#include "Items.h"
#include "KivArchive/SqliteArchive.h"
#include "sqlite/Database.h"

#include <list>
#include <map>
#include <mutex>

namespace KivArchive {

/// A stored form, and what keeps its bytes.
struct Form {
    std::shared_ptr<const void> owner;
    ByteView bytes;
    /// How many bytes the owner keeps.
    std::uint64_t held = 0;
};

/// Whether a form is known to be as it was stored.
enum class Trust : std::uint8_t {
    Verified,   ///< The segments that it comes from have been hashed.
    Unverified, ///< The caller compares it with its identifier, which costs less than hashing whole segments.
};

/// Caches the forms that were made last, up to a number of bytes, for reading differences to them. Any number of
/// threads may use it.
class FormCache {
public:
    explicit FormCache(std::uint64_t budget) noexcept : budget_(budget) {}

    /// Null if it is not there. Verified forms are found with either kind of trust.
    [[nodiscard]] std::shared_ptr<const Bytes> Find(Place const& place, Trust trust);
    void Keep(Place const& place, Trust trust, std::shared_ptr<const Bytes> const& form);
    /// Drops everything, after something in it was found to be damaged.
    void Clear() noexcept;

private:
    using Key = std::pair<Place, Trust>;
    struct Entry {
        Key key;
        std::shared_ptr<const Bytes> form;
    };

    std::mutex mutex_;
    std::uint64_t budget_;
    std::uint64_t size_ = 0;
    std::list<Entry> newestFirst_;
    std::map<Key, std::list<Entry>::iterator> entries_;
};

/// Segments that have been read, by number.
class HeldSegments {
public:
    /// Null if it is not there.
    [[nodiscard]] std::shared_ptr<const Segment> Find(std::uint64_t number) const;
    void Hold(std::shared_ptr<const Segment> const& segment);
    [[nodiscard]] std::uint64_t GetSize() const noexcept { return size_; }

private:
    std::map<std::uint64_t, std::shared_ptr<const Segment>> segments_;
    std::uint64_t size_ = 0;
};

struct Connection {
    Connection(std::string const& path, Database::Access access, SqliteOptions const& options)
        : database(path, access, options.wait, options.waiting) {}

    Database database;
    Compressor compressor;
    /// The segments read last, for the next call, provided that the file has not changed since.
    HeldSegments held;
    std::optional<std::uint32_t> heldVersion;
};

/// Reads stored forms from segments, wherever these are.
class SegmentReader {
public:
    SegmentReader(SegmentReader const&) = delete;
    SegmentReader& operator=(SegmentReader const&) = delete;
    virtual ~SegmentReader() = default;

    /// @throws Malformed if there is no such segment
    [[nodiscard]] std::shared_ptr<const Segment> SegmentAt(std::uint64_t number, Trust trust = Trust::Verified);
    /// The stored form of a member, also of one that is a difference. @throws Malformed
    [[nodiscard]] Form FormAt(Place place, Trust trust = Trust::Verified);

protected:
    SegmentReader(Compressor& compressor, FormCache& cache) : compressor_(compressor), cache_(cache) {}

    /// The form of a segment. @throws Malformed if there is no such segment
    [[nodiscard]] virtual Bytes Load(std::uint64_t number) = 0;

    HeldSegments held_;

private:
    [[nodiscard]] Form SharedForm(Segment const& segment, Member const& member, Trust trust);

    Compressor& compressor_;
    FormCache& cache_;
};

/// Reads the segments of a database within one transaction.
class FormReader final : public SegmentReader {
public:
    FormReader(Connection& connection, FormCache& cache);
    FormReader(FormReader const&) = delete;
    FormReader& operator=(FormReader const&) = delete;
    ~FormReader() override;

private:
    Bytes Load(std::uint64_t number) override;

    Connection& connection_;
    RowBlobs forms_;
    std::optional<std::uint32_t> version_;
};

/// A row of the table of objects, without its identifier.
struct ObjectRow {
    StoredType type = StoredType::Blob;
    Place place;
};

/// Reads three columns of a row: type, segment and member.
[[nodiscard]] ObjectRow RowOf(Database const& database, Query const& query, int firstColumn);

/// The row of @p id; nothing if it is not there.
[[nodiscard]] std::optional<ObjectRow> FindRow(Database& database, Id const& id);
/// The rows of all of @p ids, with one run of a statement if they are many.
[[nodiscard]] std::vector<std::optional<ObjectRow>> FindRows(Database& database, std::span<const Id> ids);

/// The implementation of one `SqliteArchive`.
class SqliteStore {
public:
    SqliteStore(std::string path, SqliteOptions const& options);

    /// A connection for the duration of a call.
    class Lease {
    public:
        explicit Lease(SqliteStore& store) : store_(store), connection_(store.Take()) {}
        Lease(Lease const&) = delete;
        Lease& operator=(Lease const&) = delete;
        ~Lease() { store_.ReturnConnection(std::move(connection_)); }

        Connection& operator*() const noexcept { return *connection_; }
        Connection* operator->() const noexcept { return connection_.get(); }

    private:
        SqliteStore& store_;
        std::unique_ptr<Connection> connection_;
    };

    [[nodiscard]] std::unique_ptr<Connection> Take();
    void ReturnConnection(std::unique_ptr<Connection> connection) noexcept;

    /// Stores @p items with the rest of @p change, which has no objects of its own.
    [[nodiscard]] ChangeOutcome Store(std::vector<Item> const& items, Change const& change);

    /// The digests of the pieces of a large content.
    [[nodiscard]] static std::vector<Id> PiecesOf(SegmentReader& reader, ObjectRow const& row);

    [[noreturn]] void ThrowDamaged(std::string const& what) const;

    std::string path;
    SqliteOptions options;
    FormCache cache;
    /// Writers of one process take turns by this, since waiting for the file's lock means sleeping.
    std::mutex writing;
    std::mutex connectionsMutex;
    std::vector<std::unique_ptr<Connection>> connections;
};

/// A row, and the index of its identifier among those asked for.
struct FoundRow {
    std::size_t wanted = 0;
    ObjectRow row;
};

/// The sizes of the objects at @p rows; nothing for those that cannot be read. Reads each segment once, in order.
[[nodiscard]] std::vector<std::optional<std::uint64_t>> SizesOf(Connection& connection, FormCache& cache,
                                                                std::vector<FoundRow> rows);

/// Runs @p read. @return false if what it read is damaged
template <class Read>
[[nodiscard]] bool IsSound(Read read) {
    try {
        read();
        return true;
    } catch (Malformed const&) {
        return false;
    } catch (ArchiveError const& error) {
        // One damaged page costs only what is on it.
        if (error.GetKind() != Failure::Damaged)
            throw;
        return false;
    }
}

[[nodiscard]] ObjectType TypeOf(StoredType type) noexcept;

/// The time of marks: seconds since 1970.
[[nodiscard]] std::int64_t SecondsNow();

} // namespace KivArchive
