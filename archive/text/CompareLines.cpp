#include "text/Lines.h"

#include <algorithm>
#include <array>
#include <functional>
#include <limits>

namespace KivArchive {

namespace {

/// Equal lines have equal numbers.
using Numbers = std::vector<std::uint32_t>;
/// Whether each line is changed. There is one more unchanged line at either end, so that line 0 is at index 1.
using Flags = std::vector<char>;

/// Gives the lines of both sides their numbers.
std::array<Numbers, 2> NumberLines(std::array<std::vector<std::string_view>, 2> const& sides) {
    struct Line {
        std::size_t hash;
        std::string_view text;
        std::uint32_t side, index;
    };
    std::vector<Line> sorted;
    sorted.reserve(sides[0].size() + sides[1].size());
    std::array<Numbers, 2> numbers;
    for (std::uint32_t side = 0; side < 2; ++side) {
        numbers[side].resize(sides[side].size());
        for (std::uint32_t index = 0; index < sides[side].size(); ++index)
            sorted.push_back({std::hash<std::string_view>()(sides[side][index]), sides[side][index], side, index});
    }
    // Sorted instead of put into a hash table, which lines with equal hashes, chosen by an attacker, would slow down.
    std::sort(sorted.begin(), sorted.end(), [](Line const& left, Line const& right) {
        return left.hash != right.hash ? left.hash < right.hash : left.text < right.text;
    });
    std::uint32_t number = 0;
    for (std::size_t at = 0; at < sorted.size(); ++at) {
        if (at > 0 && sorted[at].text != sorted[at - 1].text)
            ++number;
        numbers[sorted[at].side][sorted[at].index] = number;
    }
    return numbers;
}

/// Finds what two sequences have in common: a shortest sequence of insertions and deletions, searched from both ends at
/// once until the searches meet in the middle (Myers, "An O(ND) Difference Algorithm and Its Variations"). One that
/// takes too long is cut short where it got farthest.
class SequenceComparison {
public:
    /// Sets the flags of the elements that have no partner. @param places the index of each element's flag
    SequenceComparison(std::array<Numbers, 2> const& sequences, std::array<Numbers, 2> const& places,
                       std::array<Flags, 2>& changed)
        : old_(sequences[0]), new_(sequences[1]), places_(places), changed_(changed),
          forward_(old_.size() + new_.size() + 3), backward_(forward_.size()),
          middle_(static_cast<Position>(new_.size()) + 1) {
        while (maximumSteps_ * maximumSteps_ < static_cast<Position>(forward_.size()))
            maximumSteps_ *= 2;
    }

    void Run() {
        // A list instead of recursion, whose depth would depend on what is compared.
        std::vector<Box> open{{0, static_cast<Position>(old_.size()), 0, static_cast<Position>(new_.size())}};
        while (!open.empty()) {
            Box box = open.back();
            open.pop_back();
            Trim(box);
            if (box.oldBegin == box.oldEnd)
                Mark(1, box.newBegin, box.newEnd);
            else if (box.newBegin == box.newEnd)
                Mark(0, box.oldBegin, box.oldEnd);
            else {
                const auto [x, y] = FindMiddle(box);
                open.push_back({box.oldBegin, x, box.newBegin, y});
                open.push_back({x, box.oldEnd, y, box.newEnd});
            }
        }
    }

private:
    using Position = std::int64_t;

    static constexpr Position farBeyond = std::numeric_limits<Position>::max();

    struct Box {
        Position oldBegin, oldEnd, newBegin, newEnd;
    };
    struct Point {
        Position x, y;
    };

    [[nodiscard]] bool Match(Position x, Position y) const {
        return old_[static_cast<std::size_t>(x)] == new_[static_cast<std::size_t>(y)];
    }

    void Trim(Box& box) const {
        while (box.oldBegin < box.oldEnd && box.newBegin < box.newEnd && Match(box.oldBegin, box.newBegin)) {
            ++box.oldBegin;
            ++box.newBegin;
        }
        while (box.oldBegin < box.oldEnd && box.newBegin < box.newEnd && Match(box.oldEnd - 1, box.newEnd - 1)) {
            --box.oldEnd;
            --box.newEnd;
        }
    }

    void Mark(std::size_t side, Position begin, Position end) {
        for (; begin < end; ++begin)
            changed_[side][places_[side][static_cast<std::size_t>(begin)] + 1] = 1;
    }

    // How far the searches from the beginning and from the end have come on the diagonal x - y.
    Position& Forward(Position diagonal) { return forward_[static_cast<std::size_t>(middle_ + diagonal)]; }
    Position& Backward(Position diagonal) { return backward_[static_cast<std::size_t>(middle_ + diagonal)]; }

    /// The range of diagonals that one of the searches has reached, every second of them.
    struct Reached {
        Position least, greatest;
    };

