#include "ArchiveFiles.h"
#include "ForwardingArchive.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/Listings.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Upkeep.h"
#include "support/Builders.h"

#include <KivVcs/History.h>

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

/// Repositories over archives.

namespace KivArchive {
namespace {

using KivVcs::Blob;
using KivVcs::History;
using KivVcs::MakeBlob;
using KivVcs::NameOf;
using KivVcs::Narrow;
using KivVcs::Tree;
using KivVcs::Wide;

/// An archive that counts what it is asked for.
class CountingArchive final : public ForwardingArchive {
public:
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override {
        return ForwardingArchive::Read(ids, [&](ArchivedObject const& object) {
            contents += object.type == ObjectType::Blob ? 1 : 0;
            receiver(object);
        });
    }
    std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override {
        ++contents;
        return ForwardingArchive::ReadContent(id, offset, size);
    }
    ChangeOutcome Apply(Change const& change) override {
        stored += change.objects.size();
        relied += change.relied.size();
        return ForwardingArchive::Apply(change);
    }

    std::size_t calls = 0;
    std::size_t contents = 0;
    std::size_t stored = 0;
    std::size_t relied = 0;

protected:
    IArchive& Reach() override { return ++calls, far_; }

private:
    MemArchive far_;
};

/// Commits files, written as "path=content other=content", with a removal as "-path".
cow_ptr<Commit> CommitFiles(KivVcs::IRepository& repository, std::string const& files, std::string const& name) {
    Commit commit(&repository, false);
    std::istringstream words(files);
    for (std::string word; words >> word;) {
        auto const equals = word.find('=');
        if (word.front() == '-')
            commit.RemoveObject(&repository, Wide(word.substr(1)));
        else
            commit.AddBlob(&repository, Wide(word.substr(0, equals)), MakeBlob(word.substr(equals + 1)));
    }
    commit.SetDescription(Wide(name));
    commit.SetAuthorName(u"Ada");
    return repository.DoCommit(commit);
}

std::string FilesOf(cow_ptr<Commit> const& commit) {
    return KivVcs::Files(commit->GetCommitTree()->GetRoot());
}

std::string Line(cow_ptr<Commit> const& head) {
    std::string line;
    for (auto const& commit : History(head))
        line += (line.empty() ? "" : " ") + NameOf(commit);
    return line;
}

Resolvers TakingOurs() {
    return {KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }};
}

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
    std::size_t const callsBefore = archive->calls;
    EXPECT_TRUE(other.Publish().published);
    EXPECT_EQ(archive->stored, 4U);
    EXPECT_LE(archive->relied, 4U);
    EXPECT_EQ(archive->calls - callsBefore, 1U);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

/// What a version came back to is as new as what it is put on does not have it, whatever the versions between had.
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

std::string TextOf(Buffer const& content) {
    return Conformance::TextOf(content);
}

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

TEST(ArchivedRepository, HandsOutOneLivingObject) {
    auto const archive = std::make_shared<MemArchive>();
    Id parentId;
    {
        ArchivedRepository repository(archive);
        parentId = CommitFiles(repository, "a=1", "one")->GetId();
        CommitFiles(repository, "b=2", "two");
        repository.CreateBranch(u"side", repository.GetHead()->GetParent());
        repository.Checkout(u"side");
        CommitFiles(repository, "c=3", "three");
        ASSERT_TRUE(repository.Publish().published);
    }
    auto repository = std::make_unique<ArchivedRepository>(archive);
    cow_ptr<Commit> const head = repository->GetHead();
    cow_ptr<Commit> const side = repository->GetHead(u"side");
    KivVcs::Repository clone(repository->GetStorage()->Clone());
    auto const* const tables = &std::as_const(*repository).GetStorage()->GetCommits();
    EXPECT_EQ(tables->size(), 2U);
    cow_ptr<Commit> parent = head->GetParent();
    EXPECT_EQ(tables->size(), 2U) << "a table stays as it is while somebody walks";
    EXPECT_EQ(std::as_const(*repository).GetStorage()->GetCommits().at(parentId), parent);
    EXPECT_EQ(clone.GetCommitFromStorage(parentId), parent) << "it has entered the clone's storage, too";
    EXPECT_EQ(head->GetCommitTree()->GetRoot()->GetLocalBlob(u"a"),
              parent->GetCommitTree()->GetRoot()->GetLocalBlob(u"a"));

    // Deleted here, it lives on where it is held, and does not come back.
    repository->GetStorage()->DeleteCommit(parent);
    EXPECT_FALSE(repository->GetCommitFromStorage(parentId));
    EXPECT_EQ(repository->GetCommitCount(), 2U);
    EXPECT_EQ(side->GetParent(), parent);
    EXPECT_FALSE(repository->GetCommitFromStorage(parentId));
    EXPECT_TRUE(clone.GetCommitFromStorage(parentId));
    auto const again = KivVcs::CopyOf(*parent);
    EXPECT_EQ(repository->SyncWithStorage(again), again);
    EXPECT_EQ(repository->GetCommitFromStorage(parentId), again);

    // What only storages hold is purged; functions keep the archive alive, not the repository.
    parent = nullptr;
    repository->RemoveBranch(u"side");
    repository->UpdateStorage();
    EXPECT_TRUE(repository->GetCommitFromStorage(side->GetId()));
    repository = nullptr;
    EXPECT_EQ(FilesOf(head), "a=1 b=2");
    ArchivedRepository other(archive);
    auto const late = other.GetHead();
    std::weak_ptr<MemArchive> const watched = archive;
    EXPECT_EQ(other.Load(std::vector<Id>{parentId, late->GetRootId(), Id(Conformance::BufferOf("no"))}).size(), 1U);
    EXPECT_EQ(other.GetCommitCount() + other.GetTreeCount() + other.GetBlobCount(), 3U + 1U + 2U);
}

/// Stores a commit of the given tree data as the head of a branch. @return the tree's identifier
Id StoreForeign(IArchive& archive, KivStringT<char16_t> const& branch, NewObject const& tree) {
    auto const commit = Conformance::Commit(tree.id, {}, "foreign");
    Change change;
    change.objects = {tree, commit.object};
    change.ancestry = {commit.facts};
    change.branches = {{branch, {}, commit.object.id}};
    archive.Apply(change);
    return tree.id;
}

template <class Call>
std::optional<Failure> FailureOf(Call call, std::string* sentence = nullptr) {
    try {
        call();
    } catch (ArchiveError const& error) {
        if (sentence != nullptr)
            *sentence = error.what();
        return error.GetKind();
    }
    return std::nullopt;
}

TEST(ArchivedRepository, DamageIsLocal) {
    auto const archive = std::make_shared<MemArchive>();
    Id const empty = Conformance::Object(ObjectType::Blob, "").id;
    StoreForeign(*archive, u"sound", Conformance::Object(ObjectType::Tree, ""));
    StoreForeign(*archive, u"slash", Conformance::Object(ObjectType::Tree, Conformance::TreeOf({{"a/b", empty}})));
    StoreForeign(*archive, u"order",
                 Conformance::Object(ObjectType::Tree, Conformance::TreeOf({{"b", empty}, {"a", empty}})));
    StoreForeign(*archive, u"noUtf8", Conformance::Object(ObjectType::Tree, Conformance::TreeOf({{"\xff", empty}})));
    NewObject damaged = Conformance::Object(ObjectType::Tree, Conformance::TreeOf({{"a", empty}}));
    damaged.data = Conformance::BufferOf("other");
    StoreForeign(*archive, u"damaged", damaged);
    NewObject head = Conformance::Object(ObjectType::Commit, "tree nothing");
    NewObject const wrong{Conformance::Object(ObjectType::Commit, "x").id, ObjectType::Commit, head.data, {}};
    auto const child = Conformance::Commit(damaged.id, wrong.id, "child");
    Change change;
    change.objects = {head, wrong, child.object};
    change.ancestry = {child.facts};
    change.branches = {{u"noCommit", {}, head.id}, {u"wrong", {}, wrong.id}, {u"child", {}, child.object.id}};
    archive->Apply(change);

    ArchivedRepository repository(archive);
    auto const failureOfTree = [&](KivStringViewT<char16_t> branch) {
        auto const commit = repository.GetHead(branch);
        return FailureOf([&] { static_cast<void>(commit->GetCommitTree()); });
    };
    EXPECT_EQ(FilesOf(repository.GetHead(u"sound")), "");
    EXPECT_EQ(failureOfTree(u"slash"), Failure::Unrepresentable);
    EXPECT_EQ(failureOfTree(u"order"), Failure::Unrepresentable);
    EXPECT_EQ(failureOfTree(u"noUtf8"), Failure::Unrepresentable);
    EXPECT_EQ(failureOfTree(u"damaged"), Failure::Damaged);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.GetHead(u"noCommit")); }), Failure::Unrepresentable);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.GetHead(u"wrong")); }), Failure::Damaged);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.GetHead(u"child")->GetParent()); }), Failure::Damaged);
    EXPECT_EQ(repository.GetTreeCount(), 1U) << "nothing of what could not be read has entered";
    // What cannot be read is not taken for removed, and stays until somebody moves the branch.
    EXPECT_TRUE(repository.Publish().published && repository.Refresh().diverged.empty());
    EXPECT_EQ(archive->ReadBranches().size(), 8U);
    EXPECT_TRUE(repository.MoveBranchTo(u"wrong", repository.GetHead(u"sound")) && repository.Publish().published);
    EXPECT_EQ(ArchivedRepository(archive).GetHead(u"wrong")->GetId(), repository.GetHead(u"sound")->GetId());
}

