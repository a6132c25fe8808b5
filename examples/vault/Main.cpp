#include "Commands.h"
#include "Database.h"
#include "Names.h"
#include "Problem.h"
#include "Text.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <cstdlib>
#include <functional>
#include <iostream>
#include <new>
#include <numeric>
#include <sys/resource.h>

namespace vault {

namespace {

constexpr auto revisionHelp = "a branch, an identifier, or the beginning of one (4 digits or more)";
constexpr auto targetHelp = "a version, or with :PATH a file or directory of it";
constexpr auto authorHelp = "'Name <mail>'; by default the user who runs this";

constexpr auto footer = R"(
Begin:
  vault save ~/notes -m 'First version'     makes vault.db and saves the directory in it
  vault status ~/notes                      what differs from the last version
  vault save ~/notes -m 'More'              the next version
  vault log                                 all versions
  vault diff ~/notes --text                 what has changed, line by line
  vault restore master:todo.txt todo.old    one file as it was
Work with others:
  vault sync /mnt/stick/vault.db            brings their branches in as other/NAME
  vault merge other/master                  and their changes into the current branch
  vault merge other/master --into merged    if there are conflicts: settle them in a directory, and
  vault save merged --merge other/master    make the version that records it

Kept are contents, permission bits, modification times, symbolic links and empty directories. Not kept are owners, hard
links and extended attributes, and nothing is encrypted. Files whose names are in .vaultignore at the top of a directory
are not saved unless they are already.

Exit status: 0 all went well; 1 something was found that is not as it should be: damage, conflicts, files that could not
be saved or restored; 2 the command could not be carried out; 3 a listing was cut off.)";

/// The command line, as the library that reads it sees it: each command stores its arguments here, and what is to be run
/// when all are read.
struct CommandLine {
    CLI::App app{"Keeps versions of directories in one file, or in a database.", "vault"};
    VaultPlace place;
    unsigned waitSeconds = 30;
    SaveOptions save;
    MergeOptions merge;
    DiffOptions diff;
    RestoreCommandOptions restore;
    ListingOptions listing;
    RemovalOptions removal;
    std::string policy = "stop";
    std::string first;
    std::string second;
    std::string third;
    unsigned days = 14;
    bool flag = false;
    std::function<int()> run;

