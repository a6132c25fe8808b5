#include "sqlite/Database.h"

#include "Changes.h"
#include "sqlite/Lookup.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <new>
#include <thread>
#include <unistd.h>

namespace KivArchive {

namespace {

constexpr int longestValue = 1 << 30;
/// How long to wait before the host is told.
constexpr std::chrono::milliseconds untold{250};

/// Makes an empty file for its owner alone, unless there is one.
void MakePrivateFile(std::string const& path) {
    int const file = open(path.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, S_IRUSR | S_IWUSR); // NOLINT(*-vararg)
    if (file >= 0)
        close(file);
}

struct Meaning {
    Failure kind;
    const char* sentence;
};

Meaning MeaningOf(int code) {
    switch (code & 0xFF) {
    case SQLITE_FULL:
        return {Failure::DiskFull, "There is no room left on the disk"};
    case SQLITE_READONLY:
    case SQLITE_PERM:
    case SQLITE_AUTH:
        return {Failure::ReadOnly, "The archive may not be written"};
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
        return {Failure::Locked, "The archive is in use by somebody else"};
    case SQLITE_NOTADB:
        return {Failure::Foreign, "This file is no archive"};
    case SQLITE_CORRUPT:
    case SQLITE_MISMATCH:
        return {Failure::Damaged, "The archive is damaged"};
    case SQLITE_TOOBIG:
        return {Failure::Unrepresentable, "This is too large to be stored"};
    default:
        return {Failure::Unavailable, "The archive cannot be used"};
    }
}

} // namespace

Database::Database(std::string const& path, Access access, std::chrono::milliseconds wait,
                   std::function<void()> waiting)
    : path_(path), wait_(wait), waiting_(std::move(waiting)) {
    if (access == Access::Make)
        MakePrivateFile(path);
    sqlite3* handle = nullptr;
    int const code = sqlite3_open_v2(path.c_str(), &handle,
                                     SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE, nullptr);
    handle_.reset(handle);
    if (code != SQLITE_OK)
        Fail(code);
    auto const configure = [handle](int option, int value) { sqlite3_db_config(handle, option, value, nullptr); };
    configure(SQLITE_DBCONFIG_DEFENSIVE, 1);
    configure(SQLITE_DBCONFIG_ENABLE_TRIGGER, 0);
    configure(SQLITE_DBCONFIG_ENABLE_VIEW, 0);
    configure(SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0);
    configure(SQLITE_DBCONFIG_DQS_DML, 0);
    configure(SQLITE_DBCONFIG_DQS_DDL, 0);
    sqlite3_limit(handle, SQLITE_LIMIT_LENGTH, longestValue);
    sqlite3_limit(handle, SQLITE_LIMIT_ATTACHED, 0);
    sqlite3_limit(handle, SQLITE_LIMIT_TRIGGER_DEPTH, 0);
    sqlite3_limit(handle, SQLITE_LIMIT_VDBE_OP, 25000);
    sqlite3_busy_handler(handle, &Database::WaitFor, this);
    Lookup::Register(handle);
    Run("PRAGMA cell_size_check=ON");
    Run("PRAGMA synchronous=FULL");
}

Database::~Database() {
    // They must be gone before the connection is closed.
    statements_.clear();
}

int Database::WaitFor(void* database, int attempt) noexcept {
    auto& self = *static_cast<Database*>(database);
    auto const now = std::chrono::steady_clock::now();
    if (attempt == 0) {
        self.waitsSince_ = now;
        self.hasTold_ = false;
    }
    auto const waited = std::chrono::duration_cast<std::chrono::milliseconds>(now - self.waitsSince_);
    if (waited >= self.wait_)
        return 0;
    if (waited >= untold && !self.hasTold_ && self.waiting_) {
        self.hasTold_ = true;
        self.waiting_();
    }
    std::chrono::milliseconds const next(1 << std::min(attempt, 6));
    std::this_thread::sleep_for(std::min(next, self.wait_ - waited));
    return 1;
}

void Database::Fail(int code) const {
    if ((code & 0xFF) == SQLITE_NOMEM)
        throw std::bad_alloc();
    Meaning const meaning = MeaningOf(code);
    std::string const detail = handle_ == nullptr ? sqlite3_errstr(code) : sqlite3_errmsg(handle_.get());
    throw ArchiveError(meaning.kind, path_, std::string(meaning.sentence) + ": " + path_ + " (" + detail + ").");
}

void Database::Run(const char* sql) {
    int const code = sqlite3_exec(handle_.get(), sql, nullptr, nullptr, nullptr);
    if (code != SQLITE_OK)
        Fail(code);
}

std::int64_t Database::Ask(const char* sql) {
    Query query(*this, sql);
    return query.Next() ? query.Number(0) : 0;
}

std::optional<std::uint32_t> Database::VersionRead() const noexcept {
    std::uint32_t version = 0;
    bool const isRead = sqlite3_txn_state(handle_.get(), "main") == SQLITE_TXN_READ;
    if (!isRead || sqlite3_file_control(handle_.get(), "main", SQLITE_FCNTL_DATA_VERSION, &version) != SQLITE_OK)
        return std::nullopt;
    return version;
}

sqlite3_stmt* Database::Prepared(const char* sql) {
    auto& statement = statements_[sql];
    if (statement == nullptr) {
        sqlite3_stmt* prepared = nullptr;
        int const code = sqlite3_prepare_v3(handle_.get(), sql, -1, SQLITE_PREPARE_PERSISTENT, &prepared, nullptr);
        if (code != SQLITE_OK)
            Fail(code);
        statement.reset(prepared);
    }
    return statement.get();
}

Query& Query::With(std::int64_t number) {
    if (int const code = sqlite3_bind_int64(statement_, ++bound_, number); code != SQLITE_OK)
        database_.Fail(code);
    return *this;
}

Query& Query::With(ByteView bytes) {
    // A null pointer would bind null.
    const void* const data = bytes.empty() ? "" : static_cast<const void*>(bytes.data());
    if (int const code = sqlite3_bind_blob64(statement_, ++bound_, data, bytes.size(), SQLITE_STATIC);
        code != SQLITE_OK)
        database_.Fail(code);
    return *this;
}

Query& Query::WithPointer(void* pointer, const char* type) {
    if (int const code = sqlite3_bind_pointer(statement_, ++bound_, pointer, type, nullptr); code != SQLITE_OK)
        database_.Fail(code);
    return *this;
}

Query& Query::With(Id const& id) {
    return id.IsEmpty() ? With(ByteView()) : With(DigestOf(id));
}

bool Query::Next() {
    int const code = sqlite3_step(statement_);
    if (code == SQLITE_ROW)
        return true;
    if (code != SQLITE_DONE)
        database_.Fail(code);
    return false;
}

void Query::Run() {
    while (Next()) {
    }
}

Query& Query::Again() {
    sqlite3_reset(statement_);
    bound_ = 0;
    return *this;
}

ByteView Query::Blob(int column) const {
    const void* const data = sqlite3_column_blob(statement_, column);
    auto const size = static_cast<std::size_t>(sqlite3_column_bytes(statement_, column));
    if (data == nullptr && sqlite3_errcode(database_.Handle()) == SQLITE_NOMEM)
        throw std::bad_alloc();
    return {static_cast<const std::byte*>(data), data == nullptr ? 0 : size};
}

Id Query::OptionalIdentifier(int column) const {
    ByteView const bytes = Blob(column);
    return bytes.empty() ? Id() : IdentifierOf(bytes);
}

Id Query::Identifier(int column) const {
    return IdentifierOf(Blob(column));
}

Id Query::IdentifierOf(ByteView bytes) const {
    Id::Digest digest{};
    if (bytes.size() != digest.size())
        database_.Fail(SQLITE_CORRUPT);
    std::copy(bytes.begin(), bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
    return Id::FromDigest(digest);
}

std::optional<Bytes> RowBlobs::Read(std::uint64_t row) {
    auto const number = static_cast<std::int64_t>(row);
    int code = open_ == nullptr ? SQLITE_ABORT : sqlite3_blob_reopen(open_.get(), number);
    if (code != SQLITE_OK) {
        open_.reset();
        sqlite3_blob* blob = nullptr;
        code = sqlite3_blob_open(database_.Handle(), "main", table_, column_, number, 0, &blob);
        open_.reset(blob);
    }
    // No such row, or no blob in it.
    if (code == SQLITE_ERROR)
        return std::nullopt;
    if (code != SQLITE_OK)
        database_.Fail(code);
    Bytes bytes(static_cast<std::size_t>(sqlite3_blob_bytes(open_.get())));
    code = sqlite3_blob_read(open_.get(), bytes.data(), static_cast<int>(bytes.size()), 0);
    if (code != SQLITE_OK)
        database_.Fail(code);
    return bytes;
}

Transaction::~Transaction() {
    // An error may have ended it already; and one here would change nothing.
    if (isOpen_ && sqlite3_get_autocommit(database_.Handle()) == 0)
        sqlite3_exec(database_.Handle(), "ROLLBACK", nullptr, nullptr, nullptr);
}

void Transaction::Commit() {
    Query(database_, "COMMIT").Run();
    isOpen_ = false;
}

} // namespace KivArchive
