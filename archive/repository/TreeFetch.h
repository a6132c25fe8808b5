#pragma once

/// @file
/// Fetching trees whole, level by level.

#include "repository/ObjectSource.h"

#include <KivVcs/Tree.h>

#include <string_view>

namespace KivArchive {

/// Fetches trees with everything below them except contents, with one batch for each level.
class TreeFetch {
public:
    /// @param progress may be null
    TreeFetch(ObjectSource& source, IProgress* progress) : source_(source), progress_(progress) {}

    /// @throws ArchiveError if anything of it cannot be read; nothing has entered a storage then
    [[nodiscard]] std::vector<cow_ptr<Tree>> Fetch(std::span<const Id> ids);

private:
    struct Entry {
        bool isTree = false;
        /// Within the packed form that it was read from.
        std::string_view name;
        Id id;
    };
    /// The packed form of one directory.
    struct Form {
        Buffer data;
        std::vector<Entry> entries;
    };

    class Assembly;

    void ReadForms(std::vector<Id> level);
    void FindLiving(std::vector<Id>& level);
    [[nodiscard]] static Form ReadForm(ArchivedObject const& object);
    void ReadLevel(std::vector<Id> const& level);
    [[nodiscard]] std::vector<Id> TakeSubtrees(std::vector<Id> const& level) const;

    ObjectSource& source_;
    IProgress* progress_;
    std::unordered_map<Id, Form> forms_;
    /// The trees that storages have, which need not be read.
    std::unordered_map<Id, cow_ptr<Tree>> living_;
};

} // namespace KivArchive
