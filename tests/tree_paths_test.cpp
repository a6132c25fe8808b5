#include "support/Builders.h"
#include "support/PackedForms.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

namespace KivVcs {
namespace {

/// Records which objects trees ask for and hand over, and gives the answers that it is given.
class TreeCalls : public Repository {
public:
    TreeCalls() : Repository(std::make_unique<MemObjectsStorage>()) {}

    std::string Take() { return Joined(std::exchange(calls_, {})); }

    using Repository::SyncWithStorage;
    cow_ptr<Tree> GetTreeFromStorage(Id const& id) const override {
        calls_.emplace_back("tree?");
        return Repository::GetTreeFromStorage(id);
    }
    cow_ptr<Blob> GetBlobFromStorage(Id const& id) const override {
        calls_.emplace_back("blob?");
        return Repository::GetBlobFromStorage(id);
    }
    cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) override {
        calls_.push_back("[" + Files(tree) + "]");
        return treeAnswer ? *treeAnswer : Repository::SyncWithStorage(tree);
    }
    cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) override {
        calls_.push_back(Bytes(blob->GetData()));
        return blobAnswer ? *blobAnswer : Repository::SyncWithStorage(blob);
    }

    optional<cow_ptr<Tree>> treeAnswer;
    optional<cow_ptr<Blob>> blobAnswer;

private:
    mutable Names calls_;
};

class TreePaths : public testing::Test {
protected:
    using Components = std::vector<KivStringViewT<char16_t>>;

    cow_ptr<Tree> Of(std::string const& files) {
        auto tree = MakeTree(repo, files);
        repo.Take();
        return tree;
    }

    TreeCalls repo;
};

TEST_F(TreePaths, TreesAreStoredFromTheBottomUp) {
    auto tree = Of("a/k=1");
    EXPECT_TRUE(tree.write()->AddBlob(&repo, u"/a//b/c/", MakeBlob("2")));
    EXPECT_EQ(repo.Take(), "blob? 2 blob? tree? [c=2] tree? tree? [b/c=2 k=1] tree?");
    EXPECT_TRUE(tree.write()->RemoveObject(&repo, u"a/b/c"));
    EXPECT_EQ(repo.Take(), "tree? [k=1] tree?");
    EXPECT_TRUE(tree.write()->AddObject(&repo, u"x/y", tree->GetLocalTree(u"a")->GetId()));
    EXPECT_EQ(repo.Take(), "blob? tree? tree? [k=1] tree? tree? [y/k=1] tree?");
    EXPECT_TRUE(tree.write()->RemoveObject(&repo, u"x/y/k"));
    EXPECT_EQ(repo.Take() + Files(tree), "a/k=1");
}

TEST_F(TreePaths, WhatCannotBeDoneChangesNothing) {
    auto tree = Of("a/k=1 b=2");
    const Id before = tree->GetId();
    EXPECT_FALSE(tree.write()->AddBlob(nullptr, u"c", MakeBlob("3")));
    EXPECT_FALSE(tree.write()->AddObject(nullptr, u"c", before));
    EXPECT_FALSE(tree.write()->AddBlob(&repo, u"//", MakeBlob("3")));
    EXPECT_FALSE(tree.write()->AddObject(&repo, u"c", Commit(nullptr, false).GetId()));
    for (auto const* path : {u"", u"/", u"c", u"b/k", u"a/c", u"a/k/l"})
        EXPECT_FALSE(tree.write()->RemoveObject(&repo, path)) << Narrow(path);
    for (auto const* path : {u"", u"c", u"b/k", u"a/c"})
        EXPECT_FALSE(tree->GetDeepObject(path) || tree->GetDeepTree(path) || tree->GetIdByPath(path)) << Narrow(path);
    EXPECT_TRUE(tree->GetDeepBlob(u"a/k") && tree->GetDeepObject(u"a") == tree->GetDeepTree(u"/a/"));
    EXPECT_EQ(Files(tree), "a/k=1 b=2");
    EXPECT_TRUE(tree->GetId() == before);
}

TEST_F(TreePaths, EmptyComponentsMakeTreesOnTheWayOnly) {
    const struct {
        Components path;
        bool entered;
        const char* files;
    } cases[] = {{{}, false, "k=1"},
                 {{u""}, false, "k=1"},
                 {{u"a", u""}, false, "a/ k=1"},
                 {{u"a", u"", u"b"}, true, "a/ k=1"},
                 {{u"", u"b"}, true, "k=1"},
                 {{u"a", u"b", u"", u""}, false, "a/b/ k=1"}};
    for (auto const& [path, entered, files] : cases) {
        auto tree = Of("k=1");
        EXPECT_EQ(bool{tree.write()->AddObjectToTree(&repo, path, MakeBlob("2"))}, entered) << files;
        EXPECT_EQ(Files(tree), files);
        EXPECT_FALSE(tree.write()->RemoveObjectFromTree(&repo, path)) << files;
    }
}

