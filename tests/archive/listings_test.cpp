#include "KivArchive/ArchiveConformance.h"
#include "KivArchive/Listings.h"
#include "KivArchive/MemArchive.h"

#include <KivVcs/KivVcs.h>

#include <gtest/gtest.h>

#include <set>

/// Compares listings with the objects that were packed. The archives hold no contents, so that none can be read.

namespace KivArchive {
namespace {

using namespace Conformance;
using KivVcs::cow_ptr;
using Text = KivStringT<char16_t>;

class Listings : public testing::Test {
protected:
    std::size_t Below(std::size_t end) { return static_cast<std::size_t>(random_()) % end; }

    /// Among the names are some that UTF-8 orders otherwise than UTF-16, and one that is the beginning of another.
    Text AnyPath() {
        static const Text names[] = {u"a", u"a.b", u"\xFFFF", u"\xD83D\xDE00", u"\xD83D", u"e\x301"};
        Text path = names[Below(6)];
        for (std::size_t depth = Below(3); depth > 0; --depth)
            path += Text(u"/") + names[Below(6)];
        return path;
    }

    /// Leaves no directory that a file with its name hides, since packed forms do not show it.
    void Edit(KivVcs::Commit& commit) {
        for (std::size_t edits = Below(6); edits > 0; --edits) {
            Text const path = AnyPath();
            for (int end = path.Find(u"/"); end >= 0; end = path.Find(u"/", end + 1))
                if (commit.GetBlob(path.Left(end)))
                    commit.RemoveObject(&repository_, path.Left(end));
            commit.RemoveObject(&repository_, path);
            if (Below(3) != 0)
                commit.AddBlob(&repository_, path, KivVcs::Blob(BufferOf(std::to_string(Below(3)))));
        }
    }

    cow_ptr<KivVcs::Commit> MakeCommit(cow_ptr<KivVcs::Commit> const& parent) {
        static const Text texts[] = {
            u"", u"Ada", u"A <b> c", u"x\ncommitter y", u"\xE9 \xD83D\xDE00\xDC00", u"a\n\nb\n", u"> 5 +0000"};
        KivVcs::Commit commit(parent, false);
        Edit(commit);
        commit.SetAuthorName(texts[Below(7)]);
        commit.SetAuthorEmail(texts[Below(7)]);
        commit.SetDescription(texts[Below(7)]);
        commit.SetCommitTime(KivVcs::Time::FromTimeT(static_cast<std::int32_t>(random_()), KivVcs::TimeZone::Utc));
        constexpr std::int64_t minute = 600'000'000;
        commit.SetCommitTimezoneBias(KivVcs::TimeDelta((static_cast<std::int64_t>(Below(3000)) - 1500) * minute));
        return KivVcs::immu::make<KivVcs::Commit>(std::move(commit));
    }

    /// Stores a commit with its trees.
    void Archive(cow_ptr<KivVcs::Commit> const& commit, std::vector<ContainedCommit> contains = {}) {
        Change change;
        for (auto const& [id, tree] : repository_.GetStorage()->GetTrees())
            change.objects.push_back({id, ObjectType::Tree, tree->GetData(), {}});
        change.objects.push_back({commit->GetId(), ObjectType::Commit, commit->GetData(), {}});
        change.ancestry.push_back({commit->GetId(), commit->GetParentId(), commit->GetRootId(), std::move(contains)});
        archive_.Apply(change);
    }

    std::vector<Id> List(Id const& head, CommitListOptions const& options = {}) {
        std::vector<Id> listed;
        ListCommits(
            archive_, {&head, 1}, options,
            [&listed](CommitRecord const& record) {
                listed.push_back(record.id);
                return true;
            },
            nullptr);
        return listed;
    }

