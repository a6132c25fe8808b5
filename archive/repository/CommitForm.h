#pragma once

/// @file
/// Reading commits exactly.

#include "KivArchive/IArchive.h"

#include <KivVcs/Commit.h>

namespace KivArchive {

/// The commit that is packed to the given data, with its parent and root deferred; null if no commit is.
/// @param id the digest of that packed form
[[nodiscard]] KivVcs::cow_ptr<KivVcs::Commit> ReadCommit(Id const& id, std::span<const std::byte> data,
                                                         KivVcs::Commit::FetchCommit fetchParent,
                                                         KivVcs::Commit::FetchTree fetchRoot);

} // namespace KivArchive
