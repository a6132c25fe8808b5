#pragma once

/// @file
/// The cases of refusals, callbacks and threads.

#include "KivArchive/detail/ConformanceObjects.h"

#include <atomic>
#include <thread>

namespace KivArchive::Conformance {

inline void CheckRefusals(Trial& trial, IArchive& archive) {
    trial.ExpectFailure(
        Failure::Unrepresentable,
        [&] { Store(archive, {Object(ObjectType::Blob, std::string(largestWholeContent + 1, 'x'))}); },
        "a large content is refused where whole ones are taken");
    bool refused = false;
    try {
        static_cast<void>(archive.FindMissing(std::vector<Id>{Id()}));
    } catch (std::invalid_argument const&) {
        refused = true;
    }
    trial.Expect(refused, "identifiers must be digests");

    NewObject const object = Object(ObjectType::Blob, "sound");
    Store(archive, {object});
    struct Thrown {};
    bool passed = false;
    try {
        archive.Read({&object.id, 1}, [](ArchivedObject const&) { throw Thrown(); });
    } catch (Thrown const&) {
        passed = true;
    }
    trial.Expect(passed && ReadAll(archive, {object.id}).size() == 1, "what a receiver throws passes through");
    archive.Read({&object.id, 1}, [&](ArchivedObject const& read) {
        trial.Expect(archive.FindMissing({&read.id, 1}).empty() &&
                         Store(archive, {Object(ObjectType::Blob, "x")}).applied,
                     "a receiver may use the archive");
    });

    struct Stop final : IProgress {
        bool Report(Progress const& /*progress*/) override { return false; }
    } stop;
    std::string const data = SomeNoise(8, 3000000);
    Id const id = Object(ObjectType::Blob, data).id;
    trial.ExpectFailure(
        Failure::Cancelled, [&] { StoreStream(archive, id, data, {}, &stop); }, "a host can stop");
    trial.Expect(archive.FindMissing({&id, 1}).size() == 1 && StoreStream(archive, id, data, {}),
                 "what was stopped can be done again");
}

/// Four threads add commits to one branch, each on top of what it finds.
inline void CheckThreads(Trial& trial, IArchive& archive) {
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
    trial.Expect(wrong == 0 && branches.size() == 1 &&
                     archive.ReadAncestry({&branches[0].head, 1}, Follow::Parents, 1000).size() == 4 * each,
                 "of those who race one wins, and nothing is lost");
}

} // namespace KivArchive::Conformance
