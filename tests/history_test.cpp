#include "support/Builders.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

#include <random>

namespace KivVcs {
namespace {

using Histories = WithHistory;

TEST_F(Histories, TheCommonBaseIsWhereTheChainsMeet) {
    history.Grow("r a:r b:a c:b d:c s:a t:s alone");
    const struct {
        const char *first, *second, *base;
    } cases[] = {{"d", "s", "a"}, {"s", "d", "a"}, {"d", "t", "a"}, {"d", "b", "b"},
                 {"b", "d", "b"}, {"c", "c", "c"}, {"r", "t", "r"}, {"d", "alone", "-"}};
    for (auto const& [first, second, base] : cases)
        EXPECT_EQ(NameOf(repo.GetCommonBase(history[first], history[second])), base) << first << " " << second;
    EXPECT_FALSE(repo.GetCommonBase(nullptr, history["a"]) || repo.GetCommonBase(history["a"], nullptr));

    // Equal commits meet whatever their objects; of two met together the second one's counts.
    const auto twin = immu::make<Commit>(*history["a"]);
    Commit above(twin, false);
    EXPECT_TRUE(repo.GetCommonBase(history["a"], twin) == twin);
    EXPECT_TRUE(repo.GetCommonBase(twin, history["a"]) == history["a"]);
    EXPECT_TRUE(repo.GetCommonBase(history["a"], immu::make<Commit>(above)) == twin);
    EXPECT_TRUE(repo.GetCommonBase(immu::make<Commit>(above), history["c"]) == history["a"]);
}

TEST_F(Histories, ABranchGoesForwardOnlyOverItsOwnHead) {
    history.Grow("a b:a side:a");
    EXPECT_FALSE(repo.FastForwardMerge(nullptr));
    EXPECT_TRUE(repo.FastForwardMerge(history["a"]));
    EXPECT_TRUE(repo.FastForwardMerge(history["a"]));
    repo.TakeCalls();
    EXPECT_TRUE(repo.FastForwardMerge(history["b"]));
    EXPECT_EQ(repo.TakeCalls(), "FastForwardMerge GetHead() GetHead(master) GetCommonBase(a,b) MoveBranchTo(master,b)");
    EXPECT_FALSE(repo.FastForwardMerge(history["side"]));
    EXPECT_FALSE(repo.FastForwardMerge(history["a"]));
    const Commit onTwin(immu::make<Commit>(*history["b"]), false);
    EXPECT_FALSE(repo.FastForwardMerge(immu::make<Commit>(onTwin)));
    EXPECT_EQ(history.Branches(), "master=b/a");
}

TEST_F(Histories, APurgeRemovesExactlyWhatNobodyHolds) {
    history.Grow("r a:r b:a s:a x:s");
    history.Point("master=b side=x");
    history.Forget();
    Storage().PurgeUnusedObjects();
    EXPECT_EQ(history.Counts(), "5 5 5");
    Storage().RemoveBranch(u"side");
    auto held = repo.GetHead()->GetParent();
    auto clone = Storage().Clone();
    for (auto* storage : {&Storage(), clone.get(), &Storage()})
        storage->PurgeUnusedObjects();
    EXPECT_EQ(history.Counts(), "5 5 5");
    clone.reset();
    Storage().PurgeUnusedObjects();
    EXPECT_EQ(history.Counts(), "3 3 3");

    Storage().RemoveBranch(u"master");
    Storage().PurgeUnusedObjects();
    EXPECT_EQ(history.Counts(), "2 2 2");
    held.reset();
    repo.UpdateStorage();
    EXPECT_EQ(history.Counts(), "0 0 0");
}

TEST_F(Histories, DeletingMovesBranchesNewestFirstAndSurvivesAFailure) {
    history.Grow("a b:a c:b");
    history.Point("master=c topic=b");
    const auto tree = history["c"]->GetCommitTree()->GetRoot();
    repo.TakeCalls();
    repo.Break("MoveBranchTo");
    EXPECT_THROW(repo.DeleteCommits(history["c"]), std::runtime_error);
    EXPECT_EQ(repo.TakeCalls(), "Sync(b) Sync(c)");
    repo.Break("");
    EXPECT_TRUE(repo.DeleteCommits(history["c"]));
    EXPECT_EQ(repo.TakeCalls(), "Sync(b) Sync(c) MoveBranchTo(master,c) MoveBranchTo(topic,b) UpdateStorage");
    EXPECT_EQ(history.Branches(), "master=c/b topic=b");
    EXPECT_TRUE(repo.GetHead()->GetCommitTree()->GetRoot() == tree);

    // A branch that will not move keeps the others of its commit, and none else.
    class Refusing : public Repository {
    public:
        using Repository::Repository;
        bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) override {
            const bool refuses = NameOf(commit) == "b" && !std::exchange(hasRefused, true);
            return !refuses && Repository::MoveBranchTo(branch, commit);
        }
        bool hasRefused = false;
    };
    Refusing refusing(std::make_unique<MemObjectsStorage>());
    GrownHistory line(refusing);
    line.Grow("a b:a c:b");
    for (auto const& [branch, head] : {std::pair(u"one", "b"), {u"two", "b"}, {u"three", "c"}})
        refusing.CreateBranch(branch, line[head]);
    EXPECT_TRUE(refusing.DeleteCommits(line["c"]));
    EXPECT_EQ(line.Branches(), "master= one=b/a three=c/b two=b/a");
}

TEST_F(Histories, BranchesThatWereMovedStayThereWhenAnExceptionEndsTheOperation) {
    history.Grow("r a:r b:a c:b x y:x");
    history.Point("master=c topic=a island=y");
    repo.Break("MoveBranchTo(topic");
    EXPECT_THROW(repo.DeleteCommits(history["c"]), std::runtime_error);
    EXPECT_EQ(history.Branches(), "island=y/x master=c/a topic=a/r");
    repo.Break("MoveBranchTo(island");
    EXPECT_THROW(repo.EnsureCommonRootFor(u"master", u"island", u"new"), std::runtime_error);
    EXPECT_EQ(history.Branches(), "island=y/x master=c/a/Root commit new=Root commit topic=a/r");
    // Which branches have been moved by then is the tables' own order.
    repo.TakeCalls();
    EXPECT_THROW(repo.SimplifyCommitGraph(true), std::runtime_error);
    const std::string calls = repo.TakeCalls();
    const auto now = [&calls](const char* branch, const char* before, const char* after) {
        return " " + std::string(branch) + "=" +
               (calls.find(std::string("MoveBranchTo(") + branch) < calls.size() ? after : before);
    };
    EXPECT_EQ(history.Branches(), "island=y/x" + now("master", "c/a/Root commit", "c/Root commit") +
                                      " new=Root commit" + now("topic", "a/r", "a"));
}

TEST_F(Histories, SimplifyingAsksAboutPairsAndMakesRemovedBranchesAgain) {
    class Removing : public RecordingRepository {
    public:
        using RecordingRepository::RecordingRepository;
        cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
            (void)RecordingRepository::GetCommonBase(first, second);
            storage->RemoveBranch(u"topic");
            return kept;
        }
        IObjectsStorage* storage = GetStorage();
        cow_ptr<Commit> kept;
    };
    Removing removing(std::make_unique<MemObjectsStorage>());
    GrownHistory line(removing);
    line.Grow("r a:r b:a");
    line.Point("topic=b");
    removing.kept = line["a"];
    removing.TakeCalls();
    EXPECT_TRUE(removing.SimplifyCommitGraph(false));
    const std::string calls = removing.TakeCalls();
    // The branch "master" has no head, and is asked about all the same, in whichever order.
    EXPECT_TRUE(calls == "GetCommonBase(b,-) Sync(a) Sync(b) CreateBranch(topic,b)" ||
                calls == "GetCommonBase(-,b) Sync(a) Sync(b) CreateBranch(topic,b)")
        << calls;
    EXPECT_EQ(line.Branches(), "master= topic=b/a");
    EXPECT_EQ(line.Counts(), "5 3 3");

