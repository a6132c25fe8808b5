#pragma once

/// @file
/// What a publish has to bring, from the top.

#include "repository/ArchivedStorage.h"
#include "repository/LocalFacts.h"

#include <unordered_set>

namespace KivArchive {

/// The commits that some heads reach and the archive lacks, in the order in which they have to be stored: parents and what
/// was merged first.
class MissingCommits {
public:
    /// @param asksForAll whether the archive is asked also for commits that it has had
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
    std::unordered_map<Id, cow_ptr<Commit>> missing_;
    std::unordered_set<Id> asked_;
};

} // namespace KivArchive
