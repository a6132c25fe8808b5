#include "Changes.h"
#include "sqlite/Schema.h"
#include "sqlite/SqliteStore.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace KivArchive {

namespace {

constexpr int pagesAtOnce = 1024;

/// A new file. Removed in the end unless it was kept.
class NewFile {
public:
    explicit NewFile(std::string path) : path_(std::move(path)) {
        int const file =
            open(path_.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, S_IRUSR | S_IWUSR); // NOLINT(*-vararg)
        if (file < 0)
            throw ArchiveError(Failure::Unavailable, path_,
                               "The copy " + path_ + " cannot be made, or is there already.");
        close(file);
    }
    NewFile(NewFile const&) = delete;
    NewFile& operator=(NewFile const&) = delete;
    ~NewFile() {
        if (!isKept_)
            for (const char* const suffix : {"", "-wal", "-shm", "-journal"})
                unlink((path_ + suffix).c_str());
    }
    void Keep() noexcept { isKept_ = true; }

private:
    std::string path_;
    bool isKept_ = false;
};

void Copy(Database& from, Database& to, IProgress* progress) {
    struct Finish {
        void operator()(sqlite3_backup* backup) const noexcept { sqlite3_backup_finish(backup); }
    };
    std::unique_ptr<sqlite3_backup, Finish> const backup(
        sqlite3_backup_init(to.Handle(), "main", from.Handle(), "main"));
    if (backup == nullptr)
        to.Fail(sqlite3_errcode(to.Handle()));
    for (int code = SQLITE_OK; code != SQLITE_DONE;) {
        code = sqlite3_backup_step(backup.get(), pagesAtOnce);
        if (code != SQLITE_OK && code != SQLITE_DONE)
            to.Fail(code);
        auto const total = static_cast<std::uint64_t>(sqlite3_backup_pagecount(backup.get()));
        auto const rest = static_cast<std::uint64_t>(sqlite3_backup_remaining(backup.get()));
        ReportProgress(progress, {"copying pages", total - rest, total}, to.Path());
    }
}

} // namespace

void SqliteArchive::Backup(std::string const& path, IProgress* progress) {
    SqliteStore::Lease const connection(*store_);
    NewFile file(path);
    {
        Database copy(path, Database::Access::Use, store_->options.wait);
        // Reading within a transaction, so that the copy need not begin again whenever others write.
        Transaction const transaction(connection->database, Transaction::Kind::Read);
        static_cast<void>(connection->database.Ask("SELECT count(*) FROM branches"));
        Copy(connection->database, copy, progress);
        EnsureSchema(copy, false);
    }
    file.Keep();
}

} // namespace KivArchive
