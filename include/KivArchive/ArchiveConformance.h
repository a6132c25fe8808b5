#pragma once

/// @file
/// What every archive must do, for those who write one: hand `CheckArchiveConformance` a way to make empty archives and
/// a place to report failures to. Needs no test framework and no more than the library.

#include "KivArchive/IArchive.h"

#include <algorithm>
#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <string_view>
#include <thread>

namespace KivArchive {

/// An archive is tried with nothing but what is in it; each case begins with an empty one.
using ArchiveMaker = std::function<std::unique_ptr<IArchive>()>;

/// Receives what is wrong, in a sentence that begins with the case. May throw, which ends the check.
using ConformanceFailure = std::function<void(std::string const&)>;

namespace Conformance {

inline Buffer BufferOf(std::string_view text) {
    Buffer buffer;
    buffer.Append(text.data(), text.size());
    return buffer;
}

inline std::string TextOf(Buffer const& buffer) {
    std::string text;
    for (auto const& chunk : buffer.LockForRead())
        text.append(reinterpret_cast<const char*>(chunk.data()), chunk.size());
    return text;
}

inline NewObject Object(ObjectType type, std::string_view data, Id earlier = {}) {
    Buffer const buffer = BufferOf(data);
    return {Identify(type, buffer), type, buffer, std::move(earlier)};
}

inline std::string DigitsOf(Id const& id) {
    std::string digits;
    for (char16_t const unit : KivStringViewT<char16_t>(id.GetText()))
        digits += static_cast<char>(unit);
    return digits;
}

/// The data of a tree with the given files.
inline std::string TreeOf(std::vector<std::pair<std::string, Id>> const& files) {
    std::string data;
    for (auto const& [name, id] : files)
        data += "100644 blob " + name + '\0' + DigitsOf(id);
    return data;
}

/// A commit of a root tree, and its facts.
struct NewCommit {
    NewObject object;
    Ancestry facts;
};

inline NewCommit Commit(Id const& tree, Id const& parent, std::string const& description) {
    std::string const author = "Ada <ada@example.org> 1700000000 +0100\n";
    std::string const parentLine = parent.IsEmpty() ? "" : "parent " + DigitsOf(parent) + "\n";
    NewObject object = Object(ObjectType::Commit, "tree " + DigitsOf(tree) + "\n" + parentLine + "author " + author +
                                                      "committer " + author + "\n" + description + "\n");
    Ancestry facts{object.id, parent, tree, {}};
    return {std::move(object), std::move(facts)};
}

/// Text that compresses as sources do, the same for one seed everywhere.
inline std::string SomeText(std::uint32_t seed, std::size_t size) {
    std::mt19937 random(seed);
    std::string text;
    while (text.size() < size)
        text += "line " + std::to_string(random() % 100000) + (random() % 8 == 0 ? "\n" : " of many; ");
    text.resize(size);
    return text;
}

/// Bytes that do not compress.
inline std::string SomeNoise(std::uint32_t seed, std::size_t size) {
    std::mt19937 random(seed);
    std::string noise(size, '\0');
    for (char& byte : noise)
        byte = static_cast<char>(random() & 0xFFU);
    return noise;
}

/// The data of objects that were read, by identifier.
inline std::map<std::string, std::string> ReadAll(IArchive& archive, std::vector<Id> const& ids) {
    std::map<std::string, std::string> found;
    archive.Read(ids, [&found](ArchivedObject const& object) {
        found[DigitsOf(object.id)] = std::string(reinterpret_cast<const char*>(object.data.data()), object.data.size());
    });
    return found;
}

/// One run of all cases.
class Check {
public:
    Check(ArchiveMaker make, ConformanceFailure fail) : make_(std::move(make)), fail_(std::move(fail)) {}

    void All() {
        Run("Objects", &Check::Objects);
        Run("Versions", &Check::Versions);
        Run("LargeContents", &Check::LargeContents);
        Run("Branches", &Check::Branches);
        Run("Records", &Check::Records);
        Run("Ancestry", &Check::AncestryFacts);
        Run("Marks", &Check::Marks);
        Run("RemovedEarlierVersions", &Check::RemovedEarlierVersions);
        Run("Refusals", &Check::Refusals);
        Run("Threads", &Check::Threads);
    }

private:
    void Run(const char* name, void (Check::*run)(IArchive&)) {
        case_ = name;
        auto const archive = make_();
        try {
            (this->*run)(*archive);
        } catch (ArchiveError const& error) {
            fail_(case_ + ": unexpected failure: " + error.what());
        }
    }

