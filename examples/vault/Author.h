#pragma once

#include "Text.h"

#include <string>

namespace vault {

struct Author {
    Text name;
    Text email;
};

/// Reads 'Name <mail>' or 'Name'.
/// @throws Problem if it has angle brackets elsewhere or line breaks: a version could not be read back with them
[[nodiscard]] Author ParseAuthor(std::string const& text);

/// Who runs this program, as the system knows them.
[[nodiscard]] std::string DefaultAuthor();

} // namespace vault
