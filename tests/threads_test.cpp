#include "support/Builders.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

#include <atomic>
#include <barrier>
#include <thread>

namespace KivVcs {
namespace {

constexpr std::size_t threadCount = 8;

using Versions = std::vector<cow_ptr<Commit>>;

/// A line of stored versions, oldest first, each of which changes files in a wide directory and in nested ones.
Versions GrowLine(Repository& repository) {
    Versions line;
    for (int number = 0; number < 20; ++number) {
        const std::string digits = std::to_string(number);
        Commit next(&repository, false);
        next.SetDescription(Wide(digits));
        for (int file = number == 0 ? 0 : 299; file < 300; ++file)
            next.AddBlob(&repository, Wide("wide/" + std::to_string(file * (number + 1))), MakeBlob(digits));
        next.AddBlob(&repository, Wide("a/b/" + std::to_string(number % 5) + "/c"), MakeBlob(digits));
        if (number % 3 == 2)
            next.RemoveObject(&repository, Wide("a/b/" + std::to_string((number + 3) % 5)));
        line.push_back(repository.DoCommit(next));
    }
    return line;
}

/// The same versions on a history of their own, with nothing computed yet, so that their first readers compute it.
Versions FreshCopies(Versions const& line) {
    Repository nowhere(nullptr);
    Versions fresh;
    for (auto const& commit : line) {
        Tree root(*commit->GetCommitTree()->GetRoot());
        root.AddBlob(&nowhere, u"fresh/file", MakeBlob("fresh"));
        fresh.push_back(immu::make<Commit>(*commit));
        fresh.back().write()->ReplaceRoot(nullptr, immu::make<Tree>(std::move(root)));
        fresh.back().write()->SetParent(fresh.size() == 1 ? nullptr : fresh[fresh.size() - 2]);
    }
    return fresh;
}

/// Reads the versions in all ways, newest first, changes copies of them, and returns what it read.
std::string ReadAndDrop(Repository const& repository, Versions line) {
    std::string read;
    for (; line.size() > 1; line.pop_back()) {
        cow_ptr<Commit> commit = line.back();
        cow_ptr<CommitTree> const& files = commit->GetCommitTree();
        cow_ptr<Commit> const& earlier = line[line.size() / 2 - 1];
        read += IdText(*commit) + Bytes(commit->GetPackedData()) + NameOf(commit->GetParent());
        read += Bytes(files->GetRoot()->GetPackedData()) + Narrow(commit->ToString());
        read += Joined(ToNames(files->GetBlobDiffs(earlier->GetCommitTree())));
        read += Joined(ToNames(files->GetAllBlobPaths())) + std::to_string(files->GetBlobCount());
        for (auto const& path : files->GetBlobDiffs(commit->GetParent()->GetCommitTree())) {
            if (const auto blob = commit->GetBlob(path))
                read += Bytes(blob->GetPackedData()) + IdText(*blob);
        }
        read += NameOf(repository.GetCommonBase(commit, earlier)) + NameOf(repository.GetHead());
        if (const auto stored = repository.GetCommitFromStorage(commit->GetId()))
            read += Bytes(repository.GetTreeFromStorage(*files->GetIdByPath(u"a"))->GetData()) + NameOf(stored);
        Repository nowhere(nullptr);
        commit.write()->AddBlob(&nowhere, u"wide/7/mine", MakeBlob("mine"));
        commit.write()->RemoveObject(&nowhere, u"a/b");
        read += IdText(*commit);
        EXPECT_FALSE(line.back()->GetBlob(u"wide/7/mine"));
    }
    return read;
}

/// Runs @p read with the number of each thread in all threads at once.
template <class Read>
void AtOnce(Read read) {
    std::vector<std::thread> threads;
    std::barrier start(threadCount);
    for (std::size_t index = 0; index < threadCount; ++index)
        threads.emplace_back([&, index] {
            start.arrive_and_wait();
            read(index);
        });
    for (auto& thread : threads)
        thread.join();
}

TEST(EightThreads, ReadOneHistoryAndDropTheirCopies) {
    Repository repository(std::make_unique<MemObjectsStorage>());
    const Versions stored = GrowLine(repository);
    const auto readBoth = [&repository](Versions const& line, Versions& fresh) {
        return ReadAndDrop(repository, line) + ReadAndDrop(repository, std::move(fresh));
    };
    Versions alone = FreshCopies(stored);
    const std::string expected = readBoth(stored, alone);
    for (int round = 0; round < 5; ++round) {
        // Each thread holds its own copies of the pointers; the last one to drop the fresh versions releases them.
        std::vector<Versions> copies(threadCount, FreshCopies(stored));
        std::vector<std::string> read(threadCount);
        AtOnce([&](std::size_t index) { read[index] = readBoth(stored, copies[index]); });
        for (auto const& each : read)
            ASSERT_TRUE(each == expected);
    }
}

TEST(EightThreads, FetchWhatIsDeferredOnce) {
    const auto parent = immu::make<Commit>();
    const auto root = immu::make<Tree>();
    for (int round = 0; round < 50; ++round) {
        std::atomic<int> fetches{0};
        Commit commit;
        commit.DeferParent(parent->GetId(), [&](Id const&) { return ++fetches, immu::make<Commit>(); });
        commit.DeferRoot(root->GetId(), [&](Id const&) { return ++fetches, immu::make<Tree>(); });
        std::vector<cow_ptr<Commit>> parents(threadCount);
        std::vector<cow_ptr<CommitTree>> files(threadCount);
        AtOnce([&](std::size_t index) {
            parents[index] = commit.GetParent();
            files[index] = Commit(commit).GetHeldParent() ? commit.GetCommitTree() : nullptr;
        });
        for (std::size_t index = 0; index < threadCount; ++index)
            EXPECT_TRUE(parents[index] && parents[index] == parents[0] && files[index] == files[0]);
        EXPECT_EQ(fetches, 2);
    }
}

TEST(EightThreads, IdentifyWhatOthersIdentifyToo) {
    Repository repository(std::make_unique<MemObjectsStorage>());
    const Versions stored = GrowLine(repository);
    for (int round = 0; round < 10; ++round) {
        const Versions fresh = FreshCopies(stored);
        // Large enough to go on where the digest of another version has been.
        const std::string longName(2000, 'n');
        Tree base;
        for (int number = 100; number < 200; ++number)
            base.AddBlob(&repository, Wide(longName + std::to_string(number)), MakeBlob("1"));
        EXPECT_TRUE(round % 2 == 0 || !base.GetId().IsEmpty());
        Tree large(base);
        large.AddBlob(&repository, Wide(longName + "180"), MakeBlob("2"));
        std::vector<Blob> blobs;
        for (std::size_t number = 0; number < 100; ++number)
            blobs.push_back(MakeBlob(std::string(number * 50, 'x')));
        AtOnce([&](std::size_t index) {
            Repository nowhere(nullptr);
            std::vector<Object const*> objects{fresh[index].get(), fresh.back().get()};
            for (std::size_t number = index * 5; number < blobs.size(); ++number)
                objects.push_back(&blobs[number]);
            Identify(objects);
            Tree mine(index % 2 == 0 ? base : large);
            mine.AddBlob(&nowhere, Wide(longName + "190"), MakeBlob("2"));
            EXPECT_FALSE(mine.GetId().IsEmpty() || large.GetId() == base.GetId());
            for (Object const* object : objects)
                EXPECT_TRUE(object->GetKnownDigest() != nullptr || !object->GetId().IsEmpty());
        });
        EXPECT_EQ(blobs[99].GetId(), MakeBlob(std::string(4950, 'x')).GetId());
    }
}

} // namespace
} // namespace KivVcs
