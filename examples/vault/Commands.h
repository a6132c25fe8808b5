#pragma once

#include "Conflicts.h"

#include <filesystem>
#include <string>

namespace vault {

using Path = std::filesystem::path;

struct SaveOptions {
    Path directory;
    std::string message;
    std::string author;
    bool stamp = false;
};

struct MergeOptions {
    std::string revision;
    ConflictPolicy policy = ConflictPolicy::Stop;
    std::string author;
};

// The commands, each from opening the vault file to the last line of output. They throw `Problem` if they cannot be
// carried out, and the vault file is unchanged then.

void Save(Path const& file, SaveOptions const& options);
void Log(Path const& file, std::string const& revision);
void Show(Path const& file, std::string const& target);
void Diff(Path const& file, std::string const& before, std::string const& after);
void ListBranches(Path const& file);
void MakeBranch(Path const& file, std::string const& name);
void Checkout(Path const& file, std::string const& name);
void Restore(Path const& file, std::string const& revision, Path const& directory, bool force);
void Verify(Path const& file);

void Merge(Path const& file, MergeOptions const& options);
void Rebase(Path const& file, std::string const& branch, std::string const& onto);
void Join(Path const& file, std::string const& first, std::string const& second, std::string const& root);
void Forget(Path const& file, std::string const& revision);
void Compact(Path const& file);
void DeleteBranch(Path const& file, std::string const& name);
void Graph(Path const& file);
void Sync(Path const& file, Path const& other);

} // namespace vault
