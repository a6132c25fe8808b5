#pragma once

#include "allocation_faults/World.h"

#include <gtest/gtest.h>

#include <set>

namespace KivVcs::Faults {

/// The identifier of a tree by its listing, of everything else by a copy without caches.
inline Id Recomputed(Tree const& tree) {
    std::map<std::string, Object const*> entries;
    for (auto const& name : tree.GetLocalObjectPaths())
        entries[Narrow(name)] = tree.GetLocalObject(name).get();
    std::string data;
    for (auto const& [name, child] : entries)
        data += std::string(child->GetStoragePrefix()) + " " + child->GetHeader().GetString() + " " + name + '\0' +
                IdText(*child);
    return MakeBlob("tree " + std::to_string(data.size()) + '\0' + data).GetData();
}

template <class T>
Id Recomputed(T copy) {
    copy.ResetState();
    return copy.GetPackedData();
}

/// Expects that everything in a world has the identifier of its content.
class SoundnessCheck {
public:
    explicit SoundnessCheck(World& world) {
        for (Repository* repository : {&world.repository, &world.mirror}) {
            CheckTable(repository->GetStorage()->GetCommits());
            CheckTable(repository->GetStorage()->GetTrees());
            CheckTable(repository->GetStorage()->GetBlobs());
            for (auto const& [name, head] : repository->GetStorage()->GetRefs())
                Check(head.get());
        }
        Check(&world.draft);
        Check(&world.edited);
        Check(&world.sole);
        Check(&world.blob);
    }

private:
    template <class Table>
    void CheckTable(Table const& table) {
        for (auto const& [id, object] : table) {
            EXPECT_EQ(id, object->GetId());
            Check(object.get());
        }
    }

    bool IsNew(Object const* object) { return object != nullptr && checked_.insert(object).second; }

    template <class T>
    static void Compare(T const& object) {
        EXPECT_EQ(object.GetId(), Recomputed(object));
        EXPECT_EQ(Id(object.GetPackedData()), object.GetId());
    }

    void Check(Blob const* blob) {
        if (IsNew(blob))
            Compare(*blob);
    }
    void Check(Tree const* tree) {
        if (!IsNew(tree))
            return;
        Compare(*tree);
        for (auto const& name : tree->GetLocalSubtreePaths())
            Check(tree->GetLocalTree(name).get());
        for (auto const& name : tree->GetLocalBlobPaths())
            Check(tree->GetLocalBlob(name).get());
    }
    void Check(Commit const* commit) {
        if (!IsNew(commit))
            return;
        Compare(*commit);
        Check(commit->GetParent().get());
        Check(commit->GetCommitTree() ? commit->GetCommitTree()->GetRoot().get() : nullptr);
    }

    std::set<Object const*> checked_;
};

} // namespace KivVcs::Faults
