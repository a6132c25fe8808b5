#pragma once

#include <KivVcs/KivVcs.h>

#include <concepts>
#include <optional>
#include <string>
#include <string_view>

namespace vault {

inline constexpr std::string_view hexDigits = "0123456789abcdef";

/// The library's text is UTF-16; files and terminals speak UTF-8.
using Text = KivVcs::KivStringT<char16_t>;
using TextView = KivVcs::KivStringViewT<char16_t>;

/// UTF-8, with lone surrogates as names in trees have them.
[[nodiscard]] inline std::string ToUtf8(TextView text) {
    return KivVcs::ToUtf8(text);
}

/// Nothing if @p bytes are not UTF-8 or would not read back the same.
[[nodiscard]] std::optional<Text> FromUtf8(std::string_view bytes);

/// @throws Problem that names @p what if @p bytes are not UTF-8
[[nodiscard]] Text RequireUtf8(std::string_view bytes, std::string_view what);

/// The same for a text that must also be one line, because only the first line is read back everywhere.
[[nodiscard]] Text RequireLine(std::string_view bytes, std::string_view what);

/// The text with control characters, and bytes that are not UTF-8, escaped: names and messages of other people cannot
/// steer the terminal or fake a line.
[[nodiscard]] std::string Printable(std::string_view utf8);
template <std::same_as<Text> T>
[[nodiscard]] std::string Printable(T const& text) {
    return Printable(ToUtf8(text));
}

} // namespace vault
