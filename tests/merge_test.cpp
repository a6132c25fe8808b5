#include "support/Builders.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

#include <charconv>

namespace KivVcs {
namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

/// Resolvers that note what they are asked as "d:directory" and "f:file" and check that they are given the whole trees.
/// The top is always merged; of the files, one that is not answered for itself gets the general answer.
struct Host {
    ConflictChoice file = ConflictChoice::Left;
    TreeConflictChoice directory = TreeConflictChoice::Merge;
    MergeTrees trees{};
    std::map<std::string, ConflictChoice> files{};
    std::vector<std::string> asked{};

    std::string Note(const char* kind, Path path, MergeTrees const& whole) {
        EXPECT_TRUE(whole.left == trees.left && whole.root == trees.root && whole.right == trees.right);
        asked.push_back(kind + Joined(path));
        return Joined(path);
    }

    Resolvers AsResolvers() {
        return {[this](Path path, MergeTrees whole) {
                    const auto answer = files.find(Note("f:", path, whole));
                    return answer == files.end() ? file : answer->second;
                },
                [this](Path path, MergeTrees whole) {
                    return Note("d:", path, whole).empty() ? TreeConflictChoice::Merge : directory;
                }};
    }
};

constexpr always_return_t<TreeConflictChoice> mergeAlways{TreeConflictChoice::Merge};

class Merging : public WithHistory {
protected:
    MergeTrees Trees(std::string const& root, std::string const& left, std::string const& right) {
        return {MakeTree(repo, left), MakeTree(repo, root), MakeTree(repo, right)};
    }
};

TEST_F(Merging, AsksOnlyWhereBothSidesDisagreeAndDoesWhatItIsTold) {
    using enum ConflictChoice;
    using Whole = TreeConflictChoice;
    const struct {
        const char *root, *left, *right;
        ConflictChoice file;
        TreeConflictChoice directory;
        const char *asked, *merged;
    } cases[] = {
        // Nobody is asked about what one side changed, or both alike.
        {"a=1 b=1 c=1", "a=2 b=1", "a=1 b=3 c=1", Left, Whole::Merge, "d:", "a=2 b=3"},
        {"a=1 b=1", "a=2 l=1 n=5", "a=2 n=5", Left, Whole::Merge, "d:", "a=2 l=1 n=5"},
        {"d/x=0 g=0", "g=1", "g=0", Left, Whole::Merge, "d:", "g=1"},
        {"a=1", "a=2", "a=2", Left, Whole::Merge, "", "a=2"},
        {"a=1", "-", "-", Left, Whole::Merge, "", "-"},
        // Changed on both sides.
        {"f=0", "f=1", "f=2", Left, Whole::Merge, "d: f:f", "f=1"},
        {"f=0", "f=1", "f=2", Right, Whole::Merge, "d: f:f", "f=2"},
        {"f=0", "f=1", "f=2", Root, Whole::Merge, "d: f:f", "f=0"},
        {"f=0", "f=1", "f=2", Undecided, Whole::Merge, "d: f:f", "-"},
        // Changed here, deleted there, both ways.
        {"f=0 g=0", "f=1 g=0", "g=0", Left, Whole::Merge, "d: f:f", "f=1 g=0"},
        {"f=0 g=0", "f=1 g=0", "g=0", Right, Whole::Merge, "d: f:f", "g=0"},
        {"f=0 g=0", "g=0", "f=2 g=0", Left, Whole::Merge, "d: f:f", "g=0"},
        {"f=0 g=0", "g=0", "f=2 g=0", Right, Whole::Merge, "d: f:f", "f=2 g=0"},
        // Added on both sides; without a base everything is.
        {"g=0", "f=1 g=0", "f=2 g=0", Root, Whole::Merge, "d: f:f", "g=0"},
        {"-", "a=1 c=1 s=3", "b=2 c=2 s=3", Right, Whole::Merge, "d: f:c", "a=1 b=2 c=2 s=3"},
        {"a=0", "-", "a=2", Right, Whole::Merge, "d: f:a", "a=2"},
        // A file became a directory on one side: directories are settled after files, so that the directory stays.
        {"f=0", "f=1", "f/x=2", Right, Whole::Merge, "d: f:f", "f/x=2"},
        {"f=0", "f/x=1", "f=2", Right, Whole::Merge, "d: f:f", "f/x=1"},
        {"g=0", "f=1 g=0", "f/x=2 g=0", Left, Whole::Merge, "d:", "f/x=2 g=0"},
        // A directory became a file on one side and changed on the other: the file is no conflict, the directory is.
        {"f/x=0", "f=1", "f/x=2", Right, Whole::Merge, "d: d:f f:f/x", "f/x=2 f=1"},
        {"f/x=0", "f=1", "f/x=2", Left, Whole::Merge, "d: d:f f:f/x", "f/ f=1"},
        {"f/x=0", "f=1", "f/x=2", Left, Whole::Left, "d: d:f", ""},
        {"f/x=0", "f/x=1", "f=2", Left, Whole::Left, "d: d:f", "f/x=1 f=2"},
        // Directories added on both sides, and deleted on one.
        {"g=0", "d/x=1 g=0", "d/y=2 g=0", Left, Whole::Merge, "d: d:d", "d/x=1 d/y=2 g=0"},
        {"g=0", "d/x=1 g=0", "d/x=2 g=0", Right, Whole::Merge, "d: d:d f:d/x", "d/x=2 g=0"},
        {"d/x=0 g=0", "g=0", "d/x=2 g=0", Left, Whole::Merge, "d: d:d f:d/x", "d/ g=0"},
        {"d/x=0 g=0", "g=0", "d/x=2 g=0", Left, Whole::Left, "d: d:d", "g=0"},
        {"d/x=0 g=0", "d/x=1 g=0", "g=0", Left, Whole::Root, "d: d:d", "d/x=0 g=0"},
        {"d/x=0 g=0", "d/x=1 g=0", "g=0", Left, Whole::Undecided, "d: d:d", "-"},
    };
    for (auto const& [root, left, right, file, directory, asked, merged] : cases) {
        const auto inputs = std::string(root) + "|" + left + "|" + right;
        SCOPED_TRACE(inputs);
        Host host{file, directory, Trees(root, left, right)};
        EXPECT_EQ(Files(ThreeWayMerge(&repo, host.trees, host.AsResolvers())), merged);
        EXPECT_EQ(Joined(host.asked), asked);
        EXPECT_EQ(Files(host.trees.root) + "|" + Files(host.trees.left) + "|" + Files(host.trees.right), inputs);
    }
}

TEST_F(Merging, AsksAboutFilesBeforeDirectoriesInNameOrderWithFullPaths) {
    const std::string files = "a/b/c/d/e/f=# a/z=# k/x=# m=# n=# same/s=7";
    const auto numbered = [&files](char digit) {
        auto text = files;
        std::replace(text.begin(), text.end(), '#', digit);
        return text;
    };
    Host host{.trees = Trees(numbered('0'), numbered('1'), numbered('2'))};
    host.files = {{"k/x", ConflictChoice::Right}, {"a/b/c/d/e/f", ConflictChoice::Right}, {"n", ConflictChoice::Root}};
    const auto merged = ThreeWayMerge(&repo, host.trees, host.AsResolvers());
    EXPECT_EQ(Joined(host.asked), "d: f:m f:n d:a f:a/z d:a/b d:a/b/c d:a/b/c/d d:a/b/c/d/e f:a/b/c/d/e/f d:k f:k/x");
    EXPECT_EQ(Files(merged), "a/b/c/d/e/f=2 a/z=1 k/x=2 m=1 n=0 same/s=7");
    EXPECT_TRUE(merged->GetLocalTree(u"same") == host.trees.left->GetLocalTree(u"same"));

    host.asked.clear();
    host.files["a/z"] = ConflictChoice::Undecided;
    EXPECT_FALSE(ThreeWayMerge(&repo, host.trees, host.AsResolvers()));
    EXPECT_EQ(Joined(host.asked), "d: f:m f:n d:a f:a/z");

    host.asked.clear();
    EXPECT_FALSE(ThreeWayMerge(&repo, host.trees, {nullptr, host.AsResolvers().treeResolver}));
    EXPECT_FALSE(ThreeWayMerge(&repo, host.trees, {host.AsResolvers().blobResolver, nullptr}));
    EXPECT_FALSE(ThreeWayMerge(nullptr, host.trees, host.AsResolvers()));
    EXPECT_EQ(Joined(host.asked), "d:");
    EXPECT_TRUE(ThreeWayMerge(&repo, {host.trees.left, nullptr, host.trees.left}, {}) == host.trees.left);
}

TEST_F(Merging, BringsACommitInTheCheapestWay) {
    history.Grow("base ours:base theirs:base more:ours alone");
    const auto callsOf = [this](const char* commit, Resolvers resolvers) {
        repo.TakeCalls();
        EXPECT_TRUE(repo.Merge(history[commit], std::move(resolvers)));
        return repo.TakeCalls();
    };
    EXPECT_FALSE(repo.Merge(nullptr, {}));
    EXPECT_FALSE(repo.Merge3Way(history["base"], {}));
    EXPECT_EQ(callsOf("base", {}), "GetHead() GetHead(master) GetCurentBranch MoveBranchTo(master,base)");
    EXPECT_EQ(callsOf("ours", {}), "GetHead() GetHead(master) GetHead() GetHead(master) GetCommonBase(base,ours) "
                                   "MoveBranchTo(master,ours)");
    EXPECT_EQ(callsOf("theirs", {nullptr, mergeAlways}),
              "GetHead() GetHead(master) GetHead() GetHead(master) GetCommonBase(ours,theirs) "
              "GetHead() GetHead(master) GetCommonBase(ours,theirs) DoCommit Sync()");
    EXPECT_EQ(history.Branches(), "master=/ours/base");
    EXPECT_EQ(FilesOfHead(), "base=base ours=ours theirs=theirs");
    EXPECT_TRUE(repo.GetHead()->GetParent() == history["ours"]);
    EXPECT_TRUE(repo.GetHead()->GetAuthorName().IsEmpty());

    EXPECT_TRUE(repo.Merge(history["alone"], {nullptr, mergeAlways}));
    EXPECT_EQ(FilesOfHead(), "alone=alone base=base ours=ours theirs=theirs");
    EXPECT_FALSE(repo.Merge(history["more"], {}));
    EXPECT_EQ(history.Branches(), "master=//ours/base");
}

TEST(Resolving, ChainsAskTheNextOnlyWhileUndecided) {
    int asked = 0;
    const auto answering = [&asked]<class Choice>(Choice choice) {
        return [&asked, choice](Path, MergeTrees) { return ++asked, choice; };
    };
    const BlobConflictResolver undecided = answering(ConflictChoice::Undecided);
    EXPECT_EQ(ChainResolvers(ChainResolvers(undecided, AlwaysChooseLeft()), answering(ConflictChoice::Right))({}, {}),
              ConflictChoice::Left);
    EXPECT_EQ(asked, 1);
    EXPECT_EQ(ChainResolvers(undecided, undecided)({}, {}), ConflictChoice::Undecided);
    EXPECT_EQ(ChainResolvers(AlwaysChooseRight(), undecided)({}, {}), ConflictChoice::Right);
    EXPECT_THROW(ChainResolvers(undecided, BlobConflictResolver())({}, {}), std::bad_function_call);
    // Three is a decision in one kind of answer and none in the other.
    const TreeConflictResolver treeRoot = answering(TreeConflictChoice::Root);
    EXPECT_EQ(static_cast<int>(ChainResolvers(treeRoot, TreeConflictResolver())({}, {})), 3);
    EXPECT_EQ(static_cast<int>(AlwaysChooseRoot()({}, {})), 2);
}

TEST_F(Merging, TheLaterStampWinsAtTheFirstLevelThatDecides) {
    using enum ConflictChoice;
    const struct {
        const char *left, *right, *path;
        ConflictChoice choice;
    } cases[] = {
        {"d/stamp=5", "d/stamp=7", "d/f", Right},
        {"d/stamp=1", "stamp=9", "d/f", Left},
        {"d/stamp=4 stamp=2", "d/stamp=4 stamp=1", "d/f", Left},
        {"d/f/stamp=3 d/stamp=1", "d/stamp=2", "d/f", Left},
        {"time=4", "stamp=3", "f", Left},
        {"stamp=none time=3", "stamp=2", "f", Left},
        {"meta/stamp=8", "stamp=3", "f", Left},
        {"stamp=18446744073709551615", "stamp=5", "f", Left},
        {"-", "stamp=1", "f", Right},
        {"stamp=3", "stamp=2", "missing/directory/f", Left},
        {"stamp=3", "stamp=4", "", Right},
        {"stamp=3", "stamp=3", "d/f", Undecided},
        {"-", "-", "d/f", Undecided},
    };
    std::string read;
    const auto timeOf = [&read](cow_ptr<Blob> blob) -> optional<Time> {
        const auto text = Helpers::StringAFromBuffer(blob->GetData());
        read += text.GetString();
        std::uint64_t ticks = 0;
        const auto end = std::from_chars(text.GetString(), text.GetString() + text.GetLength(), ticks);
        return end.ec == std::errc() ? optional<Time>(Time(ticks)) : std::nullopt;
    };
    const auto resolver = TimeBasedConflictResolver({u"stamp", u"time", u"meta/stamp"}, timeOf);
    for (auto const& [left, right, path, choice] : cases) {
        SCOPED_TRACE(std::string(left) + " | " + right);
        const auto text = Wide(path);
        EXPECT_EQ(resolver(Helpers::SplitVcsPath(text), Trees("-", left, right)), choice);
    }
    const auto stamped = Trees("-", "stamp=1", "stamp=2");
    read.clear();
    EXPECT_EQ(resolver({}, stamped), Right);
    EXPECT_EQ(read, "12") << "the left side is read first";
    EXPECT_EQ(TimeBasedConflictResolver({}, timeOf)({}, stamped), Undecided);
    EXPECT_THROW(TimeBasedConflictResolver({u"stamp"}, nullptr)({}, stamped), std::bad_function_call);
}

} // namespace
} // namespace KivVcs
