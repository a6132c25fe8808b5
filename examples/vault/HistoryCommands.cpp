#include "Commands.h"
#include "Database.h"
#include "Names.h"
#include "Output.h"
#include "Problem.h"
#include "Progress.h"

#include <KivArchive/ArchivedRepository.h>
#include <KivArchive/SqliteArchive.h>
#include <KivArchive/Upkeep.h>
#include <algorithm>
#include <iostream>
#include <set>
#include <sys/stat.h>
#include <sys/statvfs.h>

namespace vault {

using KivArchive::ArchivedRepository;
using KivVcs::Commit;
using KivVcs::cow_ptr;

namespace {

constexpr char16_t const* forgetMark = u":forget";
constexpr std::string_view otherPrefix = "other/";
constexpr std::size_t factsAtOnce = 10'000;

/// What may be written before anything is given back, by what is left on the disk.
KivArchive::CollectOptions CollectingWithin(std::string const& file) {
    KivArchive::CollectOptions options;
    struct statvfs disk {};
    if (IsDatabase(file) || statvfs(file.c_str(), &disk) != 0)
        return options;
    const std::uint64_t room = std::uint64_t{disk.f_bavail} * disk.f_frsize;
    options.slice = std::clamp<std::uint64_t>(room / 16'384, 50, options.slice);
    options.sliceBytes = std::clamp<std::uint64_t>(room / 8, 64'000, options.sliceBytes);
    options.mostMarked = std::max<std::uint64_t>(room / 256, 1000);
    return options;
}

/// Removes what no branch has reached for some time; what is to go at once is marked first.
KivArchive::CollectReport CollectUnreached(Vault const& vault, std::chrono::seconds grace) {
    Progress progress("collecting");
    std::uint64_t removed = 0;
    for (bool isAllMarked = grace != std::chrono::seconds(0);;) {
        auto options = CollectingWithin(vault.File());
        options.grace = grace;
        auto report = KivArchive::Collect(vault.Archive(), options, &progress);
        report.removed = removed += report.removed;
        if (isAllMarked || report.marked == 0)
            return report;
        isAllMarked = report.marked < options.mostMarked;
    }
}

std::uint64_t SizeOf(VaultPlace const& place) {
    if (IsDatabase(place.file))
        return Vault(place).Stored().GetStatistics().bytes;
    std::uint64_t size = 0;
    for (auto const* const suffix : {"", "-wal"}) {
        struct stat status {};
        if (stat((place.file + suffix).c_str(), &status) == 0)
            size += static_cast<std::uint64_t>(status.st_size);
    }
    return size;
}

void Publish(ArchivedRepository& repository) {
    Progress progress("writing");
    if (!repository.Publish(&progress).published)
        throw Problem("somebody else changed the branches meanwhile; nothing was changed. Try again");
}

std::size_t CountCommits(ArchivedRepository const& repository) {
    std::set<Id> reached;
    for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
        for (auto commit = head; commit && reached.insert(commit->GetId()).second; commit = commit->GetParent()) {
        }
    }
    return reached.size();
}

/// The commits that only lead to a version, which are forgotten when it becomes the first one.
std::vector<Id> CommitsBelow(Vault const& vault, Id const& commit) {
    std::vector<Id> heads{commit};
    std::vector<Id> below;
    for (auto const& facts : vault.Archive().ReadAncestry(heads, KivArchive::Follow::Parents, SIZE_MAX)) {
        if (facts.commit != commit)
            below.push_back(facts.commit);
    }
    for (auto const& branch : vault.Archive().ReadBranches())
        std::erase(below, branch.head);
    return below;
}

/// The branches whose history leads from above down to @p commit.
std::vector<std::pair<Text, cow_ptr<Commit>>> BranchesAbove(ArchivedRepository const& repository,
                                                            cow_ptr<Commit> const& commit) {
    std::vector<std::pair<Text, cow_ptr<Commit>>> above;
    for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
        if (head && head != commit && repository.GetCommonBase(head, commit) == commit)
            above.emplace_back(name, head);
    }
    return above;
}

/// The library deletes a history with its top; a branch at the top makes it survive, and what lies above is put on top
/// again.
void ForgetBelow(ArchivedRepository& repository, cow_ptr<Commit> const& commit) {
    const auto above = BranchesAbove(repository, commit);
    repository.CreateBranch(forgetMark, commit);
    repository.DeleteCommits(commit);
    const auto kept = repository.GetHead(forgetMark);
    for (auto const& [name, head] : above)
        repository.MoveBranchTo(name, repository.MergelessRebase(head, commit, kept));
    repository.RemoveBranch(forgetMark);
}

/// The versions that were forgotten here and that the other vault would bring back.
std::vector<Id> Forgotten(IArchive& ours, IArchive& theirs, std::vector<Id> const& heads) {
    std::vector<Id> known;
    for (auto const& facts : theirs.ReadAncestry(heads, KivArchive::Follow::Reachable, SIZE_MAX))
        known.push_back(facts.commit);
    std::vector<Id> forgotten;
    for (std::size_t at = 0; at < known.size(); at += factsAtOnce) {
        const auto some = std::span(known).subspan(at, std::min(factsAtOnce, known.size() - at));
        const auto missing = ours.FindMissing(some);
        for (auto const& facts : ours.ReadAncestry(missing, KivArchive::Follow::Parents, 0))
            forgotten.push_back(facts.commit);
    }
    return forgotten;
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

int Forget(VaultPlace const& place, std::string const& revision, RemovalOptions const& options) {
    Vault vault(place, Vault::Access::Write);
    const auto version = vault.Find(revision);
    const auto below = CommitsBelow(vault, version.id);
    if (version.parent.IsEmpty() || below.empty()) {
        std::cout << "there is nothing below " << Printable(revision) << '\n';
        return 0;
    }
    const auto count = std::to_string(below.size()) + (below.size() == 1 ? " version" : " versions");
    if (options.dryRun) {
        std::cout << count << " would be forgotten\n";
        return 0;
    }
    Warn("another vault that still has them may bring them back when it is synced, which asks first");
    if (!Confirm("Forget " + count + " before " + Shortened(version.id) + "?", options.yes))
        return 0;
    {
        ArchivedRepository repository(vault.SharedArchive());
        repository.Load(std::span(&version.id, 1));
        ForgetBelow(repository, repository.GetCommitFromStorage(version.id));
        Publish(repository);
    }
    CollectUnreached(vault, std::chrono::seconds(0));
    std::cout << count << " forgotten\n";
    return 0;
}

int Compact(VaultPlace const& place, RemovalOptions const& options) {
    const auto size = SizeOf(place);
    {
        Vault vault(place, Vault::Access::Write);
        ArchivedRepository repository(vault.SharedArchive());
        const auto before = CountCommits(repository);
        repository.SimplifyCommitGraph(true);
        const auto gone = before - std::min(before, CountCommits(repository));
        const auto count = std::to_string(gone) + " of " + std::to_string(before) + " versions";
        if (options.dryRun) {
            std::cout << count << " would go\n";
            return 0;
        }
        if (gone > 0 && !Confirm("Drop " + count + '?', options.yes))
            return 0;
        Publish(repository);
        CollectUnreached(vault, std::chrono::seconds(0));
    }
    // A file gives back what it can when it is closed.
    const auto left = SizeOf(place);
    std::cout << size - std::min(size, left) << " bytes reclaimed, " << left << " left\n";
    return 0;
}

int Collect(VaultPlace const& place, unsigned days, RemovalOptions const& options) {
    Vault vault(place, Vault::Access::Write);
    const auto grace = std::chrono::hours(24) * days;
    const auto due = vault.Archive().ListMarked(grace, {}, SIZE_MAX).size();
    if (options.dryRun) {
        std::cout << due << " objects that nothing has needed for " << days << " days would go\n";
        return 0;
    }
    if (!Confirm("Remove what nothing has needed for " + std::to_string(days) + " days?", options.yes))
        return 0;
    const auto report = CollectUnreached(vault, grace);
    std::cout << report.removed << " objects removed, " << report.marked << " more wait, " << report.reached
              << " are needed\n";
    return 0;
}

int Sync(VaultPlace const& place, std::string const& other, bool yes) {
    struct stat one {};
    struct stat two {};
    if (IsDatabase(place.file) && place.file == other)
        throw Problem("a vault cannot be synced with itself");
    if (stat(place.file.c_str(), &one) == 0 && stat(other.c_str(), &two) == 0 && one.st_dev == two.st_dev &&
        one.st_ino == two.st_ino)
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
    const auto forgotten = Forgotten(vault.Archive(), theirs.Archive(), heads);
    if (!forgotten.empty()) {
        Warn("versions that were forgotten here and that this brings back:");
        for (auto const& commit : KivArchive::ReadCommits(theirs.Archive(), forgotten))
            Warn("    " + Shortened(commit.id) + "  " + DescribeMessage(commit));
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
    std::cout << report.objects << " objects brought in\n";
    return 0;
}

int Verify(VaultPlace const& place, bool json) {
    const Vault vault(place);
    KivArchive::VerifyReport report;
    {
        Progress progress("verifying");
        report = KivArchive::Verify(vault.Stored(), &progress);
    }
    if (json)
        std::cout << "{\"objects\":" << report.objects << ",\"sound\":" << (report.IsSound() ? "true" : "false")
                  << ",\"findings\":[";
    std::size_t count = 0;
    const auto find = [&](std::string const& finding) {
        if (json)
            std::cout << (count == 0 ? "\n" : ",\n") << JsonText(finding);
        else
            Warn(finding);
        ++count;
    };
    for (auto const& id : report.damaged)
        find("damaged object " + DigitsOf(id));
    for (auto const& [id, namedBy] : report.missing)
        find("missing object " + DigitsOf(id) + ", needed by " + DigitsOf(namedBy));
    for (auto const& [name, head] : report.branches)
        find("branch " + Printable(name) + " has lost its version " + DigitsOf(head));
    for (auto const& id : report.ancestry)
        find("facts of version " + DigitsOf(id) + " are missing or wrong");
    if (json)
        std::cout << (count == 0 ? "]}\n" : "\n]}\n");
    else if (report.IsSound())
        std::cout << "verified " << report.objects << " objects\n";
    else
        throw Problem((IsDatabase(place.file) ? "the database" : PrintableName(StoredName(place.file))) +
                          " is damaged: " + std::to_string(count) + " findings (repair takes them from another vault)",
                      findingsExitStatus);
    return report.IsSound() ? 0 : findingsExitStatus;
}

namespace {

/// Makes a branch at a version that has lost its own, so that it can be named and is not collected.
void KeepReachable(Vault const& vault, Id const& id) {
    for (auto const& branch : vault.Archive().ReadBranches()) {
        if (branch.head == id)
            return;
    }
    const auto name = "salvaged/" + Shortened(id);
    KivArchive::Change change;
    change.branches.push_back({RequireBranchName(name), {}, id});
    vault.Archive().Apply(change);
    Warn("the name of a branch is lost; it is " + name + " now");
}

} // namespace

int Salvage(VaultPlace const& place, std::string const& damaged) {
    struct stat status {};
    if (stat(place.file.c_str(), &status) == 0)
        throw Problem(PrintableName(StoredName(place.file)) +
                      " is there already; what is sound goes into a new vault: name it with -f");
    const Vault vault(place, Vault::Access::Create);
    KivArchive::SalvageReport report;
    {
        Progress progress("salvaging");
        report = KivArchive::Salvage(damaged, vault.Archive(), &progress);
    }
    for (auto const& [name, head] : report.branches)
        std::cout << Printable(name) << "  " << DigitsOf(head) << '\n';
    for (auto const& [name, head] : report.lostBranches)
        Warn("branch " + Printable(name) + " has lost its version " + DigitsOf(head));
    for (auto const& id : report.lastCommits)
        KeepReachable(vault, id);
    std::cout << report.objects << " objects salvaged, " << report.damagedSegments << " damaged pieces and "
              << report.lostObjects << " more objects lost\n";
    const bool isWhole = report.lostBranches.empty() && report.damagedSegments + report.lostObjects == 0;
    return isWhole ? 0 : findingsExitStatus;
}

int Repair(VaultPlace const& place, std::string const& other) {
    const Vault vault(place, Vault::Access::Write);
    const Vault theirs({other, place.wait});
    KivArchive::RepairReport report;
    {
        Progress progress("repairing");
        report = KivArchive::Repair(vault.Stored(), theirs.Stored(), &progress);
    }
    for (auto const& id : report.lost)
        Warn("not to be had there: object " + DigitsOf(id));
    std::cout << report.repaired.size() << " objects repaired, " << report.lost.size() << " lost\n";
    return report.lost.empty() ? 0 : findingsExitStatus;
}

} // namespace vault
