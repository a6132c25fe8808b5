#include "support/Builders.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

namespace KivVcs {
namespace {

std::string SortedNames(PathList names) {
    std::sort(names.begin(), names.end());
    return Joined(ToNames(names));
}

Commit Described(cow_ptr<Commit> parent, const char16_t* description) {
    Commit commit(std::move(parent), false);
    commit.SetDescription(description);
    return commit;
}

class Repositories : public testing::Test {
protected:
    RecordingRepository repo{std::make_unique<MemObjectsStorage>()};
    const cow_ptr<Commit> one = immu::make<Commit>(Described(nullptr, u"one"));
    const cow_ptr<Commit> two = immu::make<Commit>(Described(one, u"two"));
};

TEST_F(Repositories, AStorageKeepsTheFirstObjectUnderAnIdentifier) {
    MemObjectsStorage storage;
    EXPECT_EQ(storage.GetCommitCount() + storage.GetTreeCount() + storage.GetBlobCount(), 0U);
    const auto twin = immu::make<Commit>(*one);
    storage.AddCommit(one);
    storage.AddCommit(twin);
    storage.AddTree(immu::make<Tree>());
    storage.AddTree(immu::make<Tree>());
    storage.AddBlob(immu::make<Blob>(MakeBlob("1")));
    storage.AddBlob(immu::make<Blob>(MakeBlob("2")));
    EXPECT_TRUE(storage.GetCommit(twin->GetId()) == one && storage.GetCommits().at(one->GetId()) == one);
    EXPECT_EQ(storage.GetCommitCount(), 1U);
    EXPECT_EQ(storage.GetTreeCount(), 1U);
    EXPECT_EQ(storage.GetBlobCount(), 2U);
    EXPECT_EQ(storage.GetBlobs().max_load_factor(), 1.0F);
    EXPECT_FALSE(storage.GetTree(one->GetId()) || storage.GetBlob(Id()) || storage.GetCommit(two->GetId()));

    storage.DeleteCommit(nullptr);
    storage.DeleteCommit(two);
    EXPECT_EQ(storage.GetCommitCount(), 1U);
    storage.UpdateBranch(u"master", one);
    storage.DeleteCommit(twin);
    EXPECT_EQ(storage.GetCommitCount(), 0U);
    EXPECT_TRUE(storage.GetHead(u"master") == one);
}

TEST_F(Repositories, BranchesOfAStorageAreMadeMovedAndRemovedByExactName) {
    MemObjectsStorage storage{u"a", u"b", u"a", u""};
    EXPECT_EQ(SortedNames(storage.GetCommitBranches(nullptr)), "a b");
    EXPECT_TRUE(storage.BranchExist(u"") && !storage.BranchExist(u"A") && !storage.BranchExist(u"master"));
    EXPECT_FALSE(storage.CreateBranch(u"", one) || storage.CreateBranch(u"a", one));
    EXPECT_TRUE(storage.CreateBranch(u"c", one) && storage.CreateBranch(u"d", nullptr));
    EXPECT_FALSE(storage.UpdateBranch(u"e", one) || storage.UpdateBranch(u"", one) ||
                 storage.UpdateBranch(u"a", nullptr));
    EXPECT_TRUE(storage.UpdateBranch(u"b", two) && storage.UpdateBranch(u"d", one));
    EXPECT_EQ(SortedNames(storage.GetCommitBranches(one)), "c d");
    EXPECT_EQ(SortedNames(storage.GetCommitBranches(immu::make<Commit>(*one))), "");
    EXPECT_TRUE(storage.GetHead(u"b") == two && !storage.GetHead(u"a") && !storage.GetHead(u"e"));
    EXPECT_TRUE(storage.RemoveBranch(u"b") && !storage.RemoveBranch(u"b"));
    EXPECT_EQ(storage.GetRefs().size(), 4U);
}

TEST_F(Repositories, WithoutAStorageThereIsNothingAndNothingCanBeDone) {
    Repository none(nullptr);
    Commit commit(nullptr, false);
    EXPECT_FALSE(none.DoCommit(commit) || none.GetHead() || none.GetHead(u"master"));
    EXPECT_TRUE(commit.GetCommitTime() == Time());
    EXPECT_FALSE(none.GetCommitFromStorage(one->GetId()) || none.GetTreeFromStorage(Id()) ||
                 none.GetBlobFromStorage(Id()));
    EXPECT_EQ(none.GetCommitCount() + none.GetTreeCount() + none.GetBlobCount(), 0U);
    EXPECT_FALSE(none.BranchExist(u"master") || none.CreateBranch(u"a", one) || none.MoveBranchTo(u"master", one) ||
                 none.RemoveBranch(u"master") || none.Checkout(u"master"));
    EXPECT_FALSE(none.FastForwardMerge(one) || none.DeleteCommits(two) || none.SimplifyCommitGraph(true));
    EXPECT_TRUE(none.SyncWithStorage(one) == one);
    none.AddCommitToStorage(one);
    none.UpdateStorage();
    EXPECT_EQ(none.GetStorage(), nullptr);
    EXPECT_EQ(Narrow(none.GetCurentBranch()), "master");
}

TEST_F(Repositories, InterningGivesTheStoredObject) {
    EXPECT_FALSE(repo.SyncWithStorage(cow_ptr<Commit>()) || repo.SyncWithStorage(cow_ptr<Tree>()) ||
                 repo.SyncWithStorage(cow_ptr<Blob>()));
    EXPECT_TRUE(repo.SyncWithStorage(one) == one);
    EXPECT_TRUE(repo.SyncWithStorage(immu::make<Commit>(*one)) == one);
    const auto tree = MakeTree(repo, "a=1");
    EXPECT_TRUE(repo.SyncWithStorage(tree) == tree && repo.SyncWithStorage(MakeTree(repo, "a=1")) == tree);
    EXPECT_TRUE(repo.GetBlobFromStorage(MakeBlob("1").GetId()) == tree->GetLocalBlob(u"a"));
    EXPECT_TRUE(repo.SyncWithStorage(immu::make<Blob>(MakeBlob("1"))) == tree->GetLocalBlob(u"a"));
    EXPECT_EQ(repo.GetCommitCount() * 100 + repo.GetTreeCount() * 10 + repo.GetBlobCount(), 111U);
}

TEST_F(Repositories, ACommitIsStampedStoredAndMadeTheHead) {
    Commit commit = Described(nullptr, u"first");
    commit.SetCommitTimezoneBias(TimeDelta(1));
    const auto earliest = Time::Now().ToTimeT(TimeZone::Utc);
    const auto stored = repo.DoCommit(commit);
    const auto latest = Time::Now().ToTimeT(TimeZone::Utc);
    EXPECT_TRUE(stored == repo.GetHead() && stored.get() != &commit && stored->GetId() == commit.GetId());
    const auto seconds = commit.GetCommitTime().ToTimeT(TimeZone::Utc);
    EXPECT_TRUE(earliest <= seconds && seconds <= latest);
    EXPECT_TRUE(commit.GetCommitTime() == Time::FromTimeT(seconds, TimeZone::Utc));
    EXPECT_EQ(commit.GetCommitTimezoneBias(), DateTime::GetCurrentTimezoneBias(commit.GetCommitTime()));

    // The same content within the same second is the same commit; the clock may tick in between.
    const auto again = repo.DoCommit(commit);
    EXPECT_EQ(again == stored, commit.GetCommitTime() == stored->GetCommitTime());
    EXPECT_EQ(repo.GetCommitCount(), again == stored ? 1U : 2U);

    Commit amend(&repo, true);
    EXPECT_FALSE(amend.GetParent());
    amend.SetDescription(u"amended");
    repo.TakeCalls();
    EXPECT_EQ(NameOf(repo.DoCommit(amend)), "amended");
    EXPECT_EQ(repo.TakeCalls(), "DoCommit GetHead() GetHead(master) Sync(amended)");
    EXPECT_EQ(NameOf(repo.GetHead()), "amended");
}

TEST_F(Repositories, BranchesStartAtTheHeadAndAreMovedAtWill) {
    repo.TakeCalls();
    EXPECT_TRUE(repo.CreateBranch(u"empty", nullptr) && !repo.GetHead(u"empty"));
    EXPECT_EQ(repo.TakeCalls(), "CreateBranch(empty,-) GetHead() GetHead(master) GetHead(empty)");
    EXPECT_TRUE(repo.MoveBranchTo(u"master", two) && repo.CreateBranch(u"side", nullptr));
    EXPECT_TRUE(repo.GetHead(u"side") == two && repo.GetHead() == two);
    EXPECT_FALSE(repo.CreateBranch(u"side", one) || repo.CreateBranch(u"", one));
    EXPECT_FALSE(repo.MoveBranchTo(u"side", nullptr) || repo.MoveBranchTo(u"none", one) || repo.BranchExist(u"none"));
    EXPECT_FALSE(repo.Checkout(u"none"));
    EXPECT_EQ(Narrow(repo.GetCurentBranch()), "master");
    EXPECT_TRUE(repo.Checkout(u"side") && repo.MoveBranchTo(u"side", one) && repo.GetHead() == one);
    EXPECT_EQ(Narrow(repo.GetCurentBranch()), "side");
    EXPECT_EQ(repo.GetCommitCount(), 0U);
}

} // namespace
} // namespace KivVcs
