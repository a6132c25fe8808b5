#include "ForwardingArchive.h"
#include "archive_upkeep/Upkeep.h"

#include <sqlite3.h>

/// Synchronizing archives, and repairing one from another.

namespace KivArchive {
namespace {

using namespace Conformance;

class Synchronizing : public ArchiveUpkeep {};

SynchronizeOptions Everything() {
    SynchronizeOptions options;
    options.branches = {{u"master", u"theirs"}, {u"none", u"none"}};
    options.records = {u"settings"};
    return options;
}

/// A source with a long history and settings, whose head has merged a commit beside it.
struct Source {
    explicit Source(std::string const& path) : archive(path) {
        SmallHost host(archive, 1);
        for (int i = 0; i < 110; ++i)
            host.Publish();
        NewObject const tree = Object(ObjectType::Tree, "");
        side = Commit(tree.id, {}, "side");
        merge = Commit(tree.id, host.Head(), "merge");
        merge.facts.contains = {{Containment::Merged, side.object.id},
                                {Containment::RewrittenFrom, Id(BufferOf("gone"))}};
        Change change;
        change.objects = {tree, side.object, merge.object};
        change.ancestry = {side.facts, merge.facts};
        change.branches = {{u"master", host.Head(), merge.object.id}};
        change.records.push_back({{u"settings", BufferOf("dark")}, false, {}});
        EXPECT_TRUE(archive.Apply(change).applied);
    }

