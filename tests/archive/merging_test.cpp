#include "KivArchive/ArchiveConformance.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Merging.h"
#include "support/Builders.h"

#include <gtest/gtest.h>

/// Finding where histories meet, and merging against all of these bases.

namespace KivArchive {
namespace {

using namespace KivVcs;

Id IdOf(std::string const& name) {
    return Identify(ObjectType::Commit, Conformance::BufferOf(name));
}

/// Versions by name, and what they contain: "name:parent+merged~rewritten=equal", with files as `MakeTree` takes them.
class Versions {
public:
    Id Add(std::string const& version, std::string const& files = "-") {
        std::size_t const end = std::min(version.find_first_of(":+~="), version.size());
        std::string const name = version.substr(0, end);
        cow_ptr<Tree> const tree = MakeTree(repo_, files);
        Ancestry facts{IdOf(name), {}, tree ? tree->GetId() : Id(), {}};
        for (std::size_t at = end; at < version.size();) {
            std::size_t const next = std::min(version.find_first_of(":+~=", at + 1), version.size());
            Id const other = IdOf(version.substr(at + 1, next - at - 1));
            names_.emplace(other, version.substr(at + 1, next - at - 1));
            if (version[at] == ':')
                facts.parent = other;
            else
                facts.contains.push_back({version[at] == '+'   ? Containment::Merged
                                          : version[at] == '~' ? Containment::RewrittenFrom
                                                               : Containment::FoundEqual,
                                          other});
            at = next;
        }
        names_.emplace(facts.commit, name);
        trees_[name] = tree;
        if (tree)
            treesById_[tree->GetId()] = tree;
        Change change;
        change.ancestry = {facts};
        archive_.Apply(change);
        return facts.commit;
    }

    void Lose(std::string const& name) { treesById_.erase(trees_.at(name)->GetId()); }

    [[nodiscard]] std::string Bases(std::string const& left, std::string const& right) {
        std::vector<std::string> names;
        for (Id const& base : FindMergeBases(archive_, IdOf(left), IdOf(right)))
            names.push_back(names_.at(base));
        std::sort(names.begin(), names.end());
        return Joined(names);
    }

