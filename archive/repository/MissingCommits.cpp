#include "repository/MissingCommits.h"

#include "NamedFirst.h"
#include "repository/Unreadable.h"

#include <unordered_set>

namespace KivArchive {

namespace {

/// The most commits of one line that are asked about at once.
constexpr std::size_t maximumAskedOfLine = 1000;
/// Up to this many commits are taken for missing without asking: storing some that are there already costs less.
constexpr std::size_t maximumUnasked = 8;

} // namespace

std::vector<cow_ptr<Commit>> MissingCommits::Find(std::vector<cow_ptr<Commit>> const& heads) {
    Discover(heads);
    return InOrder(heads);
}

/// The commit and its ancestors, up to the first one that the archive is known to have had.
std::vector<cow_ptr<Commit>> MissingCommits::LineToAskFor(cow_ptr<Commit> commit) const {
    std::vector<cow_ptr<Commit>> line;
    for (; commit && line.size() < maximumAskedOfLine; commit = commit->GetHeldParent()) {
        Id const id = commit->GetId();
        if (asked_.Contains(id) || !MustAskFor(id))
            break;
        line.push_back(commit);
    }
    return line;
}

void MissingCommits::Discover(std::vector<cow_ptr<Commit>> open) {
    while (!open.empty()) {
        std::vector<std::vector<cow_ptr<Commit>>> lines;
        std::vector<Id> ids;
        for (auto const& commit : open) {
            lines.push_back(LineToAskFor(commit));
            for (auto const& asked : lines.back())
                if (asked_.Add(asked->GetId()))
                    ids.push_back(asked->GetId());
        }
        open.clear();
        bool const areUnasked = ids.size() <= maximumUnasked && !asksForAll_;
        std::vector<Id> const found = areUnasked ? std::vector<Id>() : archive_.FindMissing(ids);
        std::unordered_set<Id> const missing(found.begin(), found.end());
        std::vector<Id> unheld;
        for (auto const& line : lines) {
            bool isWhollyMissing = !line.empty();
            for (auto const& commit : line) {
                Id const id = commit->GetId();
                // A commit that is there has all that it names.
                isWhollyMissing = areUnasked || missing.contains(id);
                if (!isWhollyMissing)
                    break;
                missing_.Add(id, commit);
                for (auto const& merged : facts_.MergedBy(id))
                    open.push_back(merged);
            }
            if (!isWhollyMissing)
                continue;
            if (cow_ptr<Commit> parent = line.back()->GetHeldParent())
                open.push_back(std::move(parent));
            else if (Id parentId = line.back()->GetParentId(); !parentId.IsEmpty())
                unheld.push_back(std::move(parentId));
        }
        CheckUnheld(unheld);
    }
}

void MissingCommits::CheckUnheld(std::vector<Id> const& parents) const {
    if (!asksForAll_ || parents.empty())
        return;
    auto const gone = archive_.FindMissing(parents);
    if (!gone.empty())
        ThrowUnreadable(Failure::Collected, "version", gone.front());
}

std::vector<cow_ptr<Commit>> MissingCommits::InOrder(std::vector<cow_ptr<Commit>> const& heads) const {
    std::vector<Id> roots;
    roots.reserve(heads.size());
    for (auto const& head : heads) {
        roots.push_back(head->GetId());
        // What is missing was reached from a head that is: a single one is that head.
        if (missing_.Count() == 1 && missing_.Contains(roots.back()))
            return {head};
    }
    std::vector<cow_ptr<Commit>> ordered;
    VisitNamedFirst<Id>(
        roots,
        [this](Id const& id, std::vector<Id>& named) {
            cow_ptr<Commit> const* const found = missing_.Find(id);
            if (found == nullptr)
                return false;
            for (auto const& merged : facts_.MergedBy(id))
                named.push_back(merged->GetId());
            named.push_back((*found)->GetParentId());
            return true;
        },
        [&](Id const& id) { ordered.push_back(*missing_.Find(id)); });
    return ordered;
}

} // namespace KivArchive
