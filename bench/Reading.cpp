#include "Content.h"
#include "Measuring.h"

#include <algorithm>
#include <random>
#include <stdexcept>
#include <unordered_map>
#include <unordered_set>

namespace KivVcs::Bench {

namespace {

constexpr std::int64_t inEachDirectory = 100;

void Require(bool good, char const* what) {
    if (!good)
        throw std::runtime_error(what);
}

/// The floor builds the paths of the result from their parts, in any order, and sorts them.
Round Differences(std::int64_t files, std::int64_t changes) {
    const std::shared_ptr<Repository> repo = MakeRepository();
    const auto base = MakeTwoLevels(*repo, files, inEachDirectory);
    const auto changed = ChangeTwoLevels(*repo, *base, inEachDirectory, 0, files / changes, changes, 1);
    std::vector<std::pair<Path, Path>> parts;
    for (Path const& path : base->GetDeepBlobDiffs(changed)) {
        const int slash = path.Find(u"/");
        parts.emplace_back(path.Left(slash), path.Mid(slash + 1));
    }
    Require(parts.size() == static_cast<std::size_t>(changes), "wrong differences");
    std::shuffle(parts.begin(), parts.end(), std::mt19937_64(1));
    return [=] {
        Measurement result{.operations = static_cast<std::uint64_t>(changes)};
        const std::int64_t before = LiveBytes();
        PathList paths;
        result.seconds = SecondsOf([&] { paths = base->GetDeepBlobDiffs(changed); });
        result.keptBytes = LiveBytes() - before;
        PathList sorted;
        result.floorSeconds = SecondsOf([&] {
            for (auto const& [directory, name] : parts) {
                Path path(directory);
                path += u'/';
                path += name;
                sorted.push_back(std::move(path));
            }
            std::sort(sorted.begin(), sorted.end());
        });
        Require(paths == sorted, "wrong differences");
        // Keeps the repository, and so the trees' identifiers, until the last round.
        Require(repo != nullptr, "no repository");
        return result;
    };
}

Round Merge(std::int64_t files, std::int64_t conflicts) {
    const std::shared_ptr<Repository> repo = MakeRepository();
    const std::int64_t changes = files / 100;
    MergeTrees trees;
    trees.root = MakeTwoLevels(*repo, files, inEachDirectory);
    trees.left = ChangeTwoLevels(*repo, *trees.root, inEachDirectory, 0, 100, changes, 1);
    trees.right = ChangeTwoLevels(*repo, *trees.root, inEachDirectory, 50, 100, changes - conflicts, 2);
    if (conflicts > 0)
        trees.right = ChangeTwoLevels(*repo, *trees.right, inEachDirectory, 0, 100, conflicts, 2);
    const auto known = std::make_shared<std::unordered_set<Id>>();
    for (auto const& [id, tree] : repo->GetStorage()->GetTrees())
        known->insert(id);
    const Resolvers resolvers{AlwaysChooseLeft(), always_return_t<TreeConflictChoice>{TreeConflictChoice::Merge}};

    return [=, floor = HashFloor()]() mutable {
        Measurement result{.operations = static_cast<std::uint64_t>(2 * changes)};
        const std::int64_t before = LiveBytes();
        cow_ptr<Tree> merged;
        result.seconds = SecondsOf([&] { merged = ThreeWayMerge(repo.get(), trees, resolvers); });
        result.keptBytes = LiveBytes() - before;
        Require(merged && !merged->HasSameId(*trees.left), "the merge gave up");
        if (floor.IsEmpty()) {
            for (auto const& [id, tree] : repo->GetStorage()->GetTrees()) {
                if (!known->contains(id))
                    floor.AddTree(*tree);
            }
        }
        merged.reset();
        repo->UpdateStorage();
        result.floorSeconds = floor.Run();
        return result;
    };
}

Round ReadBack(std::int64_t files) {
    const auto packed = std::make_shared<std::unordered_map<Id, Buffer>>();
    HashFloor floor;
    Id rootId;
    {
        const auto repo = MakeRepository();
        rootId = MakeTwoLevels(*repo, files, inEachDirectory)->GetId();
        floor.AddStored(*repo);
        const auto pack = [&packed](auto const& table) {
            for (auto const& [id, object] : table)
                packed->emplace(id, object->GetPackedData());
        };
        pack(repo->GetStorage()->GetBlobs());
        pack(repo->GetStorage()->GetTrees());
    }
    return [=]() mutable {
        Measurement result{.operations = static_cast<std::uint64_t>(files)};
        const auto repo = MakeRepository();
        const std::int64_t before = LiveBytes();
        cow_ptr<Tree> tree;
        result.seconds = SecondsOf([&] {
            tree = Tree::Deserialize(rootId, repo.get(), [&packed](Id const& id) {
                const auto found = packed->find(id);
                return found == packed->end() ? StreamIO() : StreamIO(MemStream::CreateOnRef(found->second));
            });
        });
        result.keptBytes = LiveBytes() - before;
        Require(tree && tree->GetId() == rootId, "read back something else");
        result.floorSeconds = floor.Run();
        return result;
    };
}

} // namespace

void AddReadingWorkloads(std::vector<Workload>& workloads, bool quick) {
    const auto sizes = Sizes(quick, 100'000);
    for (std::int64_t files : sizes) {
        files -= files % inEachDirectory;
        for (const std::int64_t changes : {files / 10, std::int64_t{100}, std::int64_t{1}})
            workloads.push_back({"B8 differences, " + std::to_string(changes) + " of the files", files, 3, 0,
                                 [=] { return Differences(files, changes); }, changes > 100 ? 1 : 10});
        for (const std::int64_t conflicts : {std::int64_t{0}, files / 1000})
            workloads.push_back({"B9 merge, " + std::to_string(conflicts) + " conflicts", files, 8, 8192,
                                 [=] { return Merge(files, conflicts); }});
        workloads.push_back({"B11 files read back", files, 3.5, 0, [=] { return ReadBack(files); }});
    }
}

} // namespace KivVcs::Bench