    CLI::App* Add(std::string const& name, std::string const& description, std::function<int()> command) {
        auto* const added = app.add_subcommand(name, description);
        added->callback([this, command = std::move(command)] { run = command; });
        return added;
    }
};

void AddListingOptions(CLI::App* command, ListingOptions& listing) {
    command->add_option("-n,--limit", listing.limit, "show at most so many")->type_name("NUMBER");
    command->add_flag("--json", listing.json, "write JSON");
}

void AddScanOptions(CLI::App* command, SaveOptions& save) {
    command->add_option("DIR", save.directory, "the directory")->required();
    command
        ->add_option("--exclude", save.excluded,
                     "leave out new files of such names, or of such paths if it has a slash")
        ->type_name("PATTERN")
        ->expected(1)
        ->take_all();
    command->add_flag("--one-file-system", save.oneFileSystem, "leave out what is mounted below");
}

void DescribeFiles(CommandLine& line) {
    auto* const save = line.Add("save", "save the state of a directory on the current branch",
                                [&line] { return Save(line.place, line.save); });
    AddScanOptions(save, line.save);
    save->add_option("-m,--message", line.save.message, "what changed, in one line");
    save->add_option("--author", line.save.author, authorHelp)->envname("VAULT_AUTHOR");
    save->add_option("--merge", line.save.merged, "record that this version has merged that one")
        ->type_name("REVISION");
    save->add_flag("--strict", line.save.strict, "save nothing if something cannot be read");
    save->add_flag("--stamp", line.save.stamp, "put the time into a file .vault-stamp of each directory that changed");
    save->add_flag("--yes", line.save.yes, "take excluded files out of the version, too, without asking");

    auto* const status = line.Add("status", "list what differs from the current version",
                                  [&line] { return Status(line.place, line.save, line.listing); });
    AddScanOptions(status, line.save);
    AddListingOptions(status, line.listing);

    auto* const restore = line.Add("restore", "write a version, or a part of one, to the disk",
                                   [&line] { return Restore(line.place, line.restore); });
    restore->add_option("REVISION[:PATH]", line.restore.target, targetHelp)->required();
    restore->add_option("DIR", line.restore.directory, "where to; empty or to be made")->required();
    restore->add_flag("--force", line.restore.force, "write into a directory that is not empty, replacing its files");
    restore->add_flag("--delete", line.restore.removesOthers, "and remove from it what the version does not have");
    restore->add_flag("--special-modes", line.restore.specialModes, "restore setuid, setgid and sticky bits");
}

void DescribeViews(CommandLine& line) {
    auto* const log = line.Add("log", "list the versions, newest first",
                               [&line] { return Log(line.place, line.first, line.listing); });
    log->add_option(
        "REVISION[:PATH]", line.first,
        "where to begin, by default the current branch; with a path, or just a path: the versions that changed it");
    AddListingOptions(log, line.listing);

    auto* const show = line.Add("show", "show a version, or a file or directory of it",
                                [&line] { return Show(line.place, line.first); });
    show->add_option("REVISION[:PATH]", line.first, targetHelp)->required();

    auto* const diff =
        line.Add("diff", "list what differs between two versions, or a version and a directory", [&line] {
            line.diff.listing = line.listing;
            return Diff(line.place, line.diff);
        });
    diff->add_option("BEFORE", line.diff.before, std::string(revisionHelp) + ", or a directory")->required();
    diff->add_option("AFTER", line.diff.after,
                     "likewise; without it, the current version is compared with what is given");
    diff->add_option("PATH", line.diff.path, "only what lies there");
    auto* const text = diff->add_flag("--text", line.diff.text, "show the lines that differ");
    AddListingOptions(diff, line.listing);
    text->excludes("--json");

    auto* const graph = line.Add("graph", "draw the history: as text on a terminal, otherwise for Graphviz",
                                 [&line] { return Graph(line.place, line.flag || isatty(STDOUT_FILENO) == 1); });
    graph->add_flag("--text", line.flag, "as text in any case");
}

void DescribeBranches(CommandLine& line) {
    auto* const branch = line.Add("branch", "list the branches, or make one at the current version", [&line] {
        if (!line.second.empty())
            return DeleteBranch(line.place, line.second);
        return line.first.empty() ? ListBranches(line.place) : MakeBranch(line.place, line.first);
    });
    auto* const name = branch->add_option("NAME", line.first, "the new branch");
    branch->add_option("--delete", line.second, "delete this branch")->type_name("NAME")->excludes(name);

    auto* const checkout =
        line.Add("checkout", "make a branch the current one", [&line] { return Checkout(line.place, line.first); });
    checkout->add_option("NAME", line.first, "the branch")->required();

    auto* const rebase = line.Add("rebase", "put a branch's own versions, as they are, on top of another branch",
                                  [&line] { return Rebase(line.place, line.first, line.second); });
    rebase->add_option("BRANCH", line.first, "the branch to move")->required();
    rebase->add_option("ONTO", line.second, "the branch to put it on")->required();

    auto* const join = line.Add("join", "give two unrelated branches a common root",
                                [&line] { return Join(line.place, line.first, line.second, line.third); });
    join->add_option("FIRST", line.first, "a branch")->required();
    join->add_option("SECOND", line.second, "another branch")->required();
    join->add_option("ROOT", line.third, "the branch of the root, made if it is missing")->required();
}

ConflictPolicy PolicyOf(std::string_view word) noexcept {
    return word == "left"     ? ConflictPolicy::Left
           : word == "right"  ? ConflictPolicy::Right
           : word == "base"   ? ConflictPolicy::Base
           : word == "newest" ? ConflictPolicy::Newest
                              : ConflictPolicy::Stop;
}

void DescribeMerging(CommandLine& line) {
    auto* const merge = line.Add("merge", "bring another branch's changes into the current one", [&line] {
        line.merge.policy = PolicyOf(line.policy);
        line.merge.json = line.listing.json;
        return Merge(line.place, line.merge);
    });
    merge->add_option("REVISION", line.merge.revision, revisionHelp)->required();
    merge->add_option("--author", line.merge.author, authorHelp)->envname("VAULT_AUTHOR");
    merge
        ->add_option(
            "--on-conflict", line.policy,
            "who wins where both changed the same: left (the current branch), right (REVISION), base (what both "
            "began from), newest (the later .vault-stamp, otherwise what was saved last), stop (merge nothing)")
        ->capture_default_str()
        ->check(CLI::IsMember({"left", "right", "base", "newest", "stop"}));
    merge
        ->add_option("--into", line.merge.into,
                     "make no version, but a directory with the merged files and marked conflicts")
        ->type_name("DIR");
    merge->add_flag("--json", line.listing.json, "write JSON");

    auto* const sync = line.Add("sync", "bring in the branches of another vault as other/NAME",
                                [&line] { return Sync(line.place, line.first, line.removal.yes); });
    sync->add_option("OTHER", line.first, "the other vault")->required();
    sync->add_flag("--yes", line.removal.yes, "also bring back what was forgotten, without asking");
}

void DescribeUpkeep(CommandLine& line) {
    auto* const verify = line.Add("verify", "check everything that is stored",
                                  [&line] { return Verify(line.place, line.listing.json); });
    verify->add_flag("--json", line.listing.json, "write JSON");
    auto* const repair = line.Add("repair", "take what is damaged or missing from another vault",
                                  [&line] { return Repair(line.place, line.first); });
    repair->add_option("OTHER", line.first, "the other vault")->required();

    auto* const salvage =
        line.Add("salvage", "save what is sound in a vault that cannot be opened any more into a new one",
                 [&line] { return Salvage(line.place, line.first); });
    salvage->add_option("DAMAGED", line.first, "the damaged vault file, which is only read")->required();

    auto* const forget = line.Add("forget", "delete the history before a version, but for the heads of branches",
                                  [&line] { return Forget(line.place, line.first, line.removal); });
    forget->add_option("REVISION", line.first, revisionHelp)->required();
    auto* const compact = line.Add("compact", "keep only the heads of branches and where they part",
                                   [&line] { return Compact(line.place, line.removal); });
    auto* const collect = line.Add("collect", "remove what nothing has needed for some time",
                                   [&line] { return Collect(line.place, line.days, line.removal); });
    collect->add_option("--days", line.days, "for how long")->capture_default_str();
    for (auto* const command : {forget, compact, collect}) {
        command->add_flag("--yes", line.removal.yes, "do not ask");
        command->add_flag("--dry-run", line.removal.dryRun, "say what would go, and leave it");
    }
}

/// How many characters have to be changed, added or left out to make one word of the other.
std::size_t Distance(std::string_view one, std::string_view other) {
    std::vector<std::size_t> row(other.size() + 1);
    std::iota(row.begin(), row.end(), std::size_t{0});
    for (const char letter : one) {
        auto diagonal = row[0]++;
        for (std::size_t j = 0; j < other.size(); ++j) {
            const auto replaced = diagonal + (letter == other[j] ? 0U : 1U);
            diagonal = row[j + 1];
            row[j + 1] = std::min({replaced, row[j] + 1, row[j + 1] + 1});
        }
    }
    return row.back();
}

/// The first word that is no option of all commands; empty if there is none, or if one wants to know about all of them.
std::string_view CommandWord(int argumentCount, char** arguments) {
    for (int i = 1; i < argumentCount; ++i) {
        const std::string_view word(arguments[i]);
        if (word == "-f" || word == "--file" || word == "--wait")
            ++i;
        else if (!word.starts_with("--file=") && !word.starts_with("--wait="))
            return word.starts_with('-') ? std::string_view() : word;
    }
    return {};
}

/// Describes the commands among which @p word is, or all of them: each takes a while.
void DescribeCommands(CommandLine& line, std::string_view word) {
    std::array order{&DescribeViews, &DescribeFiles, &DescribeBranches, &DescribeMerging, &DescribeUpkeep};
    // Who reads about all of them begins with saving.
    if (word.empty())
        std::swap(order[0], order[1]);
    for (auto* const describe : order) {
        describe(line);
        if (!line.app.get_subcommands([word](CLI::App* command) { return command->get_name() == word; }).empty())
            return;
    }
}

/// @throws Problem if there is no command @p word
void RequireCommand(CommandLine const& line, std::string_view word) {
    std::string nearest;
    for (auto const* const command : line.app.get_subcommands({})) {
        if (word.empty() || command->get_name() == word)
            return;
        if (nearest.empty() || Distance(word, command->get_name()) < Distance(word, nearest))
            nearest = command->get_name();
    }
    throw Problem("there is no command '" + Printable(StoredName(word)) + "'; did you mean '" + nearest + "'?");
}

/// Directories are kept open while those in them wait.
void AllowManyFiles() noexcept {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
        limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 4096);
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

int Run(CommandLine& line, int argumentCount, char** arguments) {
    auto& app = line.app;
    app.require_subcommand(1);
    app.set_version_flag("--version", std::string(VAULT_VERSION));
    app.footer("vault --help shows how to begin, and what the exit statuses stand for.");
    app.get_formatter()->column_width(34);
    app.add_option("-f,--file", line.place.file, "the vault: a file, or the address of a database (postgresql://...)")
        ->envname("VAULT_FILE")
        ->capture_default_str();
    app.add_option("--wait", line.waitSeconds, "how many seconds to wait while somebody else writes")
        ->capture_default_str();
    const auto word = CommandWord(argumentCount, arguments);
    DescribeCommands(line, word);
    app.footer(footer);
    if (word == "help")
        throw CLI::CallForHelp();
    RequireCommand(line, word);
    app.parse(argumentCount, arguments);
    line.place.wait = std::chrono::seconds(line.waitSeconds);
    if (IsDatabase(line.place.file) || IsDatabase(line.first))
        RequireDatabases(arguments);
    const int status = line.run();
    if (!std::cout.flush())
        throw Problem("the output could not be written");
    return status;
}

int Complain(std::string_view reason, int exitStatus = 2) {
    std::cout.flush();
    std::cerr << "vault: " << reason << '\n';
    return exitStatus;
}

} // namespace

} // namespace vault

int main(int argumentCount, char** arguments) {
    std::ios::sync_with_stdio(false);
    vault::AllowManyFiles();
    try {
        vault::CommandLine line;
        try {
            const int status = vault::Run(line, argumentCount, arguments);
            // What describes the commands ends with the process; no other thread is left.
            std::exit(status); // NOLINT(concurrency-mt-unsafe)
        } catch (CLI::Success const& success) {
            return line.app.exit(success);
        }
    } catch (vault::Problem const& problem) {
        return vault::Complain(problem.what(), problem.ExitStatus());
    } catch (KivArchive::ArchiveError const& error) {
        const bool isDamage = error.GetKind() == KivArchive::Failure::Damaged;
        return vault::Complain(vault::Printable(vault::StoredName(error.what())),
                               isDamage ? vault::findingsExitStatus : 2);
    } catch (CLI::ParseError const& error) {
        return vault::Complain(vault::Printable(vault::StoredName(error.what())) + " (--help shows how)");
    } catch (std::bad_alloc const&) {
        return vault::Complain("out of memory");
    } catch (std::exception const& error) {
        return vault::Complain(vault::Printable(vault::StoredName(error.what())));
    }
}
