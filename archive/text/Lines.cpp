#include "text/Lines.h"

#include <algorithm>

namespace KivArchive {

std::optional<Lines> Lines::Split(KivVcs::Buffer const& content, std::uint64_t maximumBytes) {
    if (content.GetSize() > maximumBytes)
        return std::nullopt;
    Lines lines(content);
    const auto chunks = content.LockForRead();
    if (chunks.size() == 1) {
        lines.text_ = {reinterpret_cast<const char*>(chunks.begin()->data()), chunks.begin()->size()};
    } else {
        lines.joined_.resize(content.GetSize());
        if (!content.Read(0, lines.joined_.data(), lines.joined_.size()))
            return std::nullopt;
        lines.text_ = {lines.joined_.data(), lines.joined_.size()};
    }
    std::string_view const text = lines.text_;
    if (text.find('\0') != std::string_view::npos)
        return std::nullopt;
    lines.begins_.reserve(static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n')) + 2);
    lines.begins_.push_back(0);
    for (std::size_t begin = 0; begin < text.size();) {
        const auto lineFeed = text.find('\n', begin);
        begin = lineFeed == std::string_view::npos ? text.size() : lineFeed + 1;
        lines.begins_.push_back(begin);
    }
    return lines;
}

} // namespace KivArchive
