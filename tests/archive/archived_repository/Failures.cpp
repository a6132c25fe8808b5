#include "archived_repository/Versions.h"

/// Objects that cannot be read or stored, and hosts that fail or refuse.

namespace KivArchive {
namespace {

/// Stores a commit with the given tree as the head of a branch. @return the tree's identifier
Id StoreForeign(IArchive& archive, KivStringT<char16_t> const& branch, NewObject const& tree) {
    auto const commit = Conformance::Commit(tree.id, {}, "foreign");
    Change change;
    change.objects = {tree, commit.object};
    change.ancestry = {commit.facts};
    change.branches = {{branch, {}, commit.object.id}};
    archive.Apply(change);
    return tree.id;
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
    // A branch whose head cannot be read is not taken for removed, and stays until somebody moves it.
    EXPECT_TRUE(repository.Publish().published && repository.Refresh().diverged.empty());
    EXPECT_EQ(archive->ReadBranches().size(), 8U);
    EXPECT_TRUE(repository.MoveBranchTo(u"wrong", repository.GetHead(u"sound")) && repository.Publish().published);
    EXPECT_EQ(ArchivedRepository(archive).GetHead(u"wrong")->GetId(), repository.GetHead(u"sound")->GetId());
}

/// A host's blob with another type word.
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

/// A host's blob whose content cannot be read a number of times.
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
}

/// Removes "master", which has that head, and collects everything.
void RemoveAll(IArchive& archive, Id const& head) {
    Change change;
    change.branches = {{u"master", head, {}}};
    ASSERT_TRUE(archive.Apply(change).applied);
    CollectOptions options;
    options.grace = std::chrono::seconds(0);
    Collect(archive, options, nullptr);
    Collect(archive, options, nullptr);
}

TEST(ArchivedRepository, WhatOthersCollectedComesBackWhereItIsHeld) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository repository(archive);
    CommitFiles(repository, "docs/a=a docs/b=b", "before");
    ASSERT_TRUE(repository.Publish().published);
    RemoveAll(*archive, repository.GetHead()->GetId());
    CommitFiles(repository, "c=3", "after");
    EXPECT_FALSE(repository.Publish().published);
    EXPECT_TRUE(repository.Refresh().moved.empty() && repository.Publish().published);
    EXPECT_EQ(ProblemsOf(*archive), "");
    EXPECT_EQ(Line(ArchivedRepository(archive).GetHead()), "after before");

    // A commit of which only the identifier is known cannot be stored again.
    ArchivedRepository other(archive);
    CommitFiles(other, "d=4", "on what goes");
    RemoveAll(*archive, repository.GetHead()->GetId());
    other.Refresh();
    EXPECT_EQ(FailureOf([&] { other.Publish(); }), Failure::Collected);
    EXPECT_TRUE(archive->ReadBranches().empty());
}

} // namespace
} // namespace KivArchive