    void Expect(bool holds, std::string const& sentence) {
        if (!holds)
            fail_(case_ + ": " + sentence);
    }

    template <class Call>
    void ExpectFailure(Failure kind, Call call, std::string const& sentence) {
        try {
            call();
        } catch (ArchiveError const& error) {
            Expect(error.GetKind() == kind, sentence + ", but of the wrong kind: " + error.what());
            return;
        }
        Expect(false, sentence);
    }

    static ChangeOutcome Store(IArchive& archive, std::vector<NewObject> objects) {
        Change change;
        change.objects = std::move(objects);
        return archive.Apply(change);
    }

    void Objects(IArchive& archive) {
        Expect(archive.FindMissing({}).empty() && archive.Describe({}).empty() && ReadAll(archive, {}).empty(),
               "empty batches give nothing");
        std::vector<NewObject> objects{Object(ObjectType::Blob, ""), Object(ObjectType::Blob, "hello"),
                                       Object(ObjectType::Blob, SomeNoise(1, largestWholeContent)),
                                       Object(ObjectType::Blob, SomeText(2, 300000))};
        Expect(DigitsOf(objects[1].id) == "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60",
               "identifiers are digests of packed forms");
        std::vector<std::pair<std::string, Id>> files;
        for (int i = 0; i < 20000; ++i)
            files.emplace_back("file" + std::to_string(100000 + i), objects[static_cast<std::size_t>(i) % 4].id);
        objects.push_back(Object(ObjectType::Tree, TreeOf(files)));
        objects.push_back(Object(ObjectType::Tree, ""));
        objects.push_back(Object(ObjectType::Tree, TreeOf(files).substr(5)));
        objects.push_back(Commit(objects[4].id, {}, "First\n\nwith more").object);
        for (std::uint32_t i = 0; i < 500; ++i)
            objects.push_back(Object(ObjectType::Blob, SomeText(100 + i, i * 17)));
        std::vector<Id> ids;
        for (NewObject const& object : objects)
            ids.push_back(object.id);
        Expect(archive.FindMissing(ids) == ids, "an empty archive misses everything, in order");
        Expect(Store(archive, objects).applied && Store(archive, objects).applied, "storing twice is storing once");
        Expect(archive.FindMissing(ids).empty(), "what is stored is not missing");

        auto const found = ReadAll(archive, ids);
        for (NewObject const& object : objects) {
            auto const data = found.find(DigitsOf(object.id));
            Expect(data != found.end() && data->second == TextOf(object.data), "objects come back as they were stored");
            auto const info = archive.Describe({&object.id, 1});
            Expect(info.size() == 1 && info[0].type == object.type && info[0].size == object.data.GetSize(),
                   "types and sizes are reported");
        }
        Id const unknown = Object(ObjectType::Blob, "unknown").id;
        std::vector<Id> const asked{ids[1], unknown, ids[7]};
        ReadOutcome const outcome = archive.Read(asked, [](ArchivedObject const&) {});
        Expect(outcome.missing == std::vector<Id>{unknown} && outcome.damaged.empty(), "missing objects are reported");

        // Page by page in ascending order.
        std::vector<Id> listed;
        for (Id after;;) {
            auto const page = archive.ListObjects(after, 100);
            for (ObjectInfo const& info : page)
                listed.push_back(info.id);
            if (page.size() < 100)
                break;
            after = listed.back();
        }
        std::sort(ids.begin(), ids.end(),
                  [](Id const& left, Id const& right) { return *left.GetDigest() < *right.GetDigest(); });
        ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
        Expect(listed == ids, "all objects are listed in ascending order");
        auto const statistics = archive.GetStatistics();
        Expect(statistics.blobs + statistics.trees + statistics.commits == ids.size() && statistics.commits == 1 &&
                   statistics.trees == 3,
               "objects are counted by type");
    }

