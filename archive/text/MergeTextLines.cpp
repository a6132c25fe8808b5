#include "text/Lines.h"

#include <algorithm>
#include <string>

namespace KivArchive {

namespace {

/// One side of a merge: its lines, and its changes to the base.
class Side {
public:
    Side(Lines const& base, Lines const& lines) : lines_(lines), changes_(CompareLines(base, lines)) {}

    [[nodiscard]] Lines const& GetLines() const noexcept { return lines_; }
    [[nodiscard]] bool IsAtEnd() const noexcept { return next_ == changes_.size(); }
    /// Where in the base the next change begins. @pre !IsAtEnd()
    [[nodiscard]] std::size_t NextBegin() const noexcept { return changes_[next_].oldBegin; }

    /// Takes the next change if it overlaps or touches the base's lines up to @p end, and moves @p end to its end.
    bool Take(std::size_t& end) {
        if (IsAtEnd() || NextBegin() > end)
            return false;
        end = std::max(end, changes_[next_].oldEnd);
        ++next_;
        return true;
    }

    /// The line of this side that a line of the base is. @pre it is before the next change, and not before the end of
    /// those taken
    [[nodiscard]] std::size_t LineOf(std::size_t baseLine) const noexcept {
        return next_ == 0 ? baseLine : changes_[next_ - 1].newEnd + (baseLine - changes_[next_ - 1].oldEnd);
    }

private:
    Lines const& lines_;
    std::vector<LineChange> changes_;
    std::size_t next_ = 0;
};

struct Region {
    Lines const& lines;
    std::size_t begin, end;

    [[nodiscard]] std::string_view GetText() const { return lines.GetRange(begin, end); }
};

class Merger {
public:
    Merger(Lines const& base, Lines const& left, Lines const& right, TextMergeOptions const& options)
        : base_(base), left_(base, left), right_(base, right), options_(options) {}

    TextMerge Run() {
        std::size_t line = 0;
        while (!left_.IsAtEnd() || !right_.IsAtEnd()) {
            const std::size_t begin = std::min(left_.IsAtEnd() ? base_.GetCount() : left_.NextBegin(),
                                               right_.IsAtEnd() ? base_.GetCount() : right_.NextBegin());
            base_.AppendTo(merge_.text, line, begin);
            line = MergeFrom(begin);
        }
        base_.AppendTo(merge_.text, line, base_.GetCount());
        merge_.result = merge_.conflicts == 0 ? TextMergeResult::Merged : TextMergeResult::Conflicts;
        if (merge_.conflicts != 0 && !options_.showConflicts)
            merge_.text = KivVcs::Buffer();
        return std::move(merge_);
    }

private:
    /// Merges all changes that overlap or touch each other from line @p begin of the base on. @return where they end
    std::size_t MergeFrom(std::size_t begin) {
        const std::size_t leftBegin = left_.LineOf(begin);
        const std::size_t rightBegin = right_.LineOf(begin);
        std::size_t end = begin;
        bool leftChanged = false;
        bool rightChanged = false;
        for (bool grows = true; grows;) {
            const bool leftTaken = left_.Take(end);
            const bool rightTaken = right_.Take(end);
            leftChanged |= leftTaken;
            rightChanged |= rightTaken;
            grows = leftTaken || rightTaken;
        }
        const Region left{left_.GetLines(), leftBegin, left_.LineOf(end)};
        const Region right{right_.GetLines(), rightBegin, right_.LineOf(end)};
        if (!rightChanged || (leftChanged && left.GetText() == right.GetText()))
            Append(left);
        else if (!leftChanged)
            Append(right);
        else
            AppendConflict(left, {base_, begin, end}, right);
        return end;
    }

    void Append(Region const& region) { region.lines.AppendTo(merge_.text, region.begin, region.end); }

    void AppendConflict(Region const& left, Region const& base, Region const& right) {
        ++merge_.conflicts;
        if (!options_.showConflicts)
            return;
        const bool carriageReturns =
            left.lines.GetCount() > 0 ? left.lines[0].ends_with("\r\n") : right.lines[0].ends_with("\r\n");
        const std::string lineEnd = carriageReturns ? "\r\n" : "\n";
        const auto part = [&](std::string_view mark, KivVcs::KivStringT<char> const& label, Region const& region) {
            AppendText(std::string(mark).append(" ").append(label.GetString()).append(lineEnd));
            Append(region);
            if (region.begin != region.end && !region.GetText().ends_with('\n'))
                AppendText(lineEnd);
        };
        part("<<<<<<<", options_.leftLabel, left);
        part("|||||||", options_.baseLabel, base);
        AppendText("=======" + lineEnd);
        Append(right);
        if (right.begin != right.end && !right.GetText().ends_with('\n'))
            AppendText(lineEnd);
        AppendText(std::string(">>>>>>> ").append(options_.rightLabel.GetString()).append(lineEnd));
    }

    void AppendText(std::string_view text) { merge_.text.Append(text.data(), text.size()); }

    Lines const& base_;
    Side left_;
    Side right_;
    TextMergeOptions const& options_;
    TextMerge merge_;
};

} // namespace

TextMerge MergeTextLines(KivVcs::Buffer const& base, KivVcs::Buffer const& left, KivVcs::Buffer const& right,
                         TextMergeOptions const& options) {
    const auto baseLines = Lines::Split(base, options.maximumBytes);
    const auto leftLines = Lines::Split(left, options.maximumBytes);
    const auto rightLines = Lines::Split(right, options.maximumBytes);
    if (!baseLines || !leftLines || !rightLines)
        return {};
    return Merger(*baseLines, *leftLines, *rightLines, options).Run();
}

} // namespace KivArchive
