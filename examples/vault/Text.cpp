#include "Text.h"

#include "Problem.h"

#include <limits>

namespace vault {

namespace {

using ByteView = KivVcs::KivStringViewT<char>;

// The library keeps lone surrogates in an encoding that strict UTF-8 does not have; other programs could not read them.
bool HoldsSurrogate(std::string_view bytes) {
    for (auto lead = bytes.find('\xED'); lead != std::string_view::npos; lead = bytes.find('\xED', lead + 1)) {
        if (lead + 1 < bytes.size() && static_cast<unsigned char>(bytes[lead + 1]) >= 0xA0)
            return true;
    }
    return false;
}

} // namespace

std::string ToUtf8(TextView text) {
    const auto bytes = KivVcs::DataEncoding::Utf8Encode(text);
    return {bytes.GetString(), static_cast<std::size_t>(bytes.GetLength())};
}

std::string ToUtf8(KivVcs::Id const& id) {
    return ToUtf8(id.GetText());
}

std::optional<Text> FromUtf8(std::string_view bytes) {
    if (bytes.size() > std::numeric_limits<int>::max() || HoldsSurrogate(bytes))
        return std::nullopt;
    auto text = KivVcs::String::ToStringW(ByteView(bytes.data(), static_cast<int>(bytes.size())));
    if (ToUtf8(text) != bytes)
        return std::nullopt;
    return text;
}

Text RequireUtf8(std::string_view bytes, std::string_view what) {
    if (auto text = FromUtf8(bytes))
        return *std::move(text);
    throw Problem(std::string(what) + " is not UTF-8 text: " + Printable(bytes));
}

Text RequireLine(std::string_view bytes, std::string_view what) {
    if (bytes.find_first_of("\r\n") != std::string_view::npos)
        throw Problem(std::string(what) + " must be one line: only the first would be read back");
    return RequireUtf8(bytes, what);
}

std::string Printable(std::string_view utf8) {
    constexpr std::string_view digits = "0123456789abcdef";
    const bool isUtf8 = FromUtf8(utf8).has_value();
    std::string result;
    for (std::size_t i = 0; i < utf8.size(); ++i) {
        const auto byte = static_cast<unsigned char>(utf8[i]);
        const bool isLateControl =
            byte == 0xC2 && i + 1 < utf8.size() && static_cast<unsigned char>(utf8[i + 1]) < 0xA0;
        if (byte < 0x20 || byte == 0x7F || isLateControl || (byte >= 0x80 && !isUtf8))
            (result += "\\x") += {digits[byte >> 4U], digits[byte & 0xFU]};
        else
            result += utf8[i];
    }
    return result;
}

} // namespace vault
