#include "CommandTable.h"

#include "Output.h"

#include <CLI/CLI.hpp>
#include <array>

namespace vault {

namespace {

constexpr auto revisionHelp =
    "a branch, an identifier, or the beginning of one (4 digits or more); with ~N behind it the version N before";
constexpr auto targetHelp = "a version, or with :PATH a file or directory of it";
constexpr auto authorHelp = "'Name <mail>'; by default the user who runs this";

void AddListingOptions(CLI::App& command, ListingOptions& listing) {
    command.add_option("-n,--limit", listing.limit, "show at most so many")->type_name("NUMBER");
    command.add_flag("--json", listing.json, "write JSON");
}

void AddScanOptions(CLI::App& command, SaveOptions& save) {
    command.add_option("DIR", save.directory, "the directory")->required();
    command
        .add_option("--exclude", save.excluded, "leave out new files of such names, or of such paths if it has a slash")
        ->type_name("PATTERN")
        ->expected(1)
        ->take_all();
    command.add_flag("--one-file-system", save.oneFileSystem, "leave out what is mounted below");
}

void AddRemovalOptions(CLI::App& command, RemovalOptions& removal) {
    command.add_flag("--yes", removal.yes, "do not ask");
    command.add_flag("--dry-run", removal.dryRun, "say what would go, and leave it");
}

void DescribeSave(CLI::App& command, Arguments& arguments) {
    auto& save = arguments.save;
    AddScanOptions(command, save);
    command.add_option("-m,--message", save.message, "what changed, in one line");
    command.add_option("--author", save.author, authorHelp)->envname("VAULT_AUTHOR");
    command.add_option("--merge", save.merged, "record that this version has merged that one")->type_name("REVISION");
    command.add_flag("--strict", save.strict, "save nothing if something cannot be read");
    command.add_flag("--stamp", save.stamp, "put the time into a file .vault-stamp of each directory that changed");
    command.add_flag("--yes", save.yes, "take excluded files out of the version, too, without asking");
}

void DescribeStatus(CLI::App& command, Arguments& arguments) {
    AddScanOptions(command, arguments.save);
    AddListingOptions(command, arguments.listing);
}

void DescribeRestore(CLI::App& command, Arguments& arguments) {
    auto& restore = arguments.restore;
    command.add_option("REVISION[:PATH]", restore.target, targetHelp)->required();
    command.add_option("DIR", restore.directory, "where to; empty or to be made")->required();
    command.add_flag("--force", restore.force, "write into a directory that is not empty, replacing its files");
    command.add_flag("--delete", restore.removesOthers, "and remove from it what the version does not have");
    command.add_flag("--special-modes", restore.specialModes, "restore setuid, setgid and sticky bits");
}

void DescribeLog(CLI::App& command, Arguments& arguments) {
    command.add_option(
        "REVISION[:PATH]", arguments.first,
        "where to begin, by default the current branch; with a path, or just a path: the versions that changed it");
    AddListingOptions(command, arguments.listing);
    command.get_option("--limit")->description("show at most so many; -5 is short for --limit 5");
}

void DescribeShow(CLI::App& command, Arguments& arguments) {
    command.add_option("REVISION[:PATH]", arguments.first, targetHelp)->required();
}

void DescribeDiff(CLI::App& command, Arguments& arguments) {
    auto& diff = arguments.diff;
    command.add_option("BEFORE", diff.before, std::string(revisionHelp) + "; or a directory")->required();
    command.add_option(
        "AFTER", diff.after,
        "likewise; without it, the current version, or for a directory alone, that after the current version");
    command.add_option("PATH", diff.path, "only what lies there");
    auto* const text = command.add_flag("--text", diff.text, "show the lines that differ");
    AddListingOptions(command, diff.listing);
    text->excludes("--json");
}

void DescribeGraph(CLI::App& command, Arguments& arguments) {
    command.add_flag("--text", arguments.isText, "as text in any case");
}

void DescribeBranch(CLI::App& command, Arguments& arguments) {
    auto* const name = command.add_option("NAME", arguments.first, "the new branch");
    command.add_option("--delete", arguments.second, "delete this branch")->type_name("NAME")->excludes(name);
}

int RunBranch(Arguments const& arguments) {
    if (!arguments.second.empty())
        return DeleteBranch(arguments.place, arguments.second);
    return arguments.first.empty() ? ListBranches(arguments.place) : MakeBranch(arguments.place, arguments.first);
}

void DescribeCheckout(CLI::App& command, Arguments& arguments) {
    command.add_option("NAME", arguments.first, "the branch")->required();
}

void DescribeRebase(CLI::App& command, Arguments& arguments) {
    command.add_option("BRANCH", arguments.first, "the branch to move")->required();
    command.add_option("ONTO", arguments.second, "the branch to put it on")->required();
}

void DescribeJoin(CLI::App& command, Arguments& arguments) {
    command.add_option("FIRST", arguments.first, "a branch")->required();
    command.add_option("SECOND", arguments.second, "another branch")->required();
    command.add_option("ROOT", arguments.third, "the branch of the root, made if it is missing")->required();
}

void DescribeMerge(CLI::App& command, Arguments& arguments) {
    auto& merge = arguments.merge;
    command.add_option("REVISION", merge.revision, revisionHelp)->required();
    command.add_option("--author", merge.author, authorHelp)->envname("VAULT_AUTHOR");
    command
        .add_option("--on-conflict", arguments.policy,
                    "who wins where both changed the same: left (the current branch), right (REVISION), base (what "
                    "both began from), newest (the later .vault-stamp, otherwise what was saved last), stop (merge "
                    "nothing)")
        ->capture_default_str()
        ->check(CLI::IsMember({"left", "right", "base", "newest", "stop"}));
    command
        .add_option("--into", merge.into, "make no version, but a directory with the merged files and marked conflicts")
        ->type_name("DIR");
    command.add_flag("--json", merge.json, "write JSON");
}

int RunMerge(Arguments const& arguments) {
    auto options = arguments.merge;
    auto const& word = arguments.policy;
    options.policy = word == "left"     ? ConflictPolicy::Left
                     : word == "right"  ? ConflictPolicy::Right
                     : word == "base"   ? ConflictPolicy::Base
                     : word == "newest" ? ConflictPolicy::Newest
                                        : ConflictPolicy::Stop;
    return Merge(arguments.place, options);
}

void DescribeSync(CLI::App& command, Arguments& arguments) {
    command.add_option("OTHER", arguments.first, "the other vault")->required();
    command.add_flag("--yes", arguments.removal.yes, "also bring back what was forgotten, without asking");
}

void DescribeVerify(CLI::App& command, Arguments& arguments) {
    command.add_flag("--json", arguments.listing.json, "write JSON");
}

void DescribeRepair(CLI::App& command, Arguments& arguments) {
    command.add_option("OTHER", arguments.first, "the other vault")->required();
}

void DescribeSalvage(CLI::App& command, Arguments& arguments) {
    command.add_option("DAMAGED", arguments.first, "the damaged vault file, which is only read")->required();
}

void DescribeForget(CLI::App& command, Arguments& arguments) {
    command.add_option("REVISION", arguments.first, revisionHelp)->required();
    AddRemovalOptions(command, arguments.removal);
}

void DescribeCompact(CLI::App& command, Arguments& arguments) {
    AddRemovalOptions(command, arguments.removal);
}

void DescribeCollect(CLI::App& command, Arguments& arguments) {
    command.add_option("--days", arguments.days, "for how long")->capture_default_str();
    AddRemovalOptions(command, arguments.removal);
}

constexpr std::array commands{
    Command{"save", "save the state of a directory on the current branch", DescribeSave,
            [](Arguments const& all) { return Save(all.place, all.save); }},
    Command{"status", "list what differs from the current version", DescribeStatus,
            [](Arguments const& all) { return Status(all.place, all.save, all.listing); }},
    Command{"restore", "write a version, or a part of one, to the disk", DescribeRestore,
            [](Arguments const& all) { return Restore(all.place, all.restore); }},
    Command{"log", "list the versions, newest first", DescribeLog,
            [](Arguments const& all) { return Log(all.place, all.first, all.listing); }, true},
    Command{"show", "show a version, or a file or directory of it", DescribeShow,
            [](Arguments const& all) { return Show(all.place, all.first); }},
    Command{"diff", "list what differs between two versions, or a version and a directory", DescribeDiff,
            [](Arguments const& all) { return Diff(all.place, all.diff); }},
    Command{"graph", "draw the history: as text on a terminal, otherwise for Graphviz", DescribeGraph,
            [](Arguments const& all) { return Graph(all.place, all.isText || IsTerminal()); }},
    Command{"branch", "list the branches, or make one at the current version", DescribeBranch, RunBranch},
    Command{"checkout", "make a branch the current one", DescribeCheckout,
            [](Arguments const& all) { return Checkout(all.place, all.first); }},
    Command{"rebase", "put a branch's own versions, as they are, on top of another branch", DescribeRebase,
            [](Arguments const& all) { return Rebase(all.place, all.first, all.second); }},
    Command{"join", "give two unrelated branches a common root", DescribeJoin,
            [](Arguments const& all) { return Join(all.place, all.first, all.second, all.third); }},
    Command{"merge", "bring another branch's changes into the current one", DescribeMerge, RunMerge},
    Command{"sync", "bring in the branches of another vault as other/NAME", DescribeSync,
            [](Arguments const& all) { return Sync(all.place, all.first, all.removal.yes); }},
    Command{"verify", "check everything that is stored", DescribeVerify,
            [](Arguments const& all) { return Verify(all.place, all.listing.json); }},
    Command{"repair", "take what is damaged or missing from another vault", DescribeRepair,
            [](Arguments const& all) { return Repair(all.place, all.first); }},
    Command{"salvage", "save what is sound in a vault that cannot be opened any more into a new one", DescribeSalvage,
            [](Arguments const& all) { return Salvage(all.place, all.first); }},
    Command{"forget", "delete the history before a version, but for the heads of branches", DescribeForget,
            [](Arguments const& all) { return Forget(all.place, all.first, all.removal); }},
    Command{"compact", "keep only the heads of branches and where they part", DescribeCompact,
            [](Arguments const& all) { return Compact(all.place, all.removal); }},
    Command{"collect", "remove what nothing has needed for some time", DescribeCollect,
            [](Arguments const& all) { return Collect(all.place, all.days, all.removal); }},
};

} // namespace

std::span<Command const> Commands() noexcept {
    return commands;
}

} // namespace vault
