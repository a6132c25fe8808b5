#pragma once

/// @file
/// Bringing commits to an archive.

#include "KivArchive/IArchive.h"
#include "repository/LocalFacts.h"
#include "repository/MissingTrees.h"

#include <KivVcs/Storage.h>

namespace KivArchive {

using KivVcs::Commit;

/// Stores what the archive lacks, children first, in changes of a bounded size of which the last one moves the branches.
class Publishing {
public:
    /// @param asksForAll whether to ask the archive also for what is most likely new
    /// @param moves of the branches, for which all is stored
    Publishing(IArchive& archive, KivVcs::IObjectsStorage const& storage, LocalFacts const& facts,
               std::vector<BranchMove> const& moves, bool asksForAll, IProgress* progress);

    /// Stores commits with all that they bring. @param commits those that are missing, each behind what it names
    void Store(std::vector<cow_ptr<Commit>> const& commits);
    /// Moves the branches, and stores what is left.
    [[nodiscard]] ChangeOutcome Finish(std::vector<RecordChange> const& records);

private:
    [[nodiscard]] cow_ptr<Tree> HeldRootOf(Commit const& commit) const;
    void StoreTogether(std::span<cow_ptr<Commit> const> commits);
    void StoreTree(MissingTrees const& trees, std::size_t root);
    void StoreFiles(MissingTrees const& trees, std::size_t directory);
    /// @return false if what is to be stored is not what its identifier says; so does everything that stores here
    [[nodiscard]] bool StoreFile(NewDirectory::File const& file);
    [[nodiscard]] bool StoreLarge(NewDirectory::File const& file, StreamIO content);
    [[nodiscard]] bool StoreDirectory(NewDirectory const& directory);
    void StoreCommit(Commit const& commit);
    [[nodiscard]] bool AreOnExpectedHeads(std::span<cow_ptr<Commit> const> commits) const;
    void RelyOn(Id const& id);
    /// The same for what a tree of the parent names.
    void RelyOnEarlier(Id const& id);
    void Add(NewObject object);
    void Flush();

    IArchive& archive_;
    KivVcs::IObjectsStorage const& storage_;
    LocalFacts const& facts_;
    std::vector<BranchMove> const& moves_;
    /// Heads that the branches still have when they are moved.
    std::unordered_set<Id> expected_;
    bool asksForAll_;
    IProgress* progress_;
    Change change_;
    std::uint64_t size_ = 0;
    std::uint64_t storedCount_ = 0;
    /// What the change stores, and what this publish has stored.
    std::unordered_set<Id> inChange_;
    std::unordered_set<Id> stored_;
    std::unordered_set<Id> relied_;
    /// Whether nothing has been stored yet but on top of the expected heads, in this change.
    bool isOnExpected_ = true;
    /// What files of the change replace, while that is so.
    std::vector<Id> earlierFiles_;
};

} // namespace KivArchive
