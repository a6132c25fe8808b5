#include "support/Builders.h"
#include "support/HostStream.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

#include <pthread.h>

/// Long histories, deep paths and wide directories, on a stack that recursion along any of them would overflow.

namespace KivVcs {
namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int commitCount = 100'000;
constexpr int entryCount = 50'000;
#else
constexpr int commitCount = 1'000'000;
constexpr int entryCount = 500'000;
#endif
constexpr int depth = 20'000;

cow_ptr<Commit> Grow(Repository& repository, cow_ptr<Commit> const& parent, std::string const& path,
                     const char* content) {
    Commit commit(parent, false);
    EXPECT_TRUE(commit.AddBlob(&repository, Wide(path), MakeBlob(content)));
    return repository.SyncWithStorage(immu::make<Commit>(std::move(commit)));
}

/// Changes "1" in a directory of @p root on two sides, "2" on one of them, and merges; then reads the result back.
void MergeAndReadBack(Repository& repository, cow_ptr<Commit> const& root, std::string const& directory) {
    const auto left = Grow(repository, root, directory + "1", "left");
    const auto right = Grow(repository, Grow(repository, root, directory + "1", "right"), directory + "2", "");
    EXPECT_EQ(ToNames(right->GetCommitTree()->GetBlobDiffs(root->GetCommitTree())),
              (Names{directory + "1", directory + "2"}));
    EXPECT_EQ(Differences(root->GetCommitTree(), right->GetCommitTree())[1].path, Wide(directory + "2"));
    const auto conflicts = FindConflicts(
        {left->GetCommitTree()->GetRoot(), root->GetCommitTree()->GetRoot(), right->GetCommitTree()->GetRoot()});
    ASSERT_EQ(conflicts.size(), 1U);
    EXPECT_EQ(conflicts[0].path, Wide(directory + "1"));
    EXPECT_TRUE(FindCaseCollisions(right->GetCommitTree()->GetRoot()).empty());
    repository.MoveBranchTo(u"master", left);
    const auto merge = [](auto const&, auto const&) { return TreeConflictChoice::Merge; };
    EXPECT_TRUE(repository.Merge(right, {AlwaysChooseRight(), merge}));
    const cow_ptr<CommitTree> merged = repository.GetHead()->GetCommitTree();
    EXPECT_EQ(merged->GetRootId(), right->GetCommitTree()->GetRootId());

    PackedFormsOf forms(repository);
    Repository other(std::make_unique<MemObjectsStorage>());
    const auto read = CommitTree::Deserialize(merged->GetRootId(), &other, forms.Loader());
    EXPECT_TRUE(read && read->GetRootId() == merged->GetRootId());
    EXPECT_EQ(read->GetAllBlobPaths(), merged->GetAllBlobPaths());
}

void LiveThroughALongHistory() {
    cow_ptr<Commit> tip;
    cow_ptr<Commit> middle;
    auto repository = std::make_unique<Repository>(std::make_unique<MemObjectsStorage>());
    for (int index = 0; index < commitCount; ++index) {
        Commit commit(std::move(tip), false);
        commit.SetCommitTime(Time::FromTimeT(index, TimeZone::Utc));
        tip = repository->SyncWithStorage(immu::make<Commit>(std::move(commit)));
        if (index == commitCount / 2)
            middle = tip;
    }
    auto side = Grow(*repository, middle, "side", "");
    EXPECT_TRUE(repository->GetCommonBase(tip, side) == middle);
    EXPECT_TRUE(repository->GetCommonBase(side, tip) == middle);
    int walked = 0;
    for (auto const& commit : History(tip))
        walked += commit ? 1 : 0;
    EXPECT_EQ(walked, commitCount);
    EXPECT_TRUE(History(tip).Changing(u"side").begin() == History::Iterator());
    repository->MoveBranchTo(u"master", std::exchange(tip, nullptr));
    repository->CreateBranch(u"side", std::exchange(side, nullptr));
    EXPECT_EQ(repository->GetCommitCount(), commitCount + 1U);

    Repository clone(repository->GetStorage()->Clone());
    EXPECT_TRUE(repository->DeleteCommits(repository->GetHead()));
    EXPECT_EQ(repository->GetHead()->GetParent(), nullptr);
    EXPECT_EQ(repository->GetCommitCount(), 2U);
    repository.reset();

    // The purge releases the upper half, and the last pointer to its end the lower half.
    EXPECT_TRUE(clone.SimplifyCommitGraph(true));
    EXPECT_TRUE(clone.GetHead()->GetParent() == clone.GetHead(u"side")->GetParent());
    EXPECT_EQ(clone.GetCommitCount(), 3U + commitCount / 2 + 1);
}

void LiveOnADeepPath() {
    std::string directory;
    for (int level = 0; level < depth; ++level)
        directory += "d/";
    Repository repository(std::make_unique<MemObjectsStorage>());
    const auto root = Grow(repository, nullptr, directory + "f", "0");
    MergeAndReadBack(repository, root, directory);
    Commit emptied(root, false);
    EXPECT_TRUE(emptied.RemoveObject(&repository, Wide(directory + "f")));
    EXPECT_TRUE(emptied.GetCommitTree()->IsEmpty());
}

void LiveInAWideDirectory() {
    Repository repository(std::make_unique<MemObjectsStorage>());
    Tree wide;
    for (int entry = 0; entry < entryCount; ++entry)
        wide.AddBlob(&repository, Wide(std::to_string(entry)), MakeBlob(std::to_string(entry % 100)));
    Commit commit(nullptr, false);
    commit.AddTree(&repository, u"wide", wide);
    EXPECT_EQ(commit.GetCommitTree()->GetAllBlobPaths().size(), entryCount);
    MergeAndReadBack(repository, repository.SyncWithStorage(immu::make<Commit>(std::move(commit))), "wide/");
    EXPECT_TRUE(wide.RemoveObject(&repository, u"7"));
    EXPECT_EQ(wide.GetDeepBlobCount(), entryCount - 1);
}

TEST(LongHistories, AHundredThousandCommitsUnderAThousandBranchesAreRewritten) {
    constexpr int lineLength = 100'000;
    Repository repo(std::make_unique<MemObjectsStorage>());
    cow_ptr<Commit> first;
    cow_ptr<Commit> tip;
    cow_ptr<Commit> middle;
    for (int index = 0; index < lineLength; ++index) {
        Commit commit(std::move(tip), false);
        commit.SetCommitTime(Time(static_cast<std::uint64_t>(index) * 10'000'000));
        tip = repo.SyncWithStorage(immu::make<Commit>(commit));
        first = index == 0 ? tip : first;
        middle = index == lineLength / 2 ? tip : middle;
        if (index % 100 == 99)
            repo.CreateBranch(Wide("b" + std::to_string(index)), tip);
    }
    EXPECT_TRUE(repo.GetCommonBase(tip, middle) == middle);
    EXPECT_TRUE(repo.GetCommonBase(repo.MergelessRebase(middle, first, tip), tip) == tip);
    EXPECT_EQ(repo.GetCommitCount(), 150'000U);
    tip.reset();
    EXPECT_TRUE(repo.DeleteCommits(std::move(middle)));
    EXPECT_TRUE(repo.SimplifyCommitGraph(false));
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_EQ(repo.GetCommitCount(), 1000U);
}

TEST(LongHistories, AreIdentifiedWithoutStackWhereNothingIsStored) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    cow_ptr<Commit> unstored;
    cow_ptr<Commit> another;
    cow_ptr<Commit> stored;
    for (int index = 0; index < 100'000; ++index) {
        unstored = immu::make<Commit>(Commit(std::move(unstored), false));
        another = immu::make<Commit>(Commit(std::move(another), false));
        stored = repo.SyncWithStorage(immu::make<Commit>(Commit(std::move(stored), false)));
    }
    EXPECT_EQ(unstored->GetId(), stored->GetId());
    EXPECT_EQ(Bytes(another->GetData()), Bytes(stored->GetData()));
}

TEST(DeepNesting, TakesNoStackAndIsReadDownToItsBound) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    const std::string one = Identifier("blob", "1");
    const auto numbered = [](int level) {
        const std::string digits = std::to_string(level);
        return std::string(64 - digits.size(), '0') + digits;
    };
    const auto endless = [&](Id const& id) {
        const std::string text = Narrow(id.GetText());
        if (text == one)
            return ReaderOf(std::string("blob 1\0001", 8));
        return ReaderOf(std::string("tree 1\0", 7) + Entry("blob", "x", one) +
                        Entry("tree", "d", numbered(std::stoi(text) + 1)));
    };
    const auto read = Tree::Deserialize(Id(Wide(numbered(0))), &repo, endless);
    EXPECT_EQ(read->GetDeepBlobCount(), deepestLoadedNesting);
}

