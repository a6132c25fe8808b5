#pragma once

/// @file
/// Where the objects of a repository live.

#include "KivVcs/Commit.h"
#include "KivVcs/detail/ObjectTable.h"

#include <initializer_list>
#include <set>
#include <unordered_map>

namespace KivVcs {

namespace detail {
struct OwnTables;
}

/// Objects by identifier and the table of branches. It never computes content: an object is held under the
/// identifier that it reports when it is added, and returned as the same object. The order of the operations is
/// part of the binary interface.
///
/// Threads: the `const` operations may run concurrently; everything else needs exclusive use.
class KIVVCS_EXPORT IObjectsStorage {
public:
    using CommitTable = std::unordered_map<Id, cow_ptr<Commit>>;
    using TreeTable = std::unordered_map<Id, cow_ptr<Tree>>;
    using BlobTable = std::unordered_map<Id, cow_ptr<Blob>>;
    using ReferenceTable = std::unordered_map<KivStringT<char16_t>, cow_ptr<Commit>>;

    virtual ~IObjectsStorage();
    /// A new storage that shares every object and head with this one.
    [[nodiscard]] virtual std::unique_ptr<IObjectsStorage> Clone() const = 0;
    /// The stored object of that identifier, or null.
    [[nodiscard]] virtual cow_ptr<Commit> GetCommit(Id const& id) const = 0;
    [[nodiscard]] virtual cow_ptr<Tree> GetTree(Id const& id) const = 0;
    [[nodiscard]] virtual cow_ptr<Blob> GetBlob(Id const& id) const = 0;
    /// Stores the object, and nothing that it refers to; the first object under an identifier stays.
    /// @pre the pointer is not null
    virtual void AddCommit(cow_ptr<Commit> commit) = 0;
    virtual void AddTree(cow_ptr<Tree> tree) = 0;
    virtual void AddBlob(cow_ptr<Blob> blob) = 0;
    [[nodiscard]] virtual std::uint64_t GetCommitCount() const = 0;
    [[nodiscard]] virtual std::uint64_t GetTreeCount() const = 0;
    [[nodiscard]] virtual std::uint64_t GetBlobCount() const = 0;
    /// The tables themselves; valid until the storage is changed.
    [[nodiscard]] virtual CommitTable const& GetCommits() const = 0;
    [[nodiscard]] virtual TreeTable const& GetTrees() const = 0;
    [[nodiscard]] virtual BlobTable const& GetBlobs() const = 0;
    [[nodiscard]] virtual ReferenceTable const& GetRefs() const = 0;
    /// Takes the commit of that identifier out of the table; branches that point at it keep it. Null and unknown do
    /// nothing.
    virtual void DeleteCommit(cow_ptr<Commit> commit) = 0;
    /// Removes every object that only the storage's own tables hold.
    virtual void PurgeUnusedObjects() = 0;
    [[nodiscard]] virtual bool BranchExist(KivStringViewT<char16_t> name) const = 0;
    /// False if the name is empty or taken. A null commit makes a branch without a head.
    virtual bool CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) = 0;
    /// False if there is no such branch. No branch is protected.
    virtual bool RemoveBranch(KivStringViewT<char16_t> name) = 0;
    /// False if the commit is null or there is no such branch.
    virtual bool UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) = 0;
    /// The branch's head; null if it has none or does not exist.
    [[nodiscard]] virtual cow_ptr<Commit> GetHead(KivStringViewT<char16_t> name) const = 0;
    /// The names, in no particular order, of the branches whose head is this very object; of those without a head for
    /// null.
    [[nodiscard]] virtual std::vector<KivStringT<char16_t>> GetCommitBranches(cow_ptr<Commit> commit) const = 0;

protected:
    IObjectsStorage() = default;
    IObjectsStorage(IObjectsStorage const&) = default;
    IObjectsStorage& operator=(IObjectsStorage const&) = default;
};

/// The storage in memory. It holds one reference to each object, and computes an object's identifier when it stores it,
/// which makes stored objects safe and cheap to read from several threads.
class KIVVCS_EXPORT MemObjectsStorage : public IObjectsStorage {
public:
    /// No objects and one branch, "master", without a head.
    MemObjectsStorage();
    /// No objects and the given branches without heads; an empty name is taken too.
    MemObjectsStorage(std::initializer_list<KivStringViewT<char16_t>> branches);
    MemObjectsStorage(MemObjectsStorage const& other);
    MemObjectsStorage& operator=(MemObjectsStorage const&) = delete;
    ~MemObjectsStorage() override;

    [[nodiscard]] std::unique_ptr<IObjectsStorage> Clone() const override;
    [[nodiscard]] cow_ptr<Commit> GetCommit(Id const& id) const override;
    [[nodiscard]] cow_ptr<Tree> GetTree(Id const& id) const override;
    [[nodiscard]] cow_ptr<Blob> GetBlob(Id const& id) const override;
    void AddCommit(cow_ptr<Commit> commit) override;
    void AddTree(cow_ptr<Tree> tree) override;
    void AddBlob(cow_ptr<Blob> blob) override;
    [[nodiscard]] std::uint64_t GetCommitCount() const override;
    [[nodiscard]] std::uint64_t GetTreeCount() const override;
    [[nodiscard]] std::uint64_t GetBlobCount() const override;
    /// A table of objects is made when it is asked for first, and kept up to date from then on: looking up and adding take
    /// longer, and more memory. @throws std::bad_alloc
    [[nodiscard]] CommitTable const& GetCommits() const override;
    [[nodiscard]] TreeTable const& GetTrees() const override;
    [[nodiscard]] BlobTable const& GetBlobs() const override;
    [[nodiscard]] ReferenceTable const& GetRefs() const override;
    void DeleteCommit(cow_ptr<Commit> commit) override;
    /// One pass over the tables, commits, trees, blobs, plus what the objects removed have held. Use counts are the whole
    /// rule: an object stays as long as a branch, another object, another storage or the host holds it. Does not fail
    /// for want of memory, but is slower then.
    void PurgeUnusedObjects() override;
    [[nodiscard]] bool BranchExist(KivStringViewT<char16_t> name) const override;
    bool CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) override;
    bool RemoveBranch(KivStringViewT<char16_t> name) override;
    bool UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) override;
    [[nodiscard]] cow_ptr<Commit> GetHead(KivStringViewT<char16_t> name) const override;
    /// In time proportional to the names, and logarithmic in the number of branches.
    [[nodiscard]] std::vector<KivStringT<char16_t>> GetCommitBranches(cow_ptr<Commit> commit) const override;

private:
    friend struct detail::OwnTables;

    /// Every branch's head, which may be null, with the branch's name as the table of references holds it.
    using NamesByHead = std::set<std::pair<Commit const*, KivStringT<char16_t> const*>>;

    bool AddBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> head);
    void FileName(NamesByHead::node_type entry, ReferenceTable::value_type const& branch) noexcept;

    detail::ObjectTable<Commit> commits_;
    detail::ObjectTable<Tree> trees_;
    detail::ObjectTable<Blob> blobs_;
    ReferenceTable references_;
    NamesByHead namesByHead_;
};

} // namespace KivVcs
