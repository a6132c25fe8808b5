#include "KivVcs/Storage.h"

namespace KivVcs {

namespace {

/// Appends the identifiers of the objects of its own kind that an object holds.
void AddVcsDependencies(Commit const& commit, std::vector<Id>& dependencies) {
    if (commit.GetParent())
        dependencies.push_back(commit.GetParent()->GetId());
}

/// By name and not by path, which shows a blob where a subtree has the same name.
void AddVcsDependencies(Tree const& tree, std::vector<Id>& dependencies) {
    for (auto const& name : tree.GetLocalSubtreePaths())
        dependencies.push_back(tree.GetLocalTree(name)->GetId());
}

void AddVcsDependencies(Blob const&, std::vector<Id>&) {}

/// The purge of one table. An object is unused when the table holds the only reference to it.
template <class T>
class TablePurge {
public:
    using Table = std::unordered_map<Id, cow_ptr<T>>;

    explicit TablePurge(Table& table) noexcept : table_(table) {}

    void Run() {
        do {
            missedRelease_ = false;
            Sweep();
        } while (missedRelease_);
    }

private:
    /// Follows at once what an object that dies releases, wherever the sweep may have passed it already, so that the
    /// list of these stays short.
    void Sweep() {
        for (next_ = table_.begin(); next_ != table_.end();) {
            RemoveIfUnused(next_++);
            while (!released_.empty()) {
                const auto found = table_.find(released_.back());
                released_.pop_back();
                if (found != table_.end())
                    RemoveIfUnused(found);
            }
        }
    }

    void RemoveIfUnused(typename Table::iterator entry) {
        if (!IsUnused(entry->second))
            return;
        ListReleased(*entry->second);
        if (entry == next_)
            ++next_;
        table_.erase(entry);
    }

    static bool IsUnused(cow_ptr<T> const& object) noexcept { return object.use_count() == 1; }

    /// Called while @p dying still holds its dependencies, so that one that is stored is still in the table. One that
    /// is not may die with it and release stored objects further down, which only another sweep finds.
    void ListReleased(T const& dying) {
        const std::size_t listedBefore = released_.size();
        try {
            AddVcsDependencies(dying, released_);
        } catch (std::bad_alloc const&) {
            // The list saves sweeps, nothing else: what did not get into it is found by the next one.
            missedRelease_ = true;
        }
        for (std::size_t index = listedBefore; index < released_.size(); ++index)
            missedRelease_ = missedRelease_ || !table_.contains(released_[index]);
    }

    Table& table_;
    typename Table::iterator next_;
    std::vector<Id> released_;
    bool missedRelease_ = false;
};

} // namespace

void MemObjectsStorage::PurgeUnusedObjects() {
    // Commits release trees, and trees release blobs.
    TablePurge(commits_).Run();
    TablePurge(trees_).Run();
    TablePurge(blobs_).Run();
}

} // namespace KivVcs
