#pragma once

/// @file
/// What else does a workload's work: another library, or a few lines written for it alone.

#include <cstdint>
#include <functional>

namespace KivVcs::Bench {

/// Does a workload's work, and returns the seconds that it took.
using ContenderRound = std::function<double()>;

struct Contender {
    const char* name = "";
    /// Makes what it needs, outside of all times; null if there is no contender.
    std::function<ContenderRound()> prepare{};
    /// How much of its time the library may take; 0 is no limit.
    double limit = 0;
};

/// libgit2, which keeps its objects in memory, too. No contenders where it was not installed.

/// Stores @p count blobs of @p size bytes.
[[nodiscard]] Contender Libgit2Blobs(std::int64_t count, std::int64_t size);
/// Stores small files, a hundred in each directory, directory by directory.
[[nodiscard]] Contender Libgit2Directories(std::int64_t files, std::int64_t contentSize);
/// Stores small files in three levels of directories, one after the other, each time with the directories on its way.
[[nodiscard]] Contender Libgit2FilesByPath(std::int64_t files);
/// Stores a commit for each change of one of a thousand files.
[[nodiscard]] Contender Libgit2Commits(std::int64_t commits);

} // namespace KivVcs::Bench
