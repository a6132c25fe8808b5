#include "Content.h"
#include "Measuring.h"

#include <algorithm>
#include <memory>
#include <random>
#include <stdexcept>

namespace KivVcs::Bench {

namespace {

constexpr std::int64_t inEachDirectory = 100;

void Require(bool good, char const* what) {
    if (!good)
        throw std::runtime_error(what);
}

Path Join(Path const& directory, Path const& name) {
    return Path::Build(directory.GetLength() + 1 + name.GetLength(), [&](char16_t* units) {
        units = std::copy_n(directory.GetString(), directory.GetLength(), units);
        *units++ = u'/';
        std::copy_n(name.GetString(), name.GetLength(), units);
    });
}

/// The floor builds the paths of the result from their parts, in any order, and sorts them. Few changes are looked for
/// many times, since reading the clock takes longer than finding them.
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
    const auto sorted = [parts] {
        PathList paths;
        paths.reserve(parts.size());
        for (auto const& [directory, name] : parts)
            paths.push_back(Join(directory, name));
        std::sort(paths.begin(), paths.end());
        return paths;
    };
    Require(sorted() == base->GetDeepBlobDiffs(changed), "wrong differences");
    // The repository is kept until the last round, and so are the trees' identifiers.
    return [=, keptUntilThen = repo] {
        const std::int64_t times = CountsMemory() ? 1 : std::max<std::int64_t>(1, 1000 / changes);
        Measurement result{.operations = static_cast<std::uint64_t>(changes)};
        PathList paths;
        const MemoryTaken taken;
        result.seconds = LibrarySecondsOf([&] {
            for (std::int64_t time = 0; time < times; ++time)
                paths = base->GetDeepBlobDiffs(changed);
        });
        taken.WriteTo(result);
        result.floorSeconds = SecondsOf([&] {
            for (std::int64_t time = 0; time < times; ++time)
                paths = sorted();
        });
        result.seconds /= static_cast<double>(times);
        result.floorSeconds /= static_cast<double>(times);
        return result;
    };
}

/// A directory as nothing but names and digests, in order.
struct PlainDirectory {
    struct Entry {
        Path name;
        Id::Digest digest;
        /// The directory of that name, if it is one.
        std::unique_ptr<PlainDirectory> below;
    };
    std::vector<Entry> entries;
};

PlainDirectory ToPlain(Tree const& tree) {
    PlainDirectory plain;
    for (Path const& name : tree.GetLocalObjectPaths()) {
        const auto below = tree.GetLocalTree(name);
        plain.entries.push_back({name, *tree.GetLocalObject(name)->GetKnownDigest(),
                                 below ? std::make_unique<PlainDirectory>(ToPlain(*below)) : nullptr});
    }
    return plain;
}

/// Walks along the entries of both directories, in which the same names are directories.
void FindPlainDifferences(PlainDirectory const& older, PlainDirectory const& newer, Path const* prefix,
                          PathList& found) {
    auto left = older.entries.begin();
    auto right = newer.entries.begin();
    while (left != older.entries.end() || right != newer.entries.end()) {
        const int order = left == older.entries.end()    ? 1
                          : right == newer.entries.end() ? -1
                                                         : left->name.Compare(right->name);
        auto const& entry = order <= 0 ? *left : *right;
        if (order == 0 && left->digest != right->digest && left->below)
            FindPlainDifferences(*left->below, *right->below, &entry.name, found);
        else if (order != 0 || left->digest != right->digest)
            found.push_back(prefix == nullptr ? entry.name : Join(*prefix, entry.name));
        left += order <= 0 ? 1 : 0;
        right += order >= 0 ? 1 : 0;
    }
}

/// Finds the differences by a walk that is written for these directories alone.
Contender PlainDifferences(std::int64_t files, std::int64_t changes) {
    const auto prepare = [=] {
        const auto repo = MakeRepository();
        const auto base = MakeTwoLevels(*repo, files, inEachDirectory);
        const auto changed = ChangeTwoLevels(*repo, *base, inEachDirectory, 0, files / changes, changes, 1);
        const auto older = std::make_shared<PlainDirectory>(ToPlain(*base));
        const auto newer = std::make_shared<PlainDirectory>(ToPlain(*changed));
        const auto find = [=] {
            PathList found;
            FindPlainDifferences(*older, *newer, nullptr, found);
            return found;
        };
        Require(find() == base->GetDeepBlobDiffs(changed), "wrong differences");
        return [=, times = std::max<std::int64_t>(1, 1000 / changes)] {
            const double seconds = SecondsOf([&] {
                for (std::int64_t time = 0; time < times; ++time)
                    Require(!find().empty(), "no differences");
            });
            return seconds / static_cast<double>(times);
        };
    };
    return {"plain", prepare, 1.05};
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
    const auto known = StoredIds(*repo);
    const Resolvers resolvers{AlwaysChooseLeft(), always_return_t<TreeConflictChoice>{TreeConflictChoice::Merge}};

    return [=, floor = HashFloor()]() mutable {
        Measurement result{.operations = static_cast<std::uint64_t>(2 * changes)};
        const MemoryTaken taken;
        cow_ptr<Tree> merged;
        result.seconds = LibrarySecondsOf([&] { merged = ThreeWayMerge(repo.get(), trees, resolvers); });
        taken.WriteTo(result);
        Require(merged && !merged->HasSameId(*trees.left), "the merge gave up");
        if (floor.IsEmpty())
            floor.AddStored(*repo, known);
        merged.reset();
        repo->UpdateStorage();
        result.floorSeconds = floor.Run();
        return result;
    };
}

/// The host has the packed forms in the order in which they are asked for. What they were made from is kept until the last
/// round, so that what is read does not fill the gaps that it would leave in memory.
Round ReadBack(std::int64_t files) {
    using Forms = std::vector<std::pair<Id, Buffer>>;
    const std::shared_ptr<Repository> source = MakeRepository();
    const auto root = MakeTwoLevels(*source, files, inEachDirectory);
    const Id rootId = root->GetId();
    HashFloor floor;
    floor.AddStored(*source);
    const auto forms = std::make_shared<Forms>();
    forms->reserve(static_cast<std::size_t>(source->GetBlobCount() + source->GetTreeCount()));
    const auto add = [&forms](auto object) {
        Buffer const& form = object.GetPackedData();
        const auto fill = [&form](std::byte* bytes) { (void)form.Read(0, bytes, form.GetSize()); };
        forms->emplace_back(object.GetId(), Buffer::Build(form.GetSize(), fill));
    };
    add(Tree(*root));
    for (Path const& directory : root->GetLocalSubtreePaths()) {
        const auto tree = root->GetLocalTree(directory);
        add(Tree(*tree));
        for (Path const& name : tree->GetLocalBlobPaths())
            add(Blob(*tree->GetLocalBlob(name)));
    }
    return [=, keptUntilThen = source]() mutable {
        Measurement result{.operations = static_cast<std::uint64_t>(files)};
        const auto repo = MakeRepository();
        const MemoryTaken taken;
        cow_ptr<Tree> tree;
        auto next = forms->begin();
        const auto load = [&](Id const& id) {
            auto& form = *next++;
            return form.first == id ? StreamIO(MemStream::CreateOnRef(form.second)) : StreamIO();
        };
        result.seconds = LibrarySecondsOf([&] { tree = Tree::Deserialize(rootId, repo.get(), load); });
        taken.WriteTo(result);
        Require(tree && tree->GetId() == rootId && next == forms->end(), "read back something else");
        result.floorSeconds = floor.Run();
        return result;
    };
}

} // namespace

