#include "Commands.h"
#include "Commit.h"
#include "Descriptor.h"
#include "Listing.h"
#include "Names.h"
#include "Output.h"
#include "Overlay.h"
#include "Problem.h"
#include "Restore.h"
#include "Snapshot.h"

#include <ctime>
#include <iostream>
#include <sys/stat.h>

namespace vault {

namespace {

constexpr int mostAttempts = 100;
constexpr std::size_t mostNamed = 20;

void RequireDirectory(std::string const& path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode))
        throw Problem("not a directory: " + Printable(StoredName(path)));
}

void NamePaths(std::vector<std::string> const& paths) {
    for (std::size_t i = 0; i < paths.size() && i < mostNamed; ++i)
        Warn("    " + paths[i]);
    if (paths.size() > mostNamed)
        Warn("    and " + std::to_string(paths.size() - mostNamed) + " more");
}

/// Names everything that is not in a version as it is in the directory.
void Report(Snapshot const& snapshot) {
    for (auto const& problem : snapshot.problems)
        Warn("not saved, as before: " + problem);
    if (!snapshot.specials.empty()) {
        Warn(std::to_string(snapshot.specials.size()) + " devices, sockets or pipes are left out:");
        NamePaths(snapshot.specials);
    }
}

SnapshotOptions OptionsFor(Vault const& vault, SaveOptions const& options, Id const& previous, TreeReader& reader) {
    SnapshotOptions snapshot;
    snapshot.scan.top = options.directory;
    snapshot.scan.vaultFile = vault.File();
    snapshot.scan.excluded = options.excluded;
    snapshot.scan.oneFileSystem = options.oneFileSystem;
    snapshot.previous = previous;
    snapshot.scan.isSaved = [&reader, previous](std::string const& path) {
        return !previous.IsEmpty() && reader.Find(previous, path).has_value();
    };
    if (options.stamp)
        snapshot.stamp = std::time(nullptr);
    return snapshot;
}

void KeepIndex(Snapshot const& snapshot) {
    if (!snapshot.index.empty())
        WriteIndex(snapshot.top, snapshot.index);
}

Snapshot Take(Vault const& vault, SaveOptions const& options, Id const& previous, bool readsAll) {
    TreeReader reader(vault.Archive());
    auto taking = OptionsFor(vault, options, previous, reader);
    taking.readsAll = readsAll;
    taking.removesExcluded = [&options](std::vector<std::string> const& paths) {
        if (!options.yes && isatty(STDIN_FILENO) != 1)
            return false;
        Warn(std::to_string(paths.size()) + " saved paths are excluded now:");
        std::vector<std::string> printable;
        printable.reserve(paths.size());
        for (auto const& path : paths)
            printable.push_back(PrintableName(path));
        NamePaths(printable);
        return Confirm("Leave them out of the new version?", options.yes);
    };
    Progress progress("saving");
    return TakeSnapshot(vault.Archive(), taking, progress);
}

/// One try. @return the exit status, or nothing if somebody else has saved meanwhile
std::optional<int> TrySave(Vault& vault, SaveOptions const& options, Author const& author, Text const& message,
                           bool readsAll) {
    const auto branch = vault.CurrentBranch();
    const auto head = vault.HeadOf(branch);
    Id previous;
    if (!head.IsEmpty())
        previous = vault.Find(DigitsOf(head)).tree;
    const auto merged = options.merged.empty() ? Id() : vault.Find(options.merged).id;
    auto snapshot = Take(vault, options, previous, readsAll);
    if (options.strict && !snapshot.problems.empty())
        throw Problem("nothing was saved: " + snapshot.problems.front(), findingsExitStatus);
    const int status = snapshot.problems.empty() ? 0 : findingsExitStatus;
    if (snapshot.tree == previous && !head.IsEmpty() && merged.IsEmpty()) {
        KeepIndex(snapshot);
        Report(snapshot);
        std::cout << "nothing has changed since " << DigitsOf(head) << '\n';
        return status;
    }
    const auto commit = MakeCommit(snapshot.tree, head, merged, author, message);
    const auto stored = snapshot.stored + snapshot.change.objects.size() + 1;
    commit.AddTo(snapshot.change);
    if (!MoveHead(vault, std::move(snapshot.change), branch, head, commit.object.id))
        return std::nullopt;
    KeepIndex(snapshot);
    Report(snapshot);
    std::cout << DigitsOf(commit.object.id) << ' ' << Counted(snapshot.files, "file") << ", "
              << Counted(stored, "new object") << '\n';
    return status;
}

} // namespace

int Save(VaultPlace const& place, SaveOptions const& options) {
    const auto author = ParseAuthor(options.author.empty() ? DefaultAuthor() : options.author);
    const auto message = RequireLine(options.message, "a message");
    RequireDirectory(options.directory);
    Vault vault(place, Vault::Access::Create);
    bool readsAll = false;
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        try {
            if (const auto status = TrySave(vault, options, author, message, readsAll))
                return *status;
        } catch (KivArchive::ArchiveError const& error) {
            // What was taken for granted has been collected.
            if (error.GetKind() != KivArchive::Failure::Collected || attempt + 1 == mostAttempts)
                throw;
            readsAll = true;
        }
    }
    throw Problem("others saved to this branch again and again; nothing was saved");
}

int Status(VaultPlace const& place, SaveOptions const& options, ListingOptions const& listing) {
    RequireDirectory(options.directory);
    Vault vault(place);
    const auto head = vault.Find("");
    TreeReader reader(vault.Archive());
    auto taking = OptionsFor(vault, options, head.tree, reader);
    taking.stores = false;
    Snapshot snapshot;
    {
        Progress progress("looking");
        snapshot = TakeSnapshot(vault.Archive(), taking, progress);
    }
    Overlay overlay(vault.Archive());
    overlay.Add(snapshot.change);
    Report(snapshot);
    const int status = ListChanges(FindChanges(overlay, head.tree, snapshot.tree), listing);
    return status == 0 && !snapshot.problems.empty() ? findingsExitStatus : status;
}

int Restore(VaultPlace const& place, RestoreCommandOptions const& options) {
    const Vault vault(place);
    const auto target = vault.FindTarget(options.target);
    std::vector<std::string> problems;
    {
        Progress progress("restoring");
        problems = Restore(vault.Archive(), target.entry,
                           {options.directory, options.force, options.removesOthers, options.specialModes}, progress);
    }
    for (auto const& problem : problems)
        Warn("not restored: " + problem);
    return problems.empty() ? 0 : findingsExitStatus;
}

} // namespace vault
