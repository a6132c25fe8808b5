#pragma once

#include "KivVcs/Helpers.h"

#include <algorithm>
#include <array>

namespace KivVcs {

/// Hands the segments between the "/" of @p path to @p take, in order, without the empty ones.
template <class Take>
void ForEachPathComponent(KivStringViewT<char16_t> path, Take take) {
    for (const char16_t* begin = path.begin(); begin != path.end();) {
        const char16_t* const end = std::find(begin, path.end(), u'/');
        if (begin != end)
            take(KivStringViewT<char16_t>(begin, static_cast<int>(end - begin)));
        begin = end == path.end() ? end : end + 1;
    }
}

/// What `Helpers::SplitVcsPath` gives, without an allocation where the path is not deep. Views into the path.
class PathComponents {
public:
    explicit PathComponents(KivStringViewT<char16_t> path) {
        ForEachPathComponent(path, [this](KivStringViewT<char16_t> component) { Add(component); });
    }
    PathComponents(PathComponents const&) = delete;
    PathComponents& operator=(PathComponents const&) = delete;

    operator array_view<KivStringViewT<char16_t> const>() const noexcept {
        return all_.empty() ? array_view<KivStringViewT<char16_t> const>(few_.data(), count_) : all_;
    }

private:
    void Add(KivStringViewT<char16_t> component) {
        if (count_ < few_.size()) {
            few_[count_++] = component;
            return;
        }
        if (all_.empty())
            all_.assign(few_.begin(), few_.end());
        all_.push_back(component);
    }

    std::array<KivStringViewT<char16_t>, 8> few_;
    std::size_t count_ = 0;
    std::vector<KivStringViewT<char16_t>> all_;
};

} // namespace KivVcs
