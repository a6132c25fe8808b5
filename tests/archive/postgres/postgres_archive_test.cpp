#include "PostgresServer.h"

namespace {

using namespace KivArchive;
using namespace KivArchive::Conformance;

TEST(PostgresArchive, Conforms) {
    CheckArchiveConformance([] { return theServer->MakeArchive(); },
                            [](std::string const& failure) { ADD_FAILURE() << failure; });
}

} // namespace

int main(int argc, char** argv) {
    return KivArchive::RunTestsWithServer(argc, argv, "fsync=off");
}
