#pragma once

/// @file
/// The cases of branches, records, ancestry and marks.

#include "KivArchive/detail/ConformanceObjects.h"

namespace KivArchive::Conformance {

inline void CheckBranches(Trial& trial, IArchive& archive) {
    NewObject const tree = Object(ObjectType::Tree, "");
    NewCommit const one = Commit(tree.id, {}, "one");
    NewCommit const two = Commit(tree.id, one.object.id, "two");
    KivStringT<char16_t> const odd(u"odd \xD800 \0 name", 12);
    trial.Expect(
        archive.Apply(Moving({{u"master", {}, one.object.id}, {odd, {}, one.object.id}}, {tree, one.object})).applied,
        "branches are made");
    auto outcome = archive.Apply(
        Moving({{u"master", one.object.id, two.object.id}, {odd, two.object.id, {}}, {u"new", {}, two.object.id}},
               {two.object}));
    trial.Expect(!outcome.applied && outcome.movedBranches.size() == 1 && outcome.movedBranches[0].name == odd &&
                     outcome.movedBranches[0].head == one.object.id,
                 "a lost race names the branch and its head");
    trial.Expect(archive.FindMissing({&two.object.id, 1}).size() == 1 && archive.ReadBranches().size() == 2,
                 "a lost race stores nothing");
    trial.Expect(
        archive.Apply(Moving({{u"master", one.object.id, two.object.id}, {odd, one.object.id, {}}}, {two.object}))
            .applied,
        "branches move and go");
    auto const branches = archive.ReadBranches();
    trial.Expect(branches.size() == 1 && branches[0].name == KivStringT<char16_t>(u"master") &&
                     branches[0].head == two.object.id,
                 "branches are read");
    outcome = archive.Apply(Moving({{u"gone", one.object.id, two.object.id}, {u"master", {}, one.object.id}}));
    trial.Expect(!outcome.applied && outcome.movedBranches.size() == 2 && outcome.movedBranches[0].head.IsEmpty(),
                 "a branch that is gone, or is there already, is a lost race");
    trial.ExpectFailure(
        Failure::Collected,
        [&] {
            archive.Apply(
                Moving({{u"b", {}, Commit(tree.id, {}, "nowhere").object.id}}, {Object(ObjectType::Blob, "new")}));
        },
        "a head must be there");
    Id const notStored = Object(ObjectType::Blob, "new").id;
    trial.Expect(archive.ReadBranches().size() == 1 && archive.FindMissing({&notStored, 1}).size() == 1,
                 "a refused change stores nothing");
}

inline Change Setting(KivStringT<char16_t> const& name, std::optional<Buffer> value, bool compared = false,
                      std::optional<Buffer> expected = {}) {
    Change change;
    change.records.push_back({{name, std::move(value)}, compared, std::move(expected)});
    return change;
}

inline void CheckRecords(Trial& trial, IArchive& archive) {
    KivStringT<char16_t> const odd(u"a\0\xDC00", 3);
    trial.Expect(archive.Apply(Setting(u"settings", BufferOf("1"), true)).applied, "a record is made");
    trial.Expect(archive.Apply(Setting(odd, BufferOf(""))).applied, "a record may be empty");
    auto const outcome = archive.Apply(Setting(u"settings", BufferOf("2"), true, BufferOf("0")));
    trial.Expect(!outcome.applied && outcome.changedRecords.size() == 1 &&
                     TextOf(outcome.changedRecords[0].value.value_or(Buffer())) == "1",
                 "a lost race gives the value");
    trial.Expect(!archive.Apply(Setting(odd, BufferOf("x"), true)).applied, "an empty record is not a missing one");
    trial.Expect(archive.Apply(Setting(u"settings", BufferOf("2"), true, BufferOf("1"))).applied,
                 "a record is changed");
    trial.Expect(archive.ListRecords() == std::vector<KivStringT<char16_t>>{odd, u"settings"}, "records are listed");
    std::vector<KivStringT<char16_t>> const names{u"settings", u"none", odd};
    auto const records = archive.ReadRecords(names);
    trial.Expect(records.size() == 2 && records[0].name == odd && records[0].value &&
                     records[0].value->GetSize() == 0 && records[1].value && TextOf(*records[1].value) == "2",
                 "records are read");
    trial.Expect(archive.Apply(Setting(odd, {})).applied && archive.ListRecords().size() == 1, "a record is removed");
}

inline void CheckAncestry(Trial& trial, IArchive& archive) {
    std::vector<Id> ids;
    Change change;
    NewObject const tree = Object(ObjectType::Tree, "");
    for (int i = 0; i < 50; ++i) {
        ids.push_back(Commit(tree.id, i == 0 ? Id() : ids.back(), std::to_string(i)).object.id);
        change.ancestry.push_back({ids.back(), i == 0 ? Id() : ids[ids.size() - 2], tree.id, {}});
    }
    Id const side = Commit(tree.id, ids[3], "side").object.id;
    Id const old = Commit(tree.id, ids[2], "old").object.id;
    change.ancestry.push_back({side, ids[3], tree.id, {{Containment::RewrittenFrom, old}}});
    // Rewritten there and back.
    change.ancestry.push_back({old, ids[2], tree.id, {{Containment::RewrittenFrom, side}}});
    trial.Expect(archive.Apply(change).applied, "facts need no objects");
    change = {};
    change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::Merged, side}}});
    change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::FoundEqual, ids[7]}}});
    change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::Merged, side}}});
    archive.Apply(change);
    archive.Apply(change);

    auto const facts = archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 0);
    trial.Expect(facts.size() == 1 && facts[0].parent == ids[48] && facts[0].tree == tree.id &&
                     facts[0].contains.size() == 2,
                 "facts are added, each once");
    auto const idsOf = [](std::vector<Ancestry> const& walked) {
        std::vector<Id> walkedIds;
        for (Ancestry const& one : walked)
            walkedIds.push_back(one.commit);
        return walkedIds;
    };
    trial.Expect(idsOf(archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 2)) ==
                     std::vector<Id>{ids[49], ids[48], ids[47]},
                 "parents come nearest first, as many as asked for");
    std::vector<Id> const starts{ids[1], ids[0], Object(ObjectType::Blob, "unknown").id, ids[1]};
    trial.Expect(idsOf(archive.ReadAncestry(starts, Follow::Everything, 100)) == std::vector<Id>{ids[1], ids[0]},
                 "each commit is reported once, unknown ones are not");
    trial.Expect(archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 100).size() == 50 &&
                     archive.ReadAncestry({&ids[49], 1}, Follow::Reachable, 100).size() == 51 &&
                     archive.ReadAncestry({&ids[49], 1}, Follow::Everything, 100).size() == 52,
                 "walks follow what they are asked to, and end");
    trial.Expect(archive.ListAncestry({}, 30).size() == 30 &&
                     archive.ListAncestry(archive.ListAncestry({}, 30).back().commit, 30).size() == 22 &&
                     archive.GetStatistics().ancestries == 52,
                 "all facts are listed");

    NewCommit const late = Commit(tree.id, {}, "late");
    Store(archive, {tree, Commit(tree.id, {}, "0").object, late.object});
    trial.Expect(archive.ReadAncestry({&late.object.id, 1}, Follow::Parents, 0).empty() &&
                     archive.ListAncestry({}, 100).size() == 52 && archive.FindMissing({ids.data(), 2}).size() == 1 &&
                     ReadAll(archive, {ids[0]}).size() == 1,
                 "facts come before their commit, or not at all");
    change = {};
    change.ancestry = {late.facts};
    archive.Apply(change);
    trial.Expect(archive.ReadAncestry({&late.object.id, 1}, Follow::Parents, 0).size() == 1 &&
                     archive.ListAncestry({}, 100).size() == 53 && ReadAll(archive, {late.object.id}).size() == 1,
                 "or behind it");
}