    std::mt19937 random_{1};
    KivVcs::Repository repository_{std::make_unique<KivVcs::MemObjectsStorage>()};
    MemArchive archive_;
};

TEST_F(Listings, OfFilesAndDifferencesAreThoseOfTheTrees) {
    auto const sameAs = [](KivVcs::Difference const& left, KivVcs::Difference const& right) {
        return left.kind == right.kind && left.path == right.path && left.oldPath == right.oldPath &&
               left.oldId == right.oldId && left.newId == right.newId;
    };
    cow_ptr<KivVcs::Commit> before;
    for (int round = 0; round < 300; ++round) {
        auto const after = MakeCommit(before);
        Archive(after);
        KivVcs::DifferenceOptions options;
        options.findRenames = Below(2) == 0;
        auto const old = before ? before->GetCommitTree() : nullptr;
        KivVcs::Differences const expected(old, after->GetCommitTree(), options);
        Id const oldRoot = before ? before->GetRootId() : Id();
        auto const listed = ListDifferences(archive_, oldRoot, after->GetRootId(), options, nullptr);
        ASSERT_TRUE(
            std::equal(expected.begin(), expected.end(), listed.differences.begin(), listed.differences.end(), sameAs));
        EXPECT_TRUE(listed.isComplete);

        KivVcs::Differences const all(cow_ptr<KivVcs::CommitTree>(), after->GetCommitTree());
        auto const files = ListFiles(archive_, after->GetRootId(), 100, nullptr).files;
        ASSERT_TRUE(
            std::equal(all.begin(), all.end(), files.begin(), files.end(), [](auto const& one, auto const& other) {
                return one.path == other.path && one.newId == other.id;
            }));
        Text const path = AnyPath();
        std::vector<Id> const roots{after->GetRootId()};
        auto const found = FindEntries(archive_, roots, path);
        auto const id = after->GetCommitTree()->GetRoot()->GetIdByPath(path);
        ASSERT_EQ(found.empty() ? Id() : found[0].entry.id, id.value_or(Id()));
        before = after;
    }
}

TEST_F(Listings, OfHistoriesShowWhatCommitsSay) {
    cow_ptr<KivVcs::Commit> head;
    std::vector<cow_ptr<KivVcs::Commit>> commits;
    for (int i = 0; i < 1300; ++i) {
        head = repository_.SyncWithStorage(MakeCommit(head));
        commits.push_back(head);
        if (i % 100 == 99 || i == 1299)
            Archive(head);
        Change change;
        change.objects.push_back({head->GetId(), ObjectType::Commit, head->GetData(), {}});
        change.ancestry.push_back({head->GetId(), head->GetParentId(), head->GetRootId(), {}});
        archive_.Apply(change);
    }
    auto expected = commits.rbegin();
    ListCommits(
        archive_, std::vector<Id>{head->GetId()}, {},
        [&](CommitRecord const& record) {
            KivVcs::Commit const& commit = **expected++;
            EXPECT_TRUE(record.state == CommitState::Sound && record.id == commit.GetId() &&
                        record.parent == commit.GetParentId() && record.tree == commit.GetRootId());
            KivVcs::Commit again;
            again.SetAuthorName(record.authorName);
            again.SetAuthorEmail(record.authorEmail);
            again.SetDescription(record.description);
            again.SetCommitTime(record.time);
            again.SetCommitTimezoneBias(record.bias);
            // It is not always clear where a name ends and the address begins.
            EXPECT_EQ(TextOf(again.GetData()).substr(6),
                      TextOf(commit.GetData()).substr(TextOf(commit.GetData()).find("author ")));
            return true;
        },
        nullptr);
    EXPECT_EQ(expected, commits.rend());
    for (Text const& path : {Text(u"a"), Text(u"a/a.b"), Text(u"/"), Text(u"nowhere")}) {
        CommitListOptions options;
        options.changing = path;
        std::vector<Id> changing;
        for (auto const& commit : KivVcs::History(head).Changing(path))
            changing.push_back(commit->GetId());
        EXPECT_EQ(List(head->GetId(), options), changing);
        options.atMost = 7;
        changing.resize(std::min<std::size_t>(7, changing.size()));
        EXPECT_EQ(List(head->GetId(), options), changing);
    }
    std::set<std::string> digits;
    for (auto const& commit : commits)
        digits.insert(DigitsOf(commit->GetId()));
    std::string const some = *std::next(digits.begin(), 700);
    for (std::string const& begun : {std::string("0"), std::string("00"), std::string("7"), std::string("f"),
                                     std::string("ff"), some.substr(0, 2), some.substr(0, 9), some}) {
        std::vector<std::string> found;
        for (Id const& id : FindCommits(archive_, begun, 50))
            found.push_back(DigitsOf(id));
        std::vector<std::string> wanted(digits.lower_bound(begun), digits.lower_bound(begun + 'g'));
        wanted.resize(std::min<std::size_t>(50, wanted.size()));
        EXPECT_EQ(found, wanted) << begun;
    }
    EXPECT_EQ(FindCommits(archive_, "F", 3), FindCommits(archive_, "f", 3));
    for (std::string const& begun : {std::string(), std::string("g"), some + "0"})
        EXPECT_TRUE(FindCommits(archive_, begun, 50).empty());
}

TEST_F(Listings, OfGraphsShowNoCommitBeforeOneThatLeadsToIt) {
    Change change;
    std::vector<NewCommit> commits;
    std::vector<std::set<std::string>> leadsTo;
    NewObject const tree = Object(ObjectType::Tree, "");
    for (std::size_t i = 0; i < 600; ++i) {
        NewCommit commit = Commit(
            tree.id, i == 0 ? Id() : commits[i - 1 - Below(std::min<std::size_t>(i, 4))].object.id, std::to_string(i));
        if (i > 0 && Below(3) == 0)
            commit.facts.contains.push_back({Containment::Merged, commits[Below(i)].object.id});
        change.objects.push_back(commit.object);
        change.ancestry.push_back(commit.facts);
        commits.push_back(commit);
    }
    archive_.Apply(change);
    CommitListOptions options;
    options.follow = Follow::Reachable;
    std::set<std::string> shown;
    std::vector<Id> const heads{commits[599].object.id, {}, commits[300].object.id, Object(ObjectType::Blob, "?").id};
    ListCommits(
        archive_, heads, options,
        [&](CommitRecord const& record) {
            EXPECT_TRUE(shown.insert(DigitsOf(record.id)).second);
            EXPECT_EQ(record.state, record.id == heads[3] ? CommitState::Missing : CommitState::Sound);
            std::vector<Id> links = record.merged;
            links.push_back(record.parent);
            for (Id const& link : links)
                EXPECT_EQ(shown.count(DigitsOf(link)), 0U);
            return true;
        },
        nullptr);
    EXPECT_EQ(shown.size(), archive_.ReadAncestry(heads, Follow::Reachable, 10000).size() + 1);
}

TEST_F(Listings, OfHistoriesGoOnBehindDamage) {
    NewObject const noCommit =
        Object(ObjectType::Commit, "tree \nauthor A <a> 1 +0000\ncommitter B <b> 1 +0000\n\nx\n");
    NewCommit const root = Commit({}, {}, "root");
    Id const gone = Object(ObjectType::Commit, "gone").id;
    Change change;
    change.objects = {noCommit, root.object};
    change.ancestry = {
        {gone, noCommit.id, {}, {}}, {noCommit.id, root.object.id, {}, {}}, {root.object.id, {}, {}, {}}};
    archive_.Apply(change);
    std::vector<CommitState> states;
    ListCommits(
        archive_, std::vector<Id>{gone}, {},
        [&](CommitRecord const& record) {
            states.push_back(record.state);
            return true;
        },
        nullptr);
    EXPECT_EQ(states,
              (std::vector<CommitState>{CommitState::Missing, CommitState::Unrepresentable, CommitState::Sound}));
    std::vector<Id> const twice{root.object.id, noCommit.id, root.object.id};
    EXPECT_EQ(ReadCommits(archive_, twice)[2].description, Text(u"root"));
}

/// @p innermost, and sixty directories, each of which names the one before twice: @p innermost has 2^60 paths.
std::vector<NewObject> DoubledDirectories(NewObject const& innermost) {
    std::vector<NewObject> directories{innermost};
    for (int i = 0; i < 60; ++i) {
        std::string const digits = DigitsOf(directories.back().id);
        directories.push_back(Object(ObjectType::Tree, "40000 tree a" + std::string(1, '\0') + digits + "40000 tree b" +
                                                           std::string(1, '\0') + digits));
    }
    return directories;
}

TEST_F(Listings, OfDirectoriesEndWhereTheyAreToldAndSayWhatCannotBeRead) {
    Id const gone = Object(ObjectType::Blob, "gone").id;
    std::vector<NewObject> const empty = DoubledDirectories(Object(ObjectType::Tree, ""));
    std::vector<NewObject> const full = DoubledDirectories(Object(ObjectType::Tree, TreeOf({{"f", gone}})));
    NewObject const unordered = Object(ObjectType::Tree, TreeOf({{"b", gone}, {"a", gone}}));
    NewCommit const commit = Commit({}, {}, "no directory");
    Change change;
    change.objects = empty;
    change.objects.insert(change.objects.end(), full.begin(), full.end());
    change.objects.push_back(unordered);
    change.objects.push_back(commit.object);
    change.ancestry = {commit.facts};
    archive_.Apply(change);

    EXPECT_TRUE(ListFiles(archive_, empty.back().id, 100, nullptr).isComplete);
    EXPECT_TRUE(ListDifferences(archive_, {}, empty.back().id, {}, nullptr).differences.empty());
    FileList const files = ListFiles(archive_, full.back().id, 100, nullptr);
    EXPECT_TRUE(files.files.size() == 100 && !files.isComplete);
    auto const failureOf = [&](Id const& tree) {
        try {
            return ListDirectory(archive_, tree).empty() ? std::optional<Failure>() : std::nullopt;
        } catch (ArchiveError const& error) {
            return std::optional(error.GetKind());
        }
    };
    EXPECT_EQ(failureOf(unordered.id), Failure::Unrepresentable);
    EXPECT_EQ(failureOf(Object(ObjectType::Tree, TreeOf({{"x", gone}})).id), Failure::Collected);
    EXPECT_EQ(failureOf(commit.object.id), Failure::Damaged);
    EXPECT_EQ(failureOf(full.back().id), std::nullopt);
}

} // namespace
} // namespace KivArchive
