#include "KivVcs/Storage.h"

#include <new>

namespace KivVcs {

namespace {

/// Appends the objects of its own kind that an object holds.
void AddHeld(Commit const& commit, std::vector<cow_ptr<Commit>>& held) {
    if (auto parent = commit.GetHeldParent())
        held.push_back(std::move(parent));
}

/// By name and not by path, which shows a blob where a subtree has the same name.
void AddHeld(Tree const& tree, std::vector<cow_ptr<Tree>>& held) {
    if (tree.GetLocalBlobCount() == tree.GetLocalObjectCount())
        return;
    for (auto const& name : tree.GetLocalSubtreePaths())
        held.push_back(tree.GetLocalTree(name));
}

void AddHeld(Blob const&, std::vector<cow_ptr<Blob>>&) noexcept {}

/// The purge of one table. An object is unused when the table holds the only reference to it.
template <class T>
class TablePurge {
public:
    using Table = std::unordered_map<Id, cow_ptr<T>>;

    explicit TablePurge(Table& table) noexcept : table_(table) {}

    void Run() {
        do {
            hasMissed_ = false;
            Sweep();
        } while (hasMissed_);
    }

private:
    /// Follows at once what an object that dies has held, wherever the sweep may have passed it already, so that the list
    /// of these stays short.
    void Sweep() {
        for (next_ = table_.begin(); next_ != table_.end();) {
            const auto entry = next_++;
            if (entry->second.use_count() == 1)
                LetDie(TakeOut(entry));
            while (!held_.empty())
                ReleaseLastHeld();
        }
    }

    /// Releases an object whose holder has died. It may be stored, or hold what is stored, or both, or neither: what is
    /// equal to a stored object need not be that object.
    void ReleaseLastHeld() {
        cow_ptr<T> object = std::move(held_.back());
        held_.pop_back();
        if (object.use_count() == 2)
            TakeOutIfStored(object);
        if (object.use_count() == 1)
            LetDie(std::move(object));
    }

    /// Called with the last reference. What the object holds is shared before it dies: while somebody else holds it, it
    /// stays whole and dies when its turn comes.
    void LetDie(cow_ptr<T> object) {
        try {
            AddHeld(*object, held_);
        } catch (std::bad_alloc const&) {
            // The list saves sweeps, nothing else: what did not get into it is found by the next one.
            hasMissed_ = true;
        }
    }

    void TakeOutIfStored(cow_ptr<T> const& object) {
        try {
            const auto entry = table_.find(object->GetId());
            if (entry != table_.end() && entry->second == object)
                TakeOut(entry);
        } catch (std::bad_alloc const&) {
            hasMissed_ = true;
        }
    }

    cow_ptr<T> TakeOut(typename Table::iterator entry) {
        if (entry == next_)
            ++next_;
        cow_ptr<T> object = std::move(entry->second);
        table_.erase(entry);
        return object;
    }

    Table& table_;
    typename Table::iterator next_;
    std::vector<cow_ptr<T>> held_;
    bool hasMissed_ = false;
};

} // namespace

void MemObjectsStorage::PurgeUnusedObjects() {
    // Commits release trees, and trees release blobs.
    TablePurge(commits_).Run();
    TablePurge(trees_).Run();
    TablePurge(blobs_).Run();
}

} // namespace KivVcs
