#pragma once

#include <chrono>
#include <string>

namespace vault {

/// Replaces a vault file of the first release, if it is one, by one with the same versions under the same identifiers,
/// which appears whole in its place. Writes to standard error what that file had damaged, which is left out.
/// @throws Problem, KivArchive::ArchiveError; the file is as it was then
void UpgradeOldVault(std::string const& file, std::chrono::seconds wait);

} // namespace vault
