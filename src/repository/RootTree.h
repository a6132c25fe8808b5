#pragma once

#include "KivVcs/Commit.h"

namespace KivVcs {

/// The root of a commit, fetched if it is deferred; null without a commit, a holder or a root.
[[nodiscard]] inline cow_ptr<Tree> RootTreeOf(cow_ptr<Commit> const& commit) {
    const auto tree = commit ? commit->GetCommitTree() : nullptr;
    return tree ? tree->GetRoot() : nullptr;
}

} // namespace KivVcs
