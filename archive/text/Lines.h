#pragma once

#include "KivArchive/TextLines.h"

#include <string_view>

namespace KivArchive {

/// A content as lines. Refers to the buffer that it was made from.
class Lines {
public:
    /// Nothing if the content is no text.
    static std::optional<Lines> Split(KivVcs::Buffer const& content, std::uint64_t maximumBytes);

    Lines(Lines const&) = delete;
    Lines(Lines&&) noexcept = default;
    Lines& operator=(Lines const&) = delete;
    Lines& operator=(Lines&&) noexcept = default;
    ~Lines() = default;

    [[nodiscard]] std::size_t GetCount() const noexcept { return begins_.size() - 1; }
    /// The line with its line feed.
    [[nodiscard]] std::string_view operator[](std::size_t line) const noexcept { return GetRange(line, line + 1); }
    /// The text of the lines from @p begin to before @p end.
    [[nodiscard]] std::string_view GetRange(std::size_t begin, std::size_t end) const noexcept {
        return text_.substr(begins_[begin], begins_[end] - begins_[begin]);
    }
    /// Appends these lines to @p destination, sharing memory with the content where there is much of it.
    void AppendTo(KivVcs::Buffer& destination, std::size_t begin, std::size_t end) const {
        destination.Append(*content_, begins_[begin], begins_[end] - begins_[begin]);
    }

private:
    explicit Lines(KivVcs::Buffer const& content) : content_(&content) {}

    KivVcs::Buffer const* content_;
    /// Filled only if the content is not in one chunk already.
    std::vector<char> joined_;
    std::string_view text_;
    /// One for each line, and one for the end.
    std::vector<std::size_t> begins_;
};

/// The changes that turn @p before into @p after.
std::vector<LineChange> CompareLines(Lines const& before, Lines const& after);

} // namespace KivArchive