    /// Widens the range by one diagonal at either end, within the box.
    /// @param setBeyond makes the diagonal beyond a neighbour that is never the better one
    template <class Beyond>
    static void Widen(Reached& reached, Position lowest, Position highest, Beyond setBeyond) {
        if (reached.least > lowest)
            setBeyond(--reached.least - 1);
        else
            ++reached.least;
        if (reached.greatest < highest)
            setBeyond(++reached.greatest + 1);
        else
            --reached.greatest;
    }

    /// A point through which a short sequence of edits leads, neither the first nor the last of the box.
    Point FindMiddle(Box const& box) {
        const Position lowest = box.oldBegin - box.newEnd;
        const Position highest = box.oldEnd - box.newBegin;
        const Position first = box.oldBegin - box.newBegin;
        const Position last = box.oldEnd - box.newEnd;
        const bool meetForward = ((first - last) & 1) != 0;
        Reached ahead{first, first};
        Reached back{last, last};
        Forward(first) = box.oldBegin;
        Backward(last) = box.oldEnd;
        for (Position steps = 1;; ++steps) {
            Widen(ahead, lowest, highest, [this](Position diagonal) { Forward(diagonal) = -1; });
            for (Position d = ahead.greatest; d >= ahead.least; d -= 2) {
                const Position below = Forward(d - 1);
                const Position above = Forward(d + 1);
                Position x = below < above ? above : below + 1;
                while (x < box.oldEnd && x - d < box.newEnd && Match(x, x - d))
                    ++x;
                Forward(d) = x;
                if (meetForward && back.least <= d && d <= back.greatest && Backward(d) <= x)
                    return {x, x - d};
            }
            Widen(back, lowest, highest, [this](Position diagonal) { Backward(diagonal) = farBeyond; });
            for (Position d = back.greatest; d >= back.least; d -= 2) {
                const Position below = Backward(d - 1);
                const Position above = Backward(d + 1);
                Position x = below < above ? below : above - 1;
                while (x > box.oldBegin && x - d > box.newBegin && Match(x - 1, x - d - 1))
                    --x;
                Backward(d) = x;
                if (!meetForward && ahead.least <= d && d <= ahead.greatest && x <= Forward(d))
                    return {x, x - d};
            }
            if (steps >= maximumSteps_)
                return Farthest(box, ahead, back);
        }
    }

    /// The point that the search which came farther has reached.
    Point Farthest(Box const& box, Reached ahead, Reached back) {
        Point best{box.oldBegin, box.newBegin};
        for (Position d = ahead.greatest; d >= ahead.least; d -= 2) {
            const Position x = std::min({Forward(d), box.oldEnd, box.newEnd + d});
            if (x + (x - d) > best.x + best.y)
                best = {x, x - d};
        }
        Point bestBack{box.oldEnd, box.newEnd};
        for (Position d = back.greatest; d >= back.least; d -= 2) {
            const Position x = std::max({Backward(d), box.oldBegin, box.newBegin + d});
            if (x + (x - d) < bestBack.x + bestBack.y)
                bestBack = {x, x - d};
        }
        const Position gone = best.x + best.y - box.oldBegin - box.newBegin;
        const Position goneBack = box.oldEnd + box.newEnd - bestBack.x - bestBack.y;
        return gone >= goneBack ? best : bestBack;
    }

    Numbers const& old_;
    Numbers const& new_;
    std::array<Numbers, 2> const& places_;
    std::array<Flags, 2>& changed_;
    std::vector<Position> forward_;
    std::vector<Position> backward_;
    Position middle_;
    Position maximumSteps_ = 256;
};

/// Slides groups of changed lines along equal lines as far towards the end as possible, or to changes of the other
/// side, so that the same insertion is always found in the same place.
class GroupSlide {
public:
    GroupSlide(Numbers const& numbers, Flags& changed, Flags const& otherChanged)
        : numbers_(numbers), changed_(changed), other_(otherChanged),
          movesLeft_(16 * (numbers.size() + otherChanged.size())) {}

    void Run() {
        const std::size_t end = numbers_.size() + 1;
        // Indexes of flags at which both sides correspond: of the first line after a group, or of a line without one.
        std::size_t at = 1;
        std::size_t otherAt = 1;
        while (true) {
            while (at < end && changed_[at] == 0) {
                SkipOtherGroup(otherAt);
                ++at;
                ++otherAt;
            }
            if (at == end)
                return;
            std::size_t begin = at;
            while (changed_[at] != 0)
                ++at;
            SkipOtherGroup(otherAt);
            Slide(begin, at, otherAt);
        }
    }

private:
    void SkipOtherGroup(std::size_t& otherAt) const {
        while (other_[otherAt] != 0)
            ++otherAt;
    }