TEST_F(TreePaths, ARepositorysAnswerBecomesTheEntryWhateverItIs) {
    auto tree = Of("a/k=1 b=2");
    repo.blobAnswer = immu::make<Blob>(MakeBlob("other"));
    EXPECT_TRUE(tree.write()->AddBlob(&repo, u"b", MakeBlob("3")) == *repo.blobAnswer);
    EXPECT_EQ(Files(tree), "a/k=1 b=other");

    repo.blobAnswer = cow_ptr<Blob>();
    EXPECT_FALSE(tree.write()->AddBlob(&repo, u"a", MakeBlob("3")));
    EXPECT_FALSE(tree.write()->AddBlob(&repo, u"c", MakeBlob("3")));
    EXPECT_TRUE(tree->LocalObjectExists(u"c") && !tree->GetLocalObject(u"c"));
    auto filled = tree;
    repo.blobAnswer.reset();
    EXPECT_TRUE(filled.write()->AddBlob(&repo, u"c", MakeBlob("3")));
    EXPECT_EQ(Files(filled), "a/k=1 b=other c=3");
    EXPECT_EQ(tree->GetLocalObjectCount(), 4U);
    EXPECT_EQ(tree->GetDeepBlobCount(), 4U);
    EXPECT_EQ(Joined(ToNames(tree->GetLocalObjectPaths())), "a b");
    EXPECT_TRUE(tree->GetLocalObject(u"a") == tree->GetLocalTree(u"a"));
    EXPECT_EQ(Bytes(tree->GetData()), Entry("blob", "b", Identifier("blob", "other")));

    repo.treeAnswer = cow_ptr<Tree>();
    EXPECT_FALSE(tree.write()->AddTree(&repo, u"b", Tree()));
    EXPECT_TRUE(tree.write()->RemoveObject(&repo, u"c"));
    EXPECT_EQ(Joined(ToNames(tree->GetDeepBlobPaths())), "a/k b");
}

TEST_F(TreePaths, NamesOfAnyLengthArePackedUpToTheirFirstZero) {
    const std::string one = Identifier("blob", "1");
    const std::string longName(5000, 'n');
    Tree tree;
    Tree moved;
    for (auto const& name : {KivStringT<char16_t>(u"a\0b", 3), Wide(longName), KivStringT<char16_t>(u"z\x80")}) {
        tree.AddBlob(&repo, name, MakeBlob("1"));
        moved = std::move(tree);
        tree = moved;
    }
    const std::string data = Entry("blob", "a", one) + Entry("blob", longName, one) + Entry("blob", "z\xC2\x80", one);
    EXPECT_EQ(IdText(tree), Identifier("tree", data));
    EXPECT_EQ(Bytes(tree.GetData()), data);
    EXPECT_EQ(tree.GetStoragePrefix(), "40000");
}

class ReadingTrees : public testing::Test {
protected:
    Repository repo{std::make_unique<MemObjectsStorage>()};
    Packed packed;
    const std::string one = packed.Add("blob", "1");
};

TEST_F(ReadingTrees, GivesTheTreeThatWasPacked) {
    // In UTF-16 a surrogate comes before U+FFFD, in UTF-8 it is the other way round.
    auto const tree = repo.SyncWithStorage(MakeTree(repo, "a/b/c=1 a/d=2 e=3 a.b=4"));
    const std::string late = "\xEF\xBF\xBD";
    const std::string early = "\xF0\x9F\x98\x80";
    const std::string data = Entry("blob", early, one) + Entry("tree", late, IdText(*tree));
    const auto read = packed.Read(packed.Add("tree", data), &repo);
    ASSERT_TRUE(read);
    EXPECT_EQ(Bytes(read->GetData()), data);
    EXPECT_EQ(Bytes(read->GetDeepBlob(u"\xD83D\xDE00")->GetData()), "1");
    EXPECT_EQ(Files(read->GetLocalTree(u"\xFFFD")), "a.b=4 a/b/c=1 a/d=2 e=3");
    EXPECT_EQ(packed.loads, 1);
    EXPECT_TRUE(packed.Read(IdText(*read), &repo) == read);
    EXPECT_EQ(packed.loads, 1);
    EXPECT_FALSE(packed.Read(one, nullptr) || packed.Read("", &repo));
    EXPECT_FALSE(Tree::Deserialize(Id(Wide(one)), &repo, nullptr));
}

