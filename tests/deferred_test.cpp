#include "support/Builders.h"
#include "support/Text.h"

#include <gtest/gtest.h>

#include <atomic>
#include <stdexcept>

/// Commits that have an identifier and a function in place of their parent or root.

namespace KivVcs {
namespace {

/// Where commits and roots are fetched from, by identifier.
class Shelf {
public:
    Id Add(Commit const& commit) {
        forms_.insert_or_assign(commit.GetId(), commit);
        return commit.GetId();
    }
    Id Add(cow_ptr<Tree> const& root) {
        roots_.insert_or_assign(root->GetId(), root);
        return root->GetId();
    }

    Commit::FetchCommit Commits() {
        return [this](Id const& id) {
            ++fetches;
            if (fails)
                throw std::runtime_error("no shelf");
            const auto form = forms_.find(id);
            return form == forms_.end() ? nullptr : immu::make<Commit>(form->second);
        };
    }
    Commit::FetchTree Roots() {
        return [this](Id const& id) {
            ++fetches;
            const auto root = roots_.find(id);
            return root == roots_.end() ? nullptr : root->second;
        };
    }

    std::atomic<int> fetches{0};
    bool fails = false;

private:
    std::unordered_map<Id, Commit> forms_;
    std::unordered_map<Id, cow_ptr<Tree>> roots_;
};

class DeferredLinks : public testing::Test {
protected:
    /// A commit of the given name with a file of that name on top of @p parent, with both deferred.
    Commit Deferring(char16_t const* name, Id const& parent) {
        Commit commit;
        commit.SetDescription(name);
        commit.DeferParent(parent, shelf.Commits());
        commit.DeferRoot(shelf.Add(MakeTree(repo, Narrow(name) + "=1")), shelf.Roots());
        return commit;
    }

