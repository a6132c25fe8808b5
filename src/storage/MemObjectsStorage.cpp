#include "KivVcs/Storage.h"

namespace KivVcs {

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
    return commits_.Find(id);
}

cow_ptr<Tree> MemObjectsStorage::GetTree(Id const& id) const {
    return trees_.Find(id);
}

cow_ptr<Blob> MemObjectsStorage::GetBlob(Id const& id) const {
    return blobs_.Find(id);
}

void MemObjectsStorage::AddCommit(cow_ptr<Commit> commit) {
    commits_.Add(std::move(commit));
}

void MemObjectsStorage::AddTree(cow_ptr<Tree> tree) {
    trees_.Add(std::move(tree));
}

void MemObjectsStorage::AddBlob(cow_ptr<Blob> blob) {
    blobs_.Add(std::move(blob));
}

std::uint64_t MemObjectsStorage::GetCommitCount() const {
    return commits_.Size();
}

std::uint64_t MemObjectsStorage::GetTreeCount() const {
    return trees_.Size();
}

std::uint64_t MemObjectsStorage::GetBlobCount() const {
    return blobs_.Size();
}

IObjectsStorage::CommitTable const& MemObjectsStorage::GetCommits() const {
    return commits_.Show();
}

IObjectsStorage::TreeTable const& MemObjectsStorage::GetTrees() const {
    return trees_.Show();
}

IObjectsStorage::BlobTable const& MemObjectsStorage::GetBlobs() const {
    return blobs_.Show();
}

IObjectsStorage::ReferenceTable const& MemObjectsStorage::GetRefs() const {
    return references_;
}

void MemObjectsStorage::DeleteCommit(cow_ptr<Commit> commit) {
    if (!commit)
        return;
    const Id id = commit->GetId();
    if (GetCommit(id))
        commits_.Remove(id);
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
    const auto branch = references_.find(name);
    return branch == references_.end() ? nullptr : branch->second;
}

std::vector<KivStringT<char16_t>> MemObjectsStorage::GetCommitBranches(cow_ptr<Commit> commit) const {
    std::vector<KivStringT<char16_t>> names;
    for (auto entry = namesByHead_.lower_bound({commit.get(), nullptr});
         entry != namesByHead_.end() && entry->first == commit.get(); ++entry)
        names.push_back(*entry->second);
    return names;
}

} // namespace KivVcs
