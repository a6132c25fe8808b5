#include "Commit.h"

#include "Problem.h"

#include <limits>

namespace vault {

void NewCommit::AddTo(KivArchive::Change& change) const {
    change.objects.push_back(object);
    change.relied.push_back(facts.tree);
    if (!facts.parent.IsEmpty())
        change.relied.push_back(facts.parent);
    for (auto const& contained : facts.contains)
        change.relied.push_back(contained.id);
    change.ancestry.push_back(facts);
}

NewCommit MakeCommit(Id const& tree, Id const& parent, Id const& merged, Author const& author, Text const& message) {
    const auto now = KivVcs::Time::Now();
    if (now.ToTimeT(KivVcs::TimeZone::Utc) > std::numeric_limits<std::int32_t>::max())
        throw Problem("the clock shows a time after January 2038, which a version cannot hold");
    KivVcs::Commit commit;
    commit.DeferRoot(tree, [](Id const&) { return nullptr; });
    if (!parent.IsEmpty())
        commit.DeferParent(parent, [](Id const&) { return nullptr; });
    commit.SetAuthorName(author.name);
    commit.SetAuthorEmail(author.email);
    commit.SetDescription(message);
    commit.SetCommitTime(now);
    commit.SetCommitTimezoneBias(KivVcs::DateTime::GetCurrentTimezoneBias(now));
    NewCommit made{{commit.GetId(), KivArchive::ObjectType::Commit, commit.GetData(), parent}, {}};
    made.facts = {made.object.id, parent, tree, {}};
    if (!merged.IsEmpty())
        made.facts.contains.push_back({KivArchive::Containment::Merged, merged});
    return made;
}

} // namespace vault
