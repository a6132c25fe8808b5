#include "KivArchive/Listings.h"
#include "archived_repository/Versions.h"

#include <atomic>

/// When the archive is asked for what, and which objects that makes.

namespace KivArchive {
namespace {

TEST(ArchivedRepository, WalksFetchInBatchesAhead) {
    auto const archive = std::make_shared<CountingArchive>();
    constexpr int versions = 3000;
    {
        ArchivedRepository repository(archive);
        for (int i = 0; i < versions; ++i)
            CommitFiles(repository, "a/b/c/f" + std::to_string(i % 7) + "=" + std::to_string(i), std::to_string(i));
        ASSERT_TRUE(repository.Publish().published);
    }
    archive->calls = archive->contents = 0;
    ArchivedRepository repository(archive);
    auto const head = repository.GetHead();
    EXPECT_EQ(Line(cow_ptr<Commit>(head)).substr(0, 15), "2999 2998 2997 ");
    EXPECT_EQ(repository.GetCommitCount(), versions + 0U);
    EXPECT_LE(archive->calls, 20U);
    archive->calls = 0;
    EXPECT_EQ(FilesOf(repository.GetHead()->GetParent()).substr(0, 9), "a/b/c/f0=");
    EXPECT_EQ(archive->calls - archive->contents, 4U) << "a batch a level, and one a content";

    archive->calls = 0;
    ArchivedRepository few(archive);
    int listed = 0;
    for (auto const& commit : History(few.GetHead()).First(20))
        listed += commit->GetDescription().IsEmpty() ? 0 : 1;
    EXPECT_EQ(listed, 20);
    EXPECT_LE(archive->calls, 4U);
    EXPECT_LT(few.GetCommitCount(), 100U);
}

/// A commit "one" and two on top of it: "two" on "master", "three" on "side".
class LivingObjects : public testing::Test {
protected:
    LivingObjects() {
        ArchivedRepository first(archive);
        parentId = CommitFiles(first, "a=1", "one")->GetId();
        CommitFiles(first, "b=2", "two");
        first.CreateBranch(u"side", first.GetHead()->GetParent());
        first.Checkout(u"side");
        CommitFiles(first, "c=3", "three");
        first.Publish();
        repository = std::make_unique<ArchivedRepository>(archive);
        head = repository->GetHead();
        side = repository->GetHead(u"side");
    }

    std::shared_ptr<MemArchive> const archive = std::make_shared<MemArchive>();
    std::unique_ptr<ArchivedRepository> repository;
    Id parentId;
    cow_ptr<Commit> head;
    cow_ptr<Commit> side;
};

TEST_F(LivingObjects, AreHandedOutOnceWhereverTheyAreAskedFor) {
    KivVcs::Repository clone(repository->GetStorage()->Clone());
    auto const* const tables = &std::as_const(*repository).GetStorage()->GetCommits();
    EXPECT_EQ(tables->size(), 2U);
    cow_ptr<Commit> const parent = head->GetParent();
    EXPECT_EQ(tables->size(), 2U) << "a table stays as it is while somebody walks";
    EXPECT_EQ(std::as_const(*repository).GetStorage()->GetCommits().at(parentId), parent);
    EXPECT_EQ(clone.GetCommitFromStorage(parentId), parent) << "it has entered the clone's storage, too";
    EXPECT_EQ(head->GetCommitTree()->GetRoot()->GetLocalBlob(u"a"),
              parent->GetCommitTree()->GetRoot()->GetLocalBlob(u"a"));

    // A deleted commit stays alive where it is held, and does not enter the storage again.
    repository->GetStorage()->DeleteCommit(parent);
    EXPECT_FALSE(repository->GetCommitFromStorage(parentId));
    EXPECT_EQ(repository->GetCommitCount(), 2U);
    EXPECT_EQ(side->GetParent(), parent);
    EXPECT_FALSE(repository->GetCommitFromStorage(parentId));
    EXPECT_TRUE(clone.GetCommitFromStorage(parentId));
    auto const again = KivVcs::CopyOf(*parent);
    EXPECT_EQ(repository->SyncWithStorage(again), again);
    EXPECT_EQ(repository->GetCommitFromStorage(parentId), again);
}

TEST_F(LivingObjects, OutliveTheirRepositoryAndComeFromTheArchive) {
    // What only storages hold is purged. Functions that fetch keep the archive alive, not the repository.
    EXPECT_EQ(side->GetParent()->GetId(), parentId);
    repository->RemoveBranch(u"side");
    repository->UpdateStorage();
    EXPECT_TRUE(repository->GetCommitFromStorage(side->GetId()));
    repository = nullptr;
    EXPECT_EQ(FilesOf(head), "a=1 b=2");
    ArchivedRepository other(archive);
    auto const late = other.GetHead();
    EXPECT_EQ(other.Load(std::vector<Id>{parentId, late->GetRootId(), Id(Conformance::BufferOf("no"))}).size(), 1U);
    EXPECT_EQ(other.GetCommitCount() + other.GetTreeCount() + other.GetBlobCount(), 3U + 1U + 2U);
}

/// Nine files of 1,000 bytes, "f0" to "f8", in an archive whose readers cache at most four.
class ArchivedContents : public testing::Test {
protected:
    ArchivedContents() {
        ArchivedRepository repository(archive);
        Commit commit(&repository, false);
        for (char digit = '0'; digit < '9'; ++digit)
            commit.AddBlob(&repository, Wide(std::string("f") + digit), MakeBlob(std::string(1000, digit)));
        repository.DoCommit(commit);
        repository.Publish();
        archive->calls = archive->contents = 0;
    }

