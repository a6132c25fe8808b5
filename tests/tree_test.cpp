#include "PackedForms.h"
#include "RecordingRepository.h"

#include <gtest/gtest.h>

#include <random>
#include <set>

namespace KivVcs {
namespace {

/// What a tree should hold, kept in the plainest way.
struct Model {
    std::map<std::string, std::string> blobs;
    std::map<std::string, Model> trees;

    [[nodiscard]] bool IsEmpty() const { return blobs.empty() && trees.empty(); }
};

std::string Data(Model const& model) {
    std::map<std::string, std::string> entries;
    for (auto const& [name, content] : model.blobs)
        entries.emplace(name, Entry("blob", name, Identifier("blob", content)));
    for (auto const& [name, tree] : model.trees)
        entries.emplace(name, Entry("tree", name, Identifier("tree", Data(tree))));
    std::string data;
    for (auto const& [name, entry] : entries)
        data += entry;
    return data;
}

std::string VisibleId(Model const& model, std::string const& name) {
    if (auto const blob = model.blobs.find(name); blob != model.blobs.end())
        return Identifier("blob", blob->second);
    auto const tree = model.trees.find(name);
    return tree == model.trees.end() ? "" : Identifier("tree", Data(tree->second));
}

std::set<std::string> LocalDiffs(Model const& left, Model const& right, bool ofTrees) {
    std::set<std::string> names;
    for (auto const& [mine, theirs] : {std::pair(&left, &right), std::pair(&right, &left)}) {
        if (ofTrees) {
            for (auto const& [name, tree] : mine->trees)
                if (VisibleId(*theirs, name) != Identifier("tree", Data(tree)))
                    names.insert(name);
        } else {
            for (auto const& [name, content] : mine->blobs)
                if (VisibleId(*theirs, name) != Identifier("blob", content))
                    names.insert(name);
        }
    }
    return names;
}

// The paths of a single tree are its differences from an empty one.
std::set<std::string> DeepDiffs(Model const& left, Model const& right) {
    static const Model none;
    const auto below = [](Model const& model, std::string const& name) -> Model const& {
        auto const found = model.trees.find(name);
        return found == model.trees.end() ? none : found->second;
    };
    std::set<std::string> paths = LocalDiffs(left, right, false);
    for (std::string const& name : LocalDiffs(left, right, true))
        for (std::string const& path : DeepDiffs(below(left, name), below(right, name)))
            paths.insert(name + "/" + path);
    return paths;
}

bool Remove(Model& model, std::span<std::string const> path) {
    auto const sub = model.trees.find(path[0]);
    if (path.size() > 1) {
        if (sub == model.trees.end() || !Remove(sub->second, path.subspan(1)))
            return false;
        if (!sub->second.IsEmpty())
            return true;
    }
    return model.blobs.erase(path[0]) + model.trees.erase(path[0]) > 0;
}

Names Sorted(std::set<std::string> const& names) {
    return {names.begin(), names.end()};
}

/// A tree together with what it should hold.
struct Version {
    cow_ptr<Tree> tree = immu::make<Tree>();
    Model model{};

    void Check() const {
        ASSERT_EQ(Bytes(tree->GetData()), Data(model));
        ASSERT_EQ(Narrow(tree->GetId().GetText()), Identifier("tree", Data(model)));
        ASSERT_EQ(tree->IsEmpty(), model.IsEmpty());
        ASSERT_EQ(tree->GetLocalObjectCount(), model.blobs.size() + model.trees.size());
        ASSERT_EQ(tree->GetLocalBlobCount(), model.blobs.size());
        Names blobs;
        Names objects;
        for (auto const& [name, below] : model.trees) {
            objects.push_back(name);
            ASSERT_TRUE(tree->GetLocalTree(Wide(name))) << name;
        }
        for (auto const& [name, content] : model.blobs) {
            blobs.push_back(name);
            ASSERT_TRUE(tree->GetLocalBlob(Wide(name))) << name;
        }
        ASSERT_EQ(ToNames(tree->GetLocalSubtreePaths()), objects);
        ASSERT_EQ(ToNames(tree->GetLocalBlobPaths()), blobs);
        objects.insert(objects.end(), blobs.begin(), blobs.end());
        ASSERT_EQ(ToNames(tree->GetLocalObjectPaths()), objects);
        ASSERT_EQ(ToNames(tree->GetDeepBlobPaths()), Sorted(DeepDiffs(model, {})));
        ASSERT_EQ(tree->GetDeepBlobDiffs(nullptr), tree->GetDeepBlobPaths());
    }