    // Heads may stand on separate objects of one base.
    history.Grow("r a:r b:a c:a");
    Commit onTwin(*history["c"]);
    onTwin.SetParent(immu::make<Commit>(*history["a"]));
    history.Point("master=b topic=c");
    Storage().UpdateBranch(u"topic", immu::make<Commit>(onTwin));
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_EQ(history.Branches(), "master=b/a topic=c/a");

    // What is kept but not stored stops the rebuild above it.
    history.Grow("r m:r a:m b:m c:r");
    history.Point("master=a topic=b other=c");
    Storage().DeleteCommit(history["m"]);
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_EQ(history.Branches(), "master=a/m/r other=c/r topic=b/m/r");
}

/// Finds common bases by following both chains in the plainest way, and compares.
class FollowingRepository : public Repository {
public:
    using Repository::Repository;
    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        const auto base = Follow(first, second);
        const auto found = Repository::GetCommonBase(first, second);
        EXPECT_TRUE(found == base || (hasTwins && found && base && *found == *base));
        return base;
    }

    /// Whether there are equal commits, of which another one may be found.
    bool hasTwins = false;

private:
    static cow_ptr<Commit> Follow(cow_ptr<Commit> first, cow_ptr<Commit> const& second) {
        for (; first; first = first->GetParent()) {
            for (auto other = second; other; other = other->GetParent()) {
                if (*first == *other)
                    return other;
            }
        }
        return nullptr;
    }
};