/// A blob of a host's that shows another type word.
class Link final : public Blob {
public:
    explicit Link(Blob const& blob) : Blob(blob) {}
    KivStringT<char> GetStoragePrefix() const override { return "120000"; }

protected:
    cow_ptr<Blob> Copy() const override { return KivVcs::immu::make<Link>(*this); }
};

TEST(ArchivedRepository, RefusesWhatAPackedFormCannotShow) {
    auto const archive = std::make_shared<MemArchive>();
    auto const refusal = [&](auto edit) {
        ArchivedRepository repository(archive);
        Commit commit(&repository, false);
        commit.AddBlob(&repository, u"docs/deep/sound", MakeBlob("sound"));
        cow_ptr<Tree> root = commit.GetCommitTree()->GetRoot();
        edit(*root.write(), repository);
        commit.ReplaceRoot(&repository, root);
        repository.DoCommit(commit);
        std::string sentence;
        EXPECT_EQ(FailureOf([&] { repository.Publish(); }, &sentence), Failure::Unrepresentable);
        return sentence.substr(0, sentence.find(' '));
    };
    EXPECT_EQ(refusal([](Tree& root, auto& repository) {
                  KivStringViewT<char16_t> const name[] = {u"docs", u"a/b"};
                  root.AddObjectToTree<Blob>(&repository, name, MakeBlob("x"));
              }),
              "\"docs/a/b\"");
    EXPECT_EQ(refusal([](Tree& root, auto& repository) {
                  root.AddBlob(&repository, KivStringViewT<char16_t>(u"docs/z\0z", 8), MakeBlob("x"));
              }),
              "\"docs/z\\0z\"");
    EXPECT_EQ(refusal([](Tree& root, auto& repository) { root.AddBlob(&repository, u"docs/deep", MakeBlob("x")); }),
              "\"docs/deep\"");
    EXPECT_EQ(refusal([](Tree& root, auto& repository) {
                  root.AddBlob(&repository, u"docs/link", Link(MakeBlob("elsewhere")));
              }),
              "\"docs/link\"");
    EXPECT_TRUE(archive->ReadBranches().empty());
}

