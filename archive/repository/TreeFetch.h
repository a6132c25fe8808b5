#pragma once

/// @file
/// Trees read whole, level by level.

#include "KivArchive/Upkeep.h"
#include "repository/ObjectSource.h"

#include <KivVcs/Tree.h>

namespace KivArchive {

/// One fetch of a tree with everything below it, except for the contents: one batch for each level.
class TreeFetch {
public:
    explicit TreeFetch(ObjectSource& source) : source_(source) {}

    /// @throws ArchiveError if anything of it cannot be had; nothing has entered a storage then
    [[nodiscard]] cow_ptr<Tree> Fetch(Id const& id);

private:
    /// The packed form of one directory.
    struct Form {
        Buffer data;
        std::vector<Link> links;
    };

    class Assembly;

    void FindLiving(std::vector<Id>& level);
    void ReadLevel(std::vector<Id> const& level);
    [[nodiscard]] std::vector<Id> TakeSubtrees(std::vector<Id> const& level) const;

    ObjectSource& source_;
    std::unordered_map<Id, Form> forms_;
    /// Those that need not be read.
    std::unordered_map<Id, cow_ptr<Tree>> living_;
};

} // namespace KivArchive
