#include "../archive/OpenArchive.h"

#include <KivArchive/CachingArchive.h>
#include <KivArchive/PostgresArchive.h>
#include <KivArchive/SqliteArchive.h>

/// An address, or FILE+ADDRESS with a cache in between.
std::unique_ptr<KivArchive::IArchive> ArchiveBench::OpenArchive(std::string const& name, unsigned workers) {
    using namespace KivArchive;
    PostgresOptions options;
    options.workers = workers;
    std::size_t const address = name.find("postgresql://");
    auto database = std::make_unique<PostgresArchive>(name.substr(address), options);
    if (address == 0)
        return database;
    return std::make_unique<CachingArchive>(std::make_shared<SqliteArchive>(name.substr(0, address - 1)),
                                            std::move(database));
}
