#pragma once

/// @file
/// Commits read exactly.

#include "KivArchive/IArchive.h"

#include <KivVcs/Commit.h>

namespace KivArchive {

/// The commit whose packed form has the given data, with its parent and root deferred; null if no commit has.
/// @param id the digest of that packed form
[[nodiscard]] KivVcs::cow_ptr<KivVcs::Commit> ReadCommit(Id const& id, std::span<const std::byte> data,
                                                         KivVcs::Commit::FetchCommit fetchParent,
                                                         KivVcs::Commit::FetchTree fetchRoot);

} // namespace KivArchive
