#pragma once

#include "Progress.h"
#include "VaultFile.h"

#include <string>
#include <vector>

namespace vault {

/// What is wrong with a vault file, one line for each object: packed forms that do not hash to their identifier, and
/// objects that others, or branches, refer to and that are missing. Reads every object; keeps only identifiers in
/// memory.
[[nodiscard]] std::vector<std::string> FindDamage(VaultFile& file, Progress& progress);

} // namespace vault
