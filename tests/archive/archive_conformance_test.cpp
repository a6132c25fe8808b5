#include "ArchiveFiles.h"
#include "KivArchive/ArchiveConformance.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/SqliteArchive.h"

#include <gtest/gtest.h>

namespace {

using namespace KivArchive;

TEST(ArchiveConformance, OfMemArchive) {
    CheckArchiveConformance([] { return std::make_unique<MemArchive>(); },
                            [](std::string const& failure) { ADD_FAILURE() << failure; });
}

TEST(ArchiveConformance, OfSqliteArchive) {
    TemporaryDirectory const directory;
    int number = 0;
    CheckArchiveConformance([&] { return std::make_unique<SqliteArchive>(directory.Path(std::to_string(number++))); },
                            [](std::string const& failure) { ADD_FAILURE() << failure; });
}

} // namespace
