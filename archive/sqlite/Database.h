#pragma once

/// @file
/// One connection to a database file, and statements on it.

#include "Bytes.h"
#include "KivArchive/IArchive.h"

#include <memory>
#include <optional>
#include <sqlite3.h>
#include <string>
#include <unordered_map>

namespace KivArchive {

/// A connection, used by one thread at a time. Nothing that a file holds can run on it: no triggers, views or functions
/// of its schema.
class Database {
public:
    enum class Access : std::uint8_t { Use, Make };

    /// @param waiting as in `SqliteOptions`
    Database(std::string const& path, Access access, std::chrono::milliseconds wait,
             std::function<void()> waiting = {});
    Database(Database const&) = delete;
    Database& operator=(Database const&) = delete;
    ~Database();

    [[nodiscard]] std::string const& Path() const noexcept { return path_; }
    [[nodiscard]] sqlite3* Handle() const noexcept { return handle_.get(); }

    /// Runs statements without parameters.
    void Run(const char* sql);
    /// The first column of the only row of a statement.
    [[nodiscard]] std::int64_t Ask(const char* sql);

    /// A number that changes whenever the file does, within a transaction that reads and does not write; nothing
    /// otherwise.
    [[nodiscard]] std::optional<std::uint32_t> VersionRead() const noexcept;

    /// Throws the failure that SQLite's result code @p code stands for.
    [[noreturn]] void Fail(int code) const;

    /// The statement of a literal, prepared once.
    [[nodiscard]] sqlite3_stmt* Prepared(const char* sql);

private:
    struct Close {
        void operator()(sqlite3* handle) const noexcept { sqlite3_close_v2(handle); }
    };
    struct Finalize {
        void operator()(sqlite3_stmt* statement) const noexcept { sqlite3_finalize(statement); }
    };

    /// SQLite's busy handler. @return 0 to give up
    static int WaitFor(void* database, int attempt) noexcept;

    std::string path_;
    std::chrono::milliseconds wait_;
    std::function<void()> waiting_;
    std::chrono::steady_clock::time_point waitsSince_;
    bool hasTold_ = false;
    std::unique_ptr<sqlite3, Close> handle_;
    std::unordered_map<const char*, std::unique_ptr<sqlite3_stmt, Finalize>> statements_;
};

/// One use of a prepared statement.
class Query {
public:
    /// @param sql a literal
    Query(Database& database, const char* sql) : database_(database), statement_(database.Prepared(sql)) {}
    Query(Query const&) = delete;
    Query& operator=(Query const&) = delete;
    ~Query() {
        sqlite3_reset(statement_);
        sqlite3_clear_bindings(statement_);
    }

    /// Binds the next parameter. Bytes must stay valid until the query ends.
    Query& With(std::int64_t number);
    Query& With(std::uint64_t number) { return With(static_cast<std::int64_t>(number)); }
    Query& With(ByteView bytes);
    Query& With(Id::Digest const& digest) { return With(std::as_bytes(std::span(digest))); }
    /// A null identifier is stored as no bytes.
    Query& With(Id const& id);
    /// A pointer for a table of our own, which asks for it by @p type. Must stay valid as long as the query.
    Query& WithPointer(void* pointer, const char* type);

    /// Goes to the next row. @return false after the last one
    bool Next();
    /// Runs to the end.
    void Run();
    /// Resets the query, to be run again with other parameters.
    Query& Again();

    [[nodiscard]] bool IsNull(int column) const { return sqlite3_column_type(statement_, column) == SQLITE_NULL; }
    [[nodiscard]] std::int64_t Number(int column) const { return sqlite3_column_int64(statement_, column); }
    /// Valid until the next row.
    [[nodiscard]] ByteView Blob(int column) const;
    /// @throws ArchiveError of kind `Damaged` if it is no identifier
    [[nodiscard]] Id Identifier(int column) const;
    /// Null if there are no bytes.
    [[nodiscard]] Id OptionalIdentifier(int column) const;

private:
    [[nodiscard]] Id IdentifierOf(ByteView bytes) const;

    Database& database_;
    sqlite3_stmt* statement_;
    int bound_ = 0;
};

/// Reads the blobs of a column by row, within one transaction, which is faster than a query for each.
class RowBlobs {
public:
    /// @param table one with row numbers
    RowBlobs(Database& database, const char* table, const char* column) noexcept
        : database_(database), table_(table), column_(column) {}

    /// Nothing if there is no such row, or no blob in it.
    [[nodiscard]] std::optional<Bytes> Read(std::uint64_t row);

private:
    struct Close {
        void operator()(sqlite3_blob* blob) const noexcept { sqlite3_blob_close(blob); }
    };

    Database& database_;
    const char* table_;
    const char* column_;
    std::unique_ptr<sqlite3_blob, Close> open_;
};

/// A transaction, rolled back unless it is committed.
class Transaction {
public:
    enum class Kind : std::uint8_t { Read, Write };

    Transaction(Database& database, Kind kind) : database_(database) {
        Query(database, kind == Kind::Read ? "BEGIN" : "BEGIN IMMEDIATE").Run();
    }
    Transaction(Transaction const&) = delete;
    Transaction& operator=(Transaction const&) = delete;
    ~Transaction();

    void Commit();

private:
    Database& database_;
    bool isOpen_ = true;
};

} // namespace KivArchive
