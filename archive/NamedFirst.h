#pragma once

/// @file
/// The order in which an archive takes objects: each after those that it names.

#include "SmallTable.h"

#include <span>
#include <utility>
#include <vector>

namespace KivArchive {

/// Visits @p roots and what they lead to, each once and after all that it names. Has a stack of its own, since
/// histories and directories may be deeper than a thread's stack. Of a cycle, the key that is met first is visited
/// last.
/// @param enter called as `enter(key, named)` when a key is met: adds what it names to an empty list, of which the last
/// is met first, or returns false if the key is to be left out
/// @param visit called with each key that was entered, once all that it names has been visited
template <class Key, class Enter, class Visit>
void VisitNamedFirst(std::span<Key const> roots, Enter const& enter, Visit const& visit) {
    SmallSet<Key> entered;
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
            if (entered.Contains(key) || !enter(key, named))
                continue;
            entered.Add(key);
            open.emplace_back(key, true);
            for (Key& each : named)
                open.emplace_back(std::move(each), false);
        }
    }
}

} // namespace KivArchive
