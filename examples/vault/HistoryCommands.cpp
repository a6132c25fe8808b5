#include "Commands.h"
#include "Database.h"
#include "Names.h"
#include "Output.h"
#include "Problem.h"
#include "Progress.h"

#include <KivArchive/Upkeep.h>
#include <algorithm>
#include <iostream>
#include <sys/stat.h>

namespace vault {

using KivArchive::ArchivedRepository;

namespace {

constexpr std::string_view otherPrefix = "other/";
constexpr std::size_t mostNamed = 20;

bool AreOne(std::string const& vault, std::string const& other) {
    struct stat one {};
    struct stat two {};
    return (IsDatabase(vault) && vault == other) || (stat(vault.c_str(), &one) == 0 && stat(other.c_str(), &two) == 0 &&
                                                     one.st_dev == two.st_dev && one.st_ino == two.st_ino);
}

} // namespace

int ListBranches(VaultPlace const& place) {
    const Vault vault(place);
    const auto current = vault.CurrentBranch();
    for (auto const& [name, head] : vault.Archive().ReadBranches())
        std::cout << (name == current ? "* " : "  ") << Printable(name) << "  " << DigitsOf(head) << '\n';
    return 0;
}

int MakeBranch(VaultPlace const& place, std::string const& name) {
    const auto branch = RequireBranchName(name);
    Vault vault(place, Vault::Access::Write);
    const auto head = vault.Find("").id;
    if (!MoveHead(vault, {}, branch, {}, head))
        throw Problem("there is a branch " + Printable(name) + " already");
    return 0;
}

int DeleteBranch(VaultPlace const& place, std::string const& name) {
    Vault vault(place, Vault::Access::Write);
    const auto head = vault.RequireBranch(name);
    const auto branch = RequireUtf8(name, "a branch name");
    if (vault.CurrentBranch() == branch)
        throw Problem("the current branch cannot be deleted");
    if (!MoveHead(vault, {}, branch, head, {}))
        throw Problem("somebody else has moved the branch meanwhile");
    return 0;
}

int Checkout(VaultPlace const& place, std::string const& name) {
    Vault vault(place, Vault::Access::Write);
    static_cast<void>(vault.RequireBranch(name));
    vault.Checkout(RequireUtf8(name, "a branch name"));
    return 0;
}

int Rebase(VaultPlace const& place, std::string const& branch, std::string const& onto) {
    Vault vault(place, Vault::Access::Write);
    static_cast<void>(vault.RequireBranch(branch));
    static_cast<void>(vault.RequireBranch(onto));
    const auto name = RequireUtf8(branch, "a branch name");
    ArchivedRepository repository(vault.SharedArchive());
    const auto head = repository.GetHead(name);
    const auto ontoHead = repository.GetHead(RequireUtf8(onto, "a branch name"));
    const auto base = repository.GetCommonBase(head, ontoHead);
    if (base == head || base == ontoHead) {
        std::cout << "nothing to rebase\n";
        return 0;
    }
    const auto tip = repository.MergelessRebase(head, base, ontoHead);
    repository.MoveBranchTo(name, tip);
    Publish(repository);
    std::cout << Printable(branch) << " is now " << DigitsOf(tip->GetId()) << '\n';
    return 0;
}

int Join(VaultPlace const& place, std::string const& first, std::string const& second, std::string const& root) {
    const auto rootBranch = RequireBranchName(root);
    Vault vault(place, Vault::Access::Write);
    static_cast<void>(vault.RequireBranch(first));
    static_cast<void>(vault.RequireBranch(second));
    ArchivedRepository repository(vault.SharedArchive());
    if (!repository.EnsureCommonRootFor(RequireUtf8(first, "a branch name"), RequireUtf8(second, "a branch name"),
                                        rootBranch))
        throw Problem("these branches cannot be joined");
    Publish(repository);
    std::cout << Printable(first) << " and " << Printable(second) << " have a common root\n";
    return 0;
}

int Sync(VaultPlace const& place, std::string const& other, bool yes) {
    if (AreOne(place.file, other))
        throw Problem("a vault cannot be synced with itself");
    Vault vault(place, Vault::Access::Create);
    const Vault theirs({other, place.wait});
    KivArchive::SynchronizeOptions options;
    std::vector<Id> heads;
    for (auto const& [name, head] : theirs.Archive().ReadBranches()) {
        // What they have from others is not theirs to hand on.
        const auto shown = ToUtf8(name);
        if (shown.starts_with(otherPrefix))
            continue;
        options.branches.push_back({name, RequireBranchName(std::string(otherPrefix) + shown)});
        heads.push_back(head);
    }
    const auto forgotten = KivArchive::FindForgotten(theirs.Archive(), vault.Archive(), heads);
    if (!forgotten.empty()) {
        Warn(Counted(forgotten.size(), "version") + " that were forgotten here and that this brings back:");
        const auto named = std::span(forgotten).first(std::min(mostNamed, forgotten.size()));
        for (auto const& commit : KivArchive::ReadCommits(theirs.Archive(), named))
            Warn("    " + Shortened(commit.id) + "  " + DescribeMessage(commit));
        if (named.size() < forgotten.size())
            Warn("    and " + std::to_string(forgotten.size() - named.size()) + " more");
        if (!Confirm("Bring them back?", yes))
            return 0;
    }
    options.acceptsName = [](KivVcs::KivStringViewT<char16_t> name) {
        const auto stored = ToUtf8(name);
        return IsOwn(stored) || FileName(stored).has_value();
    };
    KivArchive::SynchronizeReport report;
    {
        Progress progress("syncing");
        report = KivArchive::Synchronize(theirs.Archive(), vault.Archive(), options, &progress);
    }
    for (auto const& [name, head] : report.heads)
        std::cout << otherPrefix << Printable(name) << "  " << DigitsOf(head) << '\n';
    std::cout << Counted(report.objects, "object") << " brought in\n";
    return 0;
}

} // namespace vault
