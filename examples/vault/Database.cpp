#include "Database.h"

#include "Trees.h"

#include <KivArchive/CachingArchive.h>
#include <KivArchive/PostgresArchive.h>
#include <KivArchive/SqliteArchive.h>
#include <cstdlib>
#include <filesystem>

namespace vault {

namespace {

/// The cache of an address; null if the user has no place for it.
std::shared_ptr<KivArchive::IArchive> OpenCache(std::string const& address) {
    // Nothing else runs yet.
    const char* const caches = std::getenv("XDG_CACHE_HOME"); // NOLINT(concurrency-mt-unsafe)
    const char* const home = std::getenv("HOME");             // NOLINT(concurrency-mt-unsafe)
    if (caches == nullptr && home == nullptr)
        return nullptr;
    namespace fs = std::filesystem;
    const fs::path directory = (caches != nullptr ? fs::path(caches) : fs::path(home) / ".cache") / "vault";
    // The address itself may hold a password.
    const auto id = KivArchive::Identify(KivArchive::ObjectType::Blob, std::as_bytes(std::span(address)));
    try {
        fs::create_directories(directory);
        fs::permissions(directory, fs::perms::owner_all);
        return std::make_shared<KivArchive::SqliteArchive>(directory / (DigitsOf(id).substr(0, 16) + ".db"));
    } catch (std::exception const&) {
        // It only takes longer then.
        return nullptr;
    }
}

} // namespace

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
