#pragma once

/// @file
/// Which commits publishing has to store.

#include "SmallTable.h"
#include "repository/ArchivedStorage.h"
#include "repository/LocalFacts.h"

namespace KivArchive {

/// Finds the commits that some heads reach and the archive lacks, each after its parent and what it merged, as they
/// have to be stored.
class MissingCommits {
public:
    /// @param asksForAll whether to ask also for commits that the archive has had, and that may have been collected
    MissingCommits(ArchivedStorage const& storage, LocalFacts const& facts, IArchive& archive, bool asksForAll)
        : storage_(storage), facts_(facts), archive_(archive), asksForAll_(asksForAll) {}

    /// @throws ArchiveError of kind `Collected` if the archive lacks one that is not held here either
    [[nodiscard]] std::vector<cow_ptr<Commit>> Find(std::vector<cow_ptr<Commit>> const& heads);

private:
    void Discover(std::vector<cow_ptr<Commit>> open);
    [[nodiscard]] std::vector<cow_ptr<Commit>> LineToAskFor(cow_ptr<Commit> commit) const;
    [[nodiscard]] bool MustAskFor(Id const& id) const { return asksForAll_ || storage_.MayBeUnpublished(id); }
    void CheckUnheld(std::vector<Id> const& parents) const;
    [[nodiscard]] std::vector<cow_ptr<Commit>> InOrder(std::vector<cow_ptr<Commit>> const& heads) const;

    ArchivedStorage const& storage_;
    LocalFacts const& facts_;
    IArchive& archive_;
    bool asksForAll_;
    SmallTable<Id, cow_ptr<Commit>> missing_;
    SmallSet<Id> asked_;
};

} // namespace KivArchive
