#pragma once

/// @file
/// Names, contents and trees of the workloads.

#include "KivVcs/Repository.h"

#include <string>
#include <vector>

namespace KivVcs::Bench {

using Path = KivStringT<char16_t>;

/// "PREFIXnumber", the number with at least six digits.
[[nodiscard]] Path Numbered(char const* prefix, std::int64_t number);

/// The paths of @p count files, spread evenly over @p directories.
[[nodiscard]] std::vector<Path> FilePaths(std::int64_t count, std::vector<int> const& directories);

/// A short content that depends on @p number and @p version.
[[nodiscard]] Buffer SmallContent(std::int64_t number, int version = 0);
/// The contents of files 0 to @p count, as a host has them that has read them.
[[nodiscard]] std::vector<Buffer> SmallContents(std::int64_t count, int version = 0);

/// The first level of the trees below.
[[nodiscard]] std::vector<Path> DirectoryNames(std::int64_t count);

/// A tree of the files in @p directories, evenly, built from the bottom up and stored. Takes the contents.
[[nodiscard]] cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::vector<Path> const& files,
                                          std::vector<Buffer>& contents, std::vector<Path> const& directories);
/// The same of numbered files, @p inEach directory.
[[nodiscard]] cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::int64_t files, std::int64_t inEach);

/// @p tree, made by `MakeTwoLevels`, with @p count files changed, from number @p first on in steps of @p step.
[[nodiscard]] cow_ptr<Tree> ChangeTwoLevels(Repository& repo, Tree const& tree, std::int64_t inEach, std::int64_t first,
                                            std::int64_t step, std::int64_t count, int version);

} // namespace KivVcs::Bench
