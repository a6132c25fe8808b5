#include "KivArchive/ArchiveConformance.h"
#include "KivArchive/MemArchive.h"

#include <gtest/gtest.h>

namespace {

using namespace KivArchive;

TEST(ArchiveConformance, OfMemArchive) {
    CheckArchiveConformance([] { return std::make_unique<MemArchive>(); },
                            [](std::string const& failure) { ADD_FAILURE() << failure; });
}

} // namespace
