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
    explicit TablePurge(detail::ObjectTable<T>& table) noexcept : table_(table) {}

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
        walk_ = table_.Begin();
        while (cow_ptr<T> unused = table_.TakeNextUnused(walk_)) {
            LetDie(std::move(unused));
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
            TakeOutIfStored(*object);
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

    void TakeOutIfStored(T const& object) {
        try {
            static_cast<void>(table_.TakeOut(object, walk_));
        } catch (std::bad_alloc const&) {
            hasMissed_ = true;
        }
    }

    detail::ObjectTable<T>& table_;
    typename detail::ObjectTable<T>::Walk walk_;
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
