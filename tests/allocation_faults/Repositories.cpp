#include "allocation_faults/World.h"

namespace KivVcs::Faults {
namespace {

void RebaseAndMerge(World& w) {
    w.commit = w.repository.MergelessRebase(w.commits["v"], nullptr, w.commits["j"]);
    w.done = w.repository.Merge3Way(w.commit, AskTimesThenRight());
}

void FindTheBaseOfALongLine(World& w) {
    cow_ptr<Commit> tip = w.commits["c"];
    for (char16_t name[] = u"A"; name[0] < u'f'; ++name[0]) {
        Commit next(tip, false);
        next.SetDescription(name);
        next.AddBlob(&w.repository, name, w.blob);
        tip = w.repository.SyncWithStorage(immu::make<Commit>(next));
    }
    w.commit = w.repository.GetCommonBase(tip, w.commits["v"]);
}

void AmendACommit(World& w) {
    Commit amended(&w.repository, true);
    amended.AddBlob(&w.repository, u"amended/file", w.blob);
    w.commit = w.repository.DoCommit(amended);
}

void MakeARepository(World& w) {
    Repository other(std::make_unique<MemObjectsStorage>(std::initializer_list<KivStringViewT<char16_t>>{u"a", u"b"}));
    w.done =
        other.MoveBranchTo(u"a", w.commits["v"]) && other.GetStorage()->GetCommitBranches(w.commits["v"]).size() == 1;
}

void Purge(World& w) {
    w.commits.clear();
    w.repository.UpdateStorage();
}

// clang-format off
const Operation operations[] = {
    {"RebaseAndMerge", RebaseAndMerge},
    {"FindTheBaseOfALongLine", FindTheBaseOfALongLine},
    {"DoCommit", [](World& w) { w.commit = w.repository.DoCommit(w.draft); }},
    {"AmendACommit", AmendACommit},
    {"MakeARepository", MakeARepository},
    {"CreateBranch", [](World& w) { w.done = w.repository.CreateBranch(u"new", nullptr); }},
    {"Checkout", [](World& w) { w.done = w.repository.Checkout(u"island"); }},
    {"MergeThreeWays", [](World& w) { w.done = w.repository.Merge(w.commits["v"], AskTimesThenRight()); }},
    {"MergeUnrelated", [](World& w) { w.done = w.repository.Merge3Way(w.commits["j"], AskTimesThenRight()); }},
    {"DeleteCommits", [](World& w) { w.done = w.repository.DeleteCommits(w.commits["c"]); }},
    {"SimplifyCommitGraph", [](World& w) { w.done = w.repository.SimplifyCommitGraph(true); }, true},
    {"SimplifyWithoutPurge", [](World& w) { w.done = w.repository.SimplifyCommitGraph(false); }, true},
    {"RebaseABranch", [](World& w) { w.commit = w.repository.MergelessRebase(u"topic", u"master"); }},
    {"RootAtABranch", [](World& w) { w.done = w.repository.EnsureCommonRootFor(u"topic", u"island", u"side"); }},
    {"RootAtANewBranch", [](World& w) { w.done = w.repository.EnsureCommonRootFor(u"topic", u"island", u"root"); }, true},
    {"Purge", Purge},
    {"MergeWithOutcome", [](World& w) { w.done = MergeWithOutcome(w.repository, w.commits["v"], AskTimesThenRight()).Succeeded(); }},
    {"ShortenAnId", [](World& w) { w.narrow = ShortIds(*w.repository.GetStorage()).ShortFormOf(w.commits["v"]->GetId(), 20).c_str(); }},
    {"WalkAHistory", [](World& w) { for (auto const& each : History(w.commits["v"]).Changing(u"d/e/y").First(2)) w.commit = each; }},
    {"FindWhatACommitChanged", [](World& w) { w.done = DifferencesFromParent(*w.commits["t"]).GetCount() == 3; }},
    {"Clone", [](World& w) { w.done = w.repository.GetStorage()->Clone()->GetRefs().size() == 5; }},
};
// clang-format on

} // namespace

std::span<Operation const> OnRepositories() {
    return operations;
}

} // namespace KivVcs::Faults