/// Runs the test's body on a thread with a stack of the given size; 0 for the default one.
class OnStacksOf : public testing::TestWithParam<std::size_t> {
protected:
    static void Run(void (*body)()) {
        pthread_attr_t attributes;
        pthread_attr_init(&attributes);
        if (GetParam() != 0) {
            ASSERT_EQ(pthread_attr_setstacksize(&attributes, GetParam()), 0);
        }
        pthread_t thread{};
        const auto start = [](void* context) -> void* {
            (*static_cast<void (**)()>(context))();
            return nullptr;
        };
        ASSERT_EQ(pthread_create(&thread, &attributes, start, &body), 0);
        pthread_attr_destroy(&attributes);
        pthread_join(thread, nullptr);
    }
};

TEST_P(OnStacksOf, AMillionCommitsAreBuiltSearchedRewrittenAndReleased) {
    Run(LiveThroughALongHistory);
}

TEST_P(OnStacksOf, TwentyThousandNestedDirectoriesAreEditedMergedReadBackAndReleased) {
    Run(LiveOnADeepPath);
}

TEST_P(OnStacksOf, ADirectoryOfHalfAMillionEntriesIsEditedMergedReadBackAndReleased) {
    Run(LiveInAWideDirectory);
}

INSTANTIATE_TEST_SUITE_P(Bytes, OnStacksOf, testing::Values(std::size_t{1} << 20U, std::size_t{0}));

