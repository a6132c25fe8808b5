#include "repository/ArchivedStorage.h"

namespace KivArchive {

namespace {

constexpr std::initializer_list<KivStringViewT<char16_t>> noBranches;

template <class Table>
typename Table::mapped_type FindIn(Table const& table, Id const& id) {
    auto const found = table.find(id);
    return found == table.end() ? nullptr : found->second;
}

/// A table with what has arrived and without what is hidden; the settled table itself if that is the same.
/// @param tables the tables made before, which only lack what has arrived since
template <class Table>
Table const& TableOf(Table const& settled, Table const& arrived, std::unordered_set<Id> const& hidden,
                     std::uint64_t count, std::list<Table>& tables) {
    if (arrived.empty() && count == settled.size())
        return settled;
    if (!tables.empty() && tables.back().size() == count)
        return tables.back();
    Table whole = settled;
    whole.insert(arrived.begin(), arrived.end());
    for (Id const& id : hidden)
        whole.erase(id);
    return tables.emplace_back(std::move(whole));
}

} // namespace

ArchivedStorage::ArchivedStorage(std::shared_ptr<ObjectSource> source)
    : source_(std::move(source)), objects_(noBranches) {
    source_->Add(*this);
}

ArchivedStorage::ArchivedStorage(ArchivedStorage const& other) : ArchivedStorage(other, other.LockTables()) {}

ArchivedStorage::ArchivedStorage(ArchivedStorage const& other, Lock const& /*lock*/)
    : IObjectsStorage(other), source_(other.source_), objects_(other.objects_), arrivedCommits_(other.arrivedCommits_),
      arrivedTrees_(other.arrivedTrees_), arrivedBlobs_(other.arrivedBlobs_), hidden_(other.hidden_),
      hiddenCount_(other.hiddenCount_), unpublished_(other.unpublished_) {
    source_->Add(*this);
}

ArchivedStorage::~ArchivedStorage() {
    source_->Remove(*this);
}

std::unique_ptr<KivVcs::IObjectsStorage> ArchivedStorage::Clone() const {
    return std::make_unique<ArchivedStorage>(*this);
}

void ArchivedStorage::Settle() {
    commitTables_.clear();
    treeTables_.clear();
    blobTables_.clear();
    for (; !arrivedBlobs_.empty(); arrivedBlobs_.erase(arrivedBlobs_.begin()))
        objects_.AddBlob(arrivedBlobs_.begin()->second);
    for (; !arrivedTrees_.empty(); arrivedTrees_.erase(arrivedTrees_.begin()))
        objects_.AddTree(arrivedTrees_.begin()->second);
    for (; !arrivedCommits_.empty(); arrivedCommits_.erase(arrivedCommits_.begin()))
        objects_.AddCommit(arrivedCommits_.begin()->second);
}

cow_ptr<Commit> ArchivedStorage::GetCommit(Id const& id) const {
    Lock const lock = LockTables();
    return hidden_.contains(id) ? nullptr : FindLiving(id);
}

cow_ptr<Commit> ArchivedStorage::FindLiving(Id const& id) const {
    cow_ptr<Commit> commit = objects_.GetCommit(id);
    return commit ? commit : FindIn(arrivedCommits_, id);
}

cow_ptr<Tree> ArchivedStorage::GetTree(Id const& id) const {
    Lock const lock = LockTables();
    cow_ptr<Tree> tree = objects_.GetTree(id);
    return tree ? tree : FindIn(arrivedTrees_, id);
}

cow_ptr<Blob> ArchivedStorage::GetBlob(Id const& id) const {
    Lock const lock = LockTables();
    cow_ptr<Blob> blob = objects_.GetBlob(id);
    return blob ? blob : FindIn(arrivedBlobs_, id);
}

void ArchivedStorage::AddCommit(cow_ptr<Commit> commit) {
    Lock const lock = LockTables();
    Settle();
    Id const id = commit->GetId();
    if (cow_ptr<Commit> const living = objects_.GetCommit(id)) {
        if (!hidden_.contains(id))
            return;
        // A deleted object is replaced by the one that the host adds.
        objects_.DeleteCommit(living);
        --hiddenCount_;
    }
    unpublished_.insert(id);
    objects_.AddCommit(std::move(commit));
    hidden_.erase(id);
}

void ArchivedStorage::AddTree(cow_ptr<Tree> tree) {
    Lock const lock = LockTables();
    Settle();
    objects_.AddTree(std::move(tree));
}

void ArchivedStorage::AddBlob(cow_ptr<Blob> blob) {
    Lock const lock = LockTables();
    Settle();
    objects_.AddBlob(std::move(blob));
}

std::uint64_t ArchivedStorage::GetCommitCount() const {
    Lock const lock = LockTables();
    return objects_.GetCommitCount() + arrivedCommits_.size() - hiddenCount_;
}

std::uint64_t ArchivedStorage::GetTreeCount() const {
    Lock const lock = LockTables();
    return objects_.GetTreeCount() + arrivedTrees_.size();
}

std::uint64_t ArchivedStorage::GetBlobCount() const {
    Lock const lock = LockTables();
    return objects_.GetBlobCount() + arrivedBlobs_.size();
}

KivVcs::IObjectsStorage::CommitTable const& ArchivedStorage::GetCommits() const {
    Lock const lock = LockTables();
    return TableOf(objects_.GetCommits(), arrivedCommits_, hidden_, GetCommitCount(), commitTables_);
}

KivVcs::IObjectsStorage::TreeTable const& ArchivedStorage::GetTrees() const {
    Lock const lock = LockTables();
    return TableOf(objects_.GetTrees(), arrivedTrees_, {}, GetTreeCount(), treeTables_);
}

KivVcs::IObjectsStorage::BlobTable const& ArchivedStorage::GetBlobs() const {
    Lock const lock = LockTables();
    return TableOf(objects_.GetBlobs(), arrivedBlobs_, {}, GetBlobCount(), blobTables_);
}

KivVcs::IObjectsStorage::ReferenceTable const& ArchivedStorage::GetRefs() const {
    return objects_.GetRefs();
}

void ArchivedStorage::DeleteCommit(cow_ptr<Commit> commit) {
    if (!commit)
        return;
    Lock const lock = LockTables();
    Settle();
    Id const id = commit->GetId();
    if (objects_.GetCommit(id) && hidden_.insert(id).second)
        ++hiddenCount_;
}

void ArchivedStorage::PurgeUnusedObjects() {
    Lock const lock = LockTables();
    Settle();
    objects_.PurgeUnusedObjects();
    CountHidden();
}

void ArchivedStorage::CountHidden() noexcept {
    hiddenCount_ = 0;
    for (Id const& id : hidden_)
        hiddenCount_ += objects_.GetCommit(id) ? 1 : 0;
}

bool ArchivedStorage::BranchExist(KivStringViewT<char16_t> name) const {
    return objects_.BranchExist(name);
}

bool ArchivedStorage::CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    return objects_.CreateBranch(name, std::move(commit));
}

