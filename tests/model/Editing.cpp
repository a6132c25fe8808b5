#include "model/World.h"

/// Edits of a commit or a tree, by paths.

namespace KivVcs::Model {
namespace {

// clang-format off
const Action actions[] = {
    {"AddBlob", 24, [](World& w) {
         const std::string content = w.PickContent();
         const auto blob = w.PickClass(content);
         w.EditPath([&](auto& to, auto const& path) { return !!to.AddBlob(&w.repository, path, *blob); }, content);
     }},
    {"AddTree", 6, [](World& w) {
         const Side side = w.PickSide();
         const auto added = w.PickClass(side.tree ? *side.tree : Tree());
         w.EditPath([&](auto& to, auto const& path) { return !!to.AddTree(&w.repository, path, *added); },
                    side.plain.value_or(PlainTree()));
     }},
    {"AddObject", 6, [](World& w) {
         const std::string content = w.PickContent();
         const Side side = w.PickSide();
         const std::string id = w.Below(2) == 0 ? Identifier("blob", content) : IdText(side.plain);
         const auto add = [&](auto& to, auto const& path) { return !!to.AddObject(&w.repository, path, Id(Wide(id))); };
         if (id != IdText(side.plain) && w.plain.contents.contains(content))
             w.EditPath(add, content);
         else if (w.plain.trees.contains(id))
             w.EditPath(add, PlainTree(w.plain.trees[id]));
         else
             w.Edit([&](auto& to) { return add(to, u"a"); }, [](PlainTree&) { return false; });
     }},
    {"RemoveObject", 14, [](World& w) {
         const auto path = w.PickPath();
         w.Edit([&](auto& from) { return from.RemoveObject(&w.repository, path.first); },
                [&](PlainTree& from) {
                    return !path.second.empty() && Remove(from, path.second, w.plain.Interning());
                });
     }},
    {"take the root", 4, [](World& w) {
         const Side side = w.PickSide();
         w.tree = side.tree ? *side.tree : Tree();
         w.plainTree = side.plain.value_or(PlainTree());
     }},
    {"ReplaceRoot", 2, [](World& w) {
         w.draft.ReplaceRoot(&w.repository, w.PickClass(w.tree));
         w.draft.ResetState();
         w.plainDraft.root = w.plain.Intern(w.plainTree);
     }},
    {"describe", 4, [](World& w) {
         w.plainDraft.description = w.PickContent() + "\n" + w.PickContent();
         w.plainDraft.author = "author" + w.PickContent();
         w.plainDraft.seconds = w.Below(3) - 1;
         w.plainDraft.biasMinutes = std::array{0, 60, -330, -30, 345}[static_cast<std::size_t>(w.Below(5))];
         w.draft.SetDescription(Wide(w.plainDraft.description));
         w.draft.SetAuthorName(Wide(w.plainDraft.author));
         w.draft.SetAuthorEmail(Wide(w.plainDraft.author + "@x"));
         w.draft.SetCommitTime(Time::FromTimeT(w.plainDraft.seconds, TimeZone::Utc));
         w.draft.SetCommitTimezoneBias(TimeDelta(w.plainDraft.biasMinutes * std::int64_t{600'000'000}));
     }},
    {"begin a commit", 16, [](World& w) {
         const bool isAmend = w.Below(4) == 0;
         const Version on = w.Below(2) == 0 ? Version{w.repository.GetHead(), w.plain.Head()} : w.PickVersion();
         Commit begun(on.commit, isAmend);
         if (on.plain && w.Below(4) == 0)
             w.Defer(begun, on);
         w.draft = std::move(begun);
         w.plainDraft = on.plain ? *on.plain : PlainCommit();
         if (!isAmend)
             w.plainDraft = {.parent = on.plain, .root = w.plainDraft.root};
         w.plainDraft.seconds = w.plainDraft.biasMinutes = 0;
     }},
    {"order of edits", 4, [](World& w) {
         const Side base = w.PickSide();
         std::map<Names, std::pair<KivStringT<char16_t>, std::string>> edits;
         for (int left = 4; left > 0; --left) {
             const auto path = w.PickPath();
             edits[path.second] = {path.first, w.PickContent()};
         }
         edits.erase(Names());
         const auto edited = [&](auto const& ordered) {
             Tree tree = base.tree ? *base.tree : Tree();
             PlainTree plain = base.plain.value_or(PlainTree());
             for (auto const& [names, edit] : ordered) {
                 tree.AddBlob(&w.repository, edit.first, *w.PickClass(edit.second));
                 w.plain.AddTo(plain, names, edit.second);
             }
             Expect("the tree", IdText(tree), IdOf(plain));
             return IdOf(plain);
         };
         Expect("in the other order", edited(std::vector(edits.rbegin(), edits.rend())), edited(edits));
     }},
};
// clang-format on

} // namespace

std::span<Action const> Editing() {
    return actions;
}

} // namespace KivVcs::Model