/// Another object of the same commit, on other objects of the same ancestors.
cow_ptr<Commit> TwinOf(cow_ptr<Commit> const& commit) {
    if (!commit)
        return nullptr;
    Commit copy(*commit);
    copy.SetParent(TwinOf(commit->GetParent()));
    return immu::make<Commit>(std::move(copy));
}

TEST(RandomHistories, SimplifyingKeepsWhatFollowingEveryPairKeeps) {
    for (unsigned seed = 0; seed < 60; ++seed) {
        std::mt19937 random(seed);
        const auto below = [&random](unsigned limit) { return static_cast<unsigned>(random() % limit); };
        std::string graph = "0";
        std::string branches = "master=0";
        for (unsigned commit = 1; commit < 60; ++commit) {
            const auto name = std::to_string(commit);
            graph += " " + name;
            if (const unsigned back = below(8); back < 7)
                graph += ":" + std::to_string(commit - 1 - std::min(back * back / 4, commit - 1));
            if (below(3) == 0)
                branches += " b" + name + "=" + std::to_string(below(commit + 1));
        }
        Repository plain(std::make_unique<MemObjectsStorage>());
        FollowingRepository following(std::make_unique<MemObjectsStorage>());
        following.hasTwins = seed % 3 > 0;
        const auto simplified = [&](Repository& each) {
            GrownHistory line(each);
            line.Grow(graph);
            line.Point(branches);
            line.Forget();
            for (unsigned commit = 0; commit < seed % 3 * 20; ++commit) {
                const auto branch = Wide("b" + std::to_string(commit));
                each.MoveBranchTo(branch, TwinOf(each.GetHead(branch)));
            }
            EXPECT_TRUE(each.SimplifyCommitGraph(true));
            return line.Branches() + " | " + line.Counts();
        };
        ASSERT_EQ(simplified(plain), simplified(following)) << "seed " << seed;
    }
}

