#include "sqlite/Schema.h"

#include <array>
#include <string_view>

namespace KivArchive {

namespace {

/// "KivA"
constexpr std::int64_t applicationId = 0x4B697641;
constexpr std::int64_t newestFormat = 1;

struct Table {
    std::string_view name;
    const char* sql;
};

/// In the order of their names.
constexpr std::array<Table, 9> tables{{
    {"ancestry", "CREATE TABLE ancestry(id BLOB NOT NULL PRIMARY KEY, parent BLOB NOT NULL, tree BLOB NOT NULL) "
                 "STRICT, WITHOUT ROWID"},
    {"branches", "CREATE TABLE branches(name BLOB NOT NULL PRIMARY KEY, head BLOB NOT NULL) STRICT, WITHOUT ROWID"},
    {"contained", "CREATE TABLE contained(id BLOB NOT NULL, how INTEGER NOT NULL, other BLOB NOT NULL, "
                  "PRIMARY KEY(id, how, other)) STRICT, WITHOUT ROWID"},
    {"dependencies", "CREATE TABLE dependencies(base INTEGER NOT NULL, segment INTEGER NOT NULL, "
                     "PRIMARY KEY(base, segment)) STRICT, WITHOUT ROWID"},
    {"marks", "CREATE TABLE marks(id BLOB NOT NULL PRIMARY KEY, time INTEGER NOT NULL) STRICT, WITHOUT ROWID"},
    {"objects", "CREATE TABLE objects(id BLOB NOT NULL PRIMARY KEY, type INTEGER NOT NULL, segment INTEGER NOT NULL, "
                "member INTEGER NOT NULL) STRICT, WITHOUT ROWID"},
    {"records", "CREATE TABLE records(name BLOB NOT NULL PRIMARY KEY, value BLOB NOT NULL) STRICT, WITHOUT ROWID"},
    {"segments", "CREATE TABLE segments(number INTEGER PRIMARY KEY, form BLOB NOT NULL) STRICT"},
    {"sparse", "CREATE TABLE sparse(segment INTEGER PRIMARY KEY) STRICT"},
}};

[[noreturn]] void Refuse(Database const& database, Failure kind, std::string const& why) {
    throw ArchiveError(kind, database.Path(), why + ": " + database.Path() + ".");
}

void Make(Database& database) {
    for (Table const& table : tables)
        database.Run(table.sql);
    database.Run("PRAGMA application_id=1265202753");
    database.Run("PRAGMA user_version=1");
}

std::string_view Text(Query const& query, int column) {
    ByteView const bytes = query.Blob(column);
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

bool HasOurTables(Database& database) {
    Query query(database, "SELECT type, name, sql FROM sqlite_schema ORDER BY name");
    for (Table const& table : tables)
        if (!query.Next() || Text(query, 0) != "table" || Text(query, 1) != table.name || Text(query, 2) != table.sql)
            return false;
    return !query.Next();
}

bool IsEmpty(Database& database) {
    return database.Ask("PRAGMA application_id") == 0 && database.Ask("SELECT count(*) FROM sqlite_schema") == 0;
}

void Check(Database& database) {
    if (database.Ask("PRAGMA application_id") != applicationId)
        Refuse(database, Failure::Foreign, "This file is no archive");
    if (database.Ask("PRAGMA user_version") > newestFormat)
        Refuse(database, Failure::NewerFormat, "This archive was written by a later release");
    if (!HasOurTables(database))
        Refuse(database, Failure::Foreign, "Somebody has changed the tables of this archive");
}

} // namespace

void EnsureSchema(Database& database, bool make) {
    static_assert(applicationId == 1265202753);
    if (make && IsEmpty(database)) {
        // These take effect on an empty file only, and outside of transactions.
        database.Run("PRAGMA page_size=4096");
        database.Run("PRAGMA auto_vacuum=INCREMENTAL");
        database.Run("PRAGMA journal_mode=WAL");
        Transaction transaction(database, Transaction::Kind::Write);
        if (IsEmpty(database))
            Make(database);
        transaction.Commit();
    }
    Transaction transaction(database, Transaction::Kind::Read);
    Check(database);
    transaction.Commit();
}

} // namespace KivArchive
