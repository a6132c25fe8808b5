#include "Commands.h"
#include "Database.h"
#include "Names.h"
#include "Output.h"
#include "Problem.h"
#include "Progress.h"

#include <KivArchive/SqliteArchive.h>
#include <KivArchive/Upkeep.h>
#include <KivVcs/History.h>
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

std::size_t CountCommits(ArchivedRepository const& repository) {
    std::set<Id> reached;
    for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
        for (auto const& commit : KivVcs::History(head)) {
            if (!reached.insert(commit->GetId()).second)
                break;
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

int Forget(VaultPlace const& place, std::string const& revision, RemovalOptions const& options) {
    Vault vault(place, Vault::Access::Write);
    const auto version = vault.Find(revision);
    const auto below = CommitsBelow(vault, version.id);
    if (version.parent.IsEmpty() || below.empty()) {
        std::cout << "there is nothing below " << Printable(revision) << '\n';
        return 0;
    }
    const auto count = Counted(below.size(), "version");
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
        const auto count = std::to_string(gone) + " of " + Counted(before, "version");
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
