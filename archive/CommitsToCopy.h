#pragma once

/// @file
/// Which commits one archive lacks of another.

#include "KivArchive/IArchive.h"

#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

/// What some heads of @p from reach and @p to lacks; parents and what was merged come before those that have them.
class CommitsToCopy {
public:
    /// @throws ArchiveError of kind `Damaged` if @p from does not know the ancestry of one of them
    CommitsToCopy(IArchive& from, IArchive& to, std::vector<Id> const& heads, IProgress* progress);

    [[nodiscard]] std::vector<Id> const& InOrder() const noexcept { return inOrder_; }
    [[nodiscard]] Ancestry const& FactsOf(Id const& commit) const { return commits_.at(commit).facts; }

private:
    struct Commit {
        Ancestry facts;
        /// What it comes after.
        std::vector<Id> before;
    };

    std::vector<Id> Discover(std::vector<Id> const& open, std::size_t ahead);

    IArchive& from_;
    IArchive& to_;
    std::unordered_map<Id, Commit> commits_;
    /// Whose facts have been read: these, and some that are not missing.
    std::unordered_set<Id> met_;
    std::vector<Id> inOrder_;
};

/// Adds what a commit has merged to @p ids.
void AddMerged(Ancestry const& facts, std::vector<Id>& ids);

} // namespace KivArchive
