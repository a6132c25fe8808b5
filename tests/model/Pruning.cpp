#include "model/World.h"

/// What is kept and what is not, and what a host could read back.

namespace KivVcs::Model {
namespace {

// clang-format off
const Action actions[] = {
    {"DeleteCommits", 1, [](World& w) {
         Version version = w.PickVersion();
         w.InterruptInClone([&](Repository& clone) { clone.DeleteCommits(version.commit); });
         Expect("deleted", w.repository.DeleteCommits(std::move(version.commit)), true);
         const bool isPurged = w.plain.DeleteCommits(version.plain);
         version = {};
         if (isPurged)
             w.Purge();
     }},
    {"SimplifyCommitGraph", 1, [](World& w) {
         PlainRepository simplified = w.plain;
         if (!simplified.Simplify())
             return;
         w.plain = std::move(simplified);
         const bool isPurged = w.Below(2) == 0;
         w.InterruptInClone([&](Repository& clone) { clone.SimplifyCommitGraph(isPurged); });
         Expect("simplified", w.repository.SimplifyCommitGraph(isPurged), true);
         if (isPurged)
             w.Purge();
     }},
    {"UpdateStorage", 2, [](World& w) {
         w.repository.UpdateStorage();
         w.Purge();
     }},
    {"hold", 5, [](World& w) {
         Version version = w.PickVersion();
         if (w.held.size() > 4)
             w.held.erase(w.held.begin() + w.Below(4));
         w.held.push_back(version);
     }},
    {"read back", 4, [](World& w) {
         const Version version = w.PickVersion();
         // An empty directory has no data and is not read back.
         const bool hasEmpty = version.files.empty() || (version.files + " ").find("/ ") != std::string::npos;
         if (hasEmpty || !version.plain || !w.plain.commits.contains(version.plain->id))
             return;
         w.NeedHost();
         PackedFormsOf forms(w.repository);
         Repository mirror(std::make_unique<MemObjectsStorage>());
         Id parent;
         auto read = Commit::Deserialize(version.commit->GetId(), parent, &mirror, forms.Loader());
         read.write()->SetParent(version.commit->GetParent());
         read.write()->SetDescription(version.commit->GetDescription());
         Expect("the commit", IdText(read), IdText(version.plain));
         Expect("the tree", IdText(RootOf(read)), IdText(version.plain->root));
         Expect("its parent", Narrow(parent.GetText()), version.plain->parent ? version.plain->parent->id : "");
     }},
};
// clang-format on

} // namespace

std::span<Action const> Pruning() {
    return actions;
}

} // namespace KivVcs::Model