TEST(ArchivedRepository, ContentsComeWhenAskedForWithinABudget) {
    TemporaryDirectory const directory;
    auto const archive = std::make_shared<CountingArchive>();
    std::string const large = Conformance::SomeNoise(7, 5 * 1024 * 1024 + 1);
    WriteFile(directory.Path("large"), large);
    Id largeId;
    {
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
        largeId = blob->GetId();
        Commit commit(&repository, false);
        commit.AddBlob(&repository, u"large", *blob);
        for (int i = 0; i < 9; ++i)
            commit.AddBlob(&repository, Wide("f" + std::to_string(i)),
                           MakeBlob(std::string(1000, static_cast<char>('0' + i))));
        repository.DoCommit(commit);
        ASSERT_TRUE(repository.Publish().published);
    }
    RepositoryOptions options;
    options.contentBytes = 4000;
    options.workers = 2;
    ArchivedRepository repository(archive, options);
    auto const root = repository.GetHead()->GetCommitTree()->GetRoot();
    std::vector<Id> ids;
    for (auto const& name : root->GetLocalBlobPaths())
        ids.push_back(root->GetLocalBlob(name)->GetId());
    archive->calls = archive->contents = 0;
    auto const* const file = dynamic_cast<ArchivedBlob const*>(root->GetLocalBlob(u"f0").get());
    ASSERT_NE(file, nullptr);
    EXPECT_EQ(file->GetSize() + dynamic_cast<ArchivedBlob const&>(*root->GetLocalBlob(u"large")).GetSize(),
              1000 + large.size());
    EXPECT_EQ(archive->calls, 1U) << "all sizes at once";
    EXPECT_EQ(archive->contents, 0U);
    for (int round = 0; round < 3; ++round)
        EXPECT_EQ(TextOf(file->ReadContent()), std::string(1000, '0'));
    EXPECT_EQ(archive->contents, 1U);
    for (int i = 1; i < 5; ++i)
        EXPECT_EQ(TextOf(repository.ReadContent(ids[static_cast<std::size_t>(i)])).size(), 1000U);
    EXPECT_EQ(archive->contents, 5U);
    EXPECT_EQ(TextOf(repository.ReadContent(ids[4])).size(), 1000U);
    EXPECT_EQ(archive->contents, 5U) << "what was used last is kept";
    EXPECT_FALSE(file->IsContentHeld());
    Buffer const* const held = &file->GetData();
    EXPECT_EQ(TextOf(*held), std::string(1000, '0'));
    EXPECT_EQ(archive->contents, 6U) << "what was used first has gone";
    EXPECT_TRUE(&file->GetData() == held && file->IsContentHeld());

    repository.RestoreFile(largeId, directory.Path("restored"));
    EXPECT_EQ(ReadFile(directory.Path("restored")), large);
    EXPECT_EQ(FailureOf([&] { repository.RestoreFile(largeId, directory.Path("no/where")); }), Failure::Unavailable);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.ReadContent(root->GetId())); }), Failure::Unrepresentable);
    EXPECT_EQ(FailureOf([&] { static_cast<void>(repository.ReadContent(Id(Conformance::BufferOf("no")))); }),
              Failure::Collected);

    std::atomic<std::uint64_t> bytes{0};
    std::vector<Id> many;
    for (int copies = 0; copies < 64; ++copies)
        many.insert(many.end(), ids.begin(), ids.end());
    auto const count = [&](ArchivedObject const& object) { bytes += object.data.size(); };
    EXPECT_TRUE(repository.ReadContents(many, count).missing.empty());
    EXPECT_EQ(bytes, 64U * 9000U);
    auto const refuse = [](ArchivedObject const&) { throw std::length_error("no room"); };
    EXPECT_THROW(repository.ReadContents(many, refuse), std::length_error);
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