TEST(LongHistories, AreFetchedCommitByCommit) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    constexpr int length = 1'000'000;
    // Each commit is told apart by its time, which is the number of commits below it.
    std::vector<Id> ids;
    const Commit::FetchCommit fetch = [&](Id const& id) {
        Commit commit;
        const auto position = static_cast<std::int64_t>(ids.size() - 1);
        ids.pop_back();
        commit.SetCommitTime(Time::FromTimeT(position, TimeZone::Utc));
        if (!ids.empty())
            commit.DeferParent(ids.back(), fetch);
        EXPECT_TRUE(commit.GetId() == id);
        return immu::make<Commit>(std::move(commit));
    };
    for (int position = 0; position < length; ++position) {
        Commit commit;
        commit.SetCommitTime(Time::FromTimeT(position, TimeZone::Utc));
        if (!ids.empty())
            commit.DeferParent(ids.back(), fetch);
        ids.push_back(commit.GetId());
    }
    Commit newest;
    newest.DeferParent(ids.back(), fetch);
    Commit other;
    other.SetDescription(u"other");
    EXPECT_FALSE(repo.GetCommonBase(immu::make<Commit>(newest), immu::make<Commit>(other)));
    EXPECT_TRUE(ids.empty());
}

} // namespace
} // namespace KivVcs
