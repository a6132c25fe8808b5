#include "Content.h"
#include "Measuring.h"

#include <algorithm>
#include <stdexcept>
#include <unordered_set>

namespace KivVcs::Bench {

namespace {

/// @p count commits on top of @p tip, stored if there is a repository.
cow_ptr<Commit> Grow(Repository* repo, cow_ptr<Commit> tip, std::int64_t count, char16_t const* author) {
    const KivStringT<char16_t> name(author);
    for (std::int64_t number = 0; number < count; ++number) {
        Commit commit(std::move(tip), false);
        commit.SetAuthorName(name);
        commit.SetCommitTime(Time(static_cast<std::uint64_t>(number) * 10'000'000));
        tip = immu::make<Commit>(std::move(commit));
        if (repo != nullptr)
            tip = repo->SyncWithStorage(std::move(tip));
    }
    return tip;
}

/// The floor inserts the identifiers of both chains into a table that was made large enough.
Round CommonBase(std::int64_t count) {
    const std::shared_ptr<Repository> repo = MakeRepository();
    const auto base = Grow(repo.get(), nullptr, 1, u"base");
    const auto first = Grow(repo.get(), base, count, u"first");
    const auto second = Grow(repo.get(), base, count, u"second");
    std::vector<Id> ids;
    for (Commit const *left = first.operator->(), *right = second.operator->(); left != base.operator->();) {
        ids.push_back(left->GetId());
        ids.push_back(right->GetId());
        left = left->GetParent().operator->();
        right = right->GetParent().operator->();
    }
    return [=] {
        Measurement result{.operations = static_cast<std::uint64_t>(2 * count)};
        const MemoryTaken taken;
        ForgetPeak();
        const std::int64_t before = LiveBytes();
        cow_ptr<Commit> found;
        result.seconds = LibrarySecondsOf([&] { found = repo->GetCommonBase(first, second); });
        taken.WriteTo(result);
        // Nothing stays: what counts is what was needed meanwhile.
        result.keptBytes = PeakBytes() - before;
        if (!(found == base))
            throw std::runtime_error("another common base");
        std::unordered_set<Id> table;
        table.reserve(ids.size());
        result.floorSeconds = SecondsOf([&] {
            for (Id const& id : ids)
                table.insert(id);
        });
        return result;
    };
}

/// The floor walks down every parent link once. Half of the commits are a trunk, the others grow from it as branches.
Round Simplification(std::int64_t count, int branches) {
    return [=] {
        Measurement result{.operations = static_cast<std::uint64_t>(count)};
        const auto repo = MakeRepository();
        const std::int64_t onTrunk = branches == 1 ? count : count / 2;
        cow_ptr<Commit> trunk;
        std::vector<std::pair<cow_ptr<Commit>, std::int64_t>> lines;
        for (int branch = 1; branch < branches; ++branch) {
            trunk = Grow(repo.get(), trunk, onTrunk / branches, u"trunk");
            const std::int64_t length = (count - onTrunk) / (branches - 1);
            lines.emplace_back(Grow(repo.get(), trunk, length, Numbered("branch", branch).GetString()), length);
            repo->CreateBranch(Numbered("branch", branch), lines.back().first);
        }
        trunk = Grow(repo.get(), trunk, onTrunk / branches, u"trunk");
        lines.emplace_back(trunk, onTrunk);
        repo->MoveBranchTo(u"master", trunk);
        std::uint64_t ticks = 0;
        result.floorSeconds = SecondsOf([&] {
            for (auto const& [tip, length] : lines) {
                Commit const* commit = tip.operator->();
                for (std::int64_t step = 0; step < length && commit != nullptr; ++step) {
                    ticks += commit->GetCommitTime().GetTicks();
                    commit = commit->GetParent().operator->();
                }
            }
        });
        trunk.reset();
        lines.clear();
        bool good = ticks > 0;
        result.seconds = LibrarySecondsOf([&] { good &= repo->SimplifyCommitGraph(true); });
        if (!good)
            throw std::runtime_error("not simplified");
        return result;
    };
}

double ReleaseChain(std::int64_t count, bool stored) {
    auto repo = MakeRepository();
    cow_ptr<Commit> tip = Grow(stored ? repo.get() : nullptr, nullptr, count, u"author");
    return LibrarySecondsOf([&] {
        repo.reset();
        tip.reset();
    });
}

double ReleaseDeepTree(std::int64_t depth) {
    auto repo = MakeRepository();
    cow_ptr<Tree> tree = MakeTwoLevels(*repo, 1, 1);
    for (std::int64_t level = 0; level < depth; ++level) {
        Tree above;
        above.AddTree(repo.get(), u"d", *tree);
        tree = immu::make<Tree>(std::move(above));
    }
    repo.reset();
    return LibrarySecondsOf([&] { tree.reset(); });
}

/// The floor is four times what a quarter of the size takes, so that the ratio shows how far from linear it is.
template <class Release>
Round Growth(std::int64_t size, Release release) {
    return [=] {
        Measurement result;
        result.floorSeconds = 4 * release(size / 4);
        result.seconds = release(size);
        return result;
    };
}

} // namespace

void AddHistoryWorkloads(std::vector<Workload>& workloads, Divisors const& divisors) {
    const auto add = [&](std::string const& name, std::int64_t least, Limits limits, auto rounds) {
        for (const std::int64_t divisor : divisors) {
            const std::int64_t count = std::max(100'000 / divisor, least);
            workloads.push_back({name, count, limits, [=] { return rounds(count); }});
        }
    };
    // Four times the commits take four times the instructions, but no longer fit into the caches.
    constexpr double linearBeyondCaches = 8;
    add("B10 common base of two chains", 0, {1, 64}, CommonBase);
    for (const int branches : {1, 20, 1000})
        add("B12 simplification, branches: " + std::to_string(branches), 4 * branches, {0, 0, linearBeyondCaches},
            [=](std::int64_t count) { return Simplification(count, branches); });

    constexpr double linear = 1.5;
    const auto addGrowth = [&](char const* name, std::int64_t whole, auto release) {
        workloads.push_back({name, whole / divisors.back(), {linear}, [=, size = whole / divisors.back()] {
                                 return Growth(size, release);
                             }});
    };
    addGrowth("B13 a chain released", 1'000'000, [](auto size) { return ReleaseChain(size, false); });
    addGrowth("B13 a repository of it released", 1'000'000, [](auto size) { return ReleaseChain(size, true); });
    addGrowth("B13 a deep tree released", 100'000, ReleaseDeepTree);
}

} // namespace KivVcs::Bench