/// Fails when it is asked for branches, once it has been told to.
class FailingHost : public ArchivedRepository {
public:
    using ArchivedRepository::ArchivedRepository;
    bool BranchExist(KivStringViewT<char16_t> branch) override {
        if (fails)
            throw std::runtime_error("the host");
        return ArchivedRepository::BranchExist(branch);
    }
    bool fails = false;
};

TEST(ArchivedRepository, WhatAHostThrowsBesideAMergePassesThrough) {
    auto const archive = std::make_shared<MemArchive>();
    FailingHost ours(archive);
    CommitFiles(ours, "a=1", "base");
    ASSERT_TRUE(ours.Publish().published);
    ArchivedRepository theirs(archive);
    CommitFiles(theirs, "a=2", "theirs");
    ASSERT_TRUE(theirs.Publish().published);
    CommitFiles(ours, "a=3", "ours");
    ours.CreateBranch(u"elsewhere", nullptr);
    ours.Checkout(u"elsewhere");
    auto const answer = [&](bool throws) {
        return Resolvers{[&ours, throws](auto const&, auto const&) {
                             ours.fails = true;
                             return throws ? throw std::runtime_error("the resolver") : KivVcs::ConflictChoice::Left;
                         },
                         [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }};
    };
    for (bool const throws : {true, false}) {
        ours.Checkout(u"elsewhere");
        try {
            ours.PublishMerging(answer(throws));
            ADD_FAILURE();
        } catch (std::runtime_error const& error) {
            EXPECT_STREQ(error.what(), throws ? "the resolver" : "the host");
        }
        ours.fails = false;
    }
    ours.Checkout(u"elsewhere");
    EXPECT_EQ(ours.PublishMerging(TakingOurs()).result, PublishMergingResult::Published);
    EXPECT_EQ(FilesOf(ours.GetHead(u"master")), "a=3");
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

/// A host that does not let its branches be moved.
class Stubborn final : public ArchivedRepository {
public:
    using ArchivedRepository::ArchivedRepository;
    bool MoveBranchTo(KivStringViewT<char16_t>, cow_ptr<Commit>) override { return false; }
};

TEST(ArchivedRepository, ABranchThatIsNotLetMoveTakesNothingBack) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository theirs(archive);
    CommitFiles(theirs, "a=1", "one");
    ASSERT_TRUE(theirs.Publish().published);
    Stubborn stubborn(archive);
    CommitFiles(theirs, "a=2", "two");
    ASSERT_TRUE(theirs.Publish().published);
    EXPECT_TRUE(stubborn.Refresh().moved.empty());
    EXPECT_TRUE(stubborn.Publish().published);
    EXPECT_EQ(HeadOf(*archive), theirs.GetHead()->GetId()) << "what others have published stays";
}

