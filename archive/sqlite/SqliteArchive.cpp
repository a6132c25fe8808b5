#include "KivArchive/SqliteArchive.h"

#include "Changes.h"
#include "sqlite/Schema.h"
#include "sqlite/SqliteStore.h"

namespace KivArchive {

namespace {

/// The most connections that are kept open for later calls.
constexpr std::size_t maximumIdle = 8;

} // namespace

SqliteStore::SqliteStore(std::string filePath, SqliteOptions const& givenOptions)
    : path(std::move(filePath)), options(givenOptions), cache(givenOptions.cacheBytes) {
    auto first =
        std::make_unique<Connection>(path, options.create ? Database::Access::Make : Database::Access::Use, options);
    EnsureSchema(first->database, options.create);
    connections.reserve(maximumIdle);
    connections.push_back(std::move(first));
}

std::unique_ptr<Connection> SqliteStore::Take() {
    {
        std::scoped_lock const lock(connectionsMutex);
        if (!connections.empty()) {
            auto taken = std::move(connections.back());
            connections.pop_back();
            return taken;
        }
    }
    auto made = std::make_unique<Connection>(path, Database::Access::Use, options);
    EnsureSchema(made->database, false);
    return made;
}

void SqliteStore::ReturnConnection(std::unique_ptr<Connection> connection) noexcept {
    std::scoped_lock const lock(connectionsMutex);
    if (connections.size() < maximumIdle)
        connections.push_back(std::move(connection));
}

void SqliteStore::ThrowDamaged(std::string const& what) const {
    throw ArchiveError(Failure::Damaged, path, what + " is damaged in " + path + ".");
}

std::int64_t SecondsNow() {
    auto const now = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::seconds>(now).count();
}

SqliteArchive::SqliteArchive(std::string const& path, SqliteOptions const& options)
    : store_(std::make_unique<SqliteStore>(path, options)) {}

SqliteArchive::~SqliteArchive() = default;

} // namespace KivArchive
