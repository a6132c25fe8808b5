#include "support/Builders.h"
#include "support/HostObjects.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

#include <typeinfo>

namespace KivVcs {
namespace {

class HostTrees : public testing::Test {
protected:
    HostBlob Fetched(std::string const& id) {
        return {id, [this, id] { return ++fetches, "content of " + id; }};
    }

    Repository repo{std::make_unique<MemObjectsStorage>()};
    int fetches = 0;
};

TEST_F(HostTrees, ShowWhatTheObjectsOfHostsReturn) {
    Tree tree;
    std::map<std::string, std::string> entries;
    const auto check = [&] {
        std::string data;
        for (auto const& [name, entry] : entries)
            data += entry;
        EXPECT_EQ(Bytes(tree.GetData()), data) << entries.size();
        EXPECT_EQ(IdText(tree), Identifier("tree", data)) << entries.size();
    };
    const auto add = [&](std::string const& name, HostBlob const& blob) {
        tree.AddBlob(&repo, Wide(name), blob);
        entries[name] =
            blob.prefix + " " + blob.header + " " + name + '\0' + Narrow(blob.id).substr(0, Narrow(blob.id).find('\0'));
    };
    HostBlob link = Fetched("nowhere");
    link.prefix = "120000";
    link.header = "link";
    add("link", link);
    link.id = KivStringT<char16_t>(u"here\0there", 10);
    add("zero", link);
    tree.AddBlob(&repo, u"own", MakeBlob("1"));
    entries["own"] = Entry("blob", "own", Identifier("blob", "1"));
    check();
    // Large enough to keep what leaves show.
    for (int number = 100; number < 500; ++number) {
        const std::string name = "n" + std::to_string(number);
        tree.AddBlob(&repo, Wide(name), MakeBlob(name));
        entries[name] = Entry("blob", name, Identifier("blob", name));
        if (number % 50 == 0)
            add(name, Fetched(name + "!"));
    }
    check();
    link.id = {};
    add("n250", link);
    check();
    tree.AddBlob(&repo, u"n250", MakeBlob("1"));
    entries["n250"] = Entry("blob", "n250", Identifier("blob", "1"));
    tree.RemoveObject(&repo, u"link");
    entries.erase("link");
    check();
    EXPECT_EQ(fetches, 0);
}

TEST_F(HostTrees, KeepIdentifierAndDataOfOneState) {
    // Says something else whenever it is asked, and nothing at all when that is wanted.
    static int asked = 0;
    struct Undecided : Blob {
        Id GetId() const override {
            return asked < 0 ? throw std::runtime_error("no answer") : Id(Wide(std::to_string(++asked)));
        }
        cow_ptr<Blob> Copy() const override { return immu::make<Undecided>(*this); }
    };
    const auto idOfData = [](Tree const& tree) { return Identifier("tree", Bytes(tree.GetData())); };
    Tree tree;
    EXPECT_TRUE(tree.AddBlob(&repo, u"a", Undecided()));
    asked = -1;
    EXPECT_THROW((void)tree.GetId(), std::runtime_error);
    EXPECT_THROW((void)tree.GetData(), std::runtime_error);
    asked = 10;
    const Id first = tree.GetId();
    const Tree copy(tree);
    EXPECT_EQ(Narrow(first.GetText()), idOfData(tree));
    EXPECT_EQ(IdText(copy), idOfData(copy));
    tree.ResetState();
    EXPECT_EQ(idOfData(tree), IdText(tree));
    EXPECT_FALSE(tree.GetId() == first || !(copy.GetId() == first));
}

TEST_F(HostTrees, NeitherSliceNorFetchWhatTheyHold) {
    const auto commitFile = [&](char16_t const* path, std::string const& id) {
        Commit commit(&repo, false);
        commit.AddBlob(&repo, path, Fetched(id));
        return repo.DoCommit(commit);
    };
    commitFile(u"a/1", "one");
    repo.CreateBranch(u"topic", nullptr);
    const auto mine = commitFile(u"a/2", "two");
    commitFile(u"a/4", "four");
    repo.Checkout(u"topic");
    const auto theirs = commitFile(u"a/3", "three");
    repo.Checkout(u"master");
    EXPECT_TRUE(
        repo.Merge3Way(theirs, {AlwaysChooseLeft(), [](auto, auto const&) { return TreeConflictChoice::Merge; }}));
    const auto merged = repo.GetHead()->GetCommitTree();
    EXPECT_EQ(Joined(ToNames(merged->GetAllBlobPaths())), "a/1 a/2 a/3 a/4");
    EXPECT_EQ(Joined(ToNames(merged->GetBlobDiffs(mine->GetCommitTree()))), "a/3 a/4");
    EXPECT_TRUE(repo.DeleteCommits(repo.GetHead()->GetParent()));
    repo.UpdateStorage();
    EXPECT_EQ(repo.GetBlobCount(), 4U);
    EXPECT_EQ(fetches, 0);
    const auto blob = merged->GetBlob(u"a/3");
    EXPECT_TRUE(dynamic_cast<HostBlob const*>(blob.get()) != nullptr);
    EXPECT_TRUE(blob == repo.GetBlobFromStorage(Id(Wide("three"))));
    EXPECT_EQ(Bytes(blob->GetData()), "content of three");
}

TEST_F(HostTrees, AreWholeUntilTheirDestructorsHaveRun) {
    constexpr int depth = 100'000;
    int whole = 0;
    const auto count = [&whole](Tree const& tree) { whole += tree.GetLocalTree(u"d") && !tree.IsEmpty() ? 1 : 0; };
    cow_ptr<Tree> tree = immu::make<Tree>();
    for (int level = 0; level < depth; ++level) {
        Tree above;
        above.AddTree(&repo, u"d", *tree);
        if (level % 3 == 0)
            above.AddBlob(&repo, u"d", MakeBlob(std::to_string(level)));
        tree = repo.SyncWithStorage(cow_ptr<Tree>(immu::make<HostTree>(above, count)));
    }
    repo.UpdateStorage();
    EXPECT_EQ(whole, 0);
    tree.reset();
    repo.UpdateStorage();
    EXPECT_EQ(whole, depth);
    EXPECT_EQ(repo.GetTreeCount(), 0U);
}

TEST_F(HostTrees, CountBlobsOnceForEachTreeHoweverOftenItIsNamed) {
    cow_ptr<Tree> tree = MakeTree(repo, "x=1");
    for (int level = 0; level < 40; ++level) {
        Tree above;
        above.AddTree(&repo, u"a", *tree);
        above.AddTree(&repo, u"b", *tree);
        above.AddBlob(&repo, u"b", MakeBlob("1"));
        tree = immu::make<Tree>(above);
    }
    EXPECT_EQ(tree->GetDeepBlobCount(), (std::uint64_t{2} << 40) - 1);
}

} // namespace
} // namespace KivVcs