    /// Many versions of one path, each one change apart, stored one by one and all at once.
    void Versions(IArchive& archive) {
        std::string text = SomeText(3, 200000);
        std::vector<std::pair<std::string, Id>> files;
        for (int i = 0; i < 300; ++i)
            files.emplace_back("f" + std::to_string(i + 1000), Object(ObjectType::Blob, std::to_string(i)).id);
        std::map<std::string, std::string> expected;
        std::vector<Id> ids;
        Id earlierText;
        Id earlierTree;
        Change change;
        for (std::uint32_t version = 0; version < 70; ++version) {
            text.insert(version * 2777 % text.size(), "edit " + std::to_string(version));
            if (version % 3 == 0)
                text.erase(version * 1313 % text.size(), 40);
            NewObject const blob = Object(ObjectType::Blob, text, earlierText);
            files[version * 7 % files.size()].second = blob.id;
            if (version % 5 == 0)
                files.emplace_back("g" + std::to_string(version + 1000), blob.id);
            NewObject const tree = Object(ObjectType::Tree, TreeOf(files), earlierTree);
            change.objects.push_back(blob);
            change.objects.push_back(tree);
            if (version < 40 || version == 69) {
                archive.Apply(change);
                change = {};
            }
            for (NewObject const& object : {blob, tree}) {
                expected[DigitsOf(object.id)] = TextOf(object.data);
                ids.push_back(object.id);
            }
            earlierText = blob.id;
            earlierTree = tree.id;
        }
        Expect(ReadAll(archive, ids) == expected, "every version comes back as it was");
    }

    static bool StoreStream(IArchive& archive, Id const& id, std::string const& data, Id const& earlier,
                            IProgress* progress = nullptr) {
        Buffer buffer = BufferOf(data);
        StreamIO stream(KivVcs::MemStream::CreateOnRef(buffer));
        return archive.StoreContent(id, stream, earlier, progress);
    }

    void LargeContents(IArchive& archive) {
        std::string const first = SomeNoise(5, 3500000) + SomeText(6, 3500000);
        std::string second = first;
        second.insert(1234567, "inserted");
        for (auto const& content : {std::pair{first, Id()}, {second, Object(ObjectType::Blob, first).id}}) {
            std::string const& data = content.first;
            Id const& earlier = content.second;
            Id const id = Object(ObjectType::Blob, data).id;
            Expect(!StoreStream(archive, id, data + "x", earlier) && archive.FindMissing({&id, 1}).size() == 1,
                   "a content that has changed is not stored");
            Expect(StoreStream(archive, id, data, earlier) && StoreStream(archive, id, data, earlier) &&
                       archive.FindMissing({&id, 1}).empty(),
                   "a large content is stored");
            auto const info = archive.Describe({&id, 1});
            Expect(info.size() == 1 && info[0].size == data.size(), "its size is reported");
            std::size_t taken = 0;
            archive.Read({&id, 1}, [&](ArchivedObject const& object) {
                taken += object.data.empty() && object.size == data.size() ? 1U : 100U;
            });
            Expect(taken == 1, "it is announced without its data");
            for (std::uint64_t const offset : {std::uint64_t{0}, std::uint64_t{1048570}, std::uint64_t{6999990}}) {
                auto const window = archive.ReadContent(id, offset, 100);
                Expect(window && TextOf(*window) == data.substr(offset, 100), "windows of it are read");
            }
            StreamIO stream = ContentStream(archive, id);
            std::string read(data.size(), '\0');
            Expect(stream && stream.GetSize() == data.size() && stream.Read(read.data(), 10) &&
                       stream.Read(read.data() + 10, read.size() - 10) && read == data && !stream.Read(read.data(), 1),
                   "it is read as a stream");
        }
        Id const small = Object(ObjectType::Blob, "small").id;
        Expect(StoreStream(archive, small, "small", {}) && ReadAll(archive, {small}).size() == 1,
               "small contents may be streamed, too");
        Expect(!archive.ReadContent(Object(ObjectType::Blob, "?").id, 0, 1).has_value(), "others are not there");
    }

    static Change Moving(std::vector<BranchMove> moves, std::vector<NewObject> objects = {}) {
        Change change;
        change.branches = std::move(moves);
        change.objects = std::move(objects);
        return change;
    }

