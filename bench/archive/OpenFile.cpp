#include "OpenArchive.h"

#include <KivArchive/SqliteArchive.h>

std::unique_ptr<KivArchive::IArchive> ArchiveBench::OpenArchive(std::string const& name, unsigned workers) {
    KivArchive::SqliteOptions options;
    options.workers = workers;
    return std::make_unique<KivArchive::SqliteArchive>(name, options);
}
