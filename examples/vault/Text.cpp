#include "Text.h"

#include "Names.h"
#include "Problem.h"

#include <limits>

namespace vault {

std::optional<Text> FromUtf8(std::string_view bytes) {
    // Bytes that are no UTF-8 have other names in trees.
    if (bytes.size() > std::numeric_limits<int>::max() || StoredName(bytes) != bytes)
        return std::nullopt;
    return KivVcs::FromUtf8(bytes);
}

Text RequireUtf8(std::string_view bytes, std::string_view what) {
    if (auto text = FromUtf8(bytes))
        return *std::move(text);
    throw Problem(std::string(what) + " is not UTF-8 text: " + Printable(bytes));
}

Text RequireLine(std::string_view bytes, std::string_view what) {
    if (bytes.find_first_of(std::string_view("\r\n\0", 3)) != std::string_view::npos)
        throw Problem(std::string(what) + " must be one line");
    return RequireUtf8(bytes, what);
}

std::string Printable(std::string_view utf8) {
    return PrintableName(utf8);
}

} // namespace vault