    void Branches(IArchive& archive) {
        NewObject const tree = Object(ObjectType::Tree, "");
        NewCommit const one = Commit(tree.id, {}, "one");
        NewCommit const two = Commit(tree.id, one.object.id, "two");
        KivStringT<char16_t> const odd(u"odd \xD800 \0 name", 12);
        Expect(archive.Apply(Moving({{u"master", {}, one.object.id}, {odd, {}, one.object.id}}, {tree, one.object}))
                   .applied,
               "branches are made");
        auto outcome = archive.Apply(
            Moving({{u"master", one.object.id, two.object.id}, {odd, two.object.id, {}}, {u"new", {}, two.object.id}},
                   {two.object}));
        Expect(!outcome.applied && outcome.movedBranches.size() == 1 && outcome.movedBranches[0].name == odd &&
                   outcome.movedBranches[0].head == one.object.id,
               "a lost race names the branch and its head");
        Expect(archive.FindMissing({&two.object.id, 1}).size() == 1 && archive.ReadBranches().size() == 2,
               "a lost race stores nothing");
        Expect(
            archive.Apply(Moving({{u"master", one.object.id, two.object.id}, {odd, one.object.id, {}}}, {two.object}))
                .applied,
            "branches move and go");
        auto const branches = archive.ReadBranches();
        Expect(branches.size() == 1 && branches[0].name == KivStringT<char16_t>(u"master") &&
                   branches[0].head == two.object.id,
               "branches are read");
        outcome = archive.Apply(Moving({{u"gone", one.object.id, two.object.id}, {u"master", {}, one.object.id}}));
        Expect(!outcome.applied && outcome.movedBranches.size() == 2 && outcome.movedBranches[0].head.IsEmpty(),
               "a branch that is gone, or is there already, is a lost race");
        ExpectFailure(
            Failure::Collected,
            [&] {
                archive.Apply(
                    Moving({{u"b", {}, Commit(tree.id, {}, "nowhere").object.id}}, {Object(ObjectType::Blob, "new")}));
            },
            "a head must be there");
        Id const notStored = Object(ObjectType::Blob, "new").id;
        Expect(archive.ReadBranches().size() == 1 && archive.FindMissing({&notStored, 1}).size() == 1,
               "a refused change stores nothing");
    }

    static Change Setting(KivStringT<char16_t> const& name, std::optional<Buffer> value, bool compared = false,
                          std::optional<Buffer> expected = {}) {
        Change change;
        change.records.push_back({{name, std::move(value)}, compared, std::move(expected)});
        return change;
    }

    void Records(IArchive& archive) {
        KivStringT<char16_t> const odd(u"a\0\xDC00", 3);
        Expect(archive.Apply(Setting(u"settings", BufferOf("1"), true)).applied, "a record is made");
        Expect(archive.Apply(Setting(odd, BufferOf(""))).applied, "a record may be empty");
        auto const outcome = archive.Apply(Setting(u"settings", BufferOf("2"), true, BufferOf("0")));
        Expect(!outcome.applied && outcome.changedRecords.size() == 1 &&
                   TextOf(outcome.changedRecords[0].value.value_or(Buffer())) == "1",
               "a lost race gives the value");
        Expect(!archive.Apply(Setting(odd, BufferOf("x"), true)).applied, "an empty record is not a missing one");
        Expect(archive.Apply(Setting(u"settings", BufferOf("2"), true, BufferOf("1"))).applied, "a record is changed");
        Expect(archive.ListRecords() == std::vector<KivStringT<char16_t>>{odd, u"settings"}, "records are listed");
        std::vector<KivStringT<char16_t>> const names{u"settings", u"none", odd};
        auto const records = archive.ReadRecords(names);
        Expect(records.size() == 2 && records[0].name == odd && records[0].value && records[0].value->GetSize() == 0 &&
                   records[1].value && TextOf(*records[1].value) == "2",
               "records are read");
        Expect(archive.Apply(Setting(odd, {})).applied && archive.ListRecords().size() == 1, "a record is removed");
    }

