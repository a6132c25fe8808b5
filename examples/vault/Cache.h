#pragma once

#include <optional>
#include <string>

namespace vault {

/// The vault's directory among the user's caches, made if it is missing, with a "/" at its end; nothing where there is no
/// place for it, so that everything only takes longer.
[[nodiscard]] std::optional<std::string> CacheDirectory();

/// A name for what is kept there of @p subject, which the name does not show.
[[nodiscard]] std::string CacheName(std::string const& subject);

/// What the user has noted about @p subject on this machine, at most 4 KiB, which stays when caches are emptied; nothing
/// if there is nothing.
[[nodiscard]] std::optional<std::string> ReadNote(std::string const& subject);
/// Replaces it. @throws Problem if there is no place for it
void WriteNote(std::string const& subject, std::string const& note);

} // namespace vault