bool ArchivedStorage::RemoveBranch(KivStringViewT<char16_t> name) {
    return objects_.RemoveBranch(name);
}

bool ArchivedStorage::UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) {
    return objects_.UpdateBranch(name, std::move(commit));
}

cow_ptr<Commit> ArchivedStorage::GetHead(KivStringViewT<char16_t> name) const {
    return objects_.GetHead(name);
}

std::vector<KivStringT<char16_t>> ArchivedStorage::GetCommitBranches(cow_ptr<Commit> commit) const {
    return objects_.GetCommitBranches(std::move(commit));
}

void ArchivedStorage::Enter(cow_ptr<Commit> const& commit) {
    Id const id = commit->GetId();
    if (!FindLiving(id) && arrivedCommits_.try_emplace(id, commit).second && hidden_.contains(id))
        ++hiddenCount_;
}

void ArchivedStorage::Enter(cow_ptr<Tree> const& tree) {
    Id const id = tree->GetId();
    if (!objects_.GetTree(id))
        arrivedTrees_.try_emplace(id, tree);
}

void ArchivedStorage::Enter(cow_ptr<Blob> const& blob) {
    Id const id = blob->GetId();
    if (!objects_.GetBlob(id))
        arrivedBlobs_.try_emplace(id, blob);
}

bool ArchivedStorage::MayBeUnpublished(Id const& id) const {
    Lock const lock = LockTables();
    return unpublished_.contains(id) || !FindLiving(id);
}

void ArchivedStorage::SetPublished(std::span<const Id> commits) noexcept {
    for (Id const& id : commits)
        unpublished_.erase(id);
}

} // namespace KivArchive
