#include "repository/ObjectSource.h"

#include "Changes.h"
#include "KivArchive/ArchivedBlob.h"
#include "repository/ArchivedStorage.h"
#include "repository/CommitForm.h"
#include "repository/TreeFetch.h"
#include "repository/Unreadable.h"

#include <algorithm>

namespace KivArchive {

namespace {

/// How many commits the first batch of a walk fetches, and how many its largest ones.
constexpr std::size_t fewestAhead = 32;
constexpr std::size_t mostAhead = 2048;

std::string SentenceFor(Failure kind, const char* what, Id const& id) {
    std::string digits;
    for (char16_t const unit : KivStringViewT<char16_t>(id.GetText()))
        digits += static_cast<char>(unit);
    std::string const subject = std::string("The ") + what + " " + digits;
    if (kind == Failure::Collected)
        return subject + " is not in the archive any more.";
    return subject + (kind == Failure::Damaged ? " is damaged." : " is not one that can be shown here.");
}

} // namespace

void ThrowUnreadable(Failure kind, const char* what, Id const& id) {
    throw ArchiveError(kind, {}, SentenceFor(kind, what, id));
}

ObjectSource::ObjectSource(std::shared_ptr<IArchive> archive, std::uint64_t contentBudget)
    : archive_(std::move(archive)), contents_(std::make_shared<Contents>(archive_, contentBudget)),
      ahead_(fewestAhead) {}

void ObjectSource::Add(ArchivedStorage& storage) {
    Lock const lock(mutex_);
    storages_.push_back(&storage);
}

void ObjectSource::Remove(ArchivedStorage& storage) noexcept {
    Lock const lock(mutex_);
    std::erase(storages_, &storage);
}

cow_ptr<Commit> ObjectSource::FindCommit(Id const& id) const {
    cow_ptr<Commit> found;
    for (auto storage = storages_.begin(); !found && storage != storages_.end(); ++storage)
        found = (*storage)->FindLiving(id);
    return found;
}

cow_ptr<Tree> ObjectSource::FindTree(Id const& id) const {
    cow_ptr<Tree> found;
    for (auto storage = storages_.begin(); !found && storage != storages_.end(); ++storage)
        found = (*storage)->GetTree(id);
    return found;
}

cow_ptr<Blob> ObjectSource::FindBlob(Id const& id) const {
    cow_ptr<Blob> found;
    for (auto storage = storages_.begin(); !found && storage != storages_.end(); ++storage)
        found = (*storage)->GetBlob(id);
    return found;
}

template <class T>
void ObjectSource::Enter(cow_ptr<T> const& object) {
    for (ArchivedStorage* const storage : storages_)
        storage->Enter(object);
}

template void ObjectSource::Enter(cow_ptr<Tree> const&);
template void ObjectSource::Enter(cow_ptr<Blob> const&);

cow_ptr<Commit> ObjectSource::FetchCommit(Id const& id) {
    {
        Lock const lock(mutex_);
        if (cow_ptr<Commit> living = FindCommit(id)) {
            Enter(living);
            return living;
        }
    }
    cow_ptr<Commit> fetched;
    std::optional<Failure> failure;
    ReadOutcome const outcome = archive_->Read(AncestorsAhead(id), [&](ArchivedObject const& object) {
        cow_ptr<Commit> commit = ReadObject(object);
        if (object.id == id) {
            fetched = commit;
            if (!commit)
                failure = Failure::Unrepresentable;
        }
    });
    if (fetched)
        return fetched;
    {
        // Another thread may have entered it meanwhile.
        Lock const lock(mutex_);
        if (cow_ptr<Commit> living = FindCommit(id)) {
            Enter(living);
            return living;
        }
    }
    bool const isDamaged = std::find(outcome.damaged.begin(), outcome.damaged.end(), id) != outcome.damaged.end();
    ThrowUnreadable(failure.value_or(isDamaged ? Failure::Damaged : Failure::Collected), "version", id);
}

std::vector<Id> ObjectSource::AncestorsAhead(Id const& id) {
    std::size_t ahead = fewestAhead;
    {
        Lock const lock(mutex_);
        ahead = nextAncestor_ == id ? ahead_ : fewestAhead;
    }
    std::vector<Id> ids{id};
    Id oldest = id;
    for (Ancestry const& facts : archive_->ReadAncestry({&id, 1}, Follow::Parents, ahead - 1)) {
        if (!(facts.commit == id))
            ids.push_back(facts.commit);
        oldest = facts.parent;
    }
    Lock const lock(mutex_);
    nextAncestor_ = oldest;
    ahead_ = std::min(2 * ahead, mostAhead);
    std::erase_if(ids, [this](Id const& ancestor) { return FindCommit(ancestor) != nullptr; });
    return ids;
}

/// @return the only living commit with that identifier; null if no commit is packed to this object
cow_ptr<Commit> ObjectSource::ReadObject(ArchivedObject const& object) {
    if (object.type != ObjectType::Commit)
        return nullptr;
    auto const source = shared_from_this();
    cow_ptr<Commit> commit = ReadCommit(
        object.id, object.data, [source](Id const& parent) { return source->FetchCommit(parent); },
        [source](Id const& root) { return source->FetchTree(root); });
    if (!commit)
        return nullptr;
    Lock const lock(mutex_);
    if (cow_ptr<Commit> living = FindCommit(object.id))
        commit = std::move(living);
    Enter(commit);
    return commit;
}

cow_ptr<Tree> ObjectSource::FetchTree(Id const& id) {
    return TreeFetch(*this, nullptr).Fetch({&id, 1}).front();
}

void ObjectSource::LoadTrees(std::span<const Id> ids, IProgress* progress) {
    static_cast<void>(TreeFetch(*this, progress).Fetch(ids));
}

ObjectSource::Failures ObjectSource::LoadCommits(std::span<const Id> ids) {
    std::vector<Id> wanted;
    {
        Lock const lock(mutex_);
        for (Id const& id : ids) {
            if (cow_ptr<Commit> const living = FindCommit(id))
                Enter(living);
            else
                wanted.push_back(id);
        }
    }
    Failures failures;
    if (wanted.empty())
        return failures;
    ReadOutcome const outcome = archive_->Read(wanted, [&](ArchivedObject const& object) {
        if (!ReadObject(object))
            failures.emplace(object.id, Failure::Unrepresentable);
    });
    for (Id const& id : outcome.missing)
        failures.emplace(id, Failure::Collected);
    for (Id const& id : outcome.damaged)
        failures.emplace(id, Failure::Damaged);
    return failures;
}

void ObjectSource::LoadBlobs(std::span<const Id> ids) {
    auto const group = std::make_shared<ContentGroup>(contents_, std::vector<Id>(ids.begin(), ids.end()));
    for (Id const& id : ids) {
        cow_ptr<Blob> const blob = KivVcs::immu::make<ArchivedBlob>(DigestOf(id), group);
        Lock const lock(mutex_);
        cow_ptr<Blob> const living = FindBlob(id);
        Enter(living ? living : blob);
    }
}

} // namespace KivArchive
