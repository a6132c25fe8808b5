#pragma once

#include "Progress.h"
#include "Text.h"
#include "VaultFile.h"

#include <unordered_set>

namespace vault {

/// A vault file whose history is in memory: everything that branches reach, read back through the library and linked.
///
/// Commands change the repository and then call `Write`; without it the file stays as it is.
class Vault {
public:
    /// @throws Problem that names every damaged object of the file
    Vault(std::filesystem::path const& path, VaultFile::Access access);

    [[nodiscard]] KivVcs::Repository& Repository() noexcept { return repository_; }
    [[nodiscard]] KivVcs::IObjectsStorage& Storage() noexcept { return *repository_.GetStorage(); }
    [[nodiscard]] VaultFile& File() noexcept { return file_; }

    /// Brings in a history from another file, or finds that it is here already.
    [[nodiscard]] KivVcs::cow_ptr<KivVcs::Commit> Import(VaultFile& from, std::string const& head);

    /// Writes the objects that the file lacks and the branches, as one transaction, and returns the number of those
    /// objects.
    std::size_t Write();
    /// The same, and deletes the objects that no branch reaches.
    void WriteAndPrune();

private:
    using CommitHandle = KivVcs::cow_ptr<KivVcs::Commit>;

    [[nodiscard]] CommitHandle Load(VaultFile& from, std::string const& head, Progress& progress);
    std::size_t WriteObjects();
    void WriteBranches();

    VaultFile file_;
    KivVcs::Repository repository_;
    std::unordered_set<KivVcs::Id> inFile_;
};

} // namespace vault
