#pragma once

#include <optional>
#include <string>

namespace vault {

/// The vault's directory among the user's caches, made if it is missing, with a "/" at its end; nothing where there is no
/// place for it, so that everything only takes longer.
[[nodiscard]] std::optional<std::string> CacheDirectory();

/// A name for what is kept there of @p subject, which the name does not show.
[[nodiscard]] std::string CacheName(std::string const& subject);

} // namespace vault