    static RepositoryOptions Options() {
        RepositoryOptions options;
        options.contentBytes = 4000;
        options.workers = 2;
        return options;
    }

    static std::vector<Id> FilesIn(ArchivedRepository& repository) {
        std::vector<Id> ids;
        auto const root = repository.GetHead()->GetCommitTree()->GetRoot();
        for (auto const& name : root->GetLocalBlobPaths())
            ids.push_back(root->GetLocalBlob(name)->GetId());
        return ids;
    }

    std::shared_ptr<CountingArchive> const archive = std::make_shared<CountingArchive>();
};

TEST_F(ArchivedContents, ComeWhenAskedForWithinABudget) {
    ArchivedRepository repository(archive, Options());
    auto const root = repository.GetHead()->GetCommitTree()->GetRoot();
    std::vector<Id> const ids = FilesIn(repository);
    archive->calls = 0;
    auto const* const file = dynamic_cast<ArchivedBlob const*>(root->GetLocalBlob(u"f0").get());
    ASSERT_NE(file, nullptr);
    EXPECT_EQ(file->GetSize() + dynamic_cast<ArchivedBlob const&>(*root->GetLocalBlob(u"f8")).GetSize(), 2000U);
    EXPECT_EQ(archive->calls, 1U) << "all sizes at once";
    EXPECT_EQ(archive->contents, 0U);
    for (int round = 0; round < 3; ++round)
        EXPECT_EQ(TextOf(file->ReadContent()), std::string(1000, '0'));
    EXPECT_EQ(archive->contents, 1U);
    for (std::size_t i = 1; i < 5; ++i)
        EXPECT_EQ(TextOf(repository.ReadContent(ids[i])).size(), 1000U);
    EXPECT_EQ(archive->contents, 5U);
    EXPECT_EQ(TextOf(repository.ReadContent(ids[4])).size(), 1000U);
    EXPECT_EQ(archive->contents, 5U) << "what was used last is kept";
    EXPECT_FALSE(file->IsContentHeld());
    Buffer const* const held = &file->GetData();
    EXPECT_EQ(TextOf(*held), std::string(1000, '0'));
    EXPECT_EQ(archive->contents, 6U) << "what was used first has gone";
    EXPECT_TRUE(&file->GetData() == held && file->IsContentHeld());
}

TEST_F(ArchivedContents, AreReadByManyWorkersAndFailAsWhatTheyAre) {
    ArchivedRepository repository(archive, Options());
    std::vector<Id> const ids = FilesIn(repository);
    std::atomic<std::uint64_t> bytes{0};
    std::vector<Id> many;
    for (int copies = 0; copies < 64; ++copies)
        many.insert(many.end(), ids.begin(), ids.end());
    auto const count = [&](ArchivedObject const& object) { bytes += object.data.size(); };
    EXPECT_TRUE(repository.ReadContents(many, count).missing.empty());
    EXPECT_EQ(bytes, 64U * 9000U);
    auto const refuse = [](ArchivedObject const&) { throw std::length_error("no memory left"); };
    EXPECT_THROW(repository.ReadContents(many, refuse), std::length_error);
    Id const root = repository.GetHead()->GetRootId();
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.ReadContent(root)); }), Failure::Unrepresentable);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.ReadContent(Id(Conformance::BufferOf("no")))); }),
              Failure::Collected);
}

