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

/// A short text that tells @p number and @p version.
[[nodiscard]] std::string SmallText(std::int64_t number, int version = 0);
[[nodiscard]] Blob MakeBlob(std::string const& text);

/// A file as the host has it, so that making it up is not measured.
struct HostFile {
    Path name;
    std::string text;
};
[[nodiscard]] std::vector<HostFile> MakeFiles(std::vector<Path> names, int version = 0);

/// The first level of the trees below.
[[nodiscard]] std::vector<Path> DirectoryNames(std::int64_t count);

/// A tree of @p files in @p directories, evenly, built from the bottom up and stored.
[[nodiscard]] cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::vector<HostFile> const& files,
                                          std::vector<Path> const& directories);
/// The same of numbered files, @p inEach directory.
[[nodiscard]] cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::int64_t files, std::int64_t inEach);

/// @p tree, made by `MakeTwoLevels`, with @p count files changed, from number @p first on in steps of @p step.
[[nodiscard]] cow_ptr<Tree> ChangeTwoLevels(Repository& repo, Tree const& tree, std::int64_t inEach, std::int64_t first,
                                            std::int64_t step, std::int64_t count, int version);

} // namespace KivVcs::Bench
