#include "Content.h"
#include "Measuring.h"

#include <algorithm>
#include <stdexcept>

namespace KivVcs::Bench {

namespace {

/// A commit on top of @p parent that no other one is equal to.
cow_ptr<Commit> CommitOn(cow_ptr<Commit> parent, std::int64_t number) {
    Commit commit(std::move(parent), false);
    commit.SetCommitTime(Time(static_cast<std::uint64_t>(number) * 10'000'000));
    return immu::make<Commit>(std::move(commit));
}

/// Rounds that let @p work loose on a new repository that @p prepare has filled.
template <class Prepare, class Work>
Round On(std::int64_t count, Prepare prepare, Work work) {
    return [=] {
        Measurement result{.operations = static_cast<std::uint64_t>(count)};
        const auto repo = MakeRepository();
        auto prepared = prepare(*repo, count);
        bool good = true;
        result.seconds = LibrarySecondsOf([&] { good = work(*repo, std::move(prepared)); });
        if (!good)
            throw std::runtime_error("not done");
        return result;
    };
}

/// A line of commits of which every second one is stored, held by nobody else.
bool GrowHalfStored(Repository& repo, std::int64_t count) {
    cow_ptr<Commit> tip;
    for (std::int64_t number = 0; number < count; ++number) {
        tip = CommitOn(std::move(tip), number);
        if (number % 2 == 1)
            repo.AddCommitToStorage(tip);
    }
    return true;
}

bool Purge(Repository& repo, bool) {
    repo.UpdateStorage();
    return repo.GetCommitCount() == 0;
}

/// A line of stored commits, and as many branches at its root. @return the tip
cow_ptr<Commit> GrowBelowBranches(Repository& repo, std::int64_t count) {
    cow_ptr<Commit> tip;
    for (std::int64_t number = 0; number < count; ++number) {
        tip = repo.SyncWithStorage(CommitOn(std::move(tip), number));
        repo.CreateBranch(Numbered("branch", number), number == 0 ? tip : repo.GetHead(Numbered("branch", 0)));
    }
    repo.MoveBranchTo(u"master", tip);
    return tip;
}

bool DeleteAll(Repository& repo, cow_ptr<Commit> tip) {
    return repo.DeleteCommits(std::move(tip)) && repo.GetCommitCount() == 2;
}

/// A trunk with a branch growing from each of its commits.
bool GrowBranches(Repository& repo, std::int64_t count) {
    cow_ptr<Commit> trunk;
    for (std::int64_t number = 0; number < count; ++number) {
        trunk = repo.SyncWithStorage(CommitOn(std::move(trunk), 2 * number));
        repo.CreateBranch(Numbered("branch", number), repo.SyncWithStorage(CommitOn(trunk, 2 * number + 1)));
    }
    return true;
}

bool Simplify(Repository& repo, bool) {
    return repo.SimplifyCommitGraph(true);
}

/// Directories that each name the next one twice.
cow_ptr<Tree> NestTwice(Repository& repo, std::int64_t count) {
    cow_ptr<Tree> tree = MakeTwoLevels(repo, 1, 1);
    for (std::int64_t number = 0; number < count; ++number) {
        Tree above;
        above.AddTree(&repo, u"left", *tree);
        above.AddTree(&repo, u"right", *tree);
        tree = immu::make<Tree>(std::move(above));
    }
    return tree;
}

/// Counted by 64 bits, which so many files do not fit into.
bool CountFiles(Repository&, cow_ptr<Tree> const& tree) {
    return tree->GetDeepBlobCount() == 0;
}

} // namespace

void AddScalingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors) {
    // Four times the objects take four times the instructions, but no longer fit into the caches.
    constexpr double linearBeyondCaches = 8;
    constexpr std::int64_t whole = 40'000;
    const auto add = [&](char const* name, auto prepare, auto work) {
        std::vector<std::int64_t> sizes{whole / divisors.back()};
        if (divisors.size() > 1)
            sizes = {whole / divisors.back() / 4, whole / divisors.back() / 2, whole / divisors.back()};
        for (const std::int64_t size : sizes)
            workloads.push_back({name, size, {0, 0, linearBeyondCaches}, [=] { return On(size, prepare, work); }});
    };
    add("B15 purge, every second commit not stored", GrowHalfStored, Purge);
    add("B16 deletion, as many branches as commits", GrowBelowBranches, DeleteAll);
    add("B17 simplification, a branch from each commit", GrowBranches, Simplify);
    add("B18 files counted below directories named twice", NestTwice, CountFiles);
}

} // namespace KivVcs::Bench
