#include "Database.h"

#include "Cache.h"
#include "Output.h"

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

/// The database behind the cache, which in the end says if it has been away.
std::shared_ptr<KivArchive::IArchive> OpenCached(std::shared_ptr<KivArchive::IArchive> cache,
                                                 std::shared_ptr<KivArchive::IArchive> database,
                                                 KivArchive::CachingOptions const& options) {
    const auto cached = std::make_shared<KivArchive::CachingArchive>(std::move(cache), std::move(database), options);
    return {cached.get(), [cached](KivArchive::IArchive* /*same*/) {
                if (cached->IsAway())
                    Warn("the database is away; this is what was seen of it before");
            }};
}

} // namespace

void RequireDatabases(char** /*arguments*/) {}

Database OpenDatabase(std::string const& address, Vault::Access access, std::chrono::milliseconds wait) {
    KivArchive::PostgresOptions options;
    options.create = access == Vault::Access::Create;
    options.wait = wait;
    auto cache = OpenCache(address);
    Database database;
    KivArchive::CachingOptions caching;
    try {
        database.stored = std::make_shared<KivArchive::PostgresArchive>(address, options);
    } catch (KivArchive::ArchiveError const& error) {
        const bool wasSeen = cache != nullptr && !cache->ListRecords().empty();
        if (access != Vault::Access::Read || !wasSeen || error.GetKind() != KivArchive::Failure::Unavailable)
            throw;
        options.connectsLater = true;
        database.stored = std::make_shared<KivArchive::PostgresArchive>(address, options);
        // For as long as a command takes.
        caching.pause = std::chrono::hours(1);
    }
    database.cached = cache == nullptr ? database.stored : OpenCached(std::move(cache), database.stored, caching);
    return database;
}

} // namespace vault