/// A file of a host's, whose content cannot be had a number of times.
class FailingBlob final : public Blob {
public:
    FailingBlob(std::string const& content, int& failures) : Blob(MakeBlob(content)), failures_(&failures) {}
    Id GetId() const override { return MakeBlob(Blob::GetData().GetSize() == 0 ? "" : CopyOfContent()).GetId(); }
    Buffer const& GetData() const override {
        if (*failures_ > 0 && (*failures_)-- > 0)
            throw std::runtime_error("away");
        return Blob::GetData();
    }

protected:
    cow_ptr<Blob> Copy() const override { return KivVcs::immu::make<FailingBlob>(*this); }

private:
    [[nodiscard]] std::string CopyOfContent() const { return TextOf(Blob::GetData()); }

    int* failures_;
};

TEST(ArchivedRepository, WhatFailsIsNotVisibleAndCanBeTriedAgain) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository repository(archive);
    int failures = 0;
    Commit commit(&repository, false);
    commit.AddBlob(&repository, u"docs/a", MakeBlob("a"));
    commit.AddBlob(&repository, u"docs/b", FailingBlob("b", failures));
    repository.DoCommit(commit);
    failures = 2;
    EXPECT_THROW(repository.Publish(), std::runtime_error);
    struct Stop final : IProgress {
        bool Report(Progress const&) override { return left-- > 0; }
        int left = 0;
    } stop;
    failures = 0;
    EXPECT_EQ(FailureOf([&] { repository.Publish(&stop); }), Failure::Cancelled);
    EXPECT_TRUE(archive->ReadBranches().empty() && repository.HasUnpublished(u"master"));
    ArchivedRepository late(archive);
    EXPECT_TRUE(repository.Publish().published);
    Id const root = repository.GetHead()->GetRootId();
    for (int const reports : {0, 1}) {
        stop.left = reports;
        EXPECT_EQ(FailureOf([&] { late.Refresh(&stop); }), Failure::Cancelled);
        stop.left = reports;
        EXPECT_EQ(FailureOf([&] { static_cast<void>(late.Load({&root, 1}, &stop)); }), Failure::Cancelled);
    }
    EXPECT_TRUE(!late.GetHead() && late.GetTreeCount() == 0);

    // Others remove the branch, and collect everything. What is held here comes back.
    auto const collect = [&] {
        CollectOptions options;
        options.grace = std::chrono::seconds(0);
        Collect(*archive, options, nullptr);
        Collect(*archive, options, nullptr);
    };
    Change change;
    change.branches = {{u"master", repository.GetHead()->GetId(), {}}};
    ASSERT_TRUE(archive->Apply(change).applied);
    collect();
    CommitFiles(repository, "c=3", "after");
    EXPECT_FALSE(repository.Publish().published);
    EXPECT_TRUE(repository.Refresh().moved.empty() && repository.Publish().published);
    EXPECT_EQ(ProblemsOf(*archive), "");
    EXPECT_EQ(Line(ArchivedRepository(archive).GetHead()), "after ");

    // What is only known by its identifier does not.
    ArchivedRepository other(archive);
    CommitFiles(other, "d=4", "on what goes");
    change.branches = {{u"master", repository.GetHead()->GetId(), {}}};
    ASSERT_TRUE(archive->Apply(change).applied);
    collect();
    other.Refresh();
    EXPECT_EQ(FailureOf([&] { other.Publish(); }), Failure::Collected);
    EXPECT_TRUE(archive->ReadBranches().empty());
}

/// Four hosts on one archive, each with a repository of its own, publish on one branch.
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
        // Readers of one repository, whose walks fetch at once.
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