    SqliteArchive archive;
    NewCommit side;
    NewCommit merge;
};

/// Synchronizes, is interrupted, and goes on, until it is done. @return the number of interruptions
int SynchronizeInParts(IArchive& from, IArchive& to) {
    struct Stop final : IProgress {
        bool Report(Progress const& /*progress*/) override { return --rest > 0; }
        int rest = 0;
    } stop;
    int interruptions = 0;
    for (int patience = 1;; patience += 10, ++interruptions) {
        stop.rest = patience;
        try {
            Synchronize(from, to, Everything(), &stop);
            return interruptions;
        } catch (ArchiveError const& error) {
            EXPECT_EQ(error.GetKind(), Failure::Cancelled) << error.what();
            EXPECT_EQ(ProblemsOf(to), "");
            EXPECT_TRUE(to.ReadBranches().empty());
            if (error.GetKind() != Failure::Cancelled)
                return 0;
        }
    }
}

TEST_P(Synchronizing, BringsHistoriesFactsAndRecords) {
    Source from(directory_.Path("from"));
    auto const to = Make();
    EXPECT_GT(SynchronizeInParts(from.archive, *to), 3);
    EXPECT_EQ(ProblemsOf(*to), "");
    auto const branches = to->ReadBranches();
    ASSERT_EQ(branches.size(), 1U);
    EXPECT_EQ(branches[0].name, KivStringT<char16_t>(u"theirs"));
    EXPECT_EQ(branches[0].head, from.merge.object.id);
    EXPECT_TRUE(to->FindMissing({&from.side.object.id, 1}).empty()) << "what was merged comes along";
    EXPECT_EQ(to->GetStatistics().ancestries, from.archive.GetStatistics().ancestries);
    EXPECT_EQ(to->ReadAncestry({&from.merge.object.id, 1}, Follow::Parents, 0)[0].contains.size(), 2U);
    EXPECT_EQ(to->ListRecords().size(), 2U) << "the settings, and the head";
    std::uint64_t const most = from.archive.GetStatistics().bytes * 5 / 4;
    EXPECT_TRUE(!GetParam() || to->GetStatistics().bytes < most) << "differences stay differences";
    EXPECT_EQ(Synchronize(from.archive, *to, Everything(), nullptr).objects, 0U) << "what is there is not copied";
}

TEST(ArchiveSynchronize, AsksForManyVersionsAtOnce) {
    struct Counting final : ForwardingArchive {
        IArchive& Reach() override { return ++calls, archive; }
        MemArchive archive;
        std::size_t calls = 0;
    } from, to;
    SmallHost host(from, 1);
    for (int i = 0; i < 400; ++i)
        host.Publish();
    from.calls = 0;
    Synchronize(from, to, Everything(), nullptr);
    EXPECT_EQ(to.archive.GetStatistics().commits, 400U);
    // Every fourth version has a large content, which is asked for and stored by itself.
    EXPECT_LT(from.calls, 300U);
    EXPECT_LT(to.calls, 200U);
    host.Publish();
    from.calls = to.calls = 0;
    Synchronize(from, to, Everything(), nullptr);
    EXPECT_EQ(to.archive.GetStatistics().commits, 401U);
    EXPECT_LT(from.calls + to.calls, 40U);
}

/// Later merges are made against what was brought last, even if its commit has been collected.
TEST_P(Synchronizing, KeepsTheTreeOfTheHeadExchangedLast) {
    Source from(directory_.Path("from"));
    auto const to = Make();
    std::vector<Id> const heads{from.merge.object.id};
    EXPECT_TRUE(FindForgotten(from.archive, *to, heads).empty()) << "what was never known is not forgotten";
    Synchronize(from.archive, *to, Everything(), nullptr);
    EXPECT_TRUE(FindForgotten(from.archive, *to, heads).empty());
    Id const parent = from.merge.facts.parent;
    MoveHead(from.archive, from.merge.object.id, parent);
    Synchronize(from.archive, *to, Everything(), nullptr);
    Change removal;
    removal.branches = {{u"theirs", parent, {}}};
    ASSERT_TRUE(to->Apply(removal).applied);
    CollectNow(*to);
    CollectNow(*to);
    EXPECT_EQ(to->GetStatistics().commits, 0U);
    std::vector<Id> reached;
    for (Ancestry const& facts : from.archive.ReadAncestry(heads, Follow::Reachable, SIZE_MAX))
        reached.push_back(facts.commit);
    EXPECT_EQ(FindForgotten(from.archive, *to, heads), reached);
    ASSERT_EQ(ReadExchangedHeads(*to).size(), 1U);
    EXPECT_EQ(ReadExchangedHeads(*to)[0].commit, parent);
    Id const tree = from.archive.ReadAncestry({&parent, 1}, Follow::Parents, 0)[0].tree;
    EXPECT_TRUE(to->FindMissing({&tree, 1}).empty()) << "with all that it names:";
    EXPECT_EQ(ProblemsOf(*to), "");
}

TEST_P(Synchronizing, TakesNothingThatIsNotWhatItSays) {
    auto const archive = Make();
    auto const sourceOf = [](std::string const& name, NewObject const& blob) {
        auto source = std::make_unique<MemArchive>();
        NewObject const tree = Object(ObjectType::Tree, TreeOf({{name, Object(ObjectType::Blob, "content").id}}));
        NewCommit const commit = Commit(tree.id, {}, "from elsewhere");
        Change change;
        change.objects = {blob, tree, commit.object};
        change.ancestry = {commit.facts};
        change.branches = {{u"master", {}, commit.object.id}};
        source->Apply(change);
        return source;
    };
    auto const failureOf = [&](IArchive& source) -> std::optional<Failure> {
        SynchronizeOptions options = Everything();
        options.acceptsName = [](KivStringViewT<char16_t> name) { return !(name == KivStringViewT<char16_t>(u"..")); };
        try {
            Synchronize(source, *archive, options, nullptr);
            return std::nullopt;
        } catch (ArchiveError const& error) {
            EXPECT_TRUE(archive->ReadBranches().empty());
            EXPECT_EQ(ProblemsOf(*archive), "");
            return error.GetKind();
        }
    };
    NewObject const sound = Object(ObjectType::Blob, "content");
    NewObject wrong = sound;
    wrong.data = BufferOf("other content");
    NewObject const notATree = Object(ObjectType::Tree, "");
    EXPECT_EQ(failureOf(*sourceOf("file", wrong)), Failure::Damaged);
    EXPECT_EQ(failureOf(*sourceOf("file", notATree)), Failure::Damaged) << "a file that is missing";
    EXPECT_EQ(failureOf(*sourceOf("..", sound)), Failure::Unrepresentable);
    EXPECT_EQ(failureOf(*sourceOf("file", sound)), std::nullopt);
}

TEST(ArchiveRepair, TakesWhatIsDamagedOrGoneFromElsewhere) {
    TemporaryDirectory const directory;
    MemArchive copy;
    {
        SqliteArchive archive(directory.Path("archive"));
        SmallHost host(archive, 1);
        for (int i = 0; i < 30; ++i)
            host.Publish();
        Synchronize(archive, copy, Everything(), nullptr);
    }
    sqlite3* database = nullptr;
    sqlite3_open(directory.Path("archive").c_str(), &database);
    for (const char* const damage :
         {"UPDATE segments SET form=zeroblob(100) WHERE number % 5 = 0", "DELETE FROM segments WHERE number % 7 = 1",
          "DELETE FROM objects WHERE segment % 11 = 2", "DELETE FROM objects WHERE type=2"})
        EXPECT_EQ(sqlite3_exec(database, damage, nullptr, nullptr, nullptr), SQLITE_OK);
    sqlite3_close(database);
    SqliteArchive archive(directory.Path("archive"));
    EXPECT_NE(ProblemsOf(archive), "");
    RepairReport const report = Repair(archive, copy, nullptr);
    EXPECT_EQ(ProblemsOf(archive), "");
    EXPECT_GT(report.repaired.size(), 20U);
    EXPECT_TRUE(report.lost.empty());
    EXPECT_TRUE(SmallHost(archive, 2).Publish());
}

INSTANTIATE_TEST_SUITE_P(Of, Synchronizing, testing::Bool(),
                         [](auto const& kind) { return kind.param ? "SqliteArchive" : "MemArchive"; });

} // namespace
} // namespace KivArchive
