#include "Commands.h"
#include "Problem.h"
#include "Text.h"

#include <CLI/CLI.hpp>
#include <iostream>
#include <map>
#include <new>

namespace vault {

namespace {

constexpr auto revisionHelp = "a branch, an identifier, or the beginning of one";

/// The command line, as the library that reads it sees it: each command stores its arguments here and is run when all
/// are read.
struct CommandLine {
    CLI::App app{"Keeps versions of directories in one file.", "vault"};
    Path file = "vault.db";
    SaveOptions save;
    MergeOptions merge;
    std::string policy = "stop";
    std::string first;
    std::string second;
    std::string third;
    Path directory;
    bool force = false;
};

void DescribeCommands(CommandLine& line) {
    auto& app = line.app;
    app.require_subcommand(1);
    app.add_option("-f,--file", line.file, "the vault file")->capture_default_str();

    auto* const save = app.add_subcommand("save", "save the state of a directory on the current branch");
    save->add_option("DIR", line.save.directory, "the directory")->required();
    save->add_option("-m,--message", line.save.message, "what changed, in one line");
    save->add_option("--author", line.save.author, "'Name <mail>'; by default the user who runs this")
        ->envname("VAULT_AUTHOR");
    save->add_flag("--stamp", line.save.stamp, "put the time into a file .vault-stamp of each directory that changed");
    save->callback([&] { Save(line.file, line.save); });

    auto* const log = app.add_subcommand("log", "list the versions, newest first");
    log->add_option("REV", line.first, "where to begin; by default the current branch");
    log->callback([&] { Log(line.file, line.first); });

    auto* const show = app.add_subcommand("show", "show a version, or a file or directory of it");
    show->add_option("REV[:PATH]", line.first, revisionHelp)->required();
    show->callback([&] { Show(line.file, line.first); });

    auto* const diff = app.add_subcommand("diff", "list the files that differ between two versions");
    diff->add_option("BEFORE", line.first, revisionHelp)->required();
    diff->add_option("AFTER", line.second, revisionHelp)->required();
    diff->callback([&] { Diff(line.file, line.first, line.second); });

    auto* const branch = app.add_subcommand("branch", "list the branches, or make one at the current version");
    auto* const branchName = branch->add_option("NAME", line.first, "the new branch");
    auto* const deleted = branch->add_option("--delete", line.second, "delete this branch")->type_name("NAME");
    branchName->excludes(deleted);
    branch->callback([&, branchName, deleted] {
        if (*deleted)
            DeleteBranch(line.file, line.second);
        else if (*branchName)
            MakeBranch(line.file, line.first);
        else
            ListBranches(line.file);
    });

    auto* const checkout = app.add_subcommand("checkout", "make a branch the current one");
    checkout->add_option("NAME", line.first, "the branch")->required();
    checkout->callback([&] { Checkout(line.file, line.first); });

    auto* const restore = app.add_subcommand("restore", "write the files of a version into a directory");
    restore->add_option("REV", line.first, revisionHelp)->required();
    restore->add_option("DIR", line.directory, "the directory, empty or to be made")->required();
    restore->add_flag("--force", line.force,
                      "write into a directory that is not empty: replace its files, not its directories");
    restore->callback([&] { Restore(line.file, line.first, line.directory, line.force); });

    app.add_subcommand("verify", "check every stored object")->callback([&] { Verify(line.file); });
}

ConflictPolicy PolicyOfName(std::string const& name) {
    const std::map<std::string, ConflictPolicy> policies{{"left", ConflictPolicy::Left},
                                                         {"right", ConflictPolicy::Right},
                                                         {"base", ConflictPolicy::Base},
                                                         {"newest", ConflictPolicy::Newest},
                                                         {"stop", ConflictPolicy::Stop}};
    return policies.at(name);
}

void DescribeHistoryCommands(CommandLine& line) {
    auto& app = line.app;
    auto* const merge = app.add_subcommand("merge", "bring another branch's changes into the current one");
    merge->add_option("BRANCH", line.merge.revision, "the other branch")->required();
    merge->add_option("--author", line.merge.author, "'Name <mail>'; by default the user who runs this")
        ->envname("VAULT_AUTHOR");
    merge
        ->add_option(
            "--on-conflict", line.policy,
            "who wins where both changed a file: left (the current branch), right (BRANCH), base (what both "
            "began from), newest (the later .vault-stamp, otherwise the branch saved last), stop (merge nothing)")
        ->capture_default_str()
        ->check(CLI::IsMember({"left", "right", "base", "newest", "stop"}));
    merge->callback([&] {
        line.merge.policy = PolicyOfName(line.policy);
        Merge(line.file, line.merge);
    });

    auto* const rebase =
        app.add_subcommand("rebase", "put a branch's own versions, as they are, on top of another branch");
    rebase->add_option("BRANCH", line.first, "the branch to move")->required();
    rebase->add_option("ONTO", line.second, "the branch to put it on")->required();
    rebase->callback([&] { Rebase(line.file, line.first, line.second); });

    auto* const join = app.add_subcommand("join", "give two unrelated branches a common root");
    join->add_option("FIRST", line.first, "a branch")->required();
    join->add_option("SECOND", line.second, "another branch")->required();
    join->add_option("ROOT", line.third, "the branch of the root, made if it is missing")->required();
    join->callback([&] { Join(line.file, line.first, line.second, line.third); });

    auto* const forget =
        app.add_subcommand("forget", "delete the history below a version, but for the heads of branches");
    forget->add_option("REV", line.first, revisionHelp)->required();
    forget->callback([&] { Forget(line.file, line.first); });

    app.add_subcommand("compact", "keep only the heads of branches and where they part; reclaim the space")
        ->callback([&] { Compact(line.file); });
    app.add_subcommand("graph", "draw the history for Graphviz")->callback([&] { Graph(line.file); });

    auto* const sync = app.add_subcommand("sync", "bring in the branches of another vault as other/NAME");
    sync->add_option("OTHER", line.directory, "the other vault file")->required();
    sync->callback([&] { Sync(line.file, line.directory); });
}

void Run(CommandLine& line, int argumentCount, char** arguments) {
    DescribeCommands(line);
    DescribeHistoryCommands(line);
    line.app.parse(argumentCount, arguments);
    if (!std::cout.flush())
        throw Problem("the output could not be written");
}

int Complain(std::string_view reason, int exitStatus = 2) {
    std::cerr << "vault: " << reason << '\n';
    return exitStatus;
}

} // namespace

} // namespace vault

int main(int argumentCount, char** arguments) {
    try {
        vault::CommandLine line;
        try {
            vault::Run(line, argumentCount, arguments);
            return 0;
        } catch (CLI::Success const& success) {
            return line.app.exit(success);
        }
    } catch (vault::Problem const& problem) {
        return vault::Complain(problem.what(), problem.ExitStatus());
    } catch (std::bad_alloc const&) {
        return vault::Complain("out of memory");
    } catch (std::exception const& error) {
        return vault::Complain(vault::Printable(std::string_view(error.what())));
    }
}
