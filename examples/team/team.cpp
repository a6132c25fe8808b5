// One member of a team that works on one database: team ADDRESS CACHE-FILE NAME EDITS MEMBERS
// Publishes so many edits of files of its own, merging what others publish meanwhile, waits until all members have done so, and
// prints the head and how many files it holds.

#include <KivArchive/ArchivedRepository.h>
#include <KivArchive/CachingArchive.h>
#include <KivArchive/PostgresArchive.h>
#include <KivArchive/SqliteArchive.h>
#include <KivVcs/KivVcs.h>

#include <cstdio>
#include <exception>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace KivArchive;
using KivVcs::FromUtf8;
using KivVcs::ToUtf8;

KivVcs::Resolvers TakingOurs() {
    return {KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }};
}

void PublishFile(ArchivedRepository& repository, std::string const& path, std::string const& content) {
    KivVcs::Buffer data;
    data.Append(content.data(), content.size());
    KivVcs::Commit commit(&repository, false);
    commit.AddBlob(&repository, FromUtf8(path), KivVcs::Blob(std::move(data)));
    commit.SetAuthorName(FromUtf8(path.substr(0, path.find('/'))));
    commit.SetDescription(FromUtf8("Write " + path));
    repository.DoCommit(commit);
    auto const outcome = repository.PublishMerging(TakingOurs());
    std::printf("%s: published after %u attempts\n", path.c_str(), outcome.attempts);
    if (outcome.result != PublishMergingResult::Published)
        throw std::runtime_error("others were faster each time");
}

/// How many members have published all that they have, and how many files there are.
struct Progress {
    std::size_t members = 0;
    std::size_t files = 0;
};

Progress LookAt(ArchivedRepository const& repository) {
    Progress progress;
    auto const head = repository.GetHead();
    auto const root = head ? head->GetCommitTree()->GetRoot() : nullptr;
    if (!root)
        return progress;
    for (auto const& name : root->GetLocalSubtreePaths()) {
        auto const directory = root->GetLocalTree(name);
        progress.files += directory->GetLocalBlobPaths().size();
        progress.members += directory->GetLocalBlob(u"done") ? 1 : 0;
    }
    return progress;
}

void Work(std::string const& address, std::string const& cacheFile, std::string const& name, int edits,
          std::size_t members) {
    const auto database = std::make_shared<PostgresArchive>(address);
    const auto cache = std::make_shared<CachingArchive>(std::make_shared<SqliteArchive>(cacheFile), database);
    ArchivedRepository repository(cache);
    for (int i = 1; i <= edits; ++i)
        PublishFile(repository, name + "/note " + std::to_string(i), name + " wrote this");
    PublishFile(repository, name + "/done", "all of it");
    while (LookAt(repository).members < members) {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        static_cast<void>(repository.Refresh());
    }
    std::printf("head %s, %zu files\n", ToUtf8(repository.GetHead()->GetId().GetText()).c_str(),
                LookAt(repository).files);
}

} // namespace

int main(int count, char** arguments) {
    if (count != 6) {
        (void)std::fprintf(stderr, "usage: team ADDRESS CACHE-FILE NAME EDITS MEMBERS\n");
        return 2;
    }
    try {
        Work(arguments[1], arguments[2], arguments[3], std::stoi(arguments[4]), std::stoul(arguments[5]));
        return 0;
    } catch (std::exception const& failure) {
        (void)std::fprintf(stderr, "%s\n", failure.what());
        return 1;
    }
}