    void CheckAgainst(Version const& other) const {
        ASSERT_EQ(ToNames(tree->GetLocalBlobDiffs(other.tree)), Sorted(LocalDiffs(model, other.model, false)));
        ASSERT_EQ(ToNames(tree->GetLocalTreeDiffs(other.tree)), Sorted(LocalDiffs(model, other.model, true)));
        ASSERT_EQ(ToNames(tree->GetDeepBlobDiffs(other.tree)), Sorted(DeepDiffs(model, other.model)));
    }
};

class RandomTrees : public testing::TestWithParam<int> {
protected:
    int Below(int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); }

    std::mt19937 random{static_cast<unsigned>(GetParam())};
    Version now;
    std::vector<Version> former{now};
};

TEST_P(RandomTrees, NestedTreesFollowThePlainModel) {
    // A storage may exchange a tree for an equal one without the subtrees that a blob hides, so names are doubled only
    // where there is none.
    const bool doubled = GetParam() % 2 == 0;
    Repository repo(doubled ? nullptr : std::make_unique<MemObjectsStorage>());
    for (int step = 0; step < 600; ++step) {
        std::vector<std::string> path;
        for (int depth = Below(4); depth >= 0; --depth)
            path.push_back(std::string(1, static_cast<char>('a' + Below(3))));
        const int action = Below(5);
        const auto wide = [&path] {
            std::string joined;
            for (auto const& name : path)
                joined += "/" + name;
            return Wide(joined);
        };
        if (action == 0 || action == 1) {
            if (!doubled)
                path.back() = action == 0 ? path.back() : "file";
            ASSERT_EQ(now.tree.write()->RemoveObject(&repo, wide()), Remove(now.model, path));
        } else {
            if (!doubled && action != 4)
                path.back() = "file";
            Version const& added = former[static_cast<std::size_t>(Below(static_cast<int>(former.size())))];
            if (added.tree->GetDeepBlobCount() > 30)
                continue;
            Model* holder = &now.model;
            for (std::size_t level = 0; level + 1 < path.size(); ++level)
                holder = &holder->trees[path[level]];
            if (action == 4) {
                holder->trees[path.back()] = added.model;
                ASSERT_TRUE(now.tree.write()->AddTree(&repo, wide(), *added.tree));
            } else {
                const std::string content = std::to_string(Below(3));
                holder->blobs[path.back()] = content;
                ASSERT_TRUE(now.tree.write()->AddBlob(&repo, wide(), MakeBlob(content)));
            }
        }
        ASSERT_NO_FATAL_FAILURE(now.Check()) << step;
        ASSERT_NO_FATAL_FAILURE(now.CheckAgainst(former[random() % former.size()])) << step;
        if (Below(10) == 0)
            former.push_back(now);
    }
    for (Version const& version : former)
        ASSERT_NO_FATAL_FAILURE(version.Check());
}

TEST_P(RandomTrees, LargeDirectoriesFollowThePlainModel) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    const auto edit = [&](int number, bool add) {
        std::string digits = std::to_string(number);
        const std::string name = "n" + std::string(5 - digits.size(), '0') + digits;
        if (!add) {
            const bool removed = now.model.blobs.erase(name) + now.model.trees.erase(name) > 0;
            ASSERT_EQ(now.tree.write()->RemoveObject(&repo, Wide(name)), removed);
            return;
        }
        const std::string content = std::to_string(Below(3));
        const int kind = Below(8);
        if (kind != 0) {
            now.model.blobs[name] = content;
            now.tree.write()->AddBlob(&repo, Wide(name), MakeBlob(content));
        }
        if (kind <= 1) {
            now.model.trees[name].blobs = {{"f", content}};
            now.tree.write()->AddTree(&repo, Wide(name), *MakeTree(repo, "f=" + content));
        }
    };
    constexpr int most = 4000;
    for (int round = 0; round < 40; ++round) {
        const int from = round == 0 ? 0 : Below(most);
        const int count = round == 0 ? most : Below(most - from) + 1;
        std::vector<int> numbers;
        for (int index = 0; index < count; ++index)
            numbers.push_back(from + index);
        const int order = Below(3);
        if (order == 1)
            std::ranges::reverse(numbers);
        else if (order == 2)
            std::ranges::shuffle(numbers, random);
        // Some keep a few entries, so that sparse leaves are left behind; some add to what an erasure left.
        const bool add = round == 0 || Below(5) < 2;
        const int kept = Below(2) * (Below(9) + 2);
        for (int number : numbers) {
            if (kept == 0 || Below(kept) != 0) {
                ASSERT_NO_FATAL_FAILURE(edit(number, add));
            }
        }
        ASSERT_NO_FATAL_FAILURE(now.Check()) << round;
        ASSERT_NO_FATAL_FAILURE(now.CheckAgainst(former[random() % former.size()])) << round;
        if (Below(3) == 0)
            former.push_back(now);
    }
    for (Version const& version : former)
        ASSERT_NO_FATAL_FAILURE(version.Check());
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomTrees, testing::Range(1, 5));

} // namespace
} // namespace KivVcs
