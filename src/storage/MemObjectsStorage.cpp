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
    // Where most buckets are free, the bucket alone shows that an object is new, as most that are asked for are; otherwise
    // that takes a visit to a neighbour somewhere in memory. What is there already must not make the table grow, which
    // would change its order.
    if (table.size() >= table.bucket_count() / 2 && !table.contains(id))
        table.rehash(2 * table.bucket_count());
    table.try_emplace(std::move(id), std::move(object));
}

} // namespace

IObjectsStorage::~IObjectsStorage() = default;

MemObjectsStorage::MemObjectsStorage() : MemObjectsStorage({u"master"}) {}

MemObjectsStorage::MemObjectsStorage(std::initializer_list<KivStringViewT<char16_t>> branches) {
    for (KivStringViewT<char16_t> name : branches)
        AddBranch(name, nullptr);
}

MemObjectsStorage::MemObjectsStorage(MemObjectsStorage const& other)
    : IObjectsStorage(other), commits_(other.commits_), trees_(other.trees_), blobs_(other.blobs_),
      references_(other.references_) {
    for (auto const& [name, head] : references_)
        namesByHead_.emplace(head.get(), &name);
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
    if (!commit)
        return;
    const Id id = commit->GetId();
    if (GetCommit(id))
        commits_.erase(id);
}

bool MemObjectsStorage::BranchExist(KivStringViewT<char16_t> name) const {
    return references_.contains(name);
}

bool MemObjectsStorage::CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    return !name.IsEmpty() && AddBranch(name, std::move(commit));
}

bool MemObjectsStorage::AddBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> head) {
    if (references_.contains(name))
        return false;
    // Made before the branch is, so that nothing can fail in between.
    NamesByHead entry;
    entry.emplace(head.get(), nullptr);
    auto const& added = *references_.try_emplace(name.ToString(), std::move(head)).first;
    FileName(entry.extract(entry.begin()), added);
    return true;
}

bool MemObjectsStorage::RemoveBranch(KivStringViewT<char16_t> name) {
    const auto branch = references_.find(name);
    if (branch == references_.end())
        return false;
    namesByHead_.erase({branch->second.get(), &branch->first});
    references_.erase(branch);
    return true;
}

bool MemObjectsStorage::UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    if (name.IsEmpty() || !commit)
        return false;
    const auto branch = references_.find(name);
    if (branch == references_.end())
        return false;
    auto entry = namesByHead_.extract({branch->second.get(), &branch->first});
    branch->second.swap(commit);
    FileName(std::move(entry), *branch);
    return true;
}

void MemObjectsStorage::FileName(NamesByHead::node_type entry, ReferenceTable::value_type const& branch) noexcept {
    entry.value() = {branch.second.get(), &branch.first};
    namesByHead_.insert(std::move(entry));
}

cow_ptr<Commit> MemObjectsStorage::GetHead(KivStringViewT<char16_t> name) const {
    return FindIn(references_, name);
}

std::vector<KivStringT<char16_t>> MemObjectsStorage::GetCommitBranches(cow_ptr<Commit> commit) const {
    std::vector<KivStringT<char16_t>> names;
    for (auto entry = namesByHead_.lower_bound({commit.get(), nullptr});
         entry != namesByHead_.end() && entry->first == commit.get(); ++entry)
        names.push_back(*entry->second);
    return names;
}

} // namespace KivVcs
