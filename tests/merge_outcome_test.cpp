#include "support/Builders.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

/// Merges that give reasons.

namespace KivVcs {
namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

/// "path:LR=S": what left and right did, and how it was settled; directories end with "/".
std::string Listed(std::vector<MergeConflict> const& conflicts) {
    std::vector<std::string> words;
    words.reserve(conflicts.size());
    for (auto const& each : conflicts)
        words.push_back(Narrow(each.path) + (each.isDirectory ? "/" : "") + ":" +
                        "=+-*fd>"[static_cast<int>(each.leftChange)] + "=+-*fd>"[static_cast<int>(each.rightChange)] +
                        "=?LRB!"[static_cast<int>(each.settlement) + 1]);
    return Joined(words);
}

class Outcomes : public WithHistory {
protected:
    cow_ptr<Commit> Store(cow_ptr<Commit> const& parent, std::string const& files, std::string const& name) {
        Commit commit(parent, false);
        commit.ReplaceRoot(&repo, MakeTree(repo, files));
        commit.SetDescription(Wide(name));
        return repo.SyncWithStorage(immu::make<Commit>(commit));
    }

    /// Merges @p right into a branch at @p left, both grown from @p root.
    MergeOutcome Merge(std::string const& root, std::string const& left, std::string const& right,
                       Resolvers resolvers) {
        const auto base = Store(nullptr, root, "root");
        head = Store(base, left, "left");
        repo.MoveBranchTo(u"master", head);
        return MergeWithOutcome(repo, Store(base, right, "right"), std::move(resolvers));
    }

