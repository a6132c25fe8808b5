#pragma once

#include "Text.h"

#include <string>

namespace vault {

using CommitHandle = KivVcs::cow_ptr<KivVcs::Commit>;

/// The commit that @p revision names: the head of a branch of that name, otherwise the commit whose identifier it is,
/// or begins.
/// @throws Problem if there is none or more than one
[[nodiscard]] CommitHandle FindRevision(KivVcs::Repository const& repository, std::string const& revision);

/// @p name as text.
/// @throws Problem if it cannot name a branch: such a branch could not be given as a revision, or not be printed
[[nodiscard]] Text RequireBranchName(std::string const& name);

/// The root tree; null if the commit has none.
[[nodiscard]] KivVcs::cow_ptr<KivVcs::Tree> RootOf(CommitHandle const& commit);

/// When the commit was made, in its author's time zone: 2026-01-31 18:05 +0100.
[[nodiscard]] std::string DescribeTime(KivVcs::Commit const& commit);

/// 'Name <mail>'
[[nodiscard]] std::string DescribeAuthor(KivVcs::Commit const& commit);

/// Enough of an identifier for people.
[[nodiscard]] std::string Shortened(KivVcs::Id const& id);

} // namespace vault
