#include "ArchiveFiles.h"
#include "KivArchive/MemArchive.h"

#include <gtest/gtest.h>

#include <set>
#include <sqlite3.h>
#include <thread>

/// Checking archives, and collecting from them.

namespace KivArchive {
namespace {

using namespace Conformance;

constexpr std::chrono::seconds noGrace{0};

CollectReport CollectNow(IArchive& archive, std::vector<Id> kept = {}) {
    CollectOptions options;
    options.grace = noGrace;
    options.kept = std::move(kept);
    options.slice = 3;
    return Collect(archive, options, nullptr);
}

/// Every test is run on each kind of archive.
class ArchiveUpkeep : public testing::TestWithParam<bool> {
protected:
    std::unique_ptr<IArchive> Make() {
        if (!GetParam())
            return std::make_unique<MemArchive>();
        return std::make_unique<SqliteArchive>(directory_.Path("archive"));
    }

    TemporaryDirectory directory_;
};

void MoveHead(IArchive& archive, Id const& from, Id const& to) {
    Change change;
    change.branches = {{u"master", from, to}};
    ASSERT_TRUE(archive.Apply(change).applied);
}

TEST_P(ArchiveUpkeep, VerifyNamesWhatIsMissingAndWrong) {
    auto const archive = Make();
    SmallHost host(*archive, 1);
    for (int i = 0; i < 5; ++i)
        host.Publish();
    EXPECT_EQ(ProblemsOf(*archive), "");

    NewObject const absent = Object(ObjectType::Blob, "absent");
    NewObject const tree = Object(ObjectType::Tree, TreeOf({{"file", absent.id}}));
    NewObject const noTree = Object(ObjectType::Tree, "100644 blob without an end");
    NewObject wrong = Object(ObjectType::Blob, "right");
    wrong.data = BufferOf("wrong");
    NewCommit const withoutFacts = Commit(tree.id, {}, "no facts");
    Change change;
    change.objects = {tree, noTree, wrong, withoutFacts.object};
    change.branches = {{u"no commit", {}, tree.id}};
    archive->Apply(change);
    VerifyReport const report = Verify(*archive, nullptr);
    auto const sorted = [](std::vector<Id> ids) {
        std::set<std::string> digits;
        for (Id const& id : ids)
            digits.insert(DigitsOf(id));
        return digits;
    };
    EXPECT_EQ(sorted(report.damaged), sorted({noTree.id, wrong.id}));
    ASSERT_EQ(report.missing.size(), 1U);
    EXPECT_EQ(report.missing[0].id, absent.id);
    EXPECT_EQ(report.missing[0].namedBy, tree.id);
    ASSERT_EQ(report.branches.size(), 1U);
    EXPECT_EQ(report.branches[0].name, KivStringT<char16_t>(u"no commit"));
    EXPECT_EQ(report.ancestry, std::vector<Id>{withoutFacts.object.id});
}

TEST_P(ArchiveUpkeep, CollectRemovesWhatNothingReachesAfterItsTime) {
    auto const archive = Make();
    SmallHost host(*archive, 2);
    for (int i = 0; i < 10; ++i)
        host.Publish();
    Id const head = host.Head();
    Id const tenth = archive->ReadAncestry({&head, 1}, Follow::Parents, 5).back().commit;
    std::uint64_t const before = archive->GetStatistics().blobs;
    MoveHead(*archive, head, tenth);

    CollectReport report = CollectNow(*archive);
    EXPECT_GT(report.marked, 0U);
    EXPECT_EQ(report.removed, 0U) << "what was just marked has its grace time";
    // Somebody goes back to an old version meanwhile, and away again.
    MoveHead(*archive, tenth, head);
    MoveHead(*archive, head, tenth);
    EXPECT_EQ(CollectNow(*archive, {head}).removed, 0U) << "what is kept stays";
    CollectNow(*archive);
    report = CollectNow(*archive);
    EXPECT_EQ(ProblemsOf(*archive), "");
    EXPECT_LT(archive->GetStatistics().blobs, before);
    EXPECT_EQ(archive->GetStatistics().commits, 5U);
    EXPECT_EQ(archive->GetStatistics().ancestries, 10U) << "facts stay";
    EXPECT_EQ(archive->FindMissing({&head, 1}).size(), 1U);
    // What was collected can come back.
    SmallHost again(*archive, 2);
    for (int i = 0; i < 10; ++i)
        EXPECT_TRUE(again.Publish());
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST_P(ArchiveUpkeep, CollectGoesOnInPortions) {
    auto const archive = Make();
    SmallHost host(*archive, 3);
    host.Publish();
    Id const first = host.Head();
    for (int i = 0; i < 5; ++i)
        host.Publish();
    MoveHead(*archive, host.Head(), first);
    CollectOptions options;
    options.grace = noGrace;
    options.mostMarked = 2;
    std::uint64_t marked = 0;
    std::uint64_t removed = 0;
    for (CollectReport report{0, 1, 0, 0}; report.marked > 0; marked = report.marked, removed += report.removed) {
        report = Collect(*archive, options, nullptr);
        EXPECT_LE(report.marked, 2U);
        EXPECT_EQ(report.removed, marked) << "what names them was marked before or with them";
    }
    EXPECT_GT(removed, 10U);
    EXPECT_EQ(archive->GetStatistics().commits, 1U);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST_P(ArchiveUpkeep, CollectKeepsWhatWasMergedAndEndsAtDamage) {
    auto const archive = Make();
    NewObject const tree = Object(ObjectType::Tree, "");
    NewCommit const theirs = Commit(tree.id, {}, "theirs");
    NewCommit ours = Commit(tree.id, {}, "ours");
    NewCommit const rewritten = Commit(tree.id, {}, "rewritten");
    ours.facts.contains = {{Containment::Merged, theirs.object.id}, {Containment::RewrittenFrom, rewritten.object.id}};
    Change change;
    change.objects = {tree, theirs.object, rewritten.object, ours.object};
    change.ancestry = {theirs.facts, rewritten.facts, ours.facts};
    change.branches = {{u"master", {}, ours.object.id}};
    archive->Apply(change);
    CollectNow(*archive);
    EXPECT_EQ(CollectNow(*archive).removed, 1U);
    std::vector<Id> const ids{theirs.object.id, rewritten.object.id};
    EXPECT_EQ(archive->FindMissing(ids), std::vector<Id>{rewritten.object.id});

    NewObject const unreadable = Object(ObjectType::Tree, "100644 blob nothing");
    NewCommit const broken = Commit(unreadable.id, ours.object.id, "broken");
    change = {};
    change.objects = {unreadable, broken.object};
    change.ancestry = {broken.facts};
    change.branches = {{u"master", ours.object.id, broken.object.id}};
    archive->Apply(change);
    EXPECT_THROW(CollectNow(*archive), ArchiveError);
}

/// What others do between two steps of a collection.
struct Meanwhile final : IProgress {
    bool Report(Progress const& progress) override {
        if (progress.step == std::string_view("removing objects") && act)
            std::exchange(act, nullptr)();
        return true;
    }
    std::function<void()> act;
};

TEST_P(ArchiveUpkeep, WhatIsUsedOrNotDueKeepsWhatItNames) {
    auto const archive = Make();
    NewObject const blob = Object(ObjectType::Blob, "deep");
    NewObject const inner = Object(ObjectType::Tree, TreeOf({{"file", blob.id}}));
    NewObject const outer = Object(ObjectType::Tree, "40000 tree inner" + std::string(1, '\0') + DigitsOf(inner.id));
    NewObject const youngBlob = Object(ObjectType::Blob, "old");
    NewObject const young = Object(ObjectType::Tree, TreeOf({{"file", youngBlob.id}}));
    Change change;
    change.objects = {blob, inner, outer, youngBlob, young};
    archive->Apply(change);
    std::vector<Id> const due{blob.id, inner.id, outer.id, youngBlob.id};
    archive->Mark(due);

    Meanwhile meanwhile;
    meanwhile.act = [&] {
        NewCommit const commit = Commit(outer.id, {}, "uses it");
        Change use;
        use.objects = {commit.object};
        use.relied = {outer.id};
        use.ancestry = {commit.facts};
        use.branches = {{u"master", {}, commit.object.id}};
        archive->Apply(use);
    };
    CollectOptions options;
    options.grace = noGrace;
    options.slice = 1;
    EXPECT_EQ(Collect(*archive, options, &meanwhile).removed, 0U);
    EXPECT_EQ(meanwhile.act, nullptr);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

/// Two publish and go back to old versions while a third one collects with no grace time at all.
TEST_P(ArchiveUpkeep, PublishersAndCollectorsMayRunAtOnce) {
    auto const archive = Make();
    std::atomic<bool> isDone{false};
    std::atomic<int> collected{0};
    std::thread collector([&] {
        while (!isDone) {
            CollectNow(*archive);
            ++collected;
        }
    });
    auto const publish = [&](std::uint32_t seed) {
        KivStringT<char16_t> const name(seed == 1 ? u"one" : u"two");
        std::mt19937 random(seed);
        Id head;
        Id tree;
        for (int i = 0; i < 400; ++i) {
            // The same few contents again and again, so that what is collected is used anew.
            NewObject const blob = Object(ObjectType::Blob, SomeText(static_cast<std::uint32_t>(random() % 12), 3000));
            NewObject const next =
                Object(ObjectType::Tree, TreeOf({{"f" + std::to_string(random() % 3), blob.id}}), tree);
            NewCommit const commit = Commit(next.id, {}, std::to_string(random() % 4));
            Change change;
            std::vector<Id> const ids{blob.id, next.id};
            auto const missing = archive->FindMissing(ids);
            for (NewObject const& object : {blob, next})
                if (std::find(missing.begin(), missing.end(), object.id) != missing.end())
                    change.objects.push_back(object);
                else
                    change.relied.push_back(object.id);
            change.objects.push_back(commit.object);
            change.ancestry = {commit.facts};
            change.branches = {{name, head, commit.object.id}};
            try {
                if (archive->Apply(change).applied) {
                    head = commit.object.id;
                    tree = next.id;
                }
            } catch (ArchiveError const& error) {
                EXPECT_EQ(error.GetKind(), Failure::Collected) << error.what();
            }
        }
    };
    std::thread other(publish, 1);
    publish(2);
    other.join();
    while (collected < 2)
        std::this_thread::yield();
    isDone = true;
    collector.join();
    EXPECT_EQ(ProblemsOf(*archive), "");
    CollectNow(*archive);
    CollectNow(*archive);
    EXPECT_EQ(ProblemsOf(*archive), "");
    EXPECT_LE(archive->GetStatistics().blobs, 2U);
}

SynchronizeOptions Everything() {
    SynchronizeOptions options;
    options.branches = {{u"master", u"theirs"}, {u"none", u"none"}};
    options.records = {u"settings"};
    return options;
}

TEST_P(ArchiveUpkeep, SynchronizeBringsHistoriesFactsAndRecords) {
    SqliteArchive from(directory_.Path("from"));
    SmallHost host(from, 1);
    for (int i = 0; i < 110; ++i)
        host.Publish();
    Change change;
    NewObject const tree = Object(ObjectType::Tree, "");
    NewCommit const side = Commit(tree.id, {}, "side");
    NewCommit merge = Commit(tree.id, host.Head(), "merge");
    merge.facts.contains = {{Containment::Merged, side.object.id}, {Containment::RewrittenFrom, Id(BufferOf("gone"))}};
    change.objects = {tree, side.object, merge.object};
    change.ancestry = {side.facts, merge.facts};
    change.branches = {{u"master", host.Head(), merge.object.id}};
    change.records.push_back({{u"settings", BufferOf("dark")}, false, {}});
    ASSERT_TRUE(from.Apply(change).applied);

    auto const to = Make();
    // Interrupted again and again, and gone on with.
    struct Stop final : IProgress {
        bool Report(Progress const& /*progress*/) override { return --rest > 0; }
        int rest = 0;
    } stop;
    int interruptions = 0;
    for (int patience = 1;; patience += 25, ++interruptions) {
        stop.rest = patience;
        try {
            Synchronize(from, *to, Everything(), &stop);
            break;
        } catch (ArchiveError const& error) {
            ASSERT_EQ(error.GetKind(), Failure::Cancelled) << error.what();
            ASSERT_EQ(ProblemsOf(*to), "");
            ASSERT_TRUE(to->ReadBranches().empty());
        }
    }
    EXPECT_GT(interruptions, 3);
    EXPECT_EQ(ProblemsOf(*to), "");
    auto const branches = to->ReadBranches();
    ASSERT_EQ(branches.size(), 1U);
    EXPECT_EQ(branches[0].name, KivStringT<char16_t>(u"theirs"));
    EXPECT_EQ(branches[0].head, merge.object.id);
    EXPECT_TRUE(to->FindMissing({&side.object.id, 1}).empty()) << "what was merged comes along";
    EXPECT_EQ(to->GetStatistics().ancestries, from.GetStatistics().ancestries);
    EXPECT_EQ(to->ReadAncestry({&merge.object.id, 1}, Follow::Parents, 0)[0].contains.size(), 2U);
    EXPECT_EQ(to->ListRecords().size(), 2U) << "the settings, and the head";
    std::uint64_t const most = from.GetStatistics().bytes * 5 / 4;
    EXPECT_TRUE(!GetParam() || to->GetStatistics().bytes < most) << "differences stay differences";
    EXPECT_EQ(Synchronize(from, *to, Everything(), nullptr).objects, 0U) << "what is there is not copied";

    // Later merges are made against what was brought last, also when its commit is gone.
    Id const before = from.ReadAncestry({&merge.facts.parent, 1}, Follow::Parents, 0)[0].tree;
    Change back;
    back.branches = {{u"master", merge.object.id, merge.facts.parent}};
    ASSERT_TRUE(from.Apply(back).applied);
    Synchronize(from, *to, Everything(), nullptr);
    back.branches = {{u"theirs", merge.facts.parent, {}}};
    ASSERT_TRUE(to->Apply(back).applied);
    CollectNow(*to);
    CollectNow(*to);
    EXPECT_EQ(to->GetStatistics().commits, 0U);
    ASSERT_EQ(ReadExchangedHeads(*to).size(), 1U);
    EXPECT_EQ(ReadExchangedHeads(*to)[0].commit, merge.facts.parent);
    EXPECT_TRUE(to->FindMissing({&before, 1}).empty()) << "with all that it names:";
    EXPECT_EQ(ProblemsOf(*to), "");
}

TEST_P(ArchiveUpkeep, SynchronizeTakesNothingThatIsNotWhatItSays) {
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

INSTANTIATE_TEST_SUITE_P(Of, ArchiveUpkeep, testing::Bool(),
                         [](auto const& kind) { return kind.param ? "SqliteArchive" : "MemArchive"; });

} // namespace
} // namespace KivArchive
