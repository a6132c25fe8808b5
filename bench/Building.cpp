#include "Content.h"
#include "Measuring.h"

namespace KivVcs::Bench {

namespace {

/// Blobs of buffers that are ready, or are copied from the host's memory as part of the work.
Round Blobs(std::int64_t count, std::int64_t size, bool copied) {
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
    const auto bring = [=] {
        std::vector<Buffer> buffers;
        for (std::int64_t blob = 0; blob < (copied ? 0 : count); ++blob)
            buffers.push_back(contentOf(blob));
        return buffers;
    };
    const auto store = [=](Repository& repo, std::vector<Buffer>& buffers) {
        for (std::int64_t blob = 0; blob < count; ++blob) {
            Buffer buffer = copied ? contentOf(blob) : std::move(buffers[static_cast<std::size_t>(blob)]);
            repo.SyncWithStorage(immu::make<Blob>(std::move(buffer)));
        }
    };
    return Storing(static_cast<std::uint64_t>(count), bring, store, content);
}

/// A blob from a vector that the host hands over.
Round AdoptedBlob(std::int64_t size) {
    const auto content = std::make_shared<std::vector<char>>(static_cast<std::size_t>(size), 'c');
    const auto bring = [content] {
        auto const* const bytes = reinterpret_cast<std::byte const*>(content->data());
        return std::vector<std::byte>(bytes, bytes + content->size());
    };
    const auto store = [](Repository& repo, std::vector<std::byte>& bytes) {
        repo.SyncWithStorage(immu::make<Blob>(Blob::AdoptBytes(std::move(bytes))));
    };
    return Storing(1, bring, store, content);
}

/// Blobs that are all identified at once, of buffers that are ready, or of vectors that the host hands over.
Round IdentifiedBlobs(std::int64_t count, std::int64_t size, bool handedOver) {
    auto content = std::make_shared<std::vector<char>>(static_cast<std::size_t>(count * size), 'c');
    HashFloor floor;
    for (std::int64_t blob = 0; blob < count; ++blob) {
        const std::string number = std::to_string(blob);
        std::copy(number.begin(), number.end(), content->begin() + static_cast<std::ptrdiff_t>(blob * size));
        floor.AddForm(Blob(Buffer(static_cast<std::uint64_t>(size))));
    }
    return [=]() mutable {
        Measurement result{.operations = static_cast<std::uint64_t>(count)};
        const MemoryTaken taken;
        std::vector<std::vector<char>> vectors;
        std::vector<Blob> blobs;
        blobs.reserve(static_cast<std::size_t>(count));
        for (auto bytes = content->cbegin(); bytes != content->cend(); bytes += size) {
            if (handedOver)
                vectors.emplace_back(bytes, bytes + size);
            else
                blobs.push_back(Blob::CopyBytes(&*bytes, static_cast<std::size_t>(size)));
        }
        result.seconds = LibrarySecondsOf([&] {
            for (std::vector<char>& vector : vectors)
                blobs.emplace_back(Buffer::Adopt(std::move(vector)));
            std::vector<Object const*> objects;
            objects.reserve(blobs.size());
            for (Blob const& blob : blobs)
                objects.push_back(&blob);
            Identify(objects);
        });
        vectors = {};
        taken.WriteTo(result);
        blobs = {};
        result.floorSeconds = floor.Run(content.get());
        return result;
    };
}

/// Files of @p size bytes, a hundred in each directory, all added at once.
Round FilesAtOnce(std::int64_t count, std::int64_t size) {
    const auto bring = [count, size] {
        std::vector<Buffer> contents = SmallContents(count);
        const std::string rest(static_cast<std::size_t>(size), 'c');
        for (Buffer& content : contents)
            content.Append(rest.data(), static_cast<std::uint64_t>(size) - content.GetSize());
        return contents;
    };
    std::vector<Path> paths = FilePaths(count, {});
    for (std::size_t file = 0; file < paths.size(); ++file)
        paths[file] = Numbered("directory-", static_cast<std::int64_t>(file / 100)) + u"/" + paths[file];
    const auto add = [paths = std::move(paths)](Repository& repo, std::vector<Buffer>& contents) {
        std::vector<BlobAtPath> blobs;
        blobs.reserve(paths.size());
        for (std::size_t file = 0; file < paths.size(); ++file)
            blobs.push_back({paths[file], immu::make<Blob>(std::move(contents[file]))});
        Commit commit(&repo, false);
        commit.AddBlobs(&repo, blobs);
        repo.DoCommit(commit);
    };
    return Storing(static_cast<std::uint64_t>(count), bring, add);
}

Round FilesByPath(std::int64_t count, std::vector<int> const& directories) {
    const auto bring = [count] { return SmallContents(count); };
    const auto add = [paths = FilePaths(count, directories)](Repository& repo, std::vector<Buffer>& contents) {
        Commit commit(&repo, false);
        for (std::size_t file = 0; file < paths.size(); ++file)
            commit.AddBlob(&repo, paths[file], Blob(std::move(contents[file])));
        repo.DoCommit(commit);
    };
    return Storing(static_cast<std::uint64_t>(count), bring, add);
}

Round LocalTrees(std::int64_t count) {
    const auto bring = [count] { return SmallContents(count); };
    const auto build = [files = FilePaths(count, {}),
                        directories = DirectoryNames(count / 100)](Repository& repo, std::vector<Buffer>& contents) {
        Commit commit(&repo, false);
        commit.ReplaceRoot(&repo, MakeTwoLevels(repo, files, contents, directories));
        repo.DoCommit(commit);
    };
    return Storing(static_cast<std::uint64_t>(count), bring, build);
}

Round SmallCommits(std::int64_t count) {
    return [count, paths = FilePaths(1000, {10, 10}), floor = HashFloor()]() mutable {
        auto repo = MakeRepository();
        Commit first(repo.get(), false);
        for (Path const& path : paths)
            first.AddBlob(repo.get(), path, Blob(SmallContent(0)));
        repo->DoCommit(first);
        repo->UpdateStorage();
        const auto known = floor.IsEmpty() ? StoredIds(*repo) : std::unordered_set<Id>();

        Measurement result{.operations = static_cast<std::uint64_t>(count)};
        const MemoryTaken taken;
        auto contents = SmallContents(count, 1);
        result.seconds = LibrarySecondsOf([&] {
            for (std::size_t number = 0; number < contents.size(); ++number) {
                Commit commit(repo.get(), false);
                commit.AddBlob(repo.get(), paths[number * 37 % paths.size()], Blob(std::move(contents[number])));
                repo->DoCommit(commit);
            }
        });
        contents = {};
        taken.WriteTo(result);
        if (floor.IsEmpty())
            floor.AddStored(*repo, known);
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
    floor.AddForm(*commit.GetCommitTree()->GetRoot());
    // One place after the other at this distance, all of them evenly spread however many are taken.
    const auto step = static_cast<std::int64_t>(0.6180339887 * static_cast<double>(count)) | 1;
    return [=, number = std::int64_t{0}]() mutable {
        Measurement result;
        const Path path = Numbered("file-", ++number * step % count);
        const MemoryTaken taken;
        const Blob blob(SmallContent(number, 1));
        Commit next(repo.get(), false);
        result.seconds = LibrarySecondsOf([&] { next.AddBlob(repo.get(), path, blob); });
        taken.WriteTo(result);
        result.floorSeconds = floor.Run();
        return result;
    };
}

} // namespace

void AddBuildingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors) {
    const auto withoutContender = [](std::int64_t) { return Contender(); };
    const auto addBeside = [&](std::string const& name, std::int64_t whole, Limits limits, auto rounds, auto contender,
                               int roundsInOne = 1) {
        for (const std::int64_t divisor : divisors) {
            const std::int64_t size = whole / divisor;
            workloads.push_back({name, size, limits, [=] { return rounds(size); }, roundsInOne, contender(size)});
        }
    };
    const auto add = [&](std::string const& name, std::int64_t whole, Limits limits, auto rounds, int roundsInOne = 1) {
        addBeside(name, whole, limits, rounds, withoutContender, roundsInOne);
    };
    const auto addBlobs = [&](std::string const& name, std::int64_t count, std::int64_t size, Limits limits) {
        for (const bool copied : {false, true}) {
            addBeside(
                name + (copied ? ", copied" : ""), count, copied ? Limits{} : limits,
                [=](std::int64_t number) { return Blobs(number, size, copied); },
                [=](std::int64_t number) { return copied ? Libgit2Blobs(number, size) : Contender(); });
        }
    };
    constexpr std::int64_t oneBlob = std::int64_t{1} << 28;
    for (const bool copied : {false, true}) {
        for (const std::int64_t divisor : divisors) {
            const std::int64_t size = oneBlob / divisor;
            const Limits limits{copied ? 0 : 1.15, copied ? 0 : 1.01 * static_cast<double>(size)};
            workloads.push_back(
                {copied ? "B1 one blob, copied" : "B1 one blob", size, limits, [=] { return Blobs(1, size, copied); }});
        }
    }
    add("B1 one blob, handed over", std::int64_t{1} << 24, {1.03}, AdoptedBlob);
    addBeside(
        "B1 16 MiB, copied", std::int64_t{1} << 24, {1.25}, [](auto size) { return Blobs(1, size, true); },
        [](auto size) { return Libgit2Blobs(1, size); });
    addBlobs("B2 blobs of 64 KiB", 1000, 65536, {1.25, 65536 + 600});
    addBlobs("B3 blobs of 200 B", 100'000, 200, {2.5, 400});
    add("B4 files by path, one directory", 16'000, {1.5, 6144}, [](auto count) { return FilesByPath(count, {}); });
    addBeside(
        "B5 files by path, three levels", 10'000, {2.5, 3072},
        [](auto count) {
            return FilesByPath(count, {20, 25});
        },
        Libgit2FilesByPath);
    addBeside("B6 files in local trees", 100'000, {3.5, 450}, LocalTrees,
              [](auto count) { return Libgit2Directories(count, 0); });
    addBeside("B7 commits of one change", 20'000, {3.5, 2.2 * 1024}, SmallCommits, Libgit2Commits);
    const auto addIdentified = [&](std::string const& name, double limit, bool handedOver) {
        addBeside(
            name, 4000, {limit}, [=](auto count) { return IdentifiedBlobs(count, 65536, handedOver); },
            [](auto count) { return Libgit2Blobs(count, 65536); });
    };
    addIdentified("B19 blobs of 64 KiB at once", 0.6, false);
    addIdentified("B19 blobs of 64 KiB at once, handed over", 0.7, true);
    addBeside(
        "B20 files of 200 B at once", 100'000, {2}, [](auto count) { return FilesAtOnce(count, 200); },
        [](auto count) { return Libgit2Directories(count, 200); });
    add("B14 one file of a directory", 100'000, {0.6, 3072}, OneFileOfMany, 20);
    // Smaller ones have fewer places to go on from.
    for (const std::int64_t divisor : divisors) {
        const std::int64_t count = 16'000 / divisor;
        const Limits limits = divisor == 1 ? Limits{0.6, 2600} : Limits{};
        workloads.push_back({"B14 one of 16,000 files", count, limits, [=] { return OneFileOfMany(count); }, 20});
    }
}

} // namespace KivVcs::Bench
