#pragma once

#include <KivVcs/KivVcs.h>

#include <functional>

/// Gives packed forms by identifier, from wherever they are kept; an empty buffer for what is not there.
using Fetch = std::function<KivVcs::Buffer(KivVcs::Id const&)>;

/// Reads a commit with its history and all files, as far as the repository does not hold them yet, and stores them. Branches are
/// the caller's. Null if anything is missing, damaged, or says what the packed form cannot: nothing is taken on trust.
KivVcs::cow_ptr<KivVcs::Commit> LoadHistory(KivVcs::Repository& repository, KivVcs::Id const& head, Fetch const& fetch);
