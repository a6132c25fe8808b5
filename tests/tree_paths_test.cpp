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

/// Blobs and the paths that they are added under, written as `MakeTree` reads them.
class Additions {
public:
    explicit Additions(std::string const& files) {
        std::istringstream words(files);
        for (std::string word; words >> word;) {
            const auto equals = word.find('=');
            paths_.push_back(Wide(word.substr(0, equals)));
            blobs_.push_back({paths_.back(), immu::make<Blob>(MakeBlob(word.substr(equals + 1)))});
        }
    }
    std::vector<BlobAtPath> const& All() const { return blobs_; }
    void AddOneByOne(IRepository& repo, Tree& tree) const {
        for (auto const& [path, blob] : blobs_)
            tree.AddBlob(&repo, path, *blob);
    }

private:
    std::vector<KivStringT<char16_t>> paths_;
    std::vector<BlobAtPath> blobs_;
};

TEST_F(TreePaths, ManyBlobsAreStoredFirstAndThenEachDirectoryOnce) {
    auto tree = Of("a/k=1 m/x=2");
    const Additions additions("b=3 m//n/y/=4 a/c/d=5 //=6 a/c/b=7 a/c/d=8");
    EXPECT_TRUE(tree.write()->AddBlobs(&repo, additions.All()));
    EXPECT_EQ(repo.Take(),
              "blob? 3 blob? blob? 4 blob? blob? 5 blob? blob? 7 blob? blob? 8 blob? "
              "tree? [b=7 d=8] tree? tree? [c/b=7 c/d=8 k=1] tree? tree? [y=4] tree? tree? [n/y=4 x=2] tree?");
    EXPECT_EQ(Files(tree), "a/c/b=7 a/c/d=8 a/k=1 b=3 m/n/y=4 m/x=2");
    EXPECT_TRUE(tree->GetDeepBlob(u"b") == additions.All()[0].blob);

    const Id before = tree->GetId();
    const BlobAtPath nothing[] = {{u"/", immu::make<Blob>()}, {u"z", nullptr}};
    EXPECT_FALSE(tree.write()->AddBlobs(nullptr, additions.All()) || tree.write()->AddBlobs(&repo, nothing));
    for (auto const& answer : {tree->GetLocalTree(u"m"), cow_ptr<Tree>()}) {
        repo.treeAnswer = answer;
        auto changed = tree;
        auto expected = tree;
        EXPECT_TRUE(changed.write()->AddBlobs(&repo, Additions("p/q/r=1").All()));
        expected.write()->AddBlob(&repo, u"p/q/r", MakeBlob("1"));
        EXPECT_TRUE(*changed == *expected && changed->GetLocalTree(u"p") == answer);
    }
    repo.treeAnswer.reset();
    for (const char* broken : {"blob?", "tree?"}) {
        struct Failing : Repository {
            using Repository::Repository;
            using Repository::SyncWithStorage;
            cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> synchronized) override {
                return ++trees == 3 ? throw std::runtime_error("full") : Repository::SyncWithStorage(synchronized);
            }
            cow_ptr<Blob> GetBlobFromStorage(Id const& id) const override {
                return *what == 'b' ? throw std::runtime_error("lost") : Repository::GetBlobFromStorage(id);
            }
            const char* what = "";
            int trees = 0;
        } failing(std::make_unique<MemObjectsStorage>());
        failing.what = broken;
        EXPECT_THROW(tree.write()->AddBlobs(&failing, additions.All()), std::runtime_error);
    }
    EXPECT_TRUE(tree->GetId() == before && Files(tree) == "a/c/b=7 a/c/d=8 a/k=1 b=3 m/n/y=4 m/x=2");
}

