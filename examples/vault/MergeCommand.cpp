#include "Author.h"
#include "Commands.h"
#include "Conflicts.h"
#include "Problem.h"
#include "Vault.h"

#include <iostream>

namespace vault {

namespace {

/// Gives the commit that the merge made an author and a message, and settles what the merge does not ask about.
void Finish(KivVcs::Repository& repository, Conflicts& conflicts, MergeOptions const& options) {
    const auto author = ParseAuthor(options.author.empty() ? DefaultAuthor() : options.author);
    KivVcs::Commit amended(&repository, true);
    conflicts.SettleKinds(amended, repository);
    amended.SetAuthorName(author.name);
    amended.SetAuthorEmail(author.email);
    amended.SetDescription(RequireLine("Merge " + options.revision, "a message"));
    repository.DoCommit(amended);
}

/// @return the lines to print
std::vector<std::string> MergeIntoCurrent(KivVcs::Repository& repository, MergeOptions const& options) {
    const auto other = FindRevision(repository, options.revision);
    const auto head = repository.GetHead();
    const auto base = head ? repository.GetCommonBase(head, other) : nullptr;
    if (base && base == other)
        return {"nothing to merge: the current branch holds " + Printable(options.revision) + " already"};
    if (!head || base == head) {
        repository.Merge(other, {});
        return {"moved forward to " + ToUtf8(other->GetId())};
    }

    Conflicts conflicts(options.policy, head, base, other);
    if (!repository.Merge(other, conflicts.MakeResolvers()))
        throw Problem("the merge was given up; nothing was changed", findingsExitStatus);
    // Only now are all conflicts known. What was made of them is dropped with the repository if the user wants none.
    Finish(repository, conflicts, options);
    if (options.policy == ConflictPolicy::Stop && !conflicts.IsEmpty()) {
        for (auto const& line : conflicts.Describe(nullptr))
            std::cout << line << '\n';
        throw Problem("stopped by conflicts; nothing was changed (--on-conflict chooses who wins)", findingsExitStatus);
    }
    auto lines = conflicts.Describe(repository.GetHead());
    lines.push_back("merged as " + ToUtf8(repository.GetHead()->GetId()));
    return lines;
}

} // namespace

void Merge(Path const& file, MergeOptions const& options) {
    Vault vault(file, VaultFile::Access::Write);
    const auto lines = MergeIntoCurrent(vault.Repository(), options);
    vault.Write();
    for (auto const& line : lines)
        std::cout << line << '\n';
}

} // namespace vault
