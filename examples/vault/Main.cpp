#include "CommandTable.h"
#include "Database.h"
#include "Names.h"
#include "Problem.h"
#include "Text.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <cstdio>
#include <iostream>
#include <new>
#include <numeric>
#include <sys/resource.h>

namespace vault {

namespace {

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
  vault restore master ~/notes --force      and the files that it has now into the directory
  vault merge other/master --into merged    if there are conflicts: settle them in a directory, and
  vault save merged --merge other/master    make the version that records it

Kept are contents, permission bits, modification times, symbolic links and empty directories. Not kept are owners, hard
links and extended attributes, and nothing is encrypted. Files whose names are in .vaultignore at the top of a directory
are not saved unless they are already.

Exit status: 0 all went well; 1 something was found that is not as it should be: damage, conflicts, files that could not
be saved or restored; 2 the command could not be carried out; 3 a listing was cut off.)";

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

/// The first argument that is no option of all commands, nor the value of one; empty if there is none.
std::string_view CommandWord(std::span<char*> arguments) {
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        const std::string_view word(arguments[i]);
        if (word == "-f" || word == "--file" || word == "--wait")
            ++i;
        else if (!word.starts_with("-f") && !word.starts_with("--file=") && !word.starts_with("--wait="))
            return word;
    }
    return {};
}

/// Null if @p word is an option, or nothing. @throws Problem if there is no such command
Command const* FindCommand(std::string_view word) {
    if (word.empty() || word.starts_with('-'))
        return nullptr;
    const auto commands = Commands();
    const auto found =
        std::find_if(commands.begin(), commands.end(), [&](Command const& one) { return one.name == word; });
    if (found != commands.end())
        return &*found;
    const auto nearest =
        std::min_element(commands.begin(), commands.end(), [&](Command const& one, Command const& other) {
            return Distance(word, one.name) < Distance(word, other.name);
        });
    throw Problem("there is no command '" + Printable(StoredName(word)) + "'; did you mean '" + nearest->name + "'?");
}

/// Directories are kept open while those in them wait.
void AllowManyFiles() noexcept {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
        limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 4096);
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

void Describe(CLI::App& app, Command const& command, Arguments& arguments) {
    auto& described = *app.add_subcommand(command.name, command.description);
    described.footer("vault --help shows how to begin, and what the exit statuses stand for.");
    command.describe(described, arguments);
}

/// The last argument first, as they are read.
std::vector<std::string> Reversed(std::span<char*> arguments, bool hasShortLimit) {
    std::vector<std::string> reversed(arguments.rbegin(), arguments.rend());
    for (auto& word : reversed) {
        if (hasShortLimit && word.size() > 1 && word[0] == '-' && word.find_first_not_of("0123456789", 1) == word.npos)
            word.replace(0, 1, "--limit=");
    }
    return reversed;
}

int Run(CLI::App& app, char** program, std::span<char*> words) {
    Arguments arguments;
    unsigned waitSeconds = 30;
    app.require_subcommand(1);
    app.set_version_flag("--version", std::string(VAULT_VERSION));
    app.footer(footer);
    app.get_formatter()->column_width(34);
    app.add_option("-f,--file", arguments.place.file,
                   "the vault: a file, or the address of a database (postgresql://...)")
        ->envname("VAULT_FILE")
        ->capture_default_str();
    app.add_option("--wait", waitSeconds, "how many seconds to wait while somebody else writes")->capture_default_str();
    const auto word = CommandWord(words);
    const bool wantsHelp = word == "help" || word == "-h" || word == "--help";
    auto const* const command = word == "help" ? nullptr : FindCommand(word);
    // No others: to describe them all is much of what a short command would do.
    for (auto const& one : Commands()) {
        if (&one == command || wantsHelp)
            Describe(app, one, arguments);
    }
    if (wantsHelp)
        throw CLI::CallForHelp();
    app.parse(Reversed(words, command != nullptr && command->hasShortLimit));
    arguments.place.wait = std::chrono::seconds(waitSeconds);
    if (IsDatabase(arguments.place.file) || IsDatabase(arguments.first))
        RequireDatabases(program);
    const int status = command->run(arguments);
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
    // Also on a terminal. Streams with buffers of their own would make them for all of six.
    static std::array<char, 65'536> buffer;
    static_cast<void>(std::setvbuf(stdout, buffer.data(), _IOFBF, buffer.size()));
    vault::AllowManyFiles();
    try {
        CLI::App app{"Keeps versions of directories in one file, or in a database.", "vault"};
        try {
            return vault::Run(app, arguments, std::span(arguments, static_cast<std::size_t>(argumentCount)).subspan(1));
        } catch (CLI::Success const& success) {
            return app.exit(success);
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
