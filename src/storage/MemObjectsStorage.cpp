#include "KivVcs/Storage.h"

namespace KivVcs {

namespace {

template <class Table, class Key>
typename Table::mapped_type FindIn(Table const& table, Key const& key) {
    const auto found = table.find(key);
    return found == table.end() ? nullptr : found->second;
}

template <class T>
void AddTo(std::unordered_map<Id, cow_ptr<T>>& table, cow_ptr<T> object) {
    Id id = object->GetId();
    // Where most buckets are free, the bucket alone tells that an object is new, as most that are asked for are; otherwise
    // that takes a visit to a neighbour somewhere in memory.
    if (table.size() >= table.bucket_count() / 4)
        table.rehash(2 * table.bucket_count());
    table.try_emplace(std::move(id), std::move(object));
}

} // namespace

IObjectsStorage::~IObjectsStorage() = default;

MemObjectsStorage::MemObjectsStorage() : MemObjectsStorage({u"master"}) {}

MemObjectsStorage::MemObjectsStorage(std::initializer_list<KivStringViewT<char16_t>> branches) {
    for (KivStringViewT<char16_t> name : branches)
        references_.try_emplace(name.ToString());
}

MemObjectsStorage::~MemObjectsStorage() = default;

std::unique_ptr<IObjectsStorage> MemObjectsStorage::Clone() const {
    return std::make_unique<MemObjectsStorage>(*this);
}

cow_ptr<Commit> MemObjectsStorage::GetCommit(Id const& id) const {
    return FindIn(commits_, id);
}

cow_ptr<Tree> MemObjectsStorage::GetTree(Id const& id) const {
    return FindIn(trees_, id);
}

cow_ptr<Blob> MemObjectsStorage::GetBlob(Id const& id) const {
    return FindIn(blobs_, id);
}

void MemObjectsStorage::AddCommit(cow_ptr<Commit> commit) {
    AddTo(commits_, std::move(commit));
}

void MemObjectsStorage::AddTree(cow_ptr<Tree> tree) {
    AddTo(trees_, std::move(tree));
}

void MemObjectsStorage::AddBlob(cow_ptr<Blob> blob) {
    AddTo(blobs_, std::move(blob));
}

std::uint64_t MemObjectsStorage::GetCommitCount() const {
    return commits_.size();
}

std::uint64_t MemObjectsStorage::GetTreeCount() const {
    return trees_.size();
}

std::uint64_t MemObjectsStorage::GetBlobCount() const {
    return blobs_.size();
}

IObjectsStorage::CommitTable const& MemObjectsStorage::GetCommits() const {
    return commits_;
}

IObjectsStorage::TreeTable const& MemObjectsStorage::GetTrees() const {
    return trees_;
}

IObjectsStorage::BlobTable const& MemObjectsStorage::GetBlobs() const {
    return blobs_;
}

IObjectsStorage::ReferenceTable const& MemObjectsStorage::GetRefs() const {
    return references_;
}

void MemObjectsStorage::DeleteCommit(cow_ptr<Commit> commit) {
    if (commit)
        commits_.erase(commit->GetId());
}

bool MemObjectsStorage::BranchExist(KivStringViewT<char16_t> name) const {
    return references_.contains(name);
}

bool MemObjectsStorage::CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    return !name.IsEmpty() && references_.try_emplace(name.ToString(), std::move(commit)).second;
}

bool MemObjectsStorage::RemoveBranch(KivStringViewT<char16_t> name) {
    const auto branch = references_.find(name);
    if (branch == references_.end())
        return false;
    references_.erase(branch);
    return true;
}

bool MemObjectsStorage::UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    if (name.IsEmpty() || !commit)
        return false;
    const auto branch = references_.find(name);
    if (branch == references_.end())
        return false;
    branch->second = std::move(commit);
    return true;
}

cow_ptr<Commit> MemObjectsStorage::GetHead(KivStringViewT<char16_t> name) const {
    return FindIn(references_, name);
}

std::vector<KivStringT<char16_t>> MemObjectsStorage::GetCommitBranches(cow_ptr<Commit> commit) const {
    std::vector<KivStringT<char16_t>> names;
    for (auto const& [name, head] : references_) {
        if (head == commit)
            names.push_back(name);
    }
    return names;
}

} // namespace KivVcs