    void AncestryFacts(IArchive& archive) {
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
        Expect(archive.Apply(change).applied, "facts need no objects");
        change = {};
        change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::Merged, side}}});
        change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::FoundEqual, ids[7]}}});
        change.ancestry.push_back({ids[49], ids[48], tree.id, {{Containment::Merged, side}}});
        archive.Apply(change);
        archive.Apply(change);

        auto const facts = archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 0);
        Expect(facts.size() == 1 && facts[0].parent == ids[48] && facts[0].tree == tree.id &&
                   facts[0].contains.size() == 2,
               "facts are added, each once");
        auto const idsOf = [](std::vector<Ancestry> const& walked) {
            std::vector<Id> walkedIds;
            for (Ancestry const& one : walked)
                walkedIds.push_back(one.commit);
            return walkedIds;
        };
        Expect(idsOf(archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 2)) ==
                   std::vector<Id>{ids[49], ids[48], ids[47]},
               "parents come nearest first, as many as asked for");
        std::vector<Id> const starts{ids[1], ids[0], Object(ObjectType::Blob, "unknown").id, ids[1]};
        Expect(idsOf(archive.ReadAncestry(starts, Follow::Everything, 100)) == std::vector<Id>{ids[1], ids[0]},
               "each commit is reported once, unknown ones are not");
        Expect(archive.ReadAncestry({&ids[49], 1}, Follow::Parents, 100).size() == 50 &&
                   archive.ReadAncestry({&ids[49], 1}, Follow::Reachable, 100).size() == 51 &&
                   archive.ReadAncestry({&ids[49], 1}, Follow::Everything, 100).size() == 52,
               "walks follow what they are asked to, and end");
        Expect(archive.ListAncestry({}, 30).size() == 30 &&
                   archive.ListAncestry(archive.ListAncestry({}, 30).back().commit, 30).size() == 22 &&
                   archive.GetStatistics().ancestries == 52,
               "all facts are listed");
    }

    void Marks(IArchive& archive) {
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
        Expect(marked(none) == 3 && marked(hour) == 0 && archive.GetStatistics().marked == 3,
               "marks are reported once their time has come");
        Expect(archive.Remove(ids, hour) == ids, "nothing is removed before its time");
        Change reliance;
        reliance.relied = {tree.id};
        archive.Apply(reliance);
        Expect(marked(none) == 2 && archive.Remove(ids, none) == std::vector<Id>{tree.id} &&
                   archive.FindMissing(ids).empty(),
               "relying on an object unmarks it, and then none of a batch is removed");
        archive.Apply(Moving({{u"master", {}, commit.object.id}}));
        Store(archive, {blob});
        Expect(marked(none) == 0, "so do a branch and storing it again");
        archive.Mark(ids);
        archive.Unmark(std::vector<Id>{blob.id});
        Expect(marked(none) == 2, "marks are taken away");
        archive.Mark(ids);
        Expect(archive.Remove(ids, none).empty() && archive.FindMissing(ids) == ids && marked(none) == 0 &&
                   ReadAll(archive, ids).empty() && archive.Describe(ids).empty() && archive.ListObjects({}, 9).empty(),
               "what is removed is gone");
        Expect(archive.ReadAncestry({&commit.object.id, 1}, Follow::Parents, 0).size() == 1, "its facts stay");
        ExpectFailure(
            Failure::Collected, [&] { archive.Apply(reliance); }, "what is gone cannot be relied on");
        archive.Apply(change);
        Expect(archive.FindMissing(ids).empty() && ReadAll(archive, ids).size() == 3, "it can be stored again");
    }

    /// What was stored as the difference to an object outlives it, and can take its place.
    void RemovedEarlierVersions(IArchive& archive) {
        std::vector<NewObject> versions;
        std::string text = SomeText(7, 100000);
        for (std::uint32_t i = 0; i < 20; ++i) {
            versions.push_back(Object(ObjectType::Blob, text, i == 0 ? Id() : versions.back().id));
            text.insert(i * 4001, "version " + std::to_string(i));
        }
        std::vector<Id> removed;
        for (std::size_t i = 0; i < versions.size(); ++i) {
            Store(archive, {versions[i]});
            if (i % 4 != 3)
                removed.push_back(versions[i].id);
        }
        archive.Mark(removed);
        Expect(archive.Remove(removed, std::chrono::seconds(0)).empty(), "earlier versions are removed");
        while (archive.Compact(largestWholeContent) > 0) {
        }
        Expect(archive.FindMissing(removed) == removed && ReadAll(archive, removed).empty(), "they are gone");
        for (std::size_t i = 3; i < versions.size(); i += 4)
            Expect(ReadAll(archive, {versions[i].id})[DigitsOf(versions[i].id)] == TextOf(versions[i].data),
                   "later ones are whole");
        Store(archive, {versions[2], versions[0], versions[1]});
        Expect(ReadAll(archive, removed).size() == 3, "they can be stored again");
    }

    void Refusals(IArchive& archive) {
        ExpectFailure(
            Failure::Unrepresentable,
            [&] { Store(archive, {Object(ObjectType::Blob, std::string(largestWholeContent + 1, 'x'))}); },
            "a large content is refused where whole ones are taken");
        bool refused = false;
        try {
            static_cast<void>(archive.FindMissing(std::vector<Id>{Id()}));
        } catch (std::invalid_argument const&) {
            refused = true;
        }
        Expect(refused, "identifiers must be digests");

        NewObject const object = Object(ObjectType::Blob, "sound");
        Store(archive, {object});
        struct Thrown {};
        bool passed = false;
        try {
            archive.Read({&object.id, 1}, [](ArchivedObject const&) { throw Thrown(); });
        } catch (Thrown const&) {
            passed = true;
        }
        Expect(passed && ReadAll(archive, {object.id}).size() == 1, "what a receiver throws passes through");
        archive.Read({&object.id, 1}, [&](ArchivedObject const& read) {
            Expect(archive.FindMissing({&read.id, 1}).empty() &&
                       Store(archive, {Object(ObjectType::Blob, "x")}).applied,
                   "a receiver may use the archive");
        });

        struct Stop final : IProgress {
            bool Report(Progress const& /*progress*/) override { return false; }
        } stop;
        std::string const data = SomeNoise(8, 3000000);
        Id const id = Object(ObjectType::Blob, data).id;
        ExpectFailure(
            Failure::Cancelled, [&] { StoreStream(archive, id, data, {}, &stop); }, "a host can stop");
        Expect(archive.FindMissing({&id, 1}).size() == 1 && StoreStream(archive, id, data, {}),
               "what was stopped can be done again");
    }

    /// Four threads add commits to one branch, each on top of what it finds.
    void Threads(IArchive& archive) {
        constexpr int each = 25;
        std::atomic<int> wrong{0};
        auto const work = [&](int number) {
            try {
                for (int i = 0; i < each;) {
                    auto const branches = archive.ReadBranches();
                    Id const head = branches.empty() ? Id() : branches[0].head;
                    std::string const text = std::to_string(number) + "/" + std::to_string(i);
                    NewObject const blob = Object(ObjectType::Blob, text);
                    NewObject const tree = Object(ObjectType::Tree, TreeOf({{"file", blob.id}}));
                    NewCommit const commit = Commit(tree.id, head, text);
                    Change change = Moving({{u"master", head, commit.object.id}}, {blob, tree, commit.object});
                    change.ancestry = {commit.facts};
                    if (archive.Apply(change).applied)
                        ++i;
                    std::vector<Id> const ids{tree.id, blob.id};
                    archive.Read(ids, [](ArchivedObject const&) {});
                }
            } catch (...) {
                ++wrong;
            }
        };
        std::vector<std::thread> threads;
        for (int i = 0; i < 4; ++i)
            threads.emplace_back(work, i);
        for (std::thread& thread : threads)
            thread.join();
        auto const branches = archive.ReadBranches();
        Expect(wrong == 0 && branches.size() == 1 &&
                   archive.ReadAncestry({&branches[0].head, 1}, Follow::Parents, 1000).size() == 4 * each,
               "of those who race one wins, and nothing is lost");
    }

    ArchiveMaker make_;
    ConformanceFailure fail_;
    std::string case_;
};

} // namespace Conformance

/// Tries everything that `IArchive` promises. @p makeEmpty gives a new, empty archive at each call.
inline void CheckArchiveConformance(ArchiveMaker makeEmpty, ConformanceFailure onFailure) {
    Conformance::Check(std::move(makeEmpty), std::move(onFailure)).All();
}

} // namespace KivArchive
