#include "Changes.h"
#include "sqlite/Compaction.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>

namespace KivArchive {

namespace {

bool IsMarkedSince(Database& database, Id const& id, std::int64_t latest) {
    Query query(database, "SELECT time FROM marks WHERE id=?");
    return query.With(DigestOf(id)).Next() && query.Number(0) <= latest;
}

void MarkAt(Database& database, Id const& id, std::int64_t time) {
    Query(database, "INSERT INTO marks(id, time) VALUES(?, ?) ON CONFLICT DO NOTHING").With(id).With(time).Run();
}

/// Marks the pieces of a content so that they are removed as soon as no other content names them.
void ReleasePieces(Connection& connection, FormCache& cache, ObjectRow const& row) {
    FormReader reader(connection, cache);
    try {
        for (Id const& piece : SqliteStore::PiecesOf(reader, row))
            Query(connection.database, "INSERT INTO marks(id, time) VALUES(?, 0) ON CONFLICT(id) DO UPDATE SET time=0")
                .With(piece)
                .Run();
    } catch (Malformed const&) {
        // They are removed after the grace time, like other pieces that no content names.
    }
}

/// As long as it exists, the log of a connection is copied into the file early and so stays short, since hosts may
/// collect when they have little space left.
class ShortLog {
public:
    explicit ShortLog(Database& database) : database_(database) { Write(longest); }
    ShortLog(ShortLog const&) = delete;
    ShortLog& operator=(ShortLog const&) = delete;
    ~ShortLog() { Write(ordinary); }

private:
    static constexpr int longest = 64;
    /// SQLite's default.
    static constexpr int ordinary = 1000;

    void Write(int pages) const noexcept { sqlite3_wal_autocheckpoint(database_.Handle(), pages); }

    Database& database_;
};

} // namespace

void SqliteArchive::Mark(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    ShortLog const log(connection->database);
    std::scoped_lock const turn(store_->writing);
    Transaction transaction(connection->database, Transaction::Kind::Write);
    std::int64_t const now = SecondsNow();
    for (Id const& id : ids)
        if (FindRow(connection->database, id))
            MarkAt(connection->database, id, now);
    transaction.Commit();
}

void SqliteArchive::Unmark(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    ShortLog const log(connection->database);
    std::scoped_lock const turn(store_->writing);
    Transaction transaction(connection->database, Transaction::Kind::Write);
    for (Id const& id : ids)
        Query(connection->database, "DELETE FROM marks WHERE id=?").With(DigestOf(id)).Run();
    transaction.Commit();
}

std::vector<Id> SqliteArchive::ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) {
    SqliteStore::Lease const connection(*store_);
    std::vector<Id> marked;
    Query query(connection->database, "SELECT marks.id FROM marks JOIN objects USING(id) "
                                      "WHERE time<=? AND marks.id>? AND type<>3 ORDER BY marks.id LIMIT ?");
    query.With(SecondsNow() - static_cast<std::int64_t>(grace.count()))
        .With(after)
        .With(static_cast<std::int64_t>(std::min<std::size_t>(limit, 1U << 20U)));
    while (query.Next())
        marked.push_back(query.Identifier(0));
    return marked;
}

std::vector<Id> SqliteArchive::Remove(std::span<const Id> ids, std::chrono::seconds grace) {
    SqliteStore::Lease const connection(*store_);
    Database& database = connection->database;
    ShortLog const log(database);
    std::scoped_lock const turn(store_->writing);
    Transaction transaction(database, Transaction::Kind::Write);
    std::int64_t const latest = SecondsNow() - static_cast<std::int64_t>(grace.count());
    std::vector<Id> kept;
    for (Id const& id : ids)
        if (!IsMarkedSince(database, id, latest))
            kept.push_back(id);
    if (!kept.empty())
        return kept;
    for (Id const& id : ids)
        if (auto const row = FindRow(database, id)) {
            if (row->type == StoredType::LargeBlob)
                ReleasePieces(*connection, store_->cache, *row);
            RemoveObject(database, id, row->place);
        }
    transaction.Commit();
    return kept;
}

std::uint64_t SqliteArchive::Compact(std::uint64_t bytes) {
    SqliteStore::Lease const connection(*store_);
    Database& database = connection->database;
    ShortLog const log(database);
    std::uint64_t done = 0;
    for (auto segment = FirstSparse(database); segment && done < bytes; segment = FirstSparse(database))
        done += ClearSegment(*connection, *store_, *segment);
    if (!FirstSparse(database))
        SweepPieces(*connection, *store_);
    constexpr std::int64_t incremental = 2;
    if (database.Ask("PRAGMA auto_vacuum") == incremental) {
        std::scoped_lock const turn(store_->writing);
        auto const pageSize = static_cast<std::uint64_t>(database.Ask("PRAGMA page_size"));
        std::uint64_t const pages = std::clamp<std::uint64_t>(bytes / pageSize, 1, 1U << 20U);
        database.Run(("PRAGMA incremental_vacuum(" + std::to_string(pages) + ")").c_str());
        std::int64_t const sparse = database.Ask("SELECT count(*) FROM sparse");
        return static_cast<std::uint64_t>(database.Ask("PRAGMA freelist_count")) * pageSize +
               static_cast<std::uint64_t>(sparse);
    }
    return static_cast<std::uint64_t>(database.Ask("SELECT count(*) FROM sparse"));
}

} // namespace KivArchive
