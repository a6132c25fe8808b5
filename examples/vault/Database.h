#pragma once

#include "Vault.h"

#include <KivArchive/IArchive.h>
#include <chrono>
#include <memory>
#include <string>

namespace vault {

/// A vault in a database instead of a file.
struct Database {
    /// What is in the database itself.
    std::shared_ptr<KivArchive::IArchive> stored;
    /// The same behind a cache in the user's cache directory, where there is one.
    std::shared_ptr<KivArchive::IArchive> cached;
};

/// Whether a vault's name is the address of a database.
[[nodiscard]] inline bool IsDatabase(std::string const& name) noexcept {
    return name.starts_with("postgresql://") || name.starts_with("postgres://");
}

/// Starts the program that is built with databases in place of this one, unless this is it.
/// @throws Problem if there is none
void RequireDatabases(char** arguments);

/// @param access `Create` makes an archive there if there is none; `Read` goes on with the cache while the database cannot
/// be reached, and says so in the end
/// @throws Problem if this program was built without databases, KivArchive::ArchiveError
[[nodiscard]] Database OpenDatabase(std::string const& address, Vault::Access access, std::chrono::milliseconds wait);

} // namespace vault
