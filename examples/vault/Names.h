#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vault {

// A file's name is any bytes but zero and "/". A tree's names are text. Bytes that are UTF-8 are their own name in a tree;
// every other byte is written as the lone surrogate U+DC00 plus that byte, which no UTF-8 has. So no two names become one,
// and all other lone surrogates are free for the vault's own entries.

/// What the vault's own entries begin with, U+DC00: no file's name in a tree holds it.
inline constexpr std::string_view ownPrefix = "\xED\xB0\x80";

/// The name that a tree has for a file.
[[nodiscard]] std::string StoredName(std::string_view fileName);

/// The file's name for a name in a tree; nothing for the vault's own entries, and for what is not the name of any file or
/// leads elsewhere: trees come from other people.
[[nodiscard]] std::optional<std::string> FileName(std::string_view storedName);

/// The path of file names for a path that is made of what `StoredName` gives.
[[nodiscard]] std::string FilePath(std::string_view storedPath);

[[nodiscard]] inline bool IsOwn(std::string_view storedName) noexcept {
    return storedName.starts_with(ownPrefix);
}

/// The order of entries in a tree, which is that of UTF-16.
[[nodiscard]] bool ComesBefore(std::string_view left, std::string_view right) noexcept;

/// A path in a tree for people: control characters, bytes that are not UTF-8, and the backslash itself are escaped.
[[nodiscard]] std::string PrintableName(std::string_view storedPath);

/// The same with quotation marks around it, as JSON has it.
[[nodiscard]] std::string JsonText(std::string_view stored);

} // namespace vault
