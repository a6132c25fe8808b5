#include "model/World.h"

/// Commits and branches.

namespace KivVcs::Model {
namespace {

// clang-format off
const Action actions[] = {
    {"DoCommit", 14, [](World& w) {
         const auto done = w.repository.DoCommit(w.draft);
         w.NeedHost();
         Expect("whether it is committed", !!done, !w.draft.IsAmend() || w.plain.Head());
         if (!done)
             return;
         TakeTime(w.plainDraft, *done);
         const auto stored = w.plain.Store(w.plainDraft);
         w.plain.Move(w.plain.current, stored);
         Expect("the commit", IdText(done), IdText(stored));
     }},
    {"store the commit", 6, [](World& w) {
         const auto branch = w.PickBranch();
         const auto stored = w.repository.SyncWithStorage(w.PickClass(w.draft));
         const bool done = w.plain.Move(branch, w.plain.Store(w.plainDraft));
         Expect("done", w.repository.MoveBranchTo(Wide(branch), stored), done);
     }},
    {"MakeCommitLinksInOrder", 2, [](World& w) {
         std::vector<cow_ptr<Commit>> line;
         std::vector<PlainCommit::Pointer> plain;
         for (int left = w.Below(3) + 1; left > 0; --left) {
             const Version version = w.PickVersion();
             line.push_back(version.commit);
             plain.push_back(version.plain);
         }
         Commit::MakeCommitLinksInOrder(line, &w.repository);
         w.plain.LinkInOrder(plain);
         for (std::size_t index = 0; index < line.size(); ++index)
             Expect("a linked commit", IdText(line[index]), IdText(plain[index]));
     }},
    {"CreateBranch", 8, [](World& w) {
         const auto [branch, version] = std::pair{w.PickBranch(), w.PickVersion()};
         const bool done = w.plain.Create(branch, version.plain);
         Expect("done", w.repository.CreateBranch(Wide(branch), version.commit), done);
     }},
    {"MoveBranchTo", 4, [](World& w) {
         const auto [branch, version] = std::pair{w.PickBranch(), w.PickVersion()};
         const bool done = w.plain.Move(branch, version.plain);
         Expect("done", w.repository.MoveBranchTo(Wide(branch), version.commit), done);
     }},
    {"RemoveBranch", 2, [](World& w) {
         const auto branch = w.PickBranch();
         Expect("done", w.repository.RemoveBranch(Wide(branch)), w.plain.branches.erase(branch) > 0);
     }},
    {"Checkout", 5, [](World& w) {
         const auto branch = w.PickBranch();
         Expect("done", w.repository.Checkout(Wide(branch)), w.plain.branches.contains(branch));
         w.plain.current = w.plain.branches.contains(branch) ? branch : w.plain.current;
     }},
    {"FastForwardMerge", 4, [](World& w) {
         const Version version = w.PickVersion();
         const auto base = w.plain.CommonBase(w.plain.Head(), version.plain);
         Expect("the base", IdText(w.repository.GetCommonBase(w.repository.GetHead(), version.commit)), IdText(base));
         Expect("done", w.repository.FastForwardMerge(version.commit), w.plain.FastForward(version.plain));
     }},
    {"MergelessRebase", 4, [](World& w) {
         const auto [commit, base, onto] = std::tuple{w.PickVersion(), w.PickVersion(), w.PickVersion()};
         const auto moved = w.repository.MergelessRebase(commit.commit, base.commit, onto.commit);
         const auto expected = w.plain.Rebase(commit.plain, base.plain, onto.plain);
         Expect("the new tip", IdText(moved), IdText(expected));
         w.repository.MoveBranchTo(u"b", moved);
         w.plain.Move("b", expected);
     }},
    {"MergelessRebase of a branch", 3, [](World& w) {
         const auto [branch, onto] = std::pair{w.PickBranch(), w.PickBranch()};
         const auto [head, target] = std::pair{w.plain.Head(branch), w.plain.Head(onto)};
         const auto expected = w.plain.Rebase(head, w.plain.CommonBase(head, target), target);
         Expect("the new tip", IdText(w.repository.MergelessRebase(Wide(branch), Wide(onto))), IdText(expected));
     }},
    {"Clone", 1, [](World& w) {
         Repository clone(w.repository.GetStorage()->Clone());
         Commit commit(&clone, false);
         clone.DoCommit(commit);
         clone.RemoveBranch(w.PickBranch() == "b" ? u"b" : u"c");
         clone.UpdateStorage();
         Expect("the clone's trees", clone.GetTreeCount(), w.repository.GetTreeCount());
     }},
    {"EnsureCommonRootFor", 2, [](World& w) {
         const std::string one = w.PickBranch();
         const std::string other = w.PickBranch();
         const std::string root = w.PickBranch();
         w.InterruptInClone([&](Repository& clone) { clone.EnsureCommonRootFor(Wide(one), Wide(other), Wide(root)); });
         const bool done = w.plain.EnsureCommonRoot(one, other, root);
         Expect("done", w.repository.EnsureCommonRootFor(Wide(one), Wide(other), Wide(root)), done);
     }},
};
// clang-format on

} // namespace

std::span<Action const> Branches() {
    return actions;
}

} // namespace KivVcs::Model