void AddReadingWorkloads(std::vector<Workload>& workloads, Divisors const& divisors) {
    const auto addBeside = [&](std::string const& name, Limits limits, auto rounds, auto contender) {
        for (const std::int64_t divisor : divisors) {
            const std::int64_t files = 100'000 / divisor / inEachDirectory * inEachDirectory;
            workloads.push_back({name, files, limits, [=] { return rounds(files); }, 1, contender(files)});
        }
    };
    const auto add = [&](std::string const& name, Limits limits, auto rounds) {
        addBeside(name, limits, rounds, [](auto) { return Contender(); });
    };
    const auto addDifferences = [&](std::string const& name, Limits limits, auto changes) {
        addBeside(
            "B8 differences, " + name, limits, [=](auto files) { return Differences(files, changes(files)); },
            [=](auto files) { return PlainDifferences(files, changes(files)); });
    };
    addDifferences("one file in ten", {3}, [](auto files) { return files / 10; });
    addDifferences("100 files", {3}, [](auto) { return 100; });
    addDifferences("10 files", {}, [](auto) { return 10; });
    addDifferences("1 file", {3}, [](auto) { return 1; });
    add("B9 merge without conflicts", {8, 8192}, [](auto files) { return Merge(files, 0); });
    add("B9 merge, conflicts in one change of ten", {8, 8192}, [](auto files) { return Merge(files, files / 1000); });
    add("B11 files read back", {2.5}, ReadBack);
}

} // namespace KivVcs::Bench
