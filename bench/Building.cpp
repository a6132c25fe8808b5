#include "Content.h"
#include "Measuring.h"

namespace KivVcs::Bench {

namespace {

Round Blobs(std::int64_t count, std::int64_t size, bool fromReadyBuffers) {
    auto content = std::make_shared<std::vector<char>>(static_cast<std::size_t>(count * size), 'c');
    for (std::int64_t blob = 0; blob < count; ++blob) {
        const std::string number = std::to_string(blob);
        std::copy(number.begin(), number.end(), content->begin() + static_cast<std::ptrdiff_t>(blob * size));
    }
    const auto contentOf = [content, size](std::int64_t blob) {
        Buffer buffer;
        buffer.Append(content->data() + blob * size, static_cast<std::uint64_t>(size));
        return buffer;
    };
    const auto operations = static_cast<std::uint64_t>(count);
    if (!fromReadyBuffers)
        return Storing(
            operations,
            [=](Repository& repo) {
                for (std::int64_t blob = 0; blob < count; ++blob)
                    repo.SyncWithStorage(immu::make<Blob>(contentOf(blob)));
            },
            content.get());
    return [=, floor = HashFloor()]() mutable {
        Measurement result{.operations = operations};
        const std::int64_t before = LiveBytes();
        auto repo = MakeRepository();
        for (std::int64_t blob = 0; blob < count; ++blob) {
            Buffer buffer = contentOf(blob);
            result.seconds += SecondsOf([&] { repo->SyncWithStorage(immu::make<Blob>(std::move(buffer))); });
        }
        result.keptBytes = LiveBytes() - before;
        if (floor.IsEmpty())
            floor.AddStored(*repo);
        repo.reset();
        result.floorSeconds = floor.Run(content.get());
        return result;
    };
}

Round FilesByPath(std::int64_t count, std::vector<int> const& directories) {
    auto files = MakeFiles(FilePaths(count, directories));
    return Storing(static_cast<std::uint64_t>(count), [files = std::move(files)](Repository& repo) {
        Commit commit(&repo, false);
        for (auto const& [path, text] : files)
            commit.AddBlob(&repo, path, MakeBlob(text));
        repo.DoCommit(commit);
    });
}

Round LocalTrees(std::int64_t count) {
    auto files = MakeFiles(FilePaths(count, {}));
    auto directories = DirectoryNames(count / 100);
    return Storing(static_cast<std::uint64_t>(count), [=](Repository& repo) {
        Commit commit(&repo, false);
        commit.ReplaceRoot(&repo, MakeTwoLevels(repo, files, directories));
        repo.DoCommit(commit);
    });
}

Round SmallCommits(std::int64_t count) {
    const auto paths = FilePaths(1000, {10, 10});
    std::vector<std::string> texts;
    for (std::int64_t number = 0; number < count; ++number)
        texts.push_back(SmallText(number, 1));
    return [=, floor = HashFloor()]() mutable {
        auto repo = MakeRepository();
        Commit first(repo.get(), false);
        for (Path const& path : paths)
            first.AddBlob(repo.get(), path, MakeBlob("first"));
        repo->DoCommit(first);
        repo->UpdateStorage();

        Measurement result{.operations = static_cast<std::uint64_t>(count)};
        const std::int64_t before = LiveBytes();
        result.seconds = SecondsOf([&] {
            for (std::size_t number = 0; number < texts.size(); ++number) {
                Commit commit(repo.get(), false);
                commit.AddBlob(repo.get(), paths[number * 37 % paths.size()], MakeBlob(texts[number]));
                repo->DoCommit(commit);
            }
        });
        result.keptBytes = LiveBytes() - before;
        // About a hundred trees of the first commit more than was hashed, which is less than one in a hundred.
        if (floor.IsEmpty())
            floor.AddStored(*repo);
        repo.reset();
        result.floorSeconds = floor.Run();
        return result;
    };
}

Round OneFileOfMany(std::int64_t count) {
    const std::shared_ptr<Repository> repo = MakeRepository();
    Commit commit(repo.get(), false);
    commit.ReplaceRoot(repo.get(), MakeTwoLevels(*repo, count, count)->GetLocalTree(u"directory-000000"));
    repo->DoCommit(commit);
    HashFloor floor;
    floor.AddTree(*commit.GetCommitTree()->GetRoot());
    return [=, number = std::int64_t{0}]() mutable {
        Measurement result;
        const Path path = Numbered("file-", ++number * 7919 % count);
        const Blob blob = MakeBlob(SmallText(number, 1));
        const std::int64_t before = LiveBytes();
        Commit next(repo.get(), false);
        result.seconds = SecondsOf([&] { next.AddBlob(repo.get(), path, blob); });
        result.keptBytes = LiveBytes() - before;
        result.floorSeconds = floor.Run();
        return result;
    };
}

} // namespace

void AddBuildingWorkloads(std::vector<Workload>& workloads, bool quick) {
    const auto add = [&](char const* name, std::int64_t whole, double ratio, double bytes, auto rounds,
                         int roundsInOne = 1) {
        for (const std::int64_t size : Sizes(quick, whole))
            workloads.push_back({name, size, ratio, bytes, [=] { return rounds(size); }, roundsInOne});
    };
    for (const std::int64_t size : Sizes(quick, std::int64_t{1} << 28)) {
        const double bytes = 1.01 * static_cast<double>(size);
        workloads.push_back(
            {"B1 one blob from a ready buffer", size, 1.15, bytes, [=] { return Blobs(1, size, true); }});
        workloads.push_back(
            {"B1 the same, copied from the host", size, 0, bytes, [=] { return Blobs(1, size, false); }});
    }
    add("B2 blobs of 64 KiB", 1000, 1.25, 65536 + 600, [](auto count) { return Blobs(count, 65536, false); });
    add("B3 blobs of 200 B", 100'000, 2.5, 200 + 260, [](auto count) { return Blobs(count, 200, false); });
    add("B4 files by path, one directory", 16'000, 1.5, 6144, [](auto count) { return FilesByPath(count, {}); });
    add("B5 files by path, three levels", 10'000, 2.5, 3072, [](auto count) { return FilesByPath(count, {20, 25}); });
    add("B6 files in local trees", 100'000, 3.5, 450, LocalTrees);
    add("B7 commits of one change", 20'000, 3.5, 2.2 * 1024, SmallCommits);
    add("B14 one file of a directory", 100'000, 1.1, 8192, OneFileOfMany, 20);
}

} // namespace KivVcs::Bench
