#include "KivUtils/Utf8.h"

#include "KivUtils/Encoding.h"

#include <limits>
#include <ostream>
#include <stdexcept>

namespace KivUtils {

using KivPlatform::KivStringT;
using KivPlatform::KivStringViewT;

KivStringT<char16_t> FromUtf8(std::string_view bytes) {
    if (bytes.size() > static_cast<std::size_t>(std::numeric_limits<int>::max()))
        throw std::length_error("text longer than a signed 32-bit length can hold");
    return String::ToStringW(KivStringViewT<char>(bytes.data(), static_cast<int>(bytes.size())));
}

std::string ToUtf8(KivStringViewT<char16_t> text) {
    std::string bytes(DataEncoding::Utf8Length(text), '\0');
    DataEncoding::Utf8Write(text, bytes.data());
    return bytes;
}

} // namespace KivUtils

namespace KivPlatform {

std::ostream& operator<<(std::ostream& stream, KivStringViewT<char> const& text) {
    return stream << std::string_view(text.GetString(), static_cast<std::size_t>(text.GetLength()));
}

std::ostream& operator<<(std::ostream& stream, KivStringViewT<char16_t> const& text) {
    return stream << KivUtils::ToUtf8(text);
}

std::ostream& operator<<(std::ostream& stream, KivStringT<char> const& text) {
    return stream << KivStringViewT<char>(text);
}

std::ostream& operator<<(std::ostream& stream, KivStringT<char16_t> const& text) {
    return stream << KivStringViewT<char16_t>(text);
}

} // namespace KivPlatform