    /// The merged files, followed by what was asked and how it was settled.
    [[nodiscard]] std::string Merge(std::string const& left, std::string const& right,
                                    ConflictChoice answer = ConflictChoice::Left, KindResolver kinds = {},
                                    ContentResolver contents = {}) {
        MergeResolvers const resolvers{{[answer](auto, MergeTrees const&) { return answer; },
                                        [](auto, MergeTrees const&) { return TreeConflictChoice::Merge; }},
                                       std::move(contents),
                                       std::move(kinds)};
        MergeSources const sources{
            [this](auto ids, std::size_t more) { return archive_.ReadAncestry(ids, Follow::Everything, more); },
            [this](Id const& id) { return treesById_.contains(id) ? treesById_.at(id) : nullptr; },
            {}};
        TreeMerge const merge =
            MergeAgain(repo_, sources, {IdOf(left), trees_.at(left)}, {IdOf(right), trees_.at(right)}, resolvers);
        std::string text = merge.gaveUp ? "gave up" : Files(merge.tree);
        for (auto const& conflict : merge.conflicts)
            text += " | " + Narrow(conflict.path) + " " + std::to_string(static_cast<int>(conflict.leftChange)) +
                    std::to_string(static_cast<int>(conflict.rightChange)) +
                    std::to_string(static_cast<int>(conflict.settlement));
        for (Id const& lost : merge.lostBases)
            text += " | lost " + names_.at(lost);
        return text;
    }

private:
    MemArchive archive_;
    Repository repo_{std::make_unique<MemObjectsStorage>()};
    std::map<std::string, cow_ptr<Tree>> trees_;
    std::map<Id, std::string> names_;
    std::map<Id, cow_ptr<Tree>> treesById_;
};

TEST(FindMergeBases, FollowsAllThatCommitsContain) {
    Versions versions;
    for (const char* const version :
         {"root", "a:root", "b:root", "ab:a+b", "ba:b+a", "left:ab", "right:ba", "a2~a", "onA2:a2", "equal:root=ba",
          // Rebased there and back.
          "x:a~y", "y:b~x", "onX:x", "onY:y", "elsewhere"})
        versions.Add(version);
    EXPECT_EQ(versions.Bases("left", "right"), "a b") << "merges that crossed";
    EXPECT_EQ(versions.Bases("right", "left"), "a b");
    EXPECT_EQ(versions.Bases("left", "a"), "a") << "contained";
    EXPECT_EQ(versions.Bases("onA2", "ab"), "a") << "what a commit was rewritten from";
    EXPECT_EQ(versions.Bases("equal", "right"), "ba") << "what it was found equal to";
    EXPECT_EQ(versions.Bases("onX", "onY"), IdOf("x") < IdOf("y") ? "x" : "y") << "one for a cycle";
    EXPECT_EQ(versions.Bases("onX", "left"), "a b") << "below a cycle";
    EXPECT_EQ(versions.Bases("left", "elsewhere"), "");
    EXPECT_EQ(versions.Bases("left", "unheard of"), "");
}

/// Facts of a line of a million commits, made as they are asked for.
TEST(FindMergeBases, ReadsNoMoreThanWhatLiesBetween) {
    std::map<Id, int> numbers;
    auto const commit = [&numbers](int number) {
        Id const id = IdOf(std::to_string(number));
        numbers.emplace(id, number);
        return id;
    };
    std::size_t given = 0;
    AncestryReader const read = [&](std::span<const Id> ids, std::size_t more) {
        std::vector<Ancestry> facts;
        for (Id const& id : ids)
            for (int number = numbers.at(id), count = 0; count <= static_cast<int>(more) && number > 0;
                 ++count, --number)
                facts.push_back({commit(number), commit(number - 1), {}, {}});
        given += facts.size();
        return facts;
    };
    EXPECT_EQ(FindMergeBases(read, commit(1'000'000), commit(999'700)), std::vector<Id>{commit(999'700)});
    EXPECT_LT(given, 2000U);
}

TEST(MergeAgain, AsksWhereFilesMeetDirectories) {
    Versions versions;
    versions.Add("file", "n=0 z=0");
    versions.Add("directory", "n/a=0 n/b=0 z=0");
    versions.Add("none", "z=0");
    struct {
        const char *base, *left, *right, *takesLeft, *takesRight;
    } const cases[] = {
        {"none", "n=1 z=0", "n/a=2 z=0", "n=1 z=0 | n 111", "n/a=2 z=0 | n 112"},
        {"file", "n=1 z=0", "n/a=2 z=0", "n=1 z=0 | n 351", "n/a=2 z=0 | n 352"},
        {"directory", "n/a=0 n/b=0 n/c=1 z=0", "n=2 z=0", "n/a=0 n/b=0 n/c=1 z=0 | n 341", "n=2 z=0 | n 342"},
        {"directory", "n=1 z=0", "z=0", "n=1 z=0 | n 421", "z=0 | n 422"},
        {"file", "n/a=1 z=0", "z=0", "n/a=1 z=0 | n 521", "z=0 | n 522"},
        // Nobody is asked about what only one side changed.
        {"file", "n=0 z=1", "n/a=2 z=0", "n/a=2 z=1", "n/a=2 z=1"},
        {"directory", "n/a=0 n/b=0 z=1", "n=2 z=0", "n=2 z=1", "n=2 z=1"},
        {"directory", "n/a=0 n/b=1 z=0", "z=0", "n/b=1 z=0 | n/b 321", "z=0 | n/b 322"},
        {"directory", "n/a=0 z=0", "n/b=0 z=0", "z=0", "z=0"},
    };
    int number = 0;
    for (auto const& one : cases) {
        std::string const name = std::to_string(number++);
        versions.Add("l" + name + ":" + one.base, one.left);
        versions.Add("r" + name + ":" + one.base, one.right);
        EXPECT_EQ(versions.Merge("l" + name, "r" + name, ConflictChoice::Left), one.takesLeft) << name;
        EXPECT_EQ(versions.Merge("l" + name, "r" + name, ConflictChoice::Right), one.takesRight) << name;
    }
    auto const keep = [](KindDecision::Keep what, const char16_t* fileName) -> KindResolver {
        return [what, fileName](auto, MergeTrees const&) { return KindDecision{what, fileName}; };
    };
    using Keep = KindDecision::Keep;
    EXPECT_EQ(versions.Merge("l0", "r0", {}, keep(Keep::Both, u"m")), "m=1 n/a=2 z=0 | n 114");
    EXPECT_EQ(versions.Merge("r0", "l0", {}, keep(Keep::Both, u"m")), "m=1 n/a=2 z=0 | n 114");
    EXPECT_EQ(versions.Merge("l0", "r0", ConflictChoice::Undecided, keep(Keep::Both, u"z")), "gave up | n 110")
        << "taken";
    EXPECT_EQ(versions.Merge("l0", "r0", {}, keep(Keep::None, u"")), "z=0 | n 114");
    EXPECT_EQ(versions.Merge("l0", "r0", {}, keep(Keep::Directory, u"")), "n/a=2 z=0 | n 112");
    EXPECT_EQ(versions.Merge("l1", "r1", {}, keep(Keep::File, u"")), "n=1 z=0 | n 351");
}

TEST(MergeAgain, TakesWhatBothHadWhenTheyCrossed) {
    Versions versions;
    versions.Add("root", "same=0 other=0 one=0");
    versions.Add("a:root", "same=a other=a one=a");
    versions.Add("b:root", "same=b other=b one=0");
    versions.Add("ab:a+b", "same=a other=a one=a");
    versions.Add("ba:b+a", "same=a other=b one=a");
    versions.Add("left:ab", "same=2 other=a one=a");
    versions.Add("right:ba", "same=a other=b one=3");
    EXPECT_EQ(versions.Merge("left", "right"), "one=3 other=a same=2 | other 111");
    EXPECT_EQ(versions.Merge("left", "right", ConflictChoice::Root), "gave up | other 110") << "there is no base";
    EXPECT_EQ(versions.Merge("left", "ab"), "one=a other=a same=2") << "contained";

    // Merges that have crossed again and again without ever agreeing.
    versions.Add("l0:a", "same=a");
    versions.Add("r0:b", "same=b");
    for (int rung = 1; rung <= 300; ++rung) {
        std::string const left = "l" + std::to_string(rung - 1);
        std::string const right = "r" + std::to_string(rung - 1);
        versions.Add("l" + std::to_string(rung) + ":" + left + "+" + right, "same=a");
        versions.Add("r" + std::to_string(rung) + ":" + right + "+" + left, "same=b");
    }
    EXPECT_EQ(versions.Merge("l300", "r300"), "same=a | same 111");
}

TEST(MergeAgain, AssumesNothingWhereABaseIsLost) {
    Versions versions;
    versions.Add("base", "both=0 gone=0 x/y=0");
    versions.Add("left:base", "both=0 mine=1 x/y=0");
    versions.Add("right:base", "both=0 gone=0");
    versions.Lose("base");
    EXPECT_EQ(versions.Merge("left", "right", ConflictChoice::Right),
              "both=0 gone=0 | gone 212 | mine 122 | x/y 122 | lost base");
    EXPECT_EQ(versions.Merge("left", "right", ConflictChoice::Undecided),
              "gave up | gone 210 | mine 120 | x/y 120 | lost base");
    versions.Add("again~base", "both=0 gone=0 x/y=0");
    versions.Add("onAgain:again", "both=0 gone=1 x/y=0");
    versions.Add("elsewhere", "both=0");
    EXPECT_EQ(versions.Merge("onAgain", "elsewhere"), "both=0 gone=1 x/y=0") << "nothing in common is no loss";
}

/// One party has gone back from "later" to "earlier", another one has gone on from "later".
TEST(MergeAgain, AsksWhereNobodyCanSayWhatIsLater) {
    Versions versions;
    versions.Add("root", "back=0 same=0");
    versions.Add("earlier:root~later", "back=0 same=1");
    versions.Add("later:earlier", "back=1 same=1");
    versions.Add("left:earlier", "back=0 same=2");
    versions.Add("right:later", "back=1 same=1");
    EXPECT_EQ(versions.Merge("left", "right", ConflictChoice::Left), "back=0 same=2 | back 111");
    EXPECT_EQ(versions.Merge("right", "left", ConflictChoice::Left), "back=1 same=2 | back 111");
    versions.Add("both:left+right", "back=0 same=2");
    versions.Add("on:right", "back=1 same=1 new=1");
    EXPECT_EQ(versions.Merge("both", "on"), "back=0 new=1 same=2") << "settled";
}

TEST(MergeAgain, ContentsMayBeMergedByResolvers) {
    Versions versions;
    versions.Add("base", "text=0 file=0");
    versions.Add("left:base", "text=1 file=l");
    versions.Add("right:base", "text=2 file=r");
    ContentResolver const both = [](auto path, DisputedContents const& contents) -> std::optional<Buffer> {
        if (path.back() == KivStringViewT<char16_t>(u"file"))
            return {};
        return Conformance::BufferOf(Conformance::TextOf(*contents.base) + Conformance::TextOf(contents.left) +
                                     Conformance::TextOf(contents.right));
    };
    EXPECT_EQ(versions.Merge("left", "right", ConflictChoice::Right, {}, both),
              "file=r text=012 | file 332 | text 334");
    DisputedContents lines{Conformance::BufferOf("1\n2\n3\n"), Conformance::BufferOf("0\n2\n3\n"),
                           Conformance::BufferOf("1\n2\n4\n")};
    auto const merged = MergeTexts()({}, lines);
    ASSERT_TRUE(merged);
    EXPECT_EQ(Conformance::TextOf(*merged), "0\n2\n4\n");
    lines.right = Conformance::BufferOf("5\n2\n3\n");
    EXPECT_FALSE(MergeTexts()({}, lines));
    lines.base.reset();
    EXPECT_FALSE(MergeTexts()({}, lines));
}

} // namespace
} // namespace KivArchive