TEST_F(TreePaths, ManyBlobsMakeTheTreeThatTheyMakeOneByOne) {
    std::mt19937 random(3);
    const auto below = [&random](std::size_t limit) { return random() % limit; };
    for (int round = 0; round < 30; ++round) {
        auto many = immu::make<Tree>();
        auto single = many;
        // Few directories and many names in some rounds, many directories and few names in others.
        const std::size_t names = round % 3 == 0 ? 500 : 3;
        // Identifiers do not cover a directory beside a blob of its name, and what is stored in between stands for it.
        const bool hides = round % 2 == 0;
        for (int step = 0; step < 3; ++step) {
            Names files;
            for (std::size_t count = 1 + below(round % 3 == 0 ? 400 : 30); count > 0; --count) {
                std::string path;
                for (std::size_t depth = below(names == 3 ? 4 : 2); depth > 0; --depth)
                    path += std::string(1, "abc"[below(3)]) + (below(9) == 0 ? "//" : "/");
                files.push_back(path + std::to_string(below(names)) + (hides && below(20) == 0 ? "/f=" : "=") +
                                std::to_string(below(5)));
            }
            if (below(2) == 0)
                std::sort(files.begin(), files.end());
            const Additions additions(Joined(files));
            Repository one(std::make_unique<MemObjectsStorage>());
            Repository other(std::make_unique<MemObjectsStorage>());
            ASSERT_TRUE(many.write()->AddBlobs(&one, additions.All()));
            additions.AddOneByOne(other, *single.write());
            ASSERT_EQ(Bytes(many->GetData()), Bytes(single->GetData()));
            ASSERT_TRUE(*many == *single && (hides || many->GetDeepBlobPaths() == single->GetDeepBlobPaths()));
            ASSERT_TRUE(one.GetBlobCount() == other.GetBlobCount() && one.GetTreeCount() <= other.GetTreeCount());
            // A storage that has it all gives what it has, and the tree grows and shrinks as any other does.
            auto again = immu::make<Tree>();
            again.write()->AddBlobs(&other, Additions(Files(single)).All());
            ASSERT_TRUE(hides || *again == *single);
            for (int edits = hides ? 0 : 100; edits > 0; --edits) {
                const auto path = additions.All()[below(files.size())].path;
                if (below(3) == 0)
                    ASSERT_TRUE(many.write()->AddBlob(&one, path, Blob()) &&
                                single.write()->AddBlob(&one, path, Blob()));
                else
                    ASSERT_EQ(many.write()->RemoveObject(&one, path), single.write()->RemoveObject(&one, path));
            }
            ASSERT_TRUE(*many == *single);
        }
    }
}

TEST_F(TreePaths, ManyBlobsMayLieAsDeepAsTheyLike) {
    std::string path = "file";
    for (int level = 0; level < 20'000; ++level)
        path = "d/" + path;
    const Additions additions(path + "=1 " + path.substr(20'000) + "2=2");
    Repository silent(std::make_unique<MemObjectsStorage>());
    auto tree = immu::make<Tree>();
    EXPECT_TRUE(tree.write()->AddBlobs(&silent, additions.All()));
    EXPECT_EQ(silent.GetTreeCount(), 20'000U);
    Tree expected;
    additions.AddOneByOne(silent, expected);
    EXPECT_TRUE(*tree == expected && tree->GetDeepBlobCount() == 2);
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

TEST_F(ReadingTrees, HaveTheIdentifierOfWhatTheyPackTo) {
    const std::string entry = Entry("blob", "x", one);
    const std::string other = packed.Add("blob", "2");
    packed.forms[std::string(64, 'd')] = packed.forms[one];
    std::string capitals = one;
    for (char& digit : capitals)
        digit = static_cast<char>(std::toupper(static_cast<unsigned char>(digit)));
    packed.forms[capitals] = packed.forms[other];
    const std::string tree = packed.Add("tree", entry);
    const auto withMode = [&](std::string const& mode) { return mode + entry.substr(entry.find(' ')); };
    // What is read is as long as what it packs to, or what differs makes up for it.
    for (auto const& data :
         {entry, Entry("blob", "a", other) + Entry("tree", "b", tree), Entry("blob", "\xED\x95\x9C", one),
          withMode("100755"), withMode("040000"), Entry("blob", "y", other) + entry, entry + Entry("blob", "x", other),
          Entry("blob", "x", capitals), Entry("blob", "x", std::string(64, 'd')),
          Entry("blob", "a\xFF", one) + Entry("blob", "b\xED\xA0\xBD\xED\xB8\x80", one),
          Entry("blob", "\xED\xA0\xBD\xED\xB8\x80\xFF", one), Entry("blob", "a\xFF", one),
          Entry("blob", std::string(39, '\xFF'), one) + Entry("blob", "y", std::string(64, 'f')),
          Entry("blob", "a/b", one), Entry("blob", "/", one) + entry, entry + Entry("blob", "y", std::string(64, 'f')),
          entry + Entry("blob", "y", one).substr(0, 40)}) {
        const auto read = packed.Read(packed.Add("tree", data), &repo);
        ASSERT_TRUE(read) << data;
        EXPECT_EQ(IdText(*read), Identifier("tree", Bytes(read->GetData()))) << data;
        EXPECT_TRUE(read->GetLocalBlob(u"x") == nullptr || IdText(*read->GetLocalBlob(u"x")) != std::string(64, 'd'));
    }
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
