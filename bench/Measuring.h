#pragma once

/// @file
/// How a workload is measured: contender and floor in turn, in processor time of this thread.

#include "Contenders.h"
#include "Memory.h"

#include "KivVcs/Repository.h"

#include <ctime>
#include <functional>
#include <memory>
#include <string>
#include <unordered_set>
#include <valgrind/callgrind.h>
#include <vector>

namespace KivVcs::Bench {

/// One round of a workload. Memory is reported only by rounds that are run while it is counted.
struct Measurement {
    double seconds = 0;
    double floorSeconds = 0;
    std::int64_t keptBytes = 0;
    std::int64_t residentBytes = 0;
    std::uint64_t operations = 1;
};

using Round = std::function<Measurement()>;

/// What a row of the table must stay below; 0 is no limit.
struct Limits {
    double ratio = 0;
    double bytes = 0;
    /// How much longer the whole size may take than a quarter of it.
    double growth = 0;
};

/// A row of the table. What it needs is made by `prepare`, outside of all times.
struct Workload {
    std::string name;
    std::int64_t size = 0;
    Limits limits;
    std::function<Round()> prepare;
    int roundsInOne = 1;
    Contender contender{};
};

/// The sizes to run with: the whole size of each workload, divided by each of these.
using Divisors = std::vector<std::int64_t>;

void AddBuildingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors);
void AddReadingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors);
void AddHistoryWorkloads(std::vector<Workload>& workloads, Divisors const& divisors);
void AddScalingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors);

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

/// The same of what the library does, the part of a round whose instructions are counted.
template <class Work>
[[nodiscard]] double LibrarySecondsOf(Work&& work) {
    return SecondsOf([&] {
        CALLGRIND_TOGGLE_COLLECT;
        work();
        CALLGRIND_TOGGLE_COLLECT;
    });
}

/// The memory taken and not given back since its construction, and the most that the process has grown meanwhile.
class MemoryTaken {
public:
    MemoryTaken();
    void WriteTo(Measurement& measurement) const;

private:
    std::int64_t live_;
    std::int64_t resident_;
};

/// The bytes that a workload must hash, hashed as fast as the best known implementation can: one digest for each piece.
class HashFloor {
public:
    HashFloor();
    /// Pieces of the given sizes, all read from the same bytes, which stay in the cache.
    void Add(std::uint64_t size) { sizes_.push_back(size); }
    /// The packed forms of everything that @p repo stores, except what is @p known.
    void AddStored(Repository const& repo, std::unordered_set<Id> const& known = {});
    /// The packed form of an object, made from a copy, so that it does not stay with the object.
    template <class T>
    void AddForm(T const& object) {
        Add(T(object).GetPackedData().GetSize());
    }

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
/// The identifiers of all that it stores.
[[nodiscard]] std::unordered_set<Id> StoredIds(Repository const& repo);

/// Rounds that let @p work fill a new repository with what @p bring has made ready, and hash what that stored as the
/// floor. @p content holds the bytes of the blobs one after the other, where they are too many for the cache.
template <class Bring, class Work>
[[nodiscard]] Round Storing(std::uint64_t operations, Bring bring, Work work,
                            std::shared_ptr<std::vector<char>> content = nullptr) {
    return [=, floor = HashFloor()]() mutable {
        Measurement result{.operations = operations};
        const MemoryTaken taken;
        auto brought = bring();
        auto repo = MakeRepository();
        result.seconds = LibrarySecondsOf([&] { work(*repo, brought); });
        brought = {};
        taken.WriteTo(result);
        if (floor.IsEmpty())
            floor.AddStored(*repo);
        repo.reset();
        result.floorSeconds = floor.Run(content.get());
        return result;
    };
}

} // namespace KivVcs::Bench
