#pragma once

#include "Vault.h"

#include <string>
#include <string_view>
#include <vector>

namespace vault {

/// 'Name <mail>'
[[nodiscard]] std::string DescribeAuthor(CommitRecord const& commit);
/// When a commit was made, in the reader's time zone: 2026-01-31T18:05:00+01:00.
[[nodiscard]] std::string DescribeTime(CommitRecord const& commit);
/// Enough of an identifier for people.
[[nodiscard]] std::string Shortened(Id const& id);
/// The first line that people see of a commit, or what is wrong with it.
[[nodiscard]] std::string DescribeMessage(CommitRecord const& commit);
/// A commit as an object of JSON.
[[nodiscard]] std::string JsonCommit(CommitRecord const& commit);

/// Whether standard output is a terminal.
[[nodiscard]] bool IsTerminal() noexcept;

enum class Colour { Yellow = 33, Green = 32, Red = 31, Cyan = 36 };
/// The text in a colour, where that is wanted: on a terminal, unless NO_COLOR is set.
[[nodiscard]] std::string Coloured(std::string_view text, Colour colour);

/// "1 version", "2 versions".
[[nodiscard]] std::string Counted(std::uint64_t count, std::string_view noun);

/// Writes a line to standard error.
void Warn(std::string_view line);

/// Whether the user agrees: always with @p yes; otherwise asks on the terminal.
/// @throws Problem if there is no terminal to ask on
[[nodiscard]] bool Confirm(std::string const& question, bool yes);

} // namespace vault
