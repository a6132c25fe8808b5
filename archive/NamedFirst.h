#pragma once

/// @file
/// The order in which an archive takes objects: what is named before what names it.

#include <span>
#include <unordered_set>
#include <utility>
#include <vector>

namespace KivArchive {

/// Visits @p roots and what they lead to, each once and behind all that it names, with a stack of its own, since neither
/// histories nor directories have a bound that a thread's stack would hold. In a cycle, the one that is met first comes last.
/// @param enter called as `enter(key, named)` when a key is met: adds what it names to an empty list, the last one to be met
/// first, or returns false if the key is to be left out
/// @param visit called with each key that was entered, once all that it names has been visited
template <class Key, class Enter, class Visit>
void VisitNamedFirst(std::span<Key const> roots, Enter const& enter, Visit const& visit) {
    std::unordered_set<Key> entered;
    std::vector<std::pair<Key, bool>> open;
    std::vector<Key> named;
    for (Key const& root : roots) {
        open.emplace_back(root, false);
        while (!open.empty()) {
            auto const [key, isDone] = std::move(open.back());
            open.pop_back();
            if (isDone) {
                visit(key);
                continue;
            }
            named.clear();
            if (entered.contains(key) || !enter(key, named))
                continue;
            entered.insert(key);
            open.emplace_back(key, true);
            for (Key& each : named)
                open.emplace_back(std::move(each), false);
        }
    }
}

} // namespace KivArchive
