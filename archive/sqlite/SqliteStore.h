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

/// How far what segments give is trusted.
enum class Trust : std::uint8_t {
    Verified,   ///< It is what was stored: the segments that it comes from have been hashed.
    Unverified, ///< Whoever reads it compares it with its identifier, which costs less than hashing whole segments.
};

/// The forms that were made last, up to a number of bytes, for those that are differences to them. Any number of
/// threads may use it.
class FormCache {
public:
    explicit FormCache(std::uint64_t budget) noexcept : budget_(budget) {}

    /// What is verified serves everybody. Null if it is not there.
    [[nodiscard]] std::shared_ptr<const Bytes> Find(Place const& place, Trust trust);
    void Keep(Place const& place, Trust trust, std::shared_ptr<const Bytes> const& form);
    /// Drops everything, of which something was not what was stored.
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
    /// What was read last, for the next call if the file is still at that version.
    HeldSegments held;
    std::optional<std::uint32_t> heldVersion;
};

/// Reads stored forms out of segments, wherever these come from.
class SegmentReader {
public:
    SegmentReader(SegmentReader const&) = delete;
    SegmentReader& operator=(SegmentReader const&) = delete;
    virtual ~SegmentReader() = default;

    /// @throws Malformed if there is no such segment
    [[nodiscard]] std::shared_ptr<const Segment> SegmentAt(std::uint64_t number, Trust trust = Trust::Verified);
    /// The stored form of a member, whatever it is a difference to. @throws Malformed
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

/// What the table of objects stores.
struct ObjectRow {
    StoredType type = StoredType::Blob;
    Place place;
};

/// What three columns of a row say: type, segment and member.
[[nodiscard]] ObjectRow RowOf(Database const& database, Query const& query, int firstColumn);

/// The row of @p id; none if it is not there.
[[nodiscard]] std::optional<ObjectRow> FindRow(Database& database, Id const& id);
/// The rows of all of @p ids, with one run of a statement if they are many.
[[nodiscard]] std::vector<std::optional<ObjectRow>> FindRows(Database& database, std::span<const Id> ids);

/// What is behind one `SqliteArchive`.
class SqliteStore {
public:
    SqliteStore(std::string path, SqliteOptions const& options);

    /// A connection for the time of a call.
    class Lease {
    public:
        explicit Lease(SqliteStore& store) : store_(store), connection_(store.Take()) {}
        Lease(Lease const&) = delete;
        Lease& operator=(Lease const&) = delete;
        ~Lease() { store_.GiveBack(std::move(connection_)); }

        Connection& operator*() const noexcept { return *connection_; }
        Connection* operator->() const noexcept { return connection_.get(); }

    private:
        SqliteStore& store_;
        std::unique_ptr<Connection> connection_;
    };

    [[nodiscard]] std::unique_ptr<Connection> Take();
    void GiveBack(std::unique_ptr<Connection> connection) noexcept;

    /// Stores @p items with the rest of @p change, which has no objects of its own.
    [[nodiscard]] ChangeOutcome Store(std::vector<Item> const& items, Change const& change);

    /// The digests of the pieces of a large content.
    [[nodiscard]] static std::vector<Id> PiecesOf(SegmentReader& reader, ObjectRow const& row);

    [[noreturn]] void ThrowDamaged(std::string const& what) const;

    std::string path;
    SqliteOptions options;
    FormCache cache;
    /// Writers of one process take turns here rather than by the file's lock, for which they would sleep.
    std::mutex writing;
    std::mutex connectionsMutex;
    std::vector<std::unique_ptr<Connection>> connections;
};

/// A row that was found for an identifier, which is that of number @p wanted among those asked for.
struct FoundRow {
    std::size_t wanted = 0;
    ObjectRow row;
};

/// The sizes of what is at @p rows; none for those that cannot be read. Segments are read once, in their order.
[[nodiscard]] std::vector<std::optional<std::uint64_t>> SizesOf(Connection& connection, FormCache& cache,
                                                                std::vector<FoundRow> rows);

/// Runs @p read, which reads what is stored. @return false if that is not sound
template <class Read>
[[nodiscard]] bool IsSound(Read read) {
    try {
        read();
        return true;
    } catch (Malformed const&) {
        return false;
    } catch (ArchiveError const& error) {
        // One damaged page hides what is on it, not the rest.
        if (error.GetKind() != Failure::Damaged)
            throw;
        return false;
    }
}

[[nodiscard]] ObjectType TypeOf(StoredType type) noexcept;

/// The time of marks: seconds since 1970.
[[nodiscard]] std::int64_t SecondsNow();

} // namespace KivArchive
