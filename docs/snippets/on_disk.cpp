// From in memory to on disk: what docs/archive.md shows.

#include <KivArchive/KivArchive.h>

#include <cstdio>
#include <string>

using namespace KivVcs;
using namespace KivArchive;

namespace {

bool Edit(ArchivedRepository& repository, KivStringViewT<char16_t> path, std::string_view content) {
    Commit commit(&repository, false);
    commit.AddBlob(&repository, path, Blob::CopyText(content));
    return repository.DoCommit(commit) != nullptr;
}

std::string TextOf(ArchivedRepository const& repository, KivStringViewT<char16_t> path) {
    const cow_ptr<Commit> head = repository.GetHead();
    const cow_ptr<Blob> blob = head ? head->GetBlob(path) : nullptr;
    return blob ? blob->CopyToString() : std::string();
}

int Run(std::string const& file) {
    // In place of std::make_unique<MemObjectsStorage>().
    ArchivedRepository repository(std::make_shared<SqliteArchive>(file));
    Edit(repository, u"poems/spring", "green\n");
    repository.Publish();

    // The next day, or in another process.
    ArchivedRepository again(std::make_shared<SqliteArchive>(file));
    Edit(again, u"poems/autumn", "red\n");
    again.Publish();

    // Meanwhile somebody else has gone on from the day before.
    Edit(repository, u"poems/winter", "white\n");
    const bool wasFirst = repository.Publish().published;
    const auto keepBoth = [](auto const&, auto const&) { return TreeConflictChoice::Merge; };
    const auto outcome = repository.PublishMerging(Resolvers{AlwaysChooseLeft(), keepBoth});

    again.Refresh();
    const bool isWhole =
        TextOf(again, u"poems/spring") + TextOf(again, u"poems/autumn") + TextOf(again, u"poems/winter") ==
        "green\nred\nwhite\n";
    return !wasFirst && outcome.result == PublishMergingResult::Published && isWhole ? 0 : 1;
}

} // namespace

int main(int /*count*/, char** arguments) {
    const std::string file = std::string(arguments[0]) + ".archive";
    const auto remove = [&file] {
        for (const char* const suffix : {"", "-wal", "-shm"})
            std::remove((file + suffix).c_str());
    };
    remove();
    const int result = Run(file);
    remove();
    return result;
}
