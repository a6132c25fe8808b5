#pragma once

#include "KivVcs/KivVcs.h"

#include <string>
#include <vector>

/// Converts texts and bytes of the library to those of the standard library.

namespace KivVcs {

using Names = std::vector<std::string>;

inline std::string Narrow(KivStringViewT<char16_t> text) {
    return std::string(text.begin(), text.end());
}

inline KivStringT<char16_t> Wide(std::string const& text) {
    return KivStringT<char>(text.data(), static_cast<int>(text.size()));
}

inline Names ToNames(PathList const& paths) {
    Names names;
    for (auto const& path : paths)
        names.push_back(Narrow(path));
    return names;
}

inline std::string Joined(Names const& words, const char* separator = " ") {
    std::string text;
    for (auto const& word : words)
        text += (text.empty() ? "" : separator) + word;
    return text;
}

/// The components of a path, with a "/" between them.
inline std::string Joined(array_view<KivStringViewT<char16_t> const> path) {
    Names names;
    for (auto const& component : path)
        names.push_back(Narrow(component));
    return Joined(names, "/");
}

inline std::string IdText(Object const& object) {
    return Narrow(object.GetId().GetText());
}

inline std::string Bytes(Buffer const& buffer) {
    const KivStringT<char> text = Helpers::StringAFromBuffer(buffer);
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

} // namespace KivVcs
