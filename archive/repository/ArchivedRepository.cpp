#include "KivArchive/ArchivedRepository.h"

#include "AncestryWalk.h"
#include "repository/RepositoryState.h"
#include "repository/Unreadable.h"

#include <algorithm>

namespace KivArchive {

ArchivedRepository::ArchivedRepository(std::shared_ptr<IArchive> archive, RepositoryOptions const& options)
    : ArchivedRepository(std::make_unique<State>(std::move(archive), options)) {}

ArchivedRepository::ArchivedRepository(std::unique_ptr<State> state)
    : Repository(std::move(state->made)), state_(std::move(state)) {
    ArchivedRepository::Refresh(nullptr);
    if (state_->branches.empty())
        state_->storage->CreateBranch(u"master", nullptr);
}

ArchivedRepository::~ArchivedRepository() = default;

std::shared_ptr<IArchive> const& ArchivedRepository::GetArchive() const noexcept {
    return state_->source->GetArchive();
}

cow_ptr<Commit> ArchivedRepository::GetHead(KivStringViewT<char16_t> branch) const {
    cow_ptr<Commit> head = Repository::GetHead(branch);
    if (head || !Repository::GetStorage()->BranchExist(branch))
        return head;
    auto const known = state_->branches.find(branch.ToString());
    if (known != state_->branches.end() && known->second.unreadable)
        ThrowUnreadable(*known->second.unreadable, "version", known->second.published);
    return nullptr;
}

std::vector<Id> ArchivedRepository::Load(std::span<const Id> ids, IProgress* progress) {
    ReportProgress(progress, {"loading versions", 0, 0}, {});
    std::vector<Id> commits;
    std::vector<Id> trees;
    std::vector<Id> blobs;
    for (ObjectInfo const& info : state_->Archive().Describe(ids))
        (info.type == ObjectType::Commit ? commits : info.type == ObjectType::Tree ? trees : blobs).push_back(info.id);
    for (auto const& [id, failure] : state_->source->LoadCommits(commits))
        if (failure != Failure::Collected)
            ThrowUnreadable(failure, "version", id);
    state_->source->LoadTrees(trees, progress);
    state_->source->LoadBlobs(blobs);
    bool const isAll = commits.size() + trees.size() + blobs.size() == ids.size();
    return isAll ? std::vector<Id>() : state_->Archive().FindMissing(ids);
}

Buffer ArchivedRepository::ReadContent(Id const& id) {
    return state_->source->GetContents()->Read(id);
}

StreamIO ArchivedRepository::OpenContent(Id const& id) {
    return state_->source->GetContents()->Open(id);
}

Id ArchivedRepository::GetPublishedHead(KivStringViewT<char16_t> branch) const {
    auto const known = state_->branches.find(branch.ToString());
    return known == state_->branches.end() ? Id() : known->second.published;
}

bool ArchivedRepository::HasUnpublished(KivStringViewT<char16_t> branch) const {
    auto const known = state_->branches.find(branch.ToString());
    if (known == state_->branches.end())
        return state_->storage->GetHead(branch) != nullptr;
    Id const own = state_->OwnHead(branch);
    bool const isUnreadable = own.IsEmpty() && known->second.unreadable && state_->storage->BranchExist(branch);
    return !isUnreadable && !(own == known->second.taken) && !(own == known->second.published);
}

void ArchivedRepository::CommitRewritten(cow_ptr<Commit> old, cow_ptr<Commit> rebuilt) {
    RecordContained(rebuilt, Containment::RewrittenFrom, old);
}

void ArchivedRepository::RecordContained(cow_ptr<Commit> const& commit, Containment how,
                                         cow_ptr<Commit> const& contained) {
    Id const id = contained->GetId();
    state_->facts.AddLine(contained, [this](Id const& line) { return state_->storage->MayBeUnpublished(line); });
    state_->facts.Add(*commit, {how, id}, how == Containment::Merged ? contained : nullptr);
}

std::vector<Ancestry> ArchivedRepository::ReadAncestry(std::span<const Id> commits, Follow follow,
                                                       std::size_t more) const {
    // About as many as the caller asks for, since the archive walks that far for each batch.
    std::size_t const batchSize = std::clamp<std::size_t>(more, 16, 256);
    std::unordered_map<Id, Ancestry> archived;
    std::unordered_set<Id> asked;
    auto const ask = [&](Id const& id) {
        // All unpublished commits of the line in one batch, instead of one call for each that the archive does not
        // know.
        std::vector<Id> line{id};
        for (cow_ptr<Commit> held = state_->storage->GetCommit(id);
             held && line.size() < batchSize && state_->storage->MayBeUnpublished(line.back());) {
            held = held->GetHeldParent();
            if (held)
                line.push_back(held->GetId());
        }
        asked.insert(line.begin(), line.end());
        for (Ancestry& facts : state_->Archive().ReadAncestry(line, follow, batchSize))
            archived.try_emplace(facts.commit, std::move(facts));
    };
    auto const lookUp = [&](Id const& id) -> std::optional<Ancestry> {
        Ancestry const* const local = state_->facts.Find(id);
        bool const isOnlyHere = local != nullptr && state_->storage->MayBeUnpublished(id);
        if (archived.find(id) == archived.end() && !isOnlyHere && !asked.contains(id))
            ask(id);
        std::optional<Ancestry> known;
        if (auto const found = archived.find(id); found != archived.end())
            known = found->second;
        else if (cow_ptr<Commit> const commit = state_->storage->GetCommit(id))
            known = Ancestry{id, commit->GetParentId(), commit->GetRootId(), {}};
        if (local != nullptr && !known)
            known = *local;
        else if (local != nullptr)
            AddContained(known->contains, local->contains);
        return known;
    };
    return WalkAncestry(commits, follow, more, lookUp);
}

} // namespace KivArchive
