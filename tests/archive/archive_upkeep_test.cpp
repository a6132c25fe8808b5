#include "archive_upkeep/Upkeep.h"

#include <atomic>
#include <functional>
#include <random>
#include <set>
#include <thread>

/// Checking archives, and collecting from them.

namespace KivArchive {
namespace {

using namespace Conformance;

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
    // Meanwhile the branch goes back to an old version, and away again.
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
    // What was collected can be stored again.
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

    Meanwhile meanwhile([&] {
        NewCommit const commit = Commit(outer.id, {}, "uses it");
        Change use;
        use.objects = {commit.object};
        use.relied = {outer.id};
        use.ancestry = {commit.facts};
        use.branches = {{u"master", {}, commit.object.id}};
        archive->Apply(use);
    });
    CollectOptions options;
    options.grace = noGrace;
    options.slice = 1;
    EXPECT_EQ(Collect(*archive, options, &meanwhile).removed, 0U);
    EXPECT_EQ(meanwhile.act, nullptr);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

/// Publishes root commits on a branch of its own, with few contents, so that what is collected is soon stored again.
void PublishRepeatedly(IArchive& archive, std::uint32_t seed) {
    KivStringT<char16_t> const name(seed == 1 ? u"one" : u"two");
    std::mt19937 random(seed);
    Id head;
    Id tree;
    for (int i = 0; i < 400; ++i) {
        NewObject const blob = Object(ObjectType::Blob, SomeText(static_cast<std::uint32_t>(random() % 12), 3000));
        NewObject const next = Object(ObjectType::Tree, TreeOf({{"f" + std::to_string(random() % 3), blob.id}}), tree);
        NewCommit const commit = Commit(next.id, {}, std::to_string(random() % 4));
        Change change;
        std::vector<Id> const ids{blob.id, next.id};
        auto const missing = archive.FindMissing(ids);
        for (NewObject const& object : {blob, next})
            if (std::find(missing.begin(), missing.end(), object.id) != missing.end())
                change.objects.push_back(object);
            else
                change.relied.push_back(object.id);
        change.objects.push_back(commit.object);
        change.ancestry = {commit.facts};
        change.branches = {{name, head, commit.object.id}};
        try {
            if (archive.Apply(change).applied) {
                head = commit.object.id;
                tree = next.id;
            }
        } catch (ArchiveError const& error) {
            EXPECT_EQ(error.GetKind(), Failure::Collected) << error.what();
        }
    }
}

/// Two threads publish and go back to old versions while a third one collects without any grace time.
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
    std::thread other(PublishRepeatedly, std::ref(*archive), 1U);
    PublishRepeatedly(*archive, 2);
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

INSTANTIATE_TEST_SUITE_P(Of, ArchiveUpkeep, testing::Bool(),
                         [](auto const& kind) { return kind.param ? "SqliteArchive" : "MemArchive"; });

} // namespace
} // namespace KivArchive