TEST_F(ArchivedContents, GoFromFilesToFiles) {
    TemporaryDirectory const directory;
    std::string const large = Conformance::SomeNoise(7, 5 * 1024 * 1024 + 1);
    WriteFile(directory.Path("large"), large);
    ArchivedRepository repository(archive);
    auto const blob = repository.StoreFile(directory.Path("large"));
    ASSERT_TRUE(blob);
    EXPECT_EQ(repository.StoreFile(directory.Path("large")), blob);
    EXPECT_FALSE(repository.StoreFile(directory.Path("none")));
    int opened = 0;
    EXPECT_FALSE(repository.StoreContent([&] {
        Buffer changing = Conformance::BufferOf(large + std::to_string(opened++));
        return StreamIO(KivVcs::MemStream::CreateOnCopy(std::move(changing)));
    })) << "a file that changes while it is read";
    Commit commit(&repository, false);
    commit.AddBlob(&repository, u"large", *blob);
    repository.DoCommit(commit);
    ASSERT_TRUE(repository.Publish().published);

    ArchivedRepository reader(archive, Options());
    Id const id = blob->GetId();
    EXPECT_EQ(dynamic_cast<ArchivedBlob const&>(*reader.GetHead()->GetBlob(u"large")).GetSize(), large.size());
    reader.RestoreFile(id, directory.Path("restored"));
    EXPECT_EQ(ReadFile(directory.Path("restored")), large);
    EXPECT_EQ(FailureOf([&] { reader.RestoreFile(id, directory.Path("no/where")); }), Failure::Unavailable);
}

TEST(ArchivedRepository, NoContentIsReadForHistoriesAndMergesWithoutConflicts) {
    auto const archive = std::make_shared<CountingArchive>();
    {
        ArchivedRepository repository(archive);
        CommitFiles(repository, "a=1 b=1 d/c=1", "base");
        repository.CreateBranch(u"other", repository.GetHead());
        CommitFiles(repository, "a=2 d/mine=1", "mine");
        repository.Checkout(u"other");
        CommitFiles(repository, "-b d/c=2", "theirs");
        ASSERT_TRUE(repository.Publish().published);
    }
    ArchivedRepository repository(archive);
    archive->contents = 0;
    auto const merged = repository.MergeWithReport(repository.GetHead(u"other"), {TakingOurs(), MergeTexts(), {}});
    EXPECT_EQ(merged.result, KivVcs::MergeResult::Merged);
    EXPECT_TRUE(merged.conflicts.empty());
    ASSERT_TRUE(repository.Publish().published);
    Id const head = repository.GetHead()->GetId();
    std::size_t listed = 0;
    for (Follow const follow : {Follow::Parents, Follow::Reachable})
        ListCommits(
            *archive, {&head, 1}, {follow, 100, {}}, [&listed](CommitRecord const&) { return ++listed > 0; }, nullptr);
    EXPECT_EQ(listed, 3U + 4U) << "the line, and the graph";
    auto const after = repository.GetHead()->GetRootId();
    EXPECT_EQ(ListDifferences(*archive, repository.GetHead()->GetParent()->GetRootId(), after, {}, nullptr)
                  .differences.size(),
              2U);
    EXPECT_EQ(archive->contents, 0U);
    EXPECT_EQ(FilesOf(repository.GetHead()), "a=2 d/c=2 d/mine=1");
    EXPECT_GT(archive->contents, 0U) << "which is counted";
}

TEST(ArchivedRepository, MergesOfWhatIsUnpublishedAskLittleAndCanBeStopped) {
    auto const archive = std::make_shared<CountingArchive>();
    ArchivedRepository ours(archive);
    CommitFiles(ours, "a=0 d/b=0", "base");
    ASSERT_TRUE(ours.Publish().published);
    ArchivedRepository theirs(archive);
    CommitFiles(theirs, "d/b=1", "theirs");
    ASSERT_TRUE(theirs.Publish().published);
    for (int i = 1; i <= 500; ++i)
        CommitFiles(ours, "a=" + std::to_string(i) + " d/c=1", std::to_string(i));
    ours.Load(std::vector<Id>{theirs.GetHead()->GetId()});
    auto const commit = ours.GetStorage()->GetCommit(theirs.GetHead()->GetId());
    auto const head = ours.GetHead();
    struct Stop final : IProgress {
        bool Report(Progress const&) override { return left-- > 0; }
        int left = 0;
    } stop;
    int stopped = 0;
    MergeReport report;
    for (report.result = KivVcs::MergeResult::Refused; !report.Succeeded(); ++stopped) {
        EXPECT_TRUE(ours.GetHead() == head && stopped < 100);
        stop.left = stopped;
        archive->calls = 0;
        auto const failure = FailureOf([&] { report = ours.MergeWithReport(commit, {TakingOurs(), {}, {}}, &stop); });
        EXPECT_EQ(failure.value_or(Failure::Cancelled), Failure::Cancelled);
    }
    EXPECT_GT(stopped, 3) << "before each directory, and while histories are looked at";
    EXPECT_LT(archive->calls, 30U) << "as for a commit each it would be more than a thousand";
    EXPECT_EQ(FilesOf(ours.GetHead()), "a=500 d/b=1 d/c=1");
}

} // namespace
} // namespace KivArchive
