#pragma once

/// @file
/// Storing commits in an archive.

#include "KivArchive/IArchive.h"
#include "SmallTable.h"
#include "repository/LocalFacts.h"
#include "repository/MissingTrees.h"

#include <KivVcs/Storage.h>

namespace KivArchive {

using KivVcs::Commit;

/// Stores what the archive lacks, each object after those that it names, in changes of limited size. The last one moves
/// the branches.
class Publishing {
public:
    /// @param moves the moves of the branches whose commits are stored
    /// @param asksForAll whether to ask the archive also for what is most likely new
    Publishing(IArchive& archive, KivVcs::IObjectsStorage const& storage, LocalFacts const& facts,
               std::vector<BranchMove> const& moves, bool asksForAll, IProgress* progress);

    /// Stores commits with all that they bring. @param commits those that are missing, each after what it names
    void Store(std::vector<cow_ptr<Commit>> const& commits);
    /// Moves the branches, and stores what is left.
    [[nodiscard]] ChangeOutcome Finish(std::vector<RecordChange> const& records);

private:
    [[nodiscard]] cow_ptr<Tree> HeldRootOf(Commit const& commit) const;
    void StoreTogether(std::span<cow_ptr<Commit> const> commits);
    void StoreTree(MissingTrees const& trees, std::size_t root);
    void StoreFiles(MissingTrees const& trees, std::size_t directory);
    /// @return false if the data does not match its identifier; so do `StoreLarge` and `StoreDirectory`
    [[nodiscard]] bool StoreFile(NewDirectory::File const& file);
    [[nodiscard]] bool StoreLarge(NewDirectory::File const& file, StreamIO content);
    [[nodiscard]] bool StoreDirectory(NewDirectory const& directory);
    void StoreCommit(Commit const& commit);
    [[nodiscard]] bool AreOnExpectedHeads(std::span<cow_ptr<Commit> const> commits) const;
    void RelyOn(Id const& id);
    /// The same for an earlier version, which an expected head may keep.
    void RelyOnEarlier(Id const& id);
    [[nodiscard]] bool IsInChange(Id const& id) const;
    void Add(NewObject object);
    void Flush();

    IArchive& archive_;
    KivVcs::IObjectsStorage const& storage_;
    LocalFacts const& facts_;
    std::vector<BranchMove> const& moves_;
    /// Heads that the branches still have when they are moved.
    SmallSet<Id> expected_;
    bool asksForAll_;
    IProgress* progress_;
    Change change_;
    std::uint64_t size_ = 0;
    std::uint64_t storedCount_ = 0;
    /// What stands for a change that stores one large content only.
    static constexpr std::uint64_t byItself = 0;
    /// The current change, and with which one everything has been stored.
    std::uint64_t changeNumber_ = byItself + 1;
    SmallTable<Id, std::uint64_t> stored_;
    SmallSet<Id> relied_;
    /// Whether everything stored so far is on top of the expected heads, and in this change.
    bool isOnExpected_ = true;
    /// The files that those of the change replace, as long as `isOnExpected_`.
    std::vector<Id> earlierFiles_;
};

} // namespace KivArchive