TEST_F(Histories, ARebaseChangesParentsOnly) {
    history.Grow("r a:r b:a c:b onto:r");
    history.Point("master=c two=onto");
    const auto rebased = [this](std::string const& commit, cow_ptr<Commit> const& base) {
        const auto tip = repo.MergelessRebase(history[commit], base, history["onto"]);
        EXPECT_TRUE(tip->GetCommitTree()->GetRoot() == history[commit]->GetCommitTree()->GetRoot());
        Storage().CreateBranch(u"moved", tip);
        Storage().UpdateBranch(u"moved", tip);
        return history.Branches();
    };
    EXPECT_EQ(rebased("c", history["r"]), "master=c/b/a/r moved=c/b/a/onto/r two=onto/r");
    EXPECT_EQ(rebased("b", history["b"]), "master=c/b/a/r moved=b/onto/r two=onto/r");
    EXPECT_EQ(rebased("a", nullptr), "master=c/b/a/r moved=a/r/onto/r two=onto/r");
    repo.TakeCalls();
    EXPECT_TRUE(repo.MergelessRebase(history["c"], history["a"], history["a"]) == history["c"]);
    EXPECT_EQ(repo.TakeCalls(), "");
    // An equal, but separate, object in the base's place: the moved commits are the stored ones again.
    EXPECT_TRUE(repo.MergelessRebase(history["c"], history["r"], immu::make<Commit>(*history["r"])) == history["c"]);
    EXPECT_FALSE(repo.MergelessRebase(history["a"], history["r"], nullptr));
    EXPECT_FALSE(repo.MergelessRebase(nullptr, nullptr, history["r"]));
    repo.TakeCalls();
    EXPECT_EQ(NameOf(repo.MergelessRebase(KivStringViewT<char16_t>(u"master"), u"two")), "c");
    EXPECT_EQ(repo.TakeCalls(), "GetHead(master) GetHead(two) GetCommonBase(c,onto) Sync(a) Sync(b) Sync(c)");
}

TEST_F(Histories, UnrelatedBranchesGetACommonRoot) {
    history.Grow("a b:a x y:x");
    history.Point("one=b two=y");
    repo.TakeCalls();
    EXPECT_TRUE(repo.EnsureCommonRootFor(u"one", u"two", u"root"));
    EXPECT_EQ(repo.TakeCalls(), "GetHead(one) GetHead(two) GetCommonBase(b,y) GetHead(root) Sync(Root commit) "
                                "CreateBranch(root,Root commit) GetHead(root) "
                                "GetHead(one) GetCommonBase(b,Root commit) Sync(a) Sync(b) MoveBranchTo(one,b) "
                                "GetHead(two) GetCommonBase(y,Root commit) Sync(x) Sync(y) MoveBranchTo(two,y)");
    EXPECT_EQ(history.Branches(), "master= one=b/a/Root commit root=Root commit two=y/x/Root commit");
    // sha256 of "commit 60", a zero byte, and "tree \nauthor  <> 0 +0000\ncommitter  <> 0 +0000\n\nRoot commit\n"
    EXPECT_EQ(Narrow(repo.GetHead(u"root")->GetId().GetText()),
              "2181c8f28ee8418b1478fddf0ee42f5611b4bfaafd9f39a96b756bf50f9cb6fc");

    repo.TakeCalls();
    EXPECT_TRUE(repo.EnsureCommonRootFor(u"one", u"two", u"root"));
    EXPECT_EQ(repo.TakeCalls(), "GetHead(one) GetHead(two) GetCommonBase(b,y)");
    EXPECT_TRUE(repo.EnsureCommonRootFor(u"one", u"new", u"root"));
    EXPECT_TRUE(repo.EnsureCommonRootFor(u"master", u"one", u"root"));
    EXPECT_EQ(history.Branches(), "master=Root commit new=Root commit one=b/a/Root commit root=Root commit "
                                  "two=y/x/Root commit");
    // A root branch that exists without a head cannot be made.
    Storage().CreateBranch(u"bare", nullptr);
    EXPECT_FALSE(repo.EnsureCommonRootFor(u"one", u"absent", u"bare"));
    EXPECT_FALSE(repo.EnsureCommonRootFor(u"one", u"", u"root"));
}

} // namespace
} // namespace KivVcs
