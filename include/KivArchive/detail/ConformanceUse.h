#pragma once

/// @file
/// The cases of refusals, callbacks and threads.

#include "KivArchive/Upkeep.h"
#include "KivArchive/detail/ConformanceObjects.h"

#include <atomic>
#include <thread>
#include <utility>

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

/// A version without a parent: a text among others in a directory, each made from the one before.
struct TextVersion {
    NewObject text;
    NewObject tree;
    NewCommit commit;

    TextVersion(std::uint32_t number, TextVersion const* before)
        : text(Object(ObjectType::Blob, SomeText(10, 5000) + std::to_string(number) + SomeText(11, 5000),
                      before == nullptr ? Id() : before->text.id)),
          tree(Object(ObjectType::Tree, TreeOf(Files(text.id)), before == nullptr ? Id() : before->tree.id)),
          commit(Commit(tree.id, {}, std::to_string(number))) {}

    [[nodiscard]] std::vector<Id> Ids() const { return {commit.object.id, tree.id, text.id}; }
    /// Whether an archive gives all of it.
    [[nodiscard]] bool IsIn(IArchive& archive) const {
        auto const read = ReadAll(archive, Ids());
        return read.size() == 3 && read.at(DigitsOf(text.id)) == TextOf(text.data) &&
               read.at(DigitsOf(tree.id)) == TextOf(tree.data);
    }
    /// Moves "master" here from @p before, whose objects it inherits.
    [[nodiscard]] Change After(TextVersion const* before) const {
        Change change = Moving({{u"master", before == nullptr ? Id() : before->commit.object.id, commit.object.id}},
                               {text, tree, commit.object});
        change.ancestry = {commit.facts};
        if (before != nullptr)
            change.inherited = before->Ids();
        return change;
    }

private:
    static std::vector<std::pair<std::string, Id>> Files(Id const& text) {
        std::vector<std::pair<std::string, Id>> files;
        for (int i = 0; i < 50; ++i)
            files.emplace_back("f" + std::to_string(100 + i), i == 7 ? text : Object(ObjectType::Blob, "").id);
        return files;
    }
};

/// What others do between two steps of a collection, once.
struct Meanwhile final : IProgress {
    explicit Meanwhile(std::function<void()> what) : act(std::move(what)) {}

    bool Report(Progress const& progress) override {
        if (progress.step == std::string_view("removing objects") && act)
            std::exchange(act, nullptr)();
        return true;
    }
    std::function<void()> act;
};

/// What a branch keeps may be collected as soon as it keeps it no more, and what was made from it stays.
inline void CheckInherited(Trial& trial, IArchive& archive) {
    CollectOptions options;
    options.grace = std::chrono::seconds(0);
    options.slice = 1;
    Store(archive, {Object(ObjectType::Blob, "")});
    std::vector<TextVersion> versions;
    versions.reserve(12);
    for (std::uint32_t number = 0; number < 12; ++number) {
        TextVersion const* const before = versions.empty() ? nullptr : &versions.back();
        TextVersion const& version = versions.emplace_back(number, before);
        trial.Expect(archive.Apply(version.After(before)).applied, "what the branch keeps need not be relied on");
        if (number % 3 == 2) {
            Collect(archive, options, nullptr);
            Collect(archive, options, nullptr);
            trial.Expect(archive.FindMissing(before->Ids()).size() == 3,
                         "it is collected once the branch has moved on");
        }
        trial.Expect(version.IsIn(archive), "a version stays without those that it was made from");
    }
    TextVersion const& gone = versions[1];
    TextVersion const late(100, &gone);
    ChangeOutcome const outcome = archive.Apply(late.After(&gone));
    trial.Expect(!outcome.applied && outcome.movedBranches.size() == 1 &&
                     outcome.movedBranches[0].head == versions.back().commit.object.id &&
                     archive.FindMissing(late.Ids()).size() == 3,
                 "who inherits from a version that the branch has left has lost the race");

    // A collection is about to remove what a branch goes back to, which the next version inherits.
    TextVersion const& last = versions.back();
    TextVersion const other(200, &last);
    trial.Expect(archive.Apply(other.After(&last)).applied, "the branch moves on");
    Collect(archive, options, nullptr);
    TextVersion const next(201, &last);
    bool isBack = false;
    Meanwhile meanwhile([&] {
        isBack = archive.Apply(Moving({{u"master", other.commit.object.id, last.commit.object.id}})).applied &&
                 archive.Apply(next.After(&last)).applied;
    });
    Collect(archive, options, &meanwhile);
    trial.Expect(isBack && next.IsIn(archive) && last.IsIn(archive) && Verify(archive, nullptr).IsSound(),
                 "what a branch has come back to is kept with all that it names");
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
