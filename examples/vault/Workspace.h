#pragma once

#include "Progress.h"
#include "Text.h"

#include <filesystem>
#include <optional>

namespace vault {

/// The name of the files in which a directory's version stores when it last changed: seconds since 1970 in decimal.
inline constexpr char16_t stampName[] = u".vault-stamp";

struct ScanOptions {
    /// Left out: the vault itself may lie in the directory.
    std::filesystem::path vaultFile;
    /// The last version, whose stamps unchanged directories keep; may be null.
    KivVcs::cow_ptr<KivVcs::Tree> previous;
    /// When set, every directory that differs from the last version is stamped with this time.
    std::optional<KivVcs::Time> stamp;
};

/// Makes the tree of everything below @p directory and stores it in @p repository.
///
/// Symbolic links, special files and names that are not UTF-8 are reported and left out. Links are never followed, even
/// if they appear while this works; @p directory itself may be one.
/// @throws Problem if something cannot be read
[[nodiscard]] KivVcs::cow_ptr<KivVcs::Tree> ScanDirectory(std::filesystem::path const& directory,
                                                          ScanOptions const& options, KivVcs::IRepository& repository,
                                                          Progress& progress);

/// Writes the files of @p tree below @p directory, which is made if it is missing and must be empty unless @p force.
/// Replaces what is in the way, except that it removes no directories; leaves everything else alone. Writes nowhere
/// else: links are replaced, not followed.
/// @throws Problem if something cannot be written
void RestoreDirectory(KivVcs::cow_ptr<KivVcs::Tree> const& tree, std::filesystem::path const& directory, bool force,
                      Progress& progress);

} // namespace vault
