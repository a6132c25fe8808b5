#pragma once

/// @file
/// The cases of objects: storing, reading, versions, large contents and removing.

#include "KivArchive/detail/ConformanceObjects.h"

#include <algorithm>

namespace KivArchive::Conformance {

/// Objects of every type and of many sizes: four blobs, four others, and many small blobs.
inline std::vector<NewObject> SomeObjects() {
    std::vector<NewObject> objects{Object(ObjectType::Blob, ""), Object(ObjectType::Blob, "hello"),
                                   Object(ObjectType::Blob, SomeNoise(1, largestWholeContent)),
                                   Object(ObjectType::Blob, SomeText(2, 300000))};
    std::vector<std::pair<std::string, Id>> files;
    for (int i = 0; i < 20000; ++i)
        files.emplace_back("file" + std::to_string(100000 + i), objects[static_cast<std::size_t>(i) % 4].id);
    objects.push_back(Object(ObjectType::Tree, TreeOf(files)));
    objects.push_back(Object(ObjectType::Tree, ""));
    objects.push_back(Object(ObjectType::Tree, TreeOf(files).substr(5)));
    objects.push_back(Commit(objects[4].id, {}, "First\n\nwith more").object);
    for (std::uint32_t i = 0; i < 500; ++i)
        objects.push_back(Object(ObjectType::Blob, SomeText(100 + i, i * 17)));
    return objects;
}

/// Checks that objects are listed page by page, in ascending order, and counted. @param ids of all objects there
inline void CheckListing(Trial& trial, IArchive& archive, std::vector<Id> ids) {
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
    trial.Expect(listed == ids, "all objects are listed in ascending order");
    auto const statistics = archive.GetStatistics();
    trial.Expect(statistics.blobs + statistics.trees + statistics.commits == ids.size() && statistics.commits == 1 &&
                     statistics.trees == 3,
                 "objects are counted by type");
}

/// Checks that all of @p objects can be read, and their types and sizes.
inline void CheckReading(Trial& trial, IArchive& archive, std::vector<NewObject> const& objects,
                         std::vector<Id> const& ids) {
    auto const found = ReadAll(archive, ids);
    for (NewObject const& object : objects) {
        auto const data = found.find(DigitsOf(object.id));
        trial.Expect(data != found.end() && data->second == TextOf(object.data),
                     "objects come back as they were stored");
        auto const info = archive.Describe({&object.id, 1});
        trial.Expect(info.size() == 1 && info[0].type == object.type && info[0].size == object.data.GetSize(),
                     "types and sizes are reported");
    }
}

/// Asks for some of @p ids, which are there, among others that are not.
inline void CheckMissing(Trial& trial, IArchive& archive, std::vector<Id> const& ids) {
    std::vector<Id> asked;
    std::vector<Id> unknown;
    for (std::size_t i = 0; i < 100; ++i) {
        asked.push_back(ids[i]);
        if (i % 3 == 0)
            asked.push_back(unknown.emplace_back(Object(ObjectType::Blob, "unknown " + std::to_string(i)).id));
    }
    ReadOutcome const outcome = archive.Read(asked, [](ArchivedObject const&) {});
    trial.Expect(outcome.missing == unknown && outcome.damaged.empty() && archive.FindMissing(asked) == unknown,
                 "missing objects are reported, in order");
}

inline void CheckObjects(Trial& trial, IArchive& archive) {
    trial.Expect(archive.FindMissing({}).empty() && archive.Describe({}).empty() && ReadAll(archive, {}).empty(),
                 "empty batches give nothing");
    std::vector<NewObject> const objects = SomeObjects();
    trial.Expect(DigitsOf(objects[1].id) == "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60",
                 "identifiers are digests of packed forms");
    std::vector<Id> ids;
    for (NewObject const& object : objects)
        ids.push_back(object.id);
    trial.Expect(archive.FindMissing(ids) == ids, "an empty archive misses everything, in order");
    trial.Expect(Store(archive, objects).applied && Store(archive, objects).applied, "storing twice is storing once");
    trial.Expect(archive.FindMissing(ids).empty(), "what is stored is not missing");
    CheckReading(trial, archive, objects, ids);
    CheckMissing(trial, archive, ids);
    CheckListing(trial, archive, std::move(ids));
}

/// Many versions of one path, each one change apart, stored one by one and all at once.
inline void CheckVersions(Trial& trial, IArchive& archive) {
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
    trial.Expect(ReadAll(archive, ids) == expected, "every version comes back as it was");
}

inline void CheckLargeContents(Trial& trial, IArchive& archive) {
    std::string const first = SomeNoise(5, 3500000) + SomeText(6, 3500000);
    std::string second = first;
    second.insert(1234567, "inserted");
    for (auto const& content : {std::pair{first, Id()}, {second, Object(ObjectType::Blob, first).id}}) {
        std::string const& data = content.first;
        Id const& earlier = content.second;
        Id const id = Object(ObjectType::Blob, data).id;
        trial.Expect(!StoreStream(archive, id, data + "x", earlier) && archive.FindMissing({&id, 1}).size() == 1,
                     "a content that has changed is not stored");
        trial.Expect(StoreStream(archive, id, data, earlier) && StoreStream(archive, id, data, earlier) &&
                         archive.FindMissing({&id, 1}).empty(),
                     "a large content is stored");
        auto const info = archive.Describe({&id, 1});
        trial.Expect(info.size() == 1 && info[0].size == data.size(), "its size is reported");
        std::size_t taken = 0;
        archive.Read({&id, 1}, [&](ArchivedObject const& object) {
            taken += object.data.empty() && object.size == data.size() ? 1U : 100U;
        });
        trial.Expect(taken == 1, "it is announced without its data");
        for (std::uint64_t const offset : {std::uint64_t{0}, std::uint64_t{1048570}, std::uint64_t{6999990}}) {
            auto const window = archive.ReadContent(id, offset, 100);
            trial.Expect(window && TextOf(*window) == data.substr(offset, 100), "windows of it are read");
        }
        StreamIO stream = ContentStream(archive, id);
        std::string read(data.size(), '\0');
        trial.Expect(stream && stream.GetSize() == data.size() && stream.Read(read.data(), 10) &&
                         stream.Read(read.data() + 10, read.size() - 10) && read == data &&
                         !stream.Read(read.data(), 1),
                     "it is read as a stream");
    }
    Id const small = Object(ObjectType::Blob, "small").id;
    trial.Expect(StoreStream(archive, small, "small", {}) && ReadAll(archive, {small}).size() == 1,
                 "small contents may be streamed, too");
    trial.Expect(!archive.ReadContent(Object(ObjectType::Blob, "?").id, 0, 1).has_value(), "others are not there");
}

/// What may have been stored as a difference to an earlier version outlives that version.
inline void CheckRemovedEarlierVersions(Trial& trial, IArchive& archive) {
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
    trial.Expect(archive.Remove(removed, std::chrono::seconds(0)).empty(), "earlier versions are removed");
    while (archive.Compact(largestWholeContent) > 0) {
    }
    trial.Expect(archive.FindMissing(removed) == removed && ReadAll(archive, removed).empty(), "they are gone");
    for (std::size_t i = 3; i < versions.size(); i += 4)
        trial.Expect(ReadAll(archive, {versions[i].id})[DigitsOf(versions[i].id)] == TextOf(versions[i].data),
                     "later ones are whole");
    Store(archive, {versions[2], versions[0], versions[1]});
    trial.Expect(ReadAll(archive, removed).size() == 3, "they can be stored again");
}

} // namespace KivArchive::Conformance
