#include "text/Lines.h"

#include <algorithm>
#include <string>

namespace KivArchive {

namespace {

void Append(KivVcs::Buffer& destination, std::string_view text) {
    destination.Append(text.data(), text.size());
}

std::string_view ViewOf(KivVcs::KivStringT<char> const& text) {
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

/// Such as "3" or "3,4". An empty range is named by the line before it.
std::string RangeText(std::size_t begin, std::size_t end) {
    const std::string number = std::to_string(begin == end ? begin : begin + 1);
    return end - begin == 1 ? number : number + "," + std::to_string(end - begin);
}

class UnifiedWriter {
public:
    UnifiedWriter(Lines const& before, Lines const& after, UnifiedTextOptions const& options)
        : before_(before), after_(after), context_(options.context) {
        Append(text_, std::string("--- ").append(ViewOf(options.oldLabel)).append("\n+++ "));
        Append(text_, std::string(ViewOf(options.newLabel)).append("\n"));
    }

    /// Writes changes whose contexts overlap or touch, as one hunk.
    void Write(std::vector<LineChange>::const_iterator first, std::vector<LineChange>::const_iterator last) {
        LineChange const& end = *(last - 1);
        const std::size_t ahead = std::min(context_, first->oldBegin);
        const std::size_t behind = std::min(context_, before_.GetCount() - end.oldEnd);
        std::size_t line = first->oldBegin - ahead;
        Append(text_, "@@ -" + RangeText(line, end.oldEnd + behind) + " +" +
                          RangeText(first->newBegin - ahead, end.newEnd + behind) + " @@\n");
        for (; first != last; ++first) {
            WriteLines(' ', before_, line, first->oldBegin);
            WriteLines('-', before_, first->oldBegin, first->oldEnd);
            WriteLines('+', after_, first->newBegin, first->newEnd);
            line = first->oldEnd;
        }
        WriteLines(' ', before_, line, line + behind);
    }

    [[nodiscard]] KivVcs::Buffer Take() && { return std::move(text_); }

private:
    void WriteLines(char mark, Lines const& lines, std::size_t begin, std::size_t end) {
        for (; begin < end; ++begin) {
            std::string_view const line = lines[begin];
            Append(text_, {&mark, 1});
            Append(text_, line);
            if (!line.ends_with('\n'))
                Append(text_, "\n\\ No newline at end of file\n");
        }
    }

    Lines const& before_;
    Lines const& after_;
    std::size_t context_;
    KivVcs::Buffer text_;
};

} // namespace

TextDifferences DiffTextLines(KivVcs::Buffer const& before, KivVcs::Buffer const& after, std::uint64_t maximumBytes) {
    const auto old = Lines::Split(before, maximumBytes);
    const auto fresh = Lines::Split(after, maximumBytes);
    if (!old || !fresh)
        return {};
    return {true, CompareLines(*old, *fresh)};
}

std::optional<KivVcs::Buffer> UnifiedText(KivVcs::Buffer const& before, KivVcs::Buffer const& after,
                                          UnifiedTextOptions const& options) {
    const auto old = Lines::Split(before, options.maximumBytes);
    const auto fresh = Lines::Split(after, options.maximumBytes);
    if (!old || !fresh)
        return std::nullopt;
    const std::vector<LineChange> changes = CompareLines(*old, *fresh);
    if (changes.empty())
        return KivVcs::Buffer();
    UnifiedWriter writer(*old, *fresh, options);
    const std::size_t context = std::min(options.context, old->GetCount());
    for (auto first = changes.begin(); first != changes.end();) {
        auto last = first + 1;
        while (last != changes.end() && last->oldBegin - (last - 1)->oldEnd <= 2 * context)
            ++last;
        writer.Write(first, last);
        first = last;
    }
    return std::move(writer).Take();
}

} // namespace KivArchive
