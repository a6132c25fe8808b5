#pragma once

/// @file
/// How a workload is measured: contender and floor in turn, in processor time of this thread.

#include "Memory.h"

#include "KivVcs/Repository.h"

#include <ctime>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace KivVcs::Bench {

/// One round of a workload.
struct Measurement {
    double seconds = 0;
    double floorSeconds = 0;
    std::int64_t keptBytes = 0;
    std::uint64_t operations = 1;
};

using Round = std::function<Measurement()>;

/// A row of the table. What it needs is made by `prepare`, outside of all times; limits of 0 are none.
struct Workload {
    std::string name;
    std::int64_t size = 0;
    double ratioLimit = 0;
    double bytesLimit = 0;
    std::function<Round()> prepare;
    int roundsInOne = 1;
};

/// The sizes that a workload is run with: a quarter and the whole, or one small size.
[[nodiscard]] std::vector<std::int64_t> Sizes(bool quick, std::int64_t whole);

void AddBuildingWorkloads(std::vector<Workload>& workloads, bool quick);
void AddReadingWorkloads(std::vector<Workload>& workloads, bool quick);
void AddHistoryWorkloads(std::vector<Workload>& workloads, bool quick);

/// The processor time that @p work takes, in seconds. Unlike the time on the wall it does not grow with what else the
/// machine does.
template <class Work>
[[nodiscard]] double SecondsOf(Work&& work) {
    const auto now = [] {
        std::timespec time{};
        clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
    };
    const double start = now();
    work();
    return now() - start;
}

/// The bytes that a workload must hash, hashed as fast as the best known implementation can: one digest for each piece.
class HashFloor {
public:
    HashFloor();
    /// Pieces of the given sizes, all read from the same bytes, which stay in the cache.
    void Add(std::uint64_t size) { sizes_.push_back(size); }
    /// The packed forms of everything that @p repo stores.
    void AddStored(Repository const& repo);
    /// The packed form of a tree, without leaving it cached.
    void AddTree(Tree const& tree);

    [[nodiscard]] bool IsEmpty() const noexcept { return sizes_.empty(); }
    /// The seconds that it takes. With @p content, pieces are read from there, one after the other.
    [[nodiscard]] double Run(std::vector<char> const* content = nullptr);

private:
    struct Context;

    std::vector<std::uint64_t> sizes_;
    std::vector<char> scratch_;
    std::shared_ptr<Context> context_;
};

/// A repository in memory.
[[nodiscard]] std::unique_ptr<Repository> MakeRepository();

/// Rounds that let @p work fill a new repository, and hash what that stored as the floor. @p content holds the bytes of
/// the blobs one after the other, where they are too many for the cache.
template <class Work>
[[nodiscard]] Round Storing(std::uint64_t operations, Work work, std::vector<char> const* content = nullptr) {
    return [operations, work, content, floor = HashFloor()]() mutable {
        Measurement result{.operations = operations};
        const std::int64_t before = LiveBytes();
        auto repo = MakeRepository();
        result.seconds = SecondsOf([&] { work(*repo); });
        result.keptBytes = LiveBytes() - before;
        if (floor.IsEmpty())
            floor.AddStored(*repo);
        repo.reset();
        result.floorSeconds = floor.Run(content);
        return result;
    };
}

} // namespace KivVcs::Bench
