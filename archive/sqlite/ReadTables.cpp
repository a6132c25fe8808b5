#include "AncestryWalk.h"
#include "Changes.h"
#include "sqlite/Lookup.h"
#include "sqlite/SqliteStore.h"

#include <map>

namespace KivArchive {

namespace {

/// The most rows that SQLite is asked for at once, whatever a host asks for.
constexpr std::size_t maximumRows = 1U << 20U;

/// Reads facts within one transaction.
class FactsReader {
public:
    /// @param count the most commits whose facts will be asked for
    FactsReader(Database& database, std::size_t count) : database_(database), areMany_(count > worthLookup) {
        if (areMany_)
            hasContained_ = database.Ask("SELECT EXISTS(SELECT 1 FROM contained)") != 0;
    }

    [[nodiscard]] std::optional<Ancestry> Find(Id const& id) {
        if (areMany_)
            return FindAmongMany(id);
        Query row(database_, "SELECT parent, tree FROM ancestry WHERE id=?");
        if (!row.With(DigestOf(id)).Next())
            return std::nullopt;
        return FactsOf(id, row.OptionalIdentifier(0), row.OptionalIdentifier(1));
    }

    [[nodiscard]] Ancestry FactsOf(Id const& id, Id parent, Id tree) {
        Ancestry facts{id, std::move(parent), std::move(tree), {}};
        // Many archives have no merges at all.
        if (!hasContained_)
            return facts;
        Query contained(database_, "SELECT how, other FROM contained WHERE id=?");
        contained.With(id);
        while (contained.Next()) {
            std::int64_t const how = contained.Number(0);
            if (how < 0 || how > static_cast<std::int64_t>(Containment::FoundEqual))
                database_.Fail(SQLITE_CORRUPT);
            facts.contains.push_back({static_cast<Containment>(how), contained.Identifier(1)});
        }
        return facts;
    }

private:
    [[nodiscard]] std::optional<Ancestry> FindAmongMany(Id const& id) {
        if (!lookup_)
            lookup_.emplace(database_, "SELECT parent, tree FROM asked(?) LEFT JOIN ancestry ON ancestry.id=asked.id");
        Query const& row = lookup_->At(id);
        if (row.IsNull(0))
            return std::nullopt;
        return FactsOf(id, row.OptionalIdentifier(0), row.OptionalIdentifier(1));
    }

    Database& database_;
    bool areMany_;
    bool hasContained_ = true;
    std::optional<Lookup> lookup_;
};

Buffer BufferOf(ByteView bytes) {
    Buffer buffer;
    buffer.Append(bytes.data(), bytes.size());
    return buffer;
}

std::int64_t LimitOf(std::size_t limit) noexcept {
    return static_cast<std::int64_t>(std::min(limit, maximumRows));
}

} // namespace

std::vector<Branch> SqliteArchive::ReadBranches() {
    SqliteStore::Lease const connection(*store_);
    // UTF-8 and UTF-16 order characters beyond U+FFFF differently.
    std::map<KivStringT<char16_t>, Id> heads;
    for (Query query(connection->database, "SELECT name, head FROM branches"); query.Next();)
        heads.emplace(NameOfBytes(query.Blob(0)), query.Identifier(1));
    std::vector<Branch> branches;
    branches.reserve(heads.size());
    for (auto const& [name, head] : heads)
        branches.push_back({name, head});
    return branches;
}

std::vector<Record> SqliteArchive::ReadRecords(std::span<const KivStringT<char16_t>> names) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    std::map<KivStringT<char16_t>, Buffer> values;
    for (auto const& name : names) {
        Bytes const bytes = BytesOfName(name);
        Query query(connection->database, "SELECT value FROM records WHERE name=?");
        if (query.With(bytes).Next())
            values.emplace(name, BufferOf(query.Blob(0)));
    }
    transaction.Commit();
    std::vector<Record> records;
    records.reserve(values.size());
    for (auto const& [name, value] : values)
        records.push_back({name, value});
    return records;
}

std::vector<KivStringT<char16_t>> SqliteArchive::ListRecords() {
    SqliteStore::Lease const connection(*store_);
    std::vector<KivStringT<char16_t>> names;
    for (Query query(connection->database, "SELECT name FROM records"); query.Next();)
        names.push_back(NameOfBytes(query.Blob(0)));
    std::sort(names.begin(), names.end());
    return names;
}

std::vector<Ancestry> SqliteArchive::ReadAncestry(std::span<const Id> commits, Follow follow, std::size_t more) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    FactsReader reader(connection->database, std::max(commits.size(), more));
    auto walked = WalkAncestry(commits, follow, more, [&](Id const& id) { return reader.Find(id); });
    transaction.Commit();
    return walked;
}

std::vector<Ancestry> SqliteArchive::ListAncestry(Id const& after, std::size_t limit) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    FactsReader reader(connection->database, limit);
    std::vector<Ancestry> listed;
    Query query(connection->database, "SELECT id, parent, tree FROM ancestry WHERE id>? ORDER BY id LIMIT ?");
    query.With(after).With(LimitOf(limit));
    while (query.Next())
        listed.push_back(reader.FactsOf(query.Identifier(0), query.OptionalIdentifier(1), query.OptionalIdentifier(2)));
    return listed;
}

std::vector<ObjectInfo> SqliteArchive::ListObjects(Id const& after, std::size_t limit) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    std::vector<ObjectInfo> listed;
    std::vector<FoundRow> rows;
    Query query(connection->database,
                "SELECT id, type, segment, member FROM objects WHERE id>? AND type<>3 ORDER BY id LIMIT ?");
    query.With(after).With(LimitOf(limit));
    while (query.Next()) {
        ObjectRow const row = RowOf(connection->database, query, 1);
        rows.push_back({listed.size(), row});
        listed.push_back({query.Identifier(0), TypeOf(row.type), 0});
    }
    auto const sizes = SizesOf(*connection, store_->cache, std::move(rows));
    for (std::size_t i = 0; i < listed.size(); ++i)
        listed[i].size = sizes[i].value_or(0);
    return listed;
}

ArchiveStatistics SqliteArchive::GetStatistics() {
    SqliteStore::Lease const connection(*store_);
    Database& database = connection->database;
    Transaction transaction(database, Transaction::Kind::Read);
    ArchiveStatistics statistics;
    for (Query query(database, "SELECT type, count(*) FROM objects GROUP BY type"); query.Next();) {
        auto const type = static_cast<StoredType>(query.Number(0));
        auto const count = static_cast<std::uint64_t>(query.Number(1));
        if (type == StoredType::Blob || type == StoredType::LargeBlob)
            statistics.blobs += count;
        else if (type == StoredType::Tree)
            statistics.trees = count;
        else if (type == StoredType::Commit)
            statistics.commits = count;
    }
    auto const ask = [&database](const char* sql) { return static_cast<std::uint64_t>(database.Ask(sql)); };
    statistics.ancestries = ask("SELECT count(*) FROM ancestry");
    statistics.branches = ask("SELECT count(*) FROM branches");
    statistics.records = ask("SELECT count(*) FROM records");
    statistics.marked = ask("SELECT count(*) FROM marks JOIN objects USING(id) WHERE type<>3");
    std::uint64_t const pageSize = ask("PRAGMA page_size");
    statistics.bytes = ask("PRAGMA page_count") * pageSize;
    statistics.unusedBytes = ask("PRAGMA freelist_count") * pageSize;
    return statistics;
}

} // namespace KivArchive
