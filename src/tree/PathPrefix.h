#pragma once

#include "KivVcs/Foundation.h"

#include <limits>
#include <stdexcept>
#include <string>

namespace KivVcs {

/// How the paths of a directory begin, for walks that enter directories depth first: one text for the whole walk, since a
/// path may be as long as directories are nested.
class PathPrefix {
public:
    /// Goes to the directory @p name of the one whose prefix has the first @p length code units of this one.
    void Enter(std::size_t length, KivStringViewT<char16_t> name) {
        text_.resize(length);
        text_.append(name.GetString(), static_cast<std::size_t>(name.GetLength()));
        text_ += u'/';
    }

    [[nodiscard]] std::size_t GetLength() const noexcept { return text_.size(); }

    /// The path of an entry. @throws std::bad_alloc; std::length_error for a path that is longer than a text can be
    [[nodiscard]] KivStringT<char16_t> PathOf(KivStringT<char16_t> const& name) const {
        if (text_.empty())
            return name;
        if (text_.size() > static_cast<std::size_t>(std::numeric_limits<int>::max()))
            throw std::length_error("path longer than a signed 32-bit length can tell");
        KivStringT<char16_t> path(text_.data(), static_cast<int>(text_.size()));
        return path += name;
    }

private:
    std::u16string text_;
};

} // namespace KivVcs
