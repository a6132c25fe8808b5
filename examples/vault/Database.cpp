#include "Database.h"

#include "Cache.h"

#include <KivArchive/CachingArchive.h>
#include <KivArchive/PostgresArchive.h>
#include <KivArchive/SqliteArchive.h>

namespace vault {

namespace {

/// The cache of an address; null if the user has no place for it.
std::shared_ptr<KivArchive::IArchive> OpenCache(std::string const& address) {
    const auto directory = CacheDirectory();
    if (!directory)
        return nullptr;
    try {
        // The address itself may hold a password.
        return std::make_shared<KivArchive::SqliteArchive>(*directory + CacheName(address) + ".db");
    } catch (std::exception const&) {
        // It only takes longer then.
        return nullptr;
    }
}

} // namespace

void RequireDatabases(char** /*arguments*/) {}

Database OpenDatabase(std::string const& address, bool create, std::chrono::milliseconds wait) {
    KivArchive::PostgresOptions options;
    options.create = create;
    options.wait = wait;
    Database database{std::make_shared<KivArchive::PostgresArchive>(address, options), nullptr};
    auto cache = OpenCache(address);
    database.cached = cache == nullptr
                          ? database.stored
                          : std::make_shared<KivArchive::CachingArchive>(std::move(cache), database.stored);
    return database;
}

} // namespace vault
