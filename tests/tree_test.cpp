#include "support/Builders.h"
#include "support/PlainTree.h"

#include <gtest/gtest.h>

#include <numeric>
#include <random>

namespace KivVcs {
namespace {

/// A tree together with what it should hold.
struct Version {
    cow_ptr<Tree> tree = immu::make<Tree>();
    PlainTree model{};

    void Check() const {
        ASSERT_EQ(Bytes(tree->GetData()), Data(model));
        ASSERT_EQ(IdText(*tree), IdOf(model));
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
    static constexpr int largest = 4000;

    int Below(int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); }

    /// Some neighbours in any order.
    std::vector<int> PickNumbers(int from, int count) {
        std::vector<int> numbers(static_cast<std::size_t>(count));
        std::iota(numbers.begin(), numbers.end(), from);
        const int order = Below(3);
        if (order == 1)
            std::reverse(numbers.begin(), numbers.end());
        else if (order == 2)
            std::shuffle(numbers.begin(), numbers.end(), random);
        return numbers;
    }

    void Put(std::string const& name, std::string const& content) {
        now.model.blobs[name] = content;
        now.tree.write()->AddBlob(&repo, Wide(name), MakeBlob(content));
    }

    /// Adds or removes a blob, a subtree or both.
    void Edit(int number, bool add) {
        const std::string digits = std::to_string(number);
        const std::string name = "n" + std::string(5 - digits.size(), '0') + digits;
        if (!add) {
            const bool removed = now.model.blobs.erase(name) + now.model.trees.erase(name) > 0;
            ASSERT_EQ(now.tree.write()->RemoveObject(&repo, Wide(name)), removed);
            return;
        }
        const std::string content = std::to_string(Below(3));
        const int kind = Below(8);
        if (kind != 0)
            Put(name, content);
        if (kind <= 1) {
            now.model.trees[name].blobs = {{"f", content}};
            now.tree.write()->AddTree(&repo, Wide(name), *MakeTree(repo, "f=" + content));
        }
    }

    /// Gives a few blobs other contents, which leave the packed form as long as it is.
    void EditContents(int round) {
        for (int few = Below(12); few > 0 && !now.model.blobs.empty(); --few) {
            const auto picked = std::next(now.model.blobs.begin(), Below(static_cast<int>(now.model.blobs.size())));
            Put(std::string(picked->first), std::to_string(round));
            if (few % 3 == 0) {
                ASSERT_EQ(IdText(*now.tree), IdOf(now.model)) << round;
            }
        }
    }

    std::mt19937 random{static_cast<unsigned>(GetParam())};
    Repository repo{std::make_unique<MemObjectsStorage>()};
    Version now;
    std::vector<Version> former{now};
};

TEST_P(RandomTrees, LargeDirectoriesFollowThePlainModel) {
    for (int round = 0; round < 40; ++round) {
        const int from = round == 0 ? 0 : Below(largest);
        const int count = round == 0 ? largest : Below(largest - from) + 1;
        const std::vector<int> numbers = PickNumbers(from, count);
        // Some keep a few entries, so that sparse leaves are left behind; some add to what an erasure left.
        const bool add = round == 0 || Below(5) < 2;
        const int kept = Below(2) * (Below(9) + 2);
        for (int number : numbers) {
            if (kept == 0 || Below(kept) != 0) {
                ASSERT_NO_FATAL_FAILURE(Edit(number, add));
            }
        }
        ASSERT_NO_FATAL_FAILURE(now.Check()) << round;
        ASSERT_NO_FATAL_FAILURE(EditContents(round));
        ASSERT_NO_FATAL_FAILURE(now.CheckAgainst(former[random() % former.size()])) << round;
        if (Below(3) == 0)
            former.push_back(now);
    }
    for (Version const& version : former)
        ASSERT_NO_FATAL_FAILURE(version.Check());
}

/// Around the sizes from which a directory that is edited keeps what its digest has passed, and its leaves what they packed.
TEST_P(RandomTrees, EditsBelowADirectoryFollowThePlainModel) {
    for (const int count : {30, 50, 90, 130, 300}) {
        const std::string directory = "d" + std::to_string(count);
        const auto put = [&](int number, int content) {
            const std::string name = "n" + std::to_string(number);
            now.model.trees[directory].blobs[name] = std::to_string(content);
            now.tree.write()->AddBlob(&repo, Wide(directory + "/" + name), MakeBlob(std::to_string(content)));
        };
        for (int number = 0; number < count; ++number)
            put(number, 0);
        former = {now};
        for (int round = 1; round < 60; ++round) {
            if (Below(6) == 0)
                now = former[random() % former.size()];
            for (int few = Below(3); few >= 0; --few)
                put(Below(Below(8) == 0 ? count + 3 : count), round);
            if (Below(4) != 0) {
                ASSERT_EQ(IdText(*now.tree), IdOf(now.model)) << count << ", " << round;
            }
            if (Below(3) == 0)
                former.push_back(now);
        }
        for (Version const& version : former)
            ASSERT_NO_FATAL_FAILURE(version.Check());
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomTrees, testing::Range(1, 5));

} // namespace
} // namespace KivVcs
