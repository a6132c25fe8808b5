#include "archived_repository/Versions.h"

#include <atomic>
#include <thread>
#include <unordered_set>

/// Repositories over archives: publishing, fetching again and merging versions.

namespace KivArchive {
namespace {

TEST(ArchivedRepository, VersionsComeBackAsTheyWerePublished) {
    auto const archive = std::make_shared<CountingArchive>();
    cow_ptr<Commit> head;
    {
        ArchivedRepository repository(archive);
        CommitFiles(repository, "a=1 docs/b=2 docs/deep/c=3", "one");
        CommitFiles(repository, "docs/deep/c=4", "two");
        head = CommitFiles(repository, "-a -docs/b -docs/deep/c", "three\n\nwith more\nlines");
        EXPECT_TRUE(archive->ReadBranches().empty());
        EXPECT_TRUE(repository.HasUnpublished(u"master"));
        EXPECT_TRUE(repository.Publish().published);
        EXPECT_FALSE(repository.HasUnpublished(u"master"));
    }
    EXPECT_EQ(ProblemsOf(*archive), "");
    ArchivedRepository repository(archive);
    EXPECT_EQ(repository.GetCommitCount(), 1U) << "only heads are read";
    auto const read = repository.GetHead();
    EXPECT_EQ(read->GetId(), head->GetId());
    EXPECT_EQ(Line(read), "three\n\nwith more\nlines two one");
    EXPECT_EQ(FilesOf(read), "") << "an emptied directory";
    archive->contents = 0;
    EXPECT_EQ(KivVcs::DifferencesFromParent(*read->GetParent()).begin()->path, Wide("docs/deep/c"));
    EXPECT_EQ(archive->contents, 0U);
    EXPECT_EQ(FilesOf(read->GetParent()), "a=1 docs/b=2 docs/deep/c=4");
}

TEST(ArchivedRepository, PublishesOnlyWhatIsNew) {
    auto const archive = std::make_shared<CountingArchive>();
    ArchivedRepository repository(archive);
    std::string files;
    for (int i = 0; i < 300; ++i)
        files += "d" + std::to_string(i % 10) + "/f" + std::to_string(i) + "=" + std::to_string(i) + " ";
    CommitFiles(repository, files, "many");
    EXPECT_TRUE(repository.Publish().published);
    EXPECT_EQ(archive->stored, 300U + 11U + 1U);

    archive->stored = archive->relied = archive->calls = 0;
    ArchivedRepository other(archive);
    CommitFiles(other, "d3/f13=new", "one edit");
    auto const before = other.GetHead()->GetParent();
    auto const root = before->GetCommitTree()->GetRoot();
    std::unordered_set<Id> const kept{before->GetId(), root->GetId(), root->GetLocalTree(u"d3")->GetId(),
                                      root->GetDeepBlob(u"d3/f13")->GetId()};
    std::size_t const callsBefore = archive->calls;
    EXPECT_TRUE(other.Publish().published);
    EXPECT_EQ(archive->stored, 4U);
    EXPECT_EQ(archive->relied, 0U);
    EXPECT_EQ(std::unordered_set<Id>(archive->inherited.begin(), archive->inherited.end()), kept)
        << "what the branch keeps";
    EXPECT_EQ(archive->calls - callsBefore, 1U);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

/// A version may come back to what an earlier one had and the published version does not: that must be stored, too.
TEST(ArchivedRepository, PublishesWhatVersionsCameBackTo) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository here(archive);
    auto const base = CommitFiles(here, "keep=0", "base");
    here.Publish();
    CommitFiles(here, "d/e/b=1", "added");
    CommitFiles(here, "d/a=1", "more");
    CommitFiles(here, "-d/a b=1", "back");
    ArchivedRepository there(archive);
    CommitFiles(there, "a=1", "theirs");
    there.Publish();
    here.Refresh();
    Id const published = here.GetPublishedHead(u"master");
    here.Load({&published, 1});
    here.MoveBranchTo(u"master", here.MergelessRebase(here.GetHead(), base, here.GetCommitFromStorage(published)));
    EXPECT_TRUE(here.Publish().published);
    EXPECT_TRUE(Verify(*archive, nullptr).IsSound());
    EXPECT_EQ(FilesOf(ArchivedRepository(archive).GetHead()), "b=1 d/e/b=1 keep=0");
}

TEST(ArchivedRepository, BranchesMoveByCompareAndSwap) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository ours(archive);
    CommitFiles(ours, "a=1", "base");
    ASSERT_TRUE(ours.Publish().published);
    ArchivedRepository theirs(archive);
    CommitFiles(theirs, "b=2", "theirs");
    theirs.CreateBranch(u"topic", nullptr);
    ASSERT_TRUE(theirs.Publish().published);
    auto const own = CommitFiles(ours, "c=3", "ours");
    auto const lost = ours.Publish();
    EXPECT_FALSE(lost.published);
    ASSERT_EQ(lost.moved.size(), 1U);
    EXPECT_EQ(lost.moved[0].head, theirs.GetHead()->GetId());

