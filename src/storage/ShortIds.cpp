#include "KivVcs/ShortIds.h"

#include <algorithm>

namespace KivVcs {

namespace {

int CommonLength(std::string_view left, std::string_view right) noexcept {
    const auto differ = std::mismatch(left.begin(), left.end(), right.begin(), right.end());
    return static_cast<int>(differ.first - left.begin());
}

} // namespace

ShortIds::ShortIds(IObjectsStorage const& storage) {
    const auto add = [this](auto const& table) {
        for (auto const& entry : table)
            ids_.push_back(entry.first);
    };
    add(storage.GetCommits());
    add(storage.GetTrees());
    add(storage.GetBlobs());
    std::sort(ids_.begin(), ids_.end());
    ids_.erase(std::unique(ids_.begin(), ids_.end()), ids_.end());
}

std::string ShortIds::ShortFormOf(Id const& id, int digits) const {
    const std::string text = ToUtf8(id.GetText());
    // What begins most like it stands right before or right after it.
    auto neighbour = std::lower_bound(ids_.begin(), ids_.end(), id);
    int common = 0;
    if (neighbour != ids_.begin())
        common = CommonLength(text, ToUtf8(std::prev(neighbour)->GetText()));
    if (neighbour != ids_.end() && *neighbour == id)
        ++neighbour;
    if (neighbour != ids_.end())
        common = std::max(common, CommonLength(text, ToUtf8(neighbour->GetText())));
    return text.substr(0, static_cast<std::size_t>(std::max(digits, common + 1)));
}

std::vector<Id> ShortIds::Find(std::string_view digits) const {
    std::string beginning(digits);
    for (char& digit : beginning) {
        if (digit >= 'A' && digit <= 'F')
            digit = static_cast<char>(digit - 'A' + 'a');
    }
    std::vector<Id> found;
    if (beginning.empty())
        return found;
    auto id = std::lower_bound(ids_.begin(), ids_.end(), Id(FromUtf8(beginning)));
    for (; id != ids_.end() && ToUtf8(id->GetText()).starts_with(beginning); ++id)
        found.push_back(*id);
    return found;
}

} // namespace KivVcs
