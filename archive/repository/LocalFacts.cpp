#include "repository/LocalFacts.h"

#include "Changes.h"

#include <algorithm>
#include <utility>

namespace KivArchive {

LocalFacts::Entry& LocalFacts::EntryOf(KivVcs::Commit const& commit) {
    Id const id = commit.GetId();
    auto const found = entries_.find(id);
    return found != entries_.end()
               ? found->second
               : entries_.emplace(id, Entry{{id, commit.GetParentId(), commit.GetRootId(), {}}, {}, false})
                     .first->second;
}

void LocalFacts::Add(KivVcs::Commit const& commit, ContainedCommit const& contained, CommitHandle merged) {
    Entry& entry = EntryOf(commit);
    AddContained(entry.facts.contains, {contained});
    if (merged)
        entry.merged.push_back(std::move(merged));
}

void LocalFacts::AddLine(CommitHandle commit, IsUnpublished const& isUnpublished) {
    std::vector<CommitHandle> open{std::move(commit)};
    while (!open.empty()) {
        CommitHandle const next = std::move(open.back());
        open.pop_back();
        if (!next || !isUnpublished(next->GetId()))
            continue;
        Entry& entry = EntryOf(*next);
        if (std::exchange(entry.hasLine, true))
            continue;
        open.insert(open.end(), entry.merged.begin(), entry.merged.end());
        open.push_back(next->GetHeldParent());
    }
}

Ancestry const* LocalFacts::Find(Id const& id) const {
    auto const found = entries_.find(id);
    return found == entries_.end() ? nullptr : &found->second.facts;
}

std::span<const LocalFacts::CommitHandle> LocalFacts::MergedBy(Id const& id) const {
    auto const found = entries_.find(id);
    return found == entries_.end() ? std::span<const CommitHandle>() : found->second.merged;
}

std::vector<Ancestry> LocalFacts::All() const {
    std::vector<Ancestry> all;
    all.reserve(entries_.size());
    auto const isDigest = [](Id const& known) { return known.IsEmpty() || known.GetDigest() != nullptr; };
    for (auto const& [id, entry] : entries_) {
        // Archives take digests only; a host's class may have other identifiers.
        if (!isDigest(id) || !isDigest(entry.facts.parent) || !isDigest(entry.facts.tree))
            continue;
        all.push_back(entry.facts);
        std::erase_if(all.back().contains, [&](ContainedCommit const& contained) { return !isDigest(contained.id); });
    }
    return all;
}

bool LocalFacts::HasFactsOfPublished(IsUnpublished const& isUnpublished) const {
    return std::any_of(entries_.begin(), entries_.end(),
                       [&isUnpublished](auto const& entry) { return !isUnpublished(entry.first); });
}

void LocalFacts::ForgetPublished(IsUnpublished const& isUnpublished) {
    std::erase_if(entries_, [&](auto const& entry) { return !isUnpublished(entry.first); });
}

} // namespace KivArchive