    cow_ptr<Commit> head;
};

TEST_F(Outcomes, SayWhatBecameOfTheBranch) {
    const auto root = Store(nullptr, "a=1", "root");
    const auto next = Store(root, "a=2", "next");
    EXPECT_EQ(MergeWithOutcome(repo, nullptr, {}).result, MergeResult::NothingToCommit);
    EXPECT_EQ(MergeWithOutcome(repo, root, {}).result, MergeResult::Forwarded);
    EXPECT_EQ(MergeWithOutcome(repo, next, {}).result, MergeResult::Forwarded);
    EXPECT_EQ(repo.GetHead(), next);
    EXPECT_EQ(MergeWithOutcome(repo, root, {}).result, MergeResult::UpToDate);
    EXPECT_EQ(MergeWithOutcome(repo, next, {}).result, MergeResult::UpToDate);
    EXPECT_EQ(repo.GetHead(), next);

    // A result that equals one side is a merge like any other.
    const auto side = Store(root, "a=2", "side");
    const MergeOutcome equal = MergeWithOutcome(repo, side, {});
    EXPECT_EQ(equal.result, MergeResult::Merged);
    EXPECT_TRUE(equal.Succeeded());
    EXPECT_EQ(repo.GetHead()->GetParent(), next);
    EXPECT_EQ(FilesOfHead(), "a=2");

    EXPECT_EQ(Merge("-", "-", "-", {}).result, MergeResult::NothingToCommit);
    EXPECT_EQ(Merge("a=1", "a=2", "-", {{}, always_return_t{TreeConflictChoice::Right}}).result,
              MergeResult::NothingToCommit);
    EXPECT_EQ(repo.GetHead(), head);
    repo.RemoveBranch(u"master");
    const MergeOutcome refused = MergeWithOutcome(repo, root, {});
    EXPECT_EQ(refused.result, MergeResult::Refused);
    EXPECT_FALSE(refused.Succeeded());
}

TEST_F(Outcomes, TellWhatEachSideDidAndHowItWasSettled) {
    const MergeOutcome outcome = Merge(
        "a=1 b=1 c/x=1 d/x=1 e=1 f=1", "a=2 b=2 c/x=2 d/x=2 e=2 g=1", "a=3 c/x=3 d/x=3 e/y=1 f=2 g=2",
        {[](Path path, auto const&) {
             const std::string name = Narrow(path.back());
             return name == "b" ? ConflictChoice::Right : name == "f" ? ConflictChoice::Root : ConflictChoice::Left;
         },
         [](Path path, auto const&) {
             return !path.empty() && path[0] == u"d" ? TreeConflictChoice::Right : TreeConflictChoice::Merge;
         }});
    EXPECT_EQ(outcome.result, MergeResult::Merged);
    EXPECT_EQ(Listed(outcome.conflicts), "a:**L b:*-R e:*dL f:-*B g:++L c/x:**L d/:**R");
    EXPECT_EQ(outcome.conflicts[0].rightId, MakeBlob("3").GetId());
    EXPECT_EQ(outcome.conflicts.back().leftId, MakeTree(repo, "x=2")->GetId());
}

TEST_F(Outcomes, GiveUpWithAllThatIsLeftAndAskNobodyAgain) {
    int asked = 0;
    const MergeOutcome outcome = Merge(
        "a=1 b=1 c=1 d/e/x=1 f/x=1", "a=2 b=2 c=2 d/e/x=2 f/x=2", "a=3 b=3 c=3 d/e/x=3 f/x=3",
        {[&asked](Path, auto const&) { return ++asked == 2 ? ConflictChoice::Undecided : ConflictChoice::Right; }, {}});
    EXPECT_EQ(outcome.result, MergeResult::GaveUp);
    EXPECT_EQ(asked, 2);
    EXPECT_EQ(Listed(outcome.conflicts), "a:**R b:**? c:**? d/e/x:**? f/x:**?");
    EXPECT_EQ(repo.GetHead(), head);

    const auto stopAt = [](KivStringViewT<char16_t> directory) {
        return [directory](Path path, auto const&) {
            return !path.empty() && path.back() == directory ? TreeConflictChoice::Undecided
                   : !path.empty() && path.back() == u"d"    ? TreeConflictChoice::Left
                                                             : TreeConflictChoice::Merge;
        };
    };
    const auto conflicts = [&](KivStringViewT<char16_t> directory) {
        return Listed(Merge("d/x=1 d2=1 f/x=1 g/x=1", "d/x=2 d2=2 f/x=2 g/x=2", "d/x=3 d2=3 f/x=3 g/x=3",
                            {AlwaysChooseLeft(), stopAt(directory)})
                          .conflicts);
    };
    EXPECT_EQ(conflicts(u"f"), "d2:**L d/:**L f/:**? g/x:**?");
    const auto stopAtOnce = [](Path, auto const&) { return TreeConflictChoice::Undecided; };
    EXPECT_EQ(Listed(Merge("a=1 b=1", "a=2 b=1", "a=3 b=1", {{}, stopAtOnce}).conflicts), "/:**?");
    EXPECT_THROW(
        Merge("a=1", "a=2", "a=3", {[](Path, auto const&) -> ConflictChoice { throw std::runtime_error("host"); }, {}}),
        std::runtime_error);
    EXPECT_EQ(repo.GetHead(), head);
}

TEST_F(Outcomes, AreForeseenInTheOrderOfTheQuestions) {
    for (unsigned seed = 0; seed < 2'000; ++seed) {
        std::mt19937 random(seed);
        const auto root = EditAtRandom(random, repo, nullptr);
        const MergeTrees trees{EditAtRandom(random, repo, root), root, EditAtRandom(random, repo, root)};
        Names asked;
        const auto ask = [&asked](Path path, auto const&) {
            asked.push_back(Joined(path));
            return ConflictChoice::Left;
        };
        (void)ThreeWayMerge(&repo, trees, {ask, always_return_t{TreeConflictChoice::Merge}});
        Names foreseen;
        for (auto const& conflict : FindConflicts(trees)) {
            foreseen.push_back(Narrow(conflict.path));
            EXPECT_NE(conflict.leftChange, ChangeKind::Unchanged) << seed;
            EXPECT_NE(conflict.rightChange, ChangeKind::Unchanged) << seed;
            EXPECT_NE(conflict.leftId, conflict.rightId) << seed;
        }
        EXPECT_EQ(foreseen, asked) << seed;
    }
}

} // namespace
} // namespace KivVcs