inline void CheckMarks(Trial& trial, IArchive& archive) {
    NewObject const blob = Object(ObjectType::Blob, "blob");
    NewObject const tree = Object(ObjectType::Tree, TreeOf({{"name", blob.id}}));
    NewCommit const commit = Commit(tree.id, {}, "commit");
    Change change;
    change.objects = {blob, tree, commit.object};
    change.ancestry = {commit.facts};
    archive.Apply(change);
    std::vector<Id> const ids{commit.object.id, tree.id, blob.id};
    std::chrono::seconds const none{0};
    std::chrono::seconds const hour{3600};
    auto const marked = [&](std::chrono::seconds grace) { return archive.ListMarked(grace, {}, 10).size(); };

    archive.Mark(ids);
    archive.Mark(std::vector<Id>{Object(ObjectType::Blob, "unknown").id});
    trial.Expect(marked(none) == 3 && marked(hour) == 0 && archive.GetStatistics().marked == 3,
                 "marks are reported once their time has come");
    trial.Expect(archive.Remove(ids, hour) == ids, "nothing is removed before its time");
    Change reliance;
    reliance.relied = {tree.id};
    archive.Apply(reliance);
    trial.Expect(marked(none) == 2 && archive.Remove(ids, none) == std::vector<Id>{tree.id} &&
                     archive.FindMissing(ids).empty(),
                 "relying on an object unmarks it, and then none of a batch is removed");
    archive.Apply(Moving({{u"master", {}, commit.object.id}}));
    Store(archive, {blob});
    trial.Expect(marked(none) == 0, "so do a branch and storing it again");
    archive.Mark(ids);
    archive.Unmark(std::vector<Id>{blob.id});
    trial.Expect(marked(none) == 2, "marks are taken away");
    archive.Mark(ids);
    trial.Expect(archive.Remove(ids, none).empty() && archive.FindMissing(ids) == ids && marked(none) == 0 &&
                     ReadAll(archive, ids).empty() && archive.Describe(ids).empty() &&
                     archive.ListObjects({}, 9).empty(),
                 "what is removed is gone");
    trial.Expect(archive.ReadAncestry({&commit.object.id, 1}, Follow::Parents, 0).size() == 1, "its facts stay");
    trial.ExpectFailure(
        Failure::Collected, [&] { archive.Apply(reliance); }, "what is gone cannot be relied on");
    archive.Apply(change);
    trial.Expect(archive.FindMissing(ids).empty() && ReadAll(archive, ids).size() == 3, "it can be stored again");
}

} // namespace KivArchive::Conformance