    auto const refreshed = ours.Refresh();
    EXPECT_EQ(refreshed.diverged, std::vector<KivStringT<char16_t>>{u"master"});
    EXPECT_EQ(refreshed.moved, std::vector<KivStringT<char16_t>>{u"topic"});
    EXPECT_EQ(ours.GetHead(), own);
    EXPECT_FALSE(ours.Publish().published) << "what others did is not overwritten";
    auto const outcome = ours.PublishMerging(TakingOurs());
    EXPECT_EQ(outcome.result, PublishMergingResult::Published);
    EXPECT_EQ(FilesOf(ours.GetHead()), "a=1 b=2 c=3");
    EXPECT_EQ(theirs.Refresh().moved, std::vector<KivStringT<char16_t>>{u"master"});
    EXPECT_EQ(theirs.GetHead()->GetId(), ours.GetHead()->GetId());
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST(ArchivedRepository, UnpublishedCommitsFollowAHeadThatWasRewritten) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository ours(archive);
    CommitFiles(ours, "a=1", "one");
    CommitFiles(ours, "a=2", "two");
    auto const known = CommitFiles(ours, "a=3", "three");
    ASSERT_TRUE(ours.Publish().published);
    ArchivedRepository theirs(archive);
    theirs.SimplifyCommitGraph(true);
    auto const rebuilt = theirs.GetHead();
    EXPECT_FALSE(rebuilt->GetParent());
    ASSERT_TRUE(theirs.Publish().published);
    auto const facts = archive->ReadAncestry(std::vector<Id>{rebuilt->GetId()}, Follow::Parents, 0);
    EXPECT_EQ(facts.at(0).contains, (std::vector<ContainedCommit>{{Containment::RewrittenFrom, known->GetId()}}));
    CommitFiles(theirs, "t=1", "theirs");
    ASSERT_TRUE(theirs.Publish().published);

    CommitFiles(ours, "b=1", "four");
    CommitFiles(ours, "b=2", "five");
    ours.CreateBranch(u"elsewhere", known);
    ours.Checkout(u"elsewhere");
    auto const outcome = ours.PublishMerging(TakingOurs());
    EXPECT_EQ(outcome.result, PublishMergingResult::Published);
    EXPECT_EQ(outcome.attempts, 1U);
    EXPECT_EQ(ours.GetCurentBranch(), KivStringT<char16_t>(u"elsewhere"));
    auto const head = ours.GetHead(u"master");
    EXPECT_EQ(FilesOf(head), "a=3 b=2 t=1");
    EXPECT_EQ(Line(head->GetParent()), "five four three") << "on the rebuilt commit, without the old ones";
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST(ArchivedRepository, TakesTreesFromAnotherArchive) {
    auto const far = std::make_shared<MemArchive>();
    auto const near = std::make_shared<MemArchive>();
    std::string const large = Conformance::SomeNoise(3, 2 * 1024 * 1024);
    {
        ArchivedRepository theirs(far);
        Commit commit(&theirs, false);
        commit.AddBlob(&theirs, u"d/large", MakeBlob(large));
        commit.AddBlob(&theirs, u"d/small", MakeBlob("small"));
        theirs.DoCommit(commit);
        ASSERT_TRUE(theirs.Publish().published);
    }
    ArchivedRepository ours(near);
    Commit commit(&ours, false);
    commit.AddTree(&ours, u"copied", *ArchivedRepository(far).GetHead()->GetCommitTree()->GetRoot());
    ours.DoCommit(commit);
    EXPECT_TRUE(ours.Publish().published);
    EXPECT_EQ(ProblemsOf(*near), "");
    auto const blob = ArchivedRepository(near).GetHead()->GetBlob(u"copied/d/large");
    EXPECT_TRUE(blob->CopyToString() == large);
}

/// Four hosts, each with a repository of its own over one archive, publish on one branch.
TEST(ArchivedRepository, ManyMayShareAnArchive) {
    TemporaryDirectory const directory;
    for (std::shared_ptr<IArchive> const& archive :
         {std::shared_ptr<IArchive>(std::make_shared<MemArchive>()),
          std::shared_ptr<IArchive>(std::make_shared<SqliteArchive>(directory.Path("archive")))}) {
        constexpr int hosts = 4;
        constexpr int edits = 5;
        ArchivedRepository first(archive);
        CommitFiles(first, "base=0", "base");
        ASSERT_TRUE(first.Publish().published);
        std::atomic<int> failed{0};
        auto const host = [&](int number) {
            RepositoryOptions options;
            options.attempts = 1000;
            ArchivedRepository repository(archive, options);
            for (int i = 0; i < edits; ++i) {
                std::string const name = std::to_string(number) + "/" + std::to_string(i);
                CommitFiles(repository, name + "=" + name.substr(0, 1), name);
                failed += repository.PublishMerging(TakingOurs()).result == PublishMergingResult::Published ? 0 : 1;
                failed += Line(repository.GetHead()).ends_with("base") ? 0 : 1;
            }
        };
        std::vector<std::thread> threads;
        for (int number = 0; number < hosts; ++number)
            threads.emplace_back(host, number);
        for (auto& thread : threads)
            thread.join();
        EXPECT_EQ(failed, 0);
        // Threads that read one repository, whose walks fetch concurrently.
        ArchivedRepository last(archive);
        auto const newest = last.GetHead();
        threads.clear();
        std::atomic<std::size_t> read{0};
        for (int reader = 0; reader < hosts; ++reader)
            threads.emplace_back([&] { read += Line(newest).size() + newest->GetCommitTree()->GetBlobCount(); });
        for (auto& thread : threads)
            thread.join();
        EXPECT_EQ(read, hosts * (Line(newest).size() + hosts * edits + 1));
        EXPECT_EQ(ProblemsOf(*archive), "");
    }
}

} // namespace
} // namespace KivArchive
