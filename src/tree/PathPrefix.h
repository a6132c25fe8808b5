#pragma once

#include "KivVcs/Foundation.h"

#include <algorithm>
#include <limits>
#include <stdexcept>
#include <vector>

namespace KivVcs {

/// How the paths of a directory begin, for walks that enter directories depth first: one text for the whole walk, since a
/// path may be as long as directories are nested.
class PathPrefix {
public:
    /// Goes to the directory @p name of the one whose prefix has the first @p length code units of this one.
    void Enter(std::size_t length, KivStringT<char16_t> const& name) {
        text_.resize(length);
        text_.insert(text_.end(), name.GetString(), name.GetString() + name.GetLength());
        text_.push_back(u'/');
    }

    [[nodiscard]] std::size_t GetLength() const noexcept { return text_.size(); }

    /// The path of an entry. @throws std::bad_alloc; std::length_error for a path that is longer than a text can be
    [[nodiscard]] KivStringT<char16_t> PathOf(KivStringT<char16_t> const& name) const {
        if (text_.empty())
            return name;
        const std::size_t length = text_.size() + static_cast<std::size_t>(name.GetLength());
        if (length > static_cast<std::size_t>(std::numeric_limits<int>::max()))
            throw std::length_error("path longer than a signed 32-bit length can hold");
        return KivStringT<char16_t>::Build(static_cast<int>(length), [this, &name](char16_t* path) {
            path = std::copy(text_.begin(), text_.end(), path);
            std::copy_n(name.GetString(), name.GetLength(), path);
        });
    }

private:
    std::vector<char16_t> text_;
};

} // namespace KivVcs