    [[nodiscard]] bool Equal(std::size_t left, std::size_t right) const {
        return numbers_[left - 1] == numbers_[right - 1];
    }

    void Slide(std::size_t& begin, std::size_t& end, std::size_t& otherAt) {
        std::size_t size = 0;
        std::size_t beside = 0;
        do {
            size = end - begin;
            while (begin > 1 && Equal(begin - 1, end - 1) && MayMove())
                MoveBack(begin, end, otherAt);
            beside = other_[otherAt - 1] != 0 ? end : 0;
            while (end <= numbers_.size() && Equal(begin, end) && MayMove()) {
                MoveOn(begin, end, otherAt);
                if (other_[otherAt - 1] != 0)
                    beside = end;
            }
        } while (end - begin != size);
        while (beside != 0 && beside < end)
            MoveBack(begin, end, otherAt);
    }

    // A group that meets another one joins it.
    void MoveBack(std::size_t& begin, std::size_t& end, std::size_t& otherAt) {
        changed_[--begin] = 1;
        changed_[--end] = 0;
        while (changed_[begin - 1] != 0)
            --begin;
        do
            --otherAt;
        while (other_[otherAt] != 0);
    }

    void MoveOn(std::size_t& begin, std::size_t& end, std::size_t& otherAt) {
        changed_[begin++] = 0;
        changed_[end++] = 1;
        while (changed_[end] != 0)
            ++end;
        ++otherAt;
        SkipOtherGroup(otherAt);
    }

    bool MayMove() { return movesLeft_ > 0 && movesLeft_-- > 0; }

    Numbers const& numbers_;
    Flags& changed_;
    Flags const& other_;
    /// A limit, since sliding many groups through lines that are all the same would take too long.
    std::size_t movesLeft_;
};

/// Compares what is left of both sides without the equal lines at their beginnings and ends.
std::array<Flags, 2> FindChanged(std::array<std::vector<std::string_view>, 2> const& sides) {
    const std::array<Numbers, 2> numbers = NumberLines(sides);
    std::array<std::vector<char>, 2> occurs;
    for (std::size_t side = 0; side < 2; ++side) {
        occurs[side].resize(numbers[0].size() + numbers[1].size());
        for (auto const number : numbers[side])
            occurs[side][number] = 1;
    }
    std::array<Flags, 2> changed;
    std::array<Numbers, 2> comparable;
    std::array<Numbers, 2> places;
    for (std::size_t side = 0; side < 2; ++side) {
        changed[side].resize(numbers[side].size() + 2);
        for (std::uint32_t place = 0; place < numbers[side].size(); ++place) {
            const auto number = numbers[side][place];
            // A line that the other side lacks is changed in any case, and not searched for.
            changed[side][place + 1] = occurs[1 - side][number] == 0 ? 1 : 0;
            if (occurs[1 - side][number] == 0)
                continue;
            comparable[side].push_back(number);
            places[side].push_back(place);
        }
    }
    SequenceComparison(comparable, places, changed).Run();
    GroupSlide(numbers[0], changed[0], changed[1]).Run();
    GroupSlide(numbers[1], changed[1], changed[0]).Run();
    return changed;
}

std::vector<LineChange> ToChanges(std::array<Flags, 2> const& changed, std::size_t offset) {
    std::vector<LineChange> changes;
    std::size_t old = 1;
    std::size_t fresh = 1;
    while (old + 1 < changed[0].size() || fresh + 1 < changed[1].size()) {
        const LineChange begin{old, old, fresh, fresh};
        while (changed[0][old] != 0)
            ++old;
        while (changed[1][fresh] != 0)
            ++fresh;
        if (old != begin.oldBegin || fresh != begin.newBegin)
            changes.push_back(
                {begin.oldBegin - 1 + offset, old - 1 + offset, begin.newBegin - 1 + offset, fresh - 1 + offset});
        ++old;
        ++fresh;
    }
    return changes;
}

} // namespace

std::vector<LineChange> CompareLines(Lines const& before, Lines const& after) {
    const std::size_t shorter = std::min(before.GetCount(), after.GetCount());
    std::size_t same = 0;
    while (same < shorter && before[same] == after[same])
        ++same;
    std::size_t sameAtEnd = 0;
    while (sameAtEnd < shorter - same &&
           before[before.GetCount() - 1 - sameAtEnd] == after[after.GetCount() - 1 - sameAtEnd])
        ++sameAtEnd;
    const auto middleOf = [=](Lines const& lines) {
        std::vector<std::string_view> middle;
        middle.reserve(lines.GetCount() - same - sameAtEnd);
        for (std::size_t line = same; line < lines.GetCount() - sameAtEnd; ++line)
            middle.push_back(lines[line]);
        return middle;
    };
    return ToChanges(FindChanged({middleOf(before), middleOf(after)}), same);
}

} // namespace KivArchive
