#pragma once

/// @file
/// Which commits one archive lacks of another.

#include "KivArchive/IArchive.h"

#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

/// The commits that some heads of @p from reach and @p to lacks, each after its parent and what it merged.
class CommitsToCopy {
public:
    /// @throws ArchiveError of kind `Damaged` if @p from does not know the ancestry of one of them
    CommitsToCopy(IArchive& from, IArchive& to, std::vector<Id> const& heads, IProgress* progress);

    [[nodiscard]] std::vector<Id> const& InOrder() const noexcept { return inOrder_; }
    [[nodiscard]] Ancestry const& FactsOf(Id const& commit) const { return commits_.at(commit).facts; }

private:
    struct Commit {
        Ancestry facts;
        /// The parent and merged commits that it has to come after.
        std::vector<Id> before;
    };

    std::vector<Id> Discover(std::vector<Id> const& open, std::size_t ahead);

    IArchive& from_;
    IArchive& to_;
    std::unordered_map<Id, Commit> commits_;
    /// All commits whose facts have been read, also those that turned out not to be missing.
    std::unordered_set<Id> met_;
    std::vector<Id> inOrder_;
};

/// Adds what a commit has merged to @p ids.
void AddMerged(Ancestry const& facts, std::vector<Id>& ids);

} // namespace KivArchive
