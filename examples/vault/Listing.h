#pragma once

#include "Changes.h"
#include "Commands.h"

namespace vault {

/// Lists changes: for people, at most as many as they will read, and the number of the rest; or as JSON.
/// @return the exit status
int ListChanges(std::vector<PathChange> const& changes, ListingOptions const& listing);

} // namespace vault
