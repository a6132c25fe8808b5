#include "VaultFile.h"

#include "Problem.h"
#include "Text.h"

#include <cstring>
#include <sqlite3.h>

namespace vault {

namespace {

constexpr std::int64_t applicationId = 0x4B564C54;
constexpr std::int64_t formatVersion = 1;
constexpr int lockPatienceMilliseconds = 2000;

constexpr char const* schema = R"(
    CREATE TABLE objects(id TEXT PRIMARY KEY, packed BLOB NOT NULL);
    CREATE TABLE branches(name TEXT PRIMARY KEY, head TEXT NOT NULL) WITHOUT ROWID;
    CREATE TABLE settings(name TEXT PRIMARY KEY, value TEXT NOT NULL) WITHOUT ROWID;
    PRAGMA application_id = 0x4B564C54;
    PRAGMA user_version = 1;
)";

std::string_view TextColumn(sqlite3_stmt* statement, int column) {
    auto const* const text = reinterpret_cast<char const*>(sqlite3_column_text(statement, column));
    return {text == nullptr ? "" : text, static_cast<std::size_t>(sqlite3_column_bytes(statement, column))};
}

std::string_view BlobColumn(sqlite3_stmt* statement, int column) {
    auto const* const bytes = static_cast<char const*>(sqlite3_column_blob(statement, column));
    return {bytes == nullptr ? "" : bytes, static_cast<std::size_t>(sqlite3_column_bytes(statement, column))};
}

int BindText(sqlite3_stmt* statement, int parameter, std::string_view text) {
    return sqlite3_bind_text64(statement, parameter, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
}

} // namespace

void VaultFile::CloseDatabase::operator()(sqlite3* database) const noexcept {
    sqlite3_close_v2(database);
}
void VaultFile::CloseStatement::operator()(sqlite3_stmt* statement) const noexcept {
    sqlite3_finalize(statement);
}

VaultFile::VaultFile(std::filesystem::path path, Access access) : path_(std::move(path)) {
    isMadeHere_ = !std::filesystem::exists(path_);
    if (isMadeHere_ && access != Access::Create)
        throw Problem("there is no vault " + Printable(path_.native()) + " (save makes one)");
    Open(access);
    if (isNew_ && access != Access::Create)
        throw Problem(Printable(path_.native()) + " holds no vault yet (save makes one)");
    if (isNew_)
        Execute(schema);
    else
        CheckFormat();
    readObject_ = Prepare("SELECT packed FROM objects WHERE id = ?");
    // Replacing heals an object that was damaged while no branch needed it.
    writeObject_ = Prepare("INSERT OR REPLACE INTO objects(id, packed) VALUES(?, ?)");
    deleteObject_ = Prepare("DELETE FROM objects WHERE id = ?");
}

VaultFile::~VaultFile() {
    // SQLite makes the file when it is opened; a save that failed leaves none behind. The lock is still held here.
    std::error_code ignored;
    if (isMadeHere_ && isNew_)
        std::filesystem::remove(path_, ignored);
}

void VaultFile::Open(Access access) {
    sqlite3* database = nullptr;
    // Readers may have to roll back what a killed writer left, so they open for writing too.
    const int flags = SQLITE_OPEN_READWRITE | (access == Access::Create ? SQLITE_OPEN_CREATE : 0);
    // SQLite gives some names a meaning, among them those of databases that are kept in memory; a path has none.
    const auto path = path_.is_absolute() ? path_.native() : "./" + path_.native();
    const int result = sqlite3_open_v2(path.c_str(), &database, flags, nullptr);
    database_.reset(database);
    Check(result);
    sqlite3_busy_timeout(database, lockPatienceMilliseconds);
    // Files come from other people: nothing in their schema is executed.
    Execute("PRAGMA trusted_schema = OFF; PRAGMA cache_size = -65536");
    Execute(access == Access::Read ? "BEGIN" : "BEGIN IMMEDIATE");
    isNew_ = ReadNumber("PRAGMA application_id") == 0 && ReadNumber("SELECT count(*) FROM sqlite_schema") == 0;
}

void VaultFile::CheckFormat() {
    if (ReadNumber("PRAGMA application_id") != applicationId)
        throw Problem(Printable(path_.native()) + " is not a vault file");
    const auto version = ReadNumber("PRAGMA user_version");
    if (version > formatVersion)
        throw Problem(Printable(path_.native()) + " was written by a newer version (format " + std::to_string(version) +
                      ", this one reads " + std::to_string(formatVersion) + ")");
}

std::optional<KivVcs::Buffer> VaultFile::ReadObject(std::string_view id) {
    std::optional<KivVcs::Buffer> packed;
    Check(BindText(readObject_.get(), 1, id));
    if (Step(readObject_)) {
        const auto bytes = BlobColumn(readObject_.get(), 0);
        packed =
            KivVcs::Buffer::Build(bytes.size(), [&](std::byte* to) { std::memcpy(to, bytes.data(), bytes.size()); });
    }
    sqlite3_reset(readObject_.get());
    return packed;
}

std::vector<std::string> VaultFile::ListObjects() {
    std::vector<std::string> ids;
    const auto rows = Prepare("SELECT id FROM objects");
    while (Step(rows))
        ids.emplace_back(TextColumn(rows.get(), 0));
    return ids;
}

void VaultFile::ForEachObject(std::function<void(std::string_view, std::string_view)> const& visit) {
    const auto rows = Prepare("SELECT id, packed FROM objects");
    while (Step(rows))
        visit(TextColumn(rows.get(), 0), BlobColumn(rows.get(), 1));
}

void VaultFile::WriteObject(std::string_view id, KivVcs::Buffer const& packed) {
    std::vector<std::byte> joined;
    joined.reserve(packed.GetSize());
    for (auto const& chunk : packed.LockForRead())
        joined.insert(joined.end(), chunk.begin(), chunk.end());
    Check(BindText(writeObject_.get(), 1, id));
    Check(sqlite3_bind_blob64(writeObject_.get(), 2, joined.data(), joined.size(), SQLITE_STATIC));
    Run(writeObject_);
}

void VaultFile::DeleteObject(std::string_view id) {
    Check(BindText(deleteObject_.get(), 1, id));
    Run(deleteObject_);
}

VaultFile::Branches VaultFile::ReadBranches() {
    Branches branches;
    const auto rows = Prepare("SELECT name, head FROM branches");
    while (Step(rows))
        branches.emplace(TextColumn(rows.get(), 0), TextColumn(rows.get(), 1));
    return branches;
}

std::string VaultFile::ReadCurrentBranch() {
    const auto row = Prepare("SELECT value FROM settings WHERE name = 'branch'");
    return Step(row) ? std::string(TextColumn(row.get(), 0)) : std::string();
}

void VaultFile::WriteBranches(Branches const& branches, std::string_view current) {
    Execute("DELETE FROM branches");
    const auto insert = Prepare("INSERT INTO branches(name, head) VALUES(?, ?)");
    for (auto const& [name, head] : branches) {
        Check(BindText(insert.get(), 1, name));
        Check(BindText(insert.get(), 2, head));
        Run(insert);
    }
    const auto setting = Prepare("INSERT OR REPLACE INTO settings(name, value) VALUES('branch', ?)");
    Check(BindText(setting.get(), 1, current));
    Run(setting);
}

std::string VaultFile::FindStructuralDamage() {
    const auto row = Prepare("PRAGMA integrity_check(1)");
    const std::string finding(Step(row) ? TextColumn(row.get(), 0) : "no answer");
    return finding == "ok" ? "" : finding;
}

void VaultFile::Commit() {
    Execute("COMMIT");
    isNew_ = false;
}

void VaultFile::Shrink() {
    Execute("VACUUM");
}

void VaultFile::Execute(char const* sql) {
    Check(sqlite3_exec(database_.get(), sql, nullptr, nullptr, nullptr));
}

VaultFile::Statement VaultFile::Prepare(char const* sql) {
    sqlite3_stmt* statement = nullptr;
    Check(sqlite3_prepare_v2(database_.get(), sql, -1, &statement, nullptr));
    return Statement(statement);
}

bool VaultFile::Step(Statement const& statement) {
    const int result = sqlite3_step(statement.get());
    if (result != SQLITE_ROW && result != SQLITE_DONE)
        Check(result);
    return result == SQLITE_ROW;
}

void VaultFile::Run(Statement const& statement) {
    while (Step(statement)) {
    }
    Check(sqlite3_reset(statement.get()));
}

std::int64_t VaultFile::ReadNumber(char const* sql) {
    const auto row = Prepare(sql);
    return Step(row) ? sqlite3_column_int64(row.get(), 0) : 0;
}

void VaultFile::Check(int result) {
    if (result == SQLITE_OK)
        return;
    const auto name = Printable(path_.native());
    switch (result & 0xFF) {
    case SQLITE_BUSY:
        throw Problem(name + " is locked by another process");
    case SQLITE_NOTADB:
        throw Problem(name + " is not a vault file");
    // No statement here is wrong in itself: one that fails does not find the tables that it expects.
    case SQLITE_ERROR:
    case SQLITE_CORRUPT:
        throw Problem(name + " is damaged: " + sqlite3_errmsg(database_.get()), findingsExitStatus);
    case SQLITE_NOMEM:
        throw std::bad_alloc();
    default:
        throw Problem(name + ": " + (database_ ? sqlite3_errmsg(database_.get()) : sqlite3_errstr(result)));
    }
}

} // namespace vault
