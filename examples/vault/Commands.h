#pragma once

#include "Vault.h"

#include <cstddef>
#include <limits>
#include <string>
#include <vector>

namespace vault {

struct SaveOptions {
    std::string directory;
    std::string message;
    std::string author;
    /// The revision that the directory was merged with; empty for none.
    std::string merged;
    std::vector<std::string> excluded;
    bool stamp = false;
    bool strict = false;
    bool oneFileSystem = false;
    bool yes = false;
};

struct ListingOptions {
    std::size_t limit = std::numeric_limits<std::size_t>::max();
    bool json = false;
};

struct DiffOptions {
    std::string before;
    /// A revision or a directory.
    std::string after;
    std::string path;
    bool text = false;
    ListingOptions listing;
};

struct RestoreCommandOptions {
    std::string target;
    std::string directory;
    bool force = false;
    bool removesOthers = false;
    bool specialModes = false;
};

/// Who wins where both sides changed one path.
enum class ConflictPolicy {
    Left,
    Right,
    Base,
    /// The side whose nearest stamp file has the later time; where stamps do not decide, the side that was saved later.
    Newest,
    /// Nobody: the merge is called off.
    Stop,
};

struct MergeOptions {
    std::string revision;
    ConflictPolicy policy = ConflictPolicy::Stop;
    std::string author;
    /// Where to write the merged files to, instead of making a version; empty for nowhere.
    std::string into;
    bool json = false;
};

/// What removes something, and asks before.
struct RemovalOptions {
    bool yes = false;
    bool dryRun = false;
};

// The commands, each from opening the vault file to the last line of output. They return the exit status, and throw
// `Problem` or `KivArchive::ArchiveError` if they cannot be carried out, which leaves the versions as they are.

int Save(VaultPlace const& place, SaveOptions const& options);
int Status(VaultPlace const& place, SaveOptions const& options, ListingOptions const& listing);
int Restore(VaultPlace const& place, RestoreCommandOptions const& options);

int Log(VaultPlace const& place, std::string const& target, ListingOptions const& listing);
int Show(VaultPlace const& place, std::string const& target);
int Diff(VaultPlace const& place, DiffOptions const& options);
int Graph(VaultPlace const& place, bool isText);

int ListBranches(VaultPlace const& place);
int MakeBranch(VaultPlace const& place, std::string const& name);
int DeleteBranch(VaultPlace const& place, std::string const& name);
int Checkout(VaultPlace const& place, std::string const& name);

int Merge(VaultPlace const& place, MergeOptions const& options);
int Sync(VaultPlace const& place, std::string const& other, bool yes);
int Rebase(VaultPlace const& place, std::string const& branch, std::string const& onto);
int Join(VaultPlace const& place, std::string const& first, std::string const& second, std::string const& root);

int Verify(VaultPlace const& place, bool json);
int Salvage(VaultPlace const& place, std::string const& damaged);
int Repair(VaultPlace const& place, std::string const& other);
int Forget(VaultPlace const& place, std::string const& revision, RemovalOptions const& options);
int Compact(VaultPlace const& place, RemovalOptions const& options);
int Collect(VaultPlace const& place, unsigned days, RemovalOptions const& options);

} // namespace vault
