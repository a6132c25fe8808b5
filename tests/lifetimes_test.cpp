#include "support/Builders.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

/// Results that are read when what they were asked of is gone, which a sanitizer notices.

namespace KivVcs {
namespace {

/// Commits a, b on a, c on a, and a last one on b that adds a directory.
struct World {
    World() {
        history->Grow("a b:a c:a");
        history->Point("master=b side=c");
        commit = immu::make<Commit>((*history)["b"], false);
        commit.write()->SetAuthorName(u"Ada");
        commit.write()->AddTree(repo.get(), u"t", *tree);
        commit = repo->DoCommit(*commit.write());
    }

    void End() {
        tree.reset();
        commit.reset();
        history.reset();
        repo.reset();
    }

    std::unique_ptr<Repository> repo = std::make_unique<Repository>(std::make_unique<MemObjectsStorage>());
    std::unique_ptr<GrownHistory> history = std::make_unique<GrownHistory>(*repo);
    cow_ptr<Tree> tree = MakeTree(*repo, "d/e/f=1 d/g=2 h=3");
    cow_ptr<Commit> commit;
};

Resolvers TakeRight() {
    return {AlwaysChooseRight(), [](auto const&, auto const&) { return TreeConflictChoice::Merge; }};
}

std::string ReadTimes(BlobConflictResolver const& resolver, cow_ptr<Tree> const& left) {
    return std::to_string(static_cast<int>(resolver({}, {left, nullptr, nullptr})));
}

// References on purpose: a result that is the caller's own lives as long as they do.
// clang-format off
const struct {
    const char* expected;
    std::string (*read)(World&);
} results[] = {
    {"b", [](World& w) { auto const& parent = w.commit->GetParent(); w.End(); return NameOf(parent); }},
    {"a", [](World& w) { auto const& base = w.repo->GetCommonBase(w.commit, (*w.history)["c"]); w.End(); return NameOf(base); }},
    {"c", [](World& w) { auto const& head = w.repo->GetHead(u"side"); w.End(); return NameOf(head); }},
    {"a=a b=b t/d/e/f=1 t/d/g=2 t/h=3", [](World& w) { auto const& holder = w.commit->GetCommitTree(); w.End(); return Files(holder->GetRoot()); }},
    {"a=a b=b t/d/e/f=1 t/d/g=2 t/h=3", [](World& w) { auto const& root = w.commit->GetCommitTree()->GetRoot(); w.End(); return Files(root); }},
    {"a=a b=b", [](World& w) { auto const& holder = w.commit->GetParent()->GetCommitTree(); w.End(); return Files(holder->GetRoot()); }},
    {"d/e/f=1 d/g=2 h=3", [](World& w) { auto const& holder = w.commit->GetTree(u"t"); w.End(); return Files(holder->GetRoot()); }},
    {"e/f=1 g=2", [](World& w) { auto const& tree = w.tree->GetLocalTree(u"d"); w.End(); return Files(tree); }},
    {"e/f=1 g=2", [](World& w) { auto const& tree = w.repo->GetTreeFromStorage(w.tree->GetLocalTree(u"d")->GetId()); w.End(); return Files(tree); }},
    {"f=1", [](World& w) { auto const& tree = w.tree->GetDeepTree(u"d/e"); w.End(); return Files(tree); }},
    {"2", [](World& w) { auto const& blob = w.tree->GetDeepBlob(u"d/g"); w.End(); return Bytes(blob->GetData()); }},
    {"1", [](World& w) { auto const& blob = w.commit->GetBlob(u"t/d/e/f"); w.End(); return Bytes(blob->GetData()); }},
    {"3", [](World& w) { auto const& object = w.commit->GetCommitTree()->GetRoot()->GetDeepObject(u"t/h"); w.End(); return Bytes(object->GetData()); }},
    {"d/e/f=1 d/g=2 h=3", [](World& w) { auto const& added = w.commit.write()->AddTree(w.repo.get(), u"u", *w.tree); w.End(); return Files(added); }},
    {"d/e/f=1 d/g=2 h=3 x=4", [](World& w) { auto const& merged = ThreeWayMerge(w.repo.get(), {w.tree, nullptr, MakeTree(*w.repo, "x=4")}, TakeRight()); w.End(); return Files(merged); }},
    {"b", [](World& w) { auto const& moved = w.repo->MergelessRebase((*w.history)["b"], nullptr, (*w.history)["c"]); w.End(); return NameOf(moved); }},
    {"c", [](World& w) { auto const& clone = w.repo->GetStorage()->Clone(); w.End(); return NameOf(clone->GetHead(u"side")); }},
    {"side", [](World& w) { auto const& names = w.repo->GetStorage()->GetCommitBranches((*w.history)["c"]); w.End(); return Narrow(names.front()); }},
    {"master", [](World& w) { auto const& name = w.repo->GetCurentBranch(); w.End(); return Narrow(name); }},
    {"d/e/f d/g h", [](World& w) { auto const& paths = w.tree->GetDeepBlobPaths(); w.End(); return Joined(ToNames(paths)); }},
    {"t/d/e/f t/d/g t/h", [](World& w) { auto const& paths = w.commit->GetCommitTree()->GetBlobDiffs(w.commit->GetParent()->GetCommitTree()); w.End(); return Joined(ToNames(paths)); }},
    {"d h", [](World& w) { auto const& names = w.tree->GetLocalObjectPaths(); w.End(); return Joined(ToNames(names)); }},
    {"Ada!", [](World& w) { auto const& name = w.commit->GetAuthorName() + KivStringT<char16_t>(u"!"); w.End(); return Narrow(name); }},
    {"blob", [](World& w) { auto const& header = w.tree->GetLocalBlob(u"h")->GetHeader(); w.End(); return std::string(header.GetString()); }},
    {"blob 1\\03", [](World& w) { auto const& text = w.tree->GetLocalBlob(u"h")->ToString(); w.End(); return Narrow(text); }},
    {"100644 b", [](World& w) { const Buffer data = w.tree->GetLocalTree(u"d")->GetLocalTree(u"e")->GetData(); w.End(); return Bytes(data).substr(0, 8); }},
    {"2", [](World& w) { auto const& times = TimeBasedConflictResolver({u"h"}, [](auto const& stamp) { return Time(stamp->GetData().GetSize()); }); auto const tree = w.tree->GetLocalTree(u"d"); w.End(); return ReadTimes(ChainResolvers(times, AlwaysChooseRoot()), tree); }},
};
// clang-format on

TEST(Results, OutliveWhatTheyWereAskedOf) {
    for (auto const& [expected, read] : results) {
        World world;
        EXPECT_EQ(read(world), expected);
    }
    World world;
    auto const& id = world.tree->GetDeepBlob(u"h")->GetId();
    auto const& text = id.GetText();
    world.End();
    EXPECT_EQ(Narrow(text), Identifier("blob", "3"));
}

} // namespace
} // namespace KivVcs
