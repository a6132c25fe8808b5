#pragma once

#include "Commands.h"

#include <span>

namespace CLI {
class App;
}

namespace vault {

/// What the arguments of all commands are stored in.
struct Arguments {
    VaultPlace place;
    SaveOptions save;
    MergeOptions merge;
    DiffOptions diff;
    RestoreCommandOptions restore;
    ListingOptions listing;
    RemovalOptions removal;
    /// Who wins in a merge, as the user says it.
    std::string policy = "stop";
    /// Names and revisions, in the order in which they are given.
    std::string first;
    std::string second;
    std::string third;
    unsigned days = 14;
    bool isText = false;
};

struct Command {
    char const* name;
    char const* description;
    /// Tells the library that reads command lines about the arguments.
    void (*describe)(CLI::App& command, Arguments& arguments);
    /// Runs it with the arguments that were read. @return the exit status
    int (*run)(Arguments const& arguments);
    /// `-5` stands for `--limit=5`.
    bool hasShortLimit = false;
};

/// Those that people begin with come first.
[[nodiscard]] std::span<Command const> Commands() noexcept;

} // namespace vault
