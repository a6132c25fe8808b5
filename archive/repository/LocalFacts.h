#pragma once

/// @file
/// The facts that the archive does not have yet.

#include "KivArchive/IArchive.h"

#include <KivVcs/Commit.h>

#include <functional>
#include <unordered_map>

namespace KivArchive {

/// What commits contain, and the facts of unpublished commits that others contain. Kept until the archive has them.
class LocalFacts {
public:
    using CommitHandle = KivVcs::cow_ptr<KivVcs::Commit>;
    using IsUnpublished = std::function<bool(Id const&)>;

    /// @param merged a commit that must not be purged before @p commit is published; may be null
    void Add(KivVcs::Commit const& commit, ContainedCommit const& contained, CommitHandle merged);
    /// Adds the facts of @p commit, of its ancestors and of what these have merged, as far as they are unpublished.
    void AddLine(CommitHandle commit, IsUnpublished const& isUnpublished);

    /// The facts of a commit; null if it is not known to contain anything but its parent.
    [[nodiscard]] Ancestry const* Find(Id const& id) const;
    [[nodiscard]] std::span<const CommitHandle> MergedBy(Id const& id) const;
    [[nodiscard]] std::vector<Ancestry> All() const;
    /// Whether there are facts of published commits: publishing commits would not bring these to the archive.
    [[nodiscard]] bool HasFactsOfPublished(IsUnpublished const& isUnpublished) const;
    /// Drops all facts but those of commits that are still unpublished.
    void ForgetPublished(IsUnpublished const& isUnpublished);

private:
    struct Entry {
        Ancestry facts;
        std::vector<CommitHandle> merged;
        /// Whether `AddLine` was called for it. An entry may have been made by `Add` before.
        bool hasLine = false;
    };

    Entry& EntryOf(KivVcs::Commit const& commit);

    std::unordered_map<Id, Entry> entries_;
};

} // namespace KivArchive