TEST_F(ReadingTrees, LeavesOutWhatCannotBeLoaded) {
    const std::string missing(64, 'f');
    const std::string good = Entry("blob", "x", one);
    const std::string odd = packed.Add("tree", good + Entry("link", "y", one));
    const struct {
        std::string data;
        const char* files;
    } cases[] = {{good, "x=1"},
                 {"", "-"},
                 {good + Entry("blob", "y", missing) + Entry("tree", "z", missing), "x=1"},
                 {good + Entry("tree", "z", odd) + Entry("tree", "z", one) + Entry("tree", "z", ""), "x=1"},
                 {good + Entry("link", "y", one), "-"},
                 {Entry("blob", "d/e", one) + Entry("blob", "", one) + good, "d/e=1 x=1"},
                 {"1 blob y" + std::string(1, '\0') + one + good, "x=1 y=1"}};
    for (auto const& [data, files] : cases)
        EXPECT_EQ(Files(packed.Read(packed.Add("tree", data), &repo)), files) << data;
    const std::string noDigest(64, 'Z');
    packed.forms["other"] = packed.forms[noDigest] = packed.forms[one];
    EXPECT_EQ(Files(packed.Read(packed.Add("tree", Entry("blob", "x", noDigest)), &repo)), "x=1");
    std::string repeated;
    for (auto const* name : {"a", "b", "c"})
        repeated += Entry("blob", name, noDigest) + Entry("blob", name, missing) + Entry("tree", name, missing) +
                    Entry("tree", name, one);
    packed.loads = 0;
    EXPECT_EQ(Files(packed.Read(packed.Add("tree", repeated), &repo)), "a=1 b=1 c=1");
    EXPECT_EQ(packed.loads, 5) << "whatever is named is asked for once";
    packed.forms["long"] = std::string("treehouse\0", 10) + good;
    EXPECT_EQ(Files(packed.Read("other", &repo)), "-");
    EXPECT_EQ(Files(packed.Read("long", &repo)), "x=1");
}

TEST_F(ReadingTrees, ManyEntriesFromOneBufferThatIsUsedAgain) {
    for (const int count : {1, 32, 33, 1025}) {
        Tree tree;
        for (int number = 0; number < count; ++number) {
            const std::string digits = std::to_string(10'000 + number);
            tree.AddBlob(&repo, Wide("d/" + digits), MakeBlob(std::to_string(number / 2)));
            tree.AddBlob(&repo, Wide("e/" + digits), MakeBlob(digits));
        }
        Buffer only;
        int loads = 0;
        const auto load = [&](Id const& id) {
            ++loads;
            const auto subtree = repo.GetTreeFromStorage(id);
            const auto blob = repo.GetBlobFromStorage(id);
            only = subtree ? subtree->GetPackedData() : blob ? blob->GetPackedData() : tree.GetPackedData();
            return StreamIO(MemStream::CreateOnRef(only));
        };
        Repository other(std::make_unique<MemObjectsStorage>());
        auto read = Tree::Deserialize(tree.GetId(), &other, load);
        ASSERT_TRUE(read && *read == tree) << count;
        EXPECT_EQ(loads, 3 + (count + 1) / 2 + count) << "the trees, and each content once";
        const auto edit = [](Repository& holder, Tree& edited) {
            for (auto const* path : {u"d/10000a", u"d/10500a", u"d/9"})
                edited.AddBlob(&holder, path, MakeBlob("new"));
            edited.RemoveObject(&holder, u"d/10031");
        };
        edit(repo, tree);
        edit(other, *read.write());
        EXPECT_TRUE(*read == tree && read->GetDeepBlobCount() == tree.GetDeepBlobCount()) << count;
    }
}

TEST_F(ReadingTrees, EveryTruncationGivesTheEntriesBeforeItOrNothing) {
    const std::string first = Entry("blob", "x", one);
    const std::string whole = first + Entry("blob", "y", one);
    for (std::size_t length = 1; length <= whole.size(); ++length) {
        const std::string files = Files(packed.Read(packed.Add("tree", whole.substr(0, length)), &repo));
        const char* const expected = length < first.size() ? "" : length < whole.size() ? "x=1" : "x=1 y=1";
        const std::size_t inEntry = length % first.size();
        // Before the blank behind the type, the type is not what it should be.
        EXPECT_EQ(files, inEntry > 0 && inEntry < std::string("100644 blob").size() ? "-" : expected) << length;
    }
}

TEST_F(ReadingTrees, EndsWhereTreesNameThemselvesOrEachOther) {
    const std::string header("tree 1\0", 7);
    packed.forms["self"] = header + Entry("blob", "x", one) + "40000 tree s" + std::string(1, '\0') + "self";
    EXPECT_EQ(Files(packed.Read("self", &repo)), "x=1");
    const std::string left(64, 'a');
    const std::string right(64, 'b');
    packed.forms[left] = header + Entry("tree", "r", right) + Entry("blob", "x", one);
    packed.forms[right] = header + Entry("tree", "l", left) + Entry("blob", "y", one);
    EXPECT_EQ(Files(packed.Read(left, &repo)), "r/y=1 x=1");

    // Every level names the level below twice.
    Repository none(nullptr);
    std::string id = packed.Add("tree", Entry("blob", "x", one));
    for (int level = 0; level < 60; ++level)
        id = packed.Add("tree", Entry("tree", "a", id) + Entry("tree", "b", id));
    packed.loads = 0;
    EXPECT_EQ(Narrow(packed.Read(id, &none)->GetId().GetText()), id);
    EXPECT_EQ(packed.loads, 62);
}

} // namespace
} // namespace KivVcs
