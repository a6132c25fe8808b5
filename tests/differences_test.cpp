#include "support/HostObjects.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

/// Histories, differences, conflicts and portable paths as hosts list them.

namespace KivVcs {
namespace {

std::string WordOf(ChangeKind kind) {
    return {"=+-*fd>"[static_cast<int>(kind)]};
}

std::string Listed(Differences const& differences) {
    std::vector<std::string> words;
    words.reserve(differences.GetCount());
    for (auto const& each : differences)
        words.push_back(WordOf(each.kind) + (each.oldPath.IsEmpty() ? "" : Narrow(each.oldPath) + ">") +
                        Narrow(each.path));
    return Joined(words);
}

class Differing : public testing::Test {
protected:
    Differences Between(std::string const& before, std::string const& after, DifferenceOptions const& options = {}) {
        return {MakeTree(repo, before), MakeTree(repo, after), options};
    }

    RecordingRepository repo{std::make_unique<MemObjectsStorage>()};
};

TEST_F(Differing, TellsWhatBecameOfEveryPath) {
    EXPECT_EQ(Listed(Between("a=1 b=1 d/x=1 e/y=1 f=1 same/z=1", "b=2 c=1 d=1 e/y=1 e/z/w=1 f/g=1 same/z=1")),
              "-a *b +c fd -d/x +e/z/w df +f/g");
    EXPECT_EQ(Listed(Between("-", "d/x=1")), "+d/x");
    EXPECT_EQ(Listed(Between("d/x=1", "-")), "-d/x");
    EXPECT_EQ(Listed(Between("-", "-")), "");

    const Differences differences = Between("d/x=1", "d=2");
    ASSERT_EQ(differences.GetCount(), 2U);
    EXPECT_EQ(differences[0].oldId, MakeTree(repo, "x=1")->GetId());
    EXPECT_EQ(differences[0].newId, MakeBlob("2").GetId());
    EXPECT_EQ(differences[1].oldId, MakeBlob("1").GetId());
    EXPECT_TRUE(differences[1].newId.IsEmpty());
}

TEST_F(Differing, PairsRenamedFilesByContentAndRatherByName) {
    const DifferenceOptions renames{.findRenames = true};
    EXPECT_EQ(Listed(Between("a=1 b=2", "c=1 b=3", renames)), "*b >a>c");
    EXPECT_EQ(Listed(Between("a/n=1 b/m=1 c=1", "x/m=1 y/n=1 z/o=1 z/p=1", renames)), ">b/m>x/m >a/n>y/n >c>z/o +z/p");
    EXPECT_EQ(Listed(Between("a=1 b=1 c=1", "d=1", renames)), "-b -c >a>d");
    EXPECT_EQ(Listed(Between("d/x=1", "d=1", renames)), "fd -d/x");
    EXPECT_EQ(Listed(Between("a=1", "b=2", renames)), "-a +b");
    EXPECT_EQ(Listed(Between("a=2", "b=1", renames)), "-a +b");
}

TEST_F(Differing, AgreesWithListingsAndLookupsOverRandomTrees) {
    for (unsigned seed = 0; seed < 2'000; ++seed) {
        std::mt19937 random(seed);
        cow_ptr<Tree> before = EditAtRandom(random, repo, nullptr);
        before.write();
        const cow_ptr<Tree> after = EditAtRandom(random, repo, before);
        const Differences differences(before, after);
        PathList paths;
        for (auto const& each : differences) {
            paths.push_back(each.path);
            EXPECT_EQ(each.oldId, before->GetIdByPath(each.path).value_or(Id()));
            EXPECT_EQ(each.newId, after->GetIdByPath(each.path).value_or(Id()));
            const auto kindOf = [&each](cow_ptr<Tree> const& tree) {
                return tree->GetDeepBlob(each.path) ? 'f' : tree->GetDeepTree(each.path) ? 'd' : ' ';
            };
            const std::map<std::string, std::string> expected{
                {"ff", "*"}, {"f ", "-"}, {" f", "+"}, {"fd", "d"}, {"df", "f"}};
            EXPECT_EQ(WordOf(each.kind), expected.at({kindOf(before), kindOf(after)})) << seed;
        }
        EXPECT_EQ(paths, before->GetDeepBlobDiffs(after)) << seed;
    }
}

TEST_F(Differing, EndsWhereItIsToldTo) {
    EXPECT_TRUE(Between("a=1 b=1", "-", {.atMost = 2}).IsComplete());
    const Differences cut = Between("a=1 b=1 c=1", "-", {.atMost = 2});
    EXPECT_EQ(Listed(cut), "-a -b");
    EXPECT_FALSE(cut.IsComplete());

    // Two trees that name the next one twice, forty times over, without a single file that would be listed.
    cow_ptr<Tree> tree;
    tree.write();
    for (int level = 0; level < 40; ++level) {
        Tree above;
        above.AddTree(&repo, u"a", *tree);
        above.AddTree(&repo, u"A", *tree);
        tree = immu::make<Tree>(above);
    }
    EXPECT_FALSE(Differences(tree, nullptr, {.atMost = 1'000}).IsComplete());
    EXPECT_EQ(FindCaseCollisions(tree).size(), 40U);
}

TEST_F(Differing, AsksHostsForIdentifiersAndForNoContent) {
    int fetched = 0;
    std::vector<Id> ids;
    for (auto const* content : {"base", "left", "right", "elsewhere"}) {
        ids.push_back(MakeBlob(content).GetId());
        repo.AddBlobToStorage(immu::make<LazyBlob>(content, fetched));
    }
    const auto grow = [this](cow_ptr<Commit> const& parent, std::map<std::string, Id> const& files) {
        Commit commit(parent, false);
        for (auto const& [path, id] : files)
            EXPECT_TRUE(commit.AddObject(&repo, Wide(path), id));
        return repo.SyncWithStorage(immu::make<Commit>(commit));
    };
    const auto base = grow(nullptr, {{"d/f", ids[0]}});
    const auto left = grow(base, {{"d/f", ids[1]}, {"d/g", ids[3]}});
    const auto right = grow(base, {{"d/f", ids[2]}, {"D", ids[3]}});
    const Differences differences(base->GetCommitTree(), left->GetCommitTree(), {.findRenames = true});
    ASSERT_EQ(Listed(differences), "*d/f +d/g");
    EXPECT_EQ(differences[0].oldId, ids[0]);
    EXPECT_EQ(differences[0].newId, ids[1]);
    EXPECT_EQ(Listed(DifferencesFromParent(*base)), "+d/f");
    EXPECT_EQ(FindCaseCollisions(right->GetCommitTree()->GetRoot()), (std::vector<PathList>{{u"D", u"d"}}));
    const History changes = History(left).Changing(u"d/f");
    EXPECT_EQ(std::vector<cow_ptr<Commit>>(changes.begin(), changes.end()), (std::vector{left, base}));

    repo.MoveBranchTo(u"master", left);
    const MergeOutcome outcome = MergeWithOutcome(repo, right, {});
    EXPECT_EQ(outcome.result, MergeResult::GaveUp);
    ASSERT_EQ(outcome.conflicts.size(), 1U);
    EXPECT_EQ(outcome.conflicts[0].rootId, ids[0]);
    EXPECT_EQ(outcome.conflicts[0].leftId, ids[1]);
    EXPECT_EQ(outcome.conflicts[0].rightId, ids[2]);
    EXPECT_EQ(fetched, 0);
}

TEST_F(Differing, HistoryShowsTheNewestThatChangedAPath) {
    cow_ptr<Commit> head;
    const auto commit = [&](std::string const& name, std::string const& path, std::string const& content) {
        Commit next(head, false);
        if (content.empty())
            next.RemoveObject(&repo, Wide(path));
        else
            next.AddBlob(&repo, Wide(path), MakeBlob(content));
        next.SetDescription(Wide(name));
        head = repo.SyncWithStorage(immu::make<Commit>(next));
    };
    commit("a", "d/x", "1");
    commit("b", "other", "1");
    commit("c", "d/y", "1");
    commit("d", "d/x", "2");
    commit("e", "d", "");
    commit("f", "other", "1");
    const auto namesOf = [](History const& history) {
        std::string names;
        for (auto const& each : history)
            names += Narrow(each->GetDescription());
        return names;
    };
    EXPECT_EQ(namesOf(History(head)), "fedcba");
    EXPECT_EQ(namesOf(History(head).First(2)), "fe");
    EXPECT_EQ(namesOf(History(head).Changing(u"d/x")), "eda");
    EXPECT_EQ(namesOf(History(head).Changing(u"/d/").First(3)), "edc");
    EXPECT_EQ(namesOf(History(head).First(1).Changing(u"d/x").First(2)), "e");
    EXPECT_EQ(namesOf(History(head).Changing(u"")), "edcba");
    EXPECT_EQ(namesOf(History(head).Changing(u"none")), "");
    EXPECT_EQ(namesOf(History(head).First(0)), "");
    EXPECT_EQ(namesOf(History(nullptr).Changing(u"d")), "");
}

TEST(PortablePaths, NameWhatAFileSystemCannotHold) {
    const auto problem = [](KivStringViewT<char16_t> path) {
        const auto found = PortablePathProblem(path);
        return found ? optional<PathProblemKind>(found->kind) : std::nullopt;
    };
    const std::u16string long255(255, u'x');
    for (auto const* fine : {u"a/b", u"/a//b/", u"console.txt", u".profile", u" a", u"com10", u"auxiliary/lpt",
                             u"\u00E9", u"a\U0001F600", long255.c_str()})
        EXPECT_EQ(problem(fine), std::nullopt) << ToUtf8(fine);
    for (auto const* name : {u"NUL", u"a/con.txt/b", u"Com1", u"lpt\u00B2.log", u"aux .c", u"conout$"})
        EXPECT_EQ(problem(name), PathProblemKind::ReservedName) << ToUtf8(name);
    for (auto const* name : {u"a\\b", u"a:b", u"what?", u"\u0001", u"a\tb", u"\u007F"})
        EXPECT_EQ(problem(name), PathProblemKind::ReservedCharacter) << ToUtf8(name);
    for (auto const* name : {u"a./b", u"a ", u"..."})
        EXPECT_EQ(problem(name), PathProblemKind::TrailingDotOrBlank) << ToUtf8(name);
    EXPECT_EQ(problem(u"a/../b"), PathProblemKind::RelativeName);
    EXPECT_EQ(problem(u"//"), PathProblemKind::Empty);
    EXPECT_EQ(problem((long255 + u"x").c_str()), PathProblemKind::LongName);
    EXPECT_EQ(problem(std::u16string(128, u'\u00E9').c_str()), PathProblemKind::LongName);
    for (std::u16string const& name :
         {std::u16string(u"\xD800"), std::u16string(u"\xDC00\xD800"), u"a" + std::u16string(1, u'\xDBFF')})
        EXPECT_EQ(problem(name.c_str()), PathProblemKind::NotUnicode);
    EXPECT_EQ(PortablePathProblem(u"a/nul/con")->component, KivStringViewT<char16_t>(u"nul"));
}

TEST_F(Differing, FindsNamesThatDifferInCaseOnly) {
    cow_ptr<Tree> tree;
    for (auto const* path : {u"d/Read",        u"d/READ",        u"d/read/x",       u"d/Reed", u"D",
                             u"\u00C9t\u00E9", u"\u00E9T\u00C9", u"e\u0301t\u00E9", u"\u03A3", u"\u03C2",
                             u"\u03C3",        u"\U00010400",    u"\U00010428",     u"\u0130", u"i",
                             u"stra\u00DFe",   u"strasse",       u"\u212A",         u"k",      u"\u0100",
                             u"\u0101",        u"both",          u"both/x"})
        ASSERT_TRUE(tree.write()->AddBlob(&repo, path, Blob()));
    EXPECT_EQ(FindCaseCollisions(tree), (std::vector<PathList>{{u"D", u"d"},
                                                               {u"d/READ", u"d/Read", u"d/read"},
                                                               {u"k", u"\u212A"},
                                                               {u"\u00C9t\u00E9", u"\u00E9T\u00C9"},
                                                               {u"\u0100", u"\u0101"},
                                                               {u"\u03A3", u"\u03C2", u"\u03C3"},
                                                               {u"\U00010400", u"\U00010428"}}));
    EXPECT_TRUE(FindCaseCollisions(nullptr).empty());
}

} // namespace
} // namespace KivVcs