    Shelf shelf;
    Repository repo{std::make_unique<MemObjectsStorage>()};
};

TEST_F(DeferredLinks, AreNotFetchedByWhatNeedsTheirIdentifierOnly) {
    Commit held(nullptr, false);
    held.SetDescription(u"parent");
    Commit child(immu::make<Commit>(held), false);
    child.SetDescription(u"child");
    child.ReplaceRoot(nullptr, MakeTree(repo, "child=1"));

    const Commit deferring = Deferring(u"child", shelf.Add(held));
    EXPECT_EQ(Bytes(deferring.GetPackedData()), Bytes(child.GetPackedData()));
    EXPECT_TRUE(deferring.HasSameId(child) && deferring.GetParentId() == held.GetId());
    EXPECT_TRUE(deferring.GetRootId() == child.GetRootId());
    EXPECT_FALSE(deferring.GetHeldParent() || deferring.GetHeldCommitTree());
    {
        const cow_ptr<Commit> copied = CopyOf(deferring);
        const Commit amend(copied, true);
        Commit onTop(copied, false);
        Commit assigned;
        assigned = onTop;
        EXPECT_TRUE(amend.GetParentId() == held.GetId() && onTop.GetRootId() == child.GetRootId());
        onTop.ReplaceRoot(nullptr, MakeTree(repo, "other=1"));
        EXPECT_EQ(Files(onTop.GetCommitTree()->GetRoot()), "other=1");
        assigned.SetParent(nullptr);
        EXPECT_FALSE(assigned.GetParent());
    }
    repo.CreateBranch(u"branch", repo.SyncWithStorage(immu::make<Commit>(deferring)));
    repo.UpdateStorage();
    repo.GetStorage()->RemoveBranch(u"branch");
    repo.UpdateStorage();
    EXPECT_EQ(repo.GetCommitCount(), 0U);
    EXPECT_EQ(shelf.fetches, 0);
}

TEST_F(DeferredLinks, AreFetchedOnceAndHeldFromThenOn) {
    const Commit commit = Deferring(u"child", shelf.Add(Deferring(u"parent", Id())));
    const Commit before = commit;
    const auto parent = commit.GetParent();
    EXPECT_TRUE(parent == commit.GetParent() && parent == commit.GetHeldParent() &&
                parent == Commit(commit).GetParent());
    EXPECT_EQ(shelf.fetches, 1);
    EXPECT_FALSE(parent->GetParent());
    const auto files = commit.GetCommitTree();
    EXPECT_TRUE(files == commit.GetCommitTree() && files == commit.GetHeldCommitTree());
    EXPECT_EQ(Files(files->GetRoot()), "child=1");
    EXPECT_EQ(shelf.fetches, 2);
    EXPECT_TRUE(commit.GetBlob(u"child") && !commit.GetTree(u"child"));
    // A copy made before has its own turn.
    EXPECT_TRUE(before.GetParent() && before.GetParent() != parent);
    EXPECT_EQ(shelf.fetches, 3);

    Commit edited = before;
    edited.AddBlob(&repo, u"new", MakeBlob("2"));
    EXPECT_EQ(Files(edited.GetCommitTree()->GetRoot()), "child=1 new=2");
    Commit rebuilt = Deferring(u"r", Id());
    rebuilt.RebuildTree(&repo);
    EXPECT_TRUE(rebuilt.GetCommitTree()->GetRoot() == repo.GetTreeFromStorage(rebuilt.GetRootId()));
}

TEST_F(DeferredLinks, ThatCannotBeFetchedNeverLookLikeMissingOnes) {
    Commit commit = Deferring(u"child", shelf.Add(Deferring(u"parent", Id())));
    shelf.fails = true;
    EXPECT_THROW(static_cast<void>(commit.GetParent()), std::runtime_error);
    shelf.fails = false;
    EXPECT_EQ(NameOf(commit.GetParent()), "parent");

    commit.DeferParent(Id(u"unknown"), shelf.Commits());
    commit.DeferRoot(Id(u"unknown"), [&](Id const&) { return MakeTree(repo, "a=1"); });
    for (int attempt = 0; attempt < 2; ++attempt) {
        EXPECT_THROW(static_cast<void>(commit.GetParent()), std::runtime_error);
        EXPECT_THROW(static_cast<void>(commit.GetCommitTree()), std::runtime_error);
    }
    EXPECT_THROW(commit.RemoveObject(&repo, u"a"), std::runtime_error);
    EXPECT_EQ(Bytes(commit.GetData()).substr(0, 28), "tree unknown\nparent unknown\n");
    const auto head = immu::make<Commit>(commit);
    EXPECT_THROW(static_cast<void>(repo.GetCommonBase(head, immu::make<Commit>())), std::runtime_error);
    commit.DeferParent(commit.GetId(), nullptr);
    EXPECT_THROW(static_cast<void>(commit.GetParent()), std::bad_function_call);
    commit.DeferParent(Id(), shelf.Commits());
    commit.DeferRoot(Id(), shelf.Roots());
    EXPECT_FALSE(commit.GetParent() || commit.GetCommitTree());
}

TEST_F(DeferredLinks, LeadThroughHistoriesOfRepositoriesAndTheirClones) {
    Commit oldest = Deferring(u"base", Id());
    const Id base = shelf.Add(oldest);
    auto left = repo.SyncWithStorage(immu::make<Commit>(Deferring(u"left", base)));
    auto right = repo.SyncWithStorage(immu::make<Commit>(Deferring(u"right", base)));
    repo.CreateBranch(u"left", left);
    repo.CreateBranch(u"right", right);
    Repository clone(repo.GetStorage()->Clone());
    EXPECT_TRUE(repo.GetCommonBase(left, right)->GetId() == base);
    EXPECT_TRUE(clone.GetCommonBase(left, right) == repo.GetCommonBase(left, right));
    EXPECT_EQ(shelf.fetches, 2);

    clone.Checkout(u"left");
    EXPECT_TRUE(clone.Merge(right, {AlwaysChooseLeft(), always_return_t(TreeConflictChoice::Merge)}));
    EXPECT_EQ(Files(clone.GetHead()->GetCommitTree()->GetRoot()), "left=1 right=1");
    EXPECT_EQ(NameOf(clone.GetHead()->GetParent()), "left");
}

} // namespace
} // namespace KivVcs
