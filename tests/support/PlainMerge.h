#pragma once

#include "support/PlainRepository.h"

namespace KivVcs {

/// A merge as documented: directory by directory, the files of each before its directories.
class PlainMerge {
public:
    /// Settles the conflict at a path; returns the number of one of the library's choices.
    using Ask = std::function<int(std::string const& path, bool isTree)>;
    using Side = optional<PlainTree>;

    PlainMerge(PlainRepository& repository, Ask ask) : repository_(repository), ask_(std::move(ask)) {}

    /// Nothing if there is no tree, or if the merge gave up.
    Side Run(Side const& left, Side const& root, Side const& right) {
        try {
            return Merge(left, root, right, "");
        } catch (GaveUp const&) {
            return {};
        }
    }

private:
    struct GaveUp {};

    template <class Choice>
    Choice AskAbout(std::string const& path) {
        const auto choice = static_cast<Choice>(ask_(path, std::is_same_v<Choice, TreeConflictChoice>));
        return choice == Choice::Undecided ? throw GaveUp() : choice;
    }

    Side Merge(Side const& left, Side const& root, Side const& right, std::string const& path) {
        if (left && right ? IdOf(*left) == IdOf(*right) : !left && !right)
            return left;
        const auto choice = AskAbout<TreeConflictChoice>(path);
        if (choice != TreeConflictChoice::Merge)
            return choice == TreeConflictChoice::Root ? root : choice == TreeConflictChoice::Left ? left : right;
        const PlainTree base = root.value_or(PlainTree());
        const PlainTree mine = left.value_or(PlainTree());
        const PlainTree theirs = right.value_or(PlainTree());
        PlainTree result = base;
        for (const bool ofTrees : {false, true}) {
            const auto changedHere = LocalDiffs(base, mine, ofTrees);
            const auto changedThere = LocalDiffs(base, theirs, ofTrees);
            Names conflicts;
            std::set_intersection(changedHere.begin(), changedHere.end(), changedThere.begin(), changedThere.end(),
                                  std::back_inserter(conflicts));
            std::erase_if(conflicts,
                          [&](auto const& name) { return VisibleId(mine, name) == VisibleId(theirs, name); });
            for (auto const& name : ofTrees ? Names() : conflicts) {
                const auto wanted = AskAbout<ConflictChoice>(path + name);
                if (wanted != ConflictChoice::Root)
                    Use(result, wanted == ConflictChoice::Left ? mine : theirs, name);
            }
            for (auto const& [changed, from] : {std::pair(&changedThere, &theirs), std::pair(&changedHere, &mine)})
                for (auto const& name : *changed)
                    if (!std::binary_search(conflicts.begin(), conflicts.end(), name))
                        Use(result, *from, name);
            for (auto const& name : ofTrees ? conflicts : Names()) {
                const auto below = [&name](PlainTree const& tree) {
                    return tree.trees.contains(name) ? Side(tree.trees.at(name)) : Side();
                };
                if (const auto merged = Merge(below(mine), below(base), below(theirs), path + name + "/"))
                    repository_.AddTo(result, {name}, *merged);
                else
                    Remove(result, Names{name});
            }
        }
        return result;
    }

    void Use(PlainTree& result, PlainTree const& from, std::string const& name) {
        Remove(result, Names{name});
        if (from.blobs.contains(name))
            repository_.AddTo(result, {name}, from.blobs.at(name));
        else if (from.trees.contains(name))
            repository_.AddTo(result, {name}, from.trees.at(name));
    }

    PlainRepository& repository_;
    Ask ask_;
};

} // namespace KivVcs
