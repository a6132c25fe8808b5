#pragma once

#include "tree/ForEachDifference.h"
#include "tree/PathPrefix.h"

namespace KivVcs::detail {

/// Walks two trees side by side, a pair of directories of the same path after the other, each before those in it, with a
/// stack of its own, since directories may be nested deeper than calls can be. Either directory of a pair may be null. Both
/// trees stay as they are meanwhile, and hold all that it looks at.
class DirectoryPairs {
public:
    DirectoryPairs(Tree const* mine, Tree const* theirs) : mine_(mine), theirs_(theirs) {}

    /// Hands the names under which the pair differs to @p visit, as the function for nodes does, which returns whether the
    /// directories of that name are a pair to be entered.
    template <class Visit>
    void ForEachDifference(Visit const& visit) {
        const auto before = static_cast<std::ptrdiff_t>(open_.size());
        detail::ForEachDifference(
            TopOf(mine_), TopOf(theirs_), [&](KivStringT<char16_t> const& name, Held const& mine, Held const& theirs) {
                if (visit(name, mine, theirs))
                    open_.push_back({&name, mine.GetTree(), theirs.GetTree(), prefix_.GetLength()});
            });
        std::reverse(open_.begin() + before, open_.end());
    }

    /// Goes to the next pair, the first one of the directory that it is in where there is one; false behind the last.
    [[nodiscard]] bool Next() {
        if (open_.empty())
            return false;
        const Pair next = open_.back();
        open_.pop_back();
        prefix_.Enter(next.prefixLength, *next.name);
        mine_ = next.mine;
        theirs_ = next.theirs;
        return true;
    }

    /// The path of an entry of the pair. @throws std::bad_alloc; std::length_error for a path that is longer than a text can be
    [[nodiscard]] KivStringT<char16_t> PathOf(KivStringT<char16_t> const& name) const { return prefix_.PathOf(name); }

private:
    /// How much of the prefix of the pair entered last is also the beginning of this one's, and the name that follows it.
    struct Pair {
        KivStringT<char16_t> const* name;
        Tree const* mine;
        Tree const* theirs;
        std::size_t prefixLength;
    };

    Tree const* mine_;
    Tree const* theirs_;
    PathPrefix prefix_;
    std::vector<Pair> open_;
};

} // namespace KivVcs::detail
