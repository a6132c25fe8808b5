#include "ArchiveFiles.h"
#include "KivArchive/TextLines.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <fstream>
#include <random>
#include <string>
#include <vector>

namespace KivArchive {
namespace {

using KivVcs::Buffer;

Buffer Content(std::string_view text) {
    // In two pieces, so that a line lies across two chunks.
    Buffer content;
    content.Append(text.data(), text.size() / 2);
    Buffer rest;
    rest.Append(text.data() + text.size() / 2, text.size() - text.size() / 2);
    content.Append(rest);
    return content;
}

std::string Text(Buffer const& content) {
    std::string text(content.GetSize(), '\0');
    EXPECT_TRUE(content.Read(0, text.data(), text.size()));
    return text;
}

std::vector<std::string> SplitLines(std::string const& text) {
    std::vector<std::string> lines;
    for (std::size_t begin = 0; begin < text.size();) {
        const auto end = std::min(text.find('\n', begin), text.size() - 1) + 1;
        lines.push_back(text.substr(begin, end - begin));
        begin = end;
    }
    return lines;
}

std::string Join(std::vector<std::string> const& lines) {
    std::string text;
    for (auto const& line : lines)
        text += line;
    return text;
}

TextMerge Merge(std::string const& base, std::string const& left, std::string const& right,
                TextMergeOptions const& options = {}) {
    return MergeTextLines(Content(base), Content(left), Content(right), options);
}

/// The result of a merge: the text, "conflict" or "gave up".
std::string Merged(std::string const& base, std::string const& left, std::string const& right) {
    const auto merge = Merge(base, left, right);
    return merge.result == TextMergeResult::Merged      ? Text(merge.text)
           : merge.result == TextMergeResult::Conflicts ? "conflict"
                                                        : "gave up";
}

TEST(TextLines, ChangesInDifferentPlacesAreTakenFromBothSides) {
    const std::string base = "1\n2\n3\n4\n5\n";
    EXPECT_EQ(Merged(base, "0\n1\n2\n3\n4\n5\n", "1\n2\n3\n4\n"), "0\n1\n2\n3\n4\n");
    EXPECT_EQ(Merged(base, base, "other\n"), "other\n");
    EXPECT_EQ(Merged(base, "", base), "");
    EXPECT_EQ(Merged(base, "1\nx\n3\n4\n5\n", "1\nx\n3\n4\ny\n"), "1\nx\n3\n4\ny\n");
    EXPECT_EQ(Merged("", "same\n", "same\n"), "same\n");
    // Both kinds of line ends, and a missing last one.
    EXPECT_EQ(Merged("1\r\n2\r\n3", "0\r\n2\r\n3", "1\r\n2\r\n3\r\n"), "0\r\n2\r\n3\r\n");
    EXPECT_EQ(Merged("1\n2\n3\n", "1\n2\n3", "0\n2\n3\n"), "0\n2\n3");
}

TEST(TextLines, OverlappingAndTouchingChangesAreConflicts) {
    const std::string base = "1\n2\n3\n4\n";
    EXPECT_EQ(Merged(base, "x\n2\n3\n4\n", "y\n2\n3\n4\n"), "conflict");
    EXPECT_EQ(Merged(base, "1\nx\n3\n4\n", "1\n2\ny\n4\n"), "conflict");
    EXPECT_EQ(Merged(base, "1\n2\nx\n3\n4\n", "1\n2\ny\n4\n"), "conflict");
    EXPECT_EQ(Merged(base, "", "1\n2\ny\n4\n"), "conflict");
    EXPECT_EQ(Merged("", "x\n", "y\n"), "conflict");
    const auto merge = Merge("1\r\n2\r\n", "1\r\nx", "1\r\n", {.showConflicts = true, .rightLabel = "theirs"});
    EXPECT_EQ(merge.conflicts, 1U);
    EXPECT_EQ(Text(merge.text), "1\r\n<<<<<<< left\r\nx\r\n||||||| base\r\n2\r\n=======\r\n>>>>>>> theirs\r\n");
    EXPECT_EQ(Merge(base, "x\n", "y\n").text.GetSize(), 0U);
}

TEST(TextLines, WhatIsNoTextIsGivenUp) {
    const std::string binary("a\0b\n", 4);
    EXPECT_EQ(Merged("a\n", binary, "a\n") + Merged(binary, "a\n", "a\n") + Merged("a\n", "a\n", binary),
              "gave upgave upgave up");
    EXPECT_EQ(Merge("a\n", "b\n", "a\n", {.maximumBytes = 1}).result, TextMergeResult::GaveUp);
    EXPECT_FALSE(DiffTextLines(Content("a"), Content(binary)).areTexts || UnifiedText(Content(binary), Content("")) ||
                 DiffTextLines(Content("abc"), Content("a"), 2).areTexts);
    EXPECT_TRUE(DiffTextLines(Content("a"), Content("a")).areTexts);
}

/// Random texts, and the results of the system's tools for them.
class RandomTexts : public testing::Test {
protected:
    int Below(int limit) { return std::uniform_int_distribution(0, limit - 1)(random_); }

    /// Lines that are all different, or one of a few.
    std::vector<std::string> MakeLines(int count, int kinds) {
        std::vector<std::string> lines;
        for (int number = 0; number < count; ++number)
            lines.push_back((kinds == 0 ? "line " + std::to_string(++made_) : std::string(1, "abcdef"[Below(kinds)])) +
                            "\n");
        return lines;
    }

    std::string Edit(std::vector<std::string> lines, int edits, int kinds) {
        for (; edits > 0; --edits) {
            const auto at = lines.begin() + Below(static_cast<int>(lines.size()) + 1);
            const auto removed = at + std::min<std::ptrdiff_t>(Below(4), lines.end() - at);
            const auto added = MakeLines(Below(4), kinds);
            lines.insert(lines.erase(at, removed), added.begin(), added.end());
        }
        return Join(lines);
    }

    void Write(const char* name, std::string const& text) {
        std::ofstream(directory_.Path(name), std::ios::binary) << text;
    }

    std::string Run(std::string const& command) {
        std::string output;
        FILE* const pipe = popen(("cd '" + directory_.Path(".") + "' && " + command).c_str(), "r");
        std::array<char, 4096> some{};
        while (const auto size = fread(some.data(), 1, some.size(), pipe))
            output.append(some.data(), size);
        pclose(pipe);
        return output;
    }

private:
    std::mt19937 random_{1};
    int made_ = 0;
    TemporaryDirectory directory_;
};

std::string Apply(std::vector<LineChange> const& changes, std::string const& before, std::string const& after) {
    const auto old = SplitLines(before);
    const auto fresh = SplitLines(after);
    std::string result;
    std::size_t line = 0;
    for (auto const& change : changes) {
        EXPECT_TRUE(change.oldBegin >= line && (change.oldBegin > line || line == 0));
        for (; line < change.oldBegin; ++line)
            result += old[line];
        for (std::size_t added = change.newBegin; added < change.newEnd; ++added)
            result += fresh[added];
        line = change.oldEnd;
    }
    for (; line < old.size(); ++line)
        result += old[line];
    return result;
}

TEST_F(RandomTexts, DifferAsDiffSays) {
    for (int round = 0; round < 150; ++round) {
        const int kinds = round % 3 == 0 ? 0 : 2 + Below(3);
        const auto lines = MakeLines(Below(60), kinds);
        const std::string before = Join(lines);
        std::string after = Edit(lines, Below(8), kinds);
        if (Below(3) == 0 && !after.empty())
            after.pop_back();
        Write("before", before);
        Write("after", after);
        const auto changes = DiffTextLines(Content(before), Content(after)).changes;
        ASSERT_EQ(Apply(changes, before, after), after);
        // If all lines are different there is only one shortest difference; otherwise the tool's is as short.
        if (kinds == 0) {
            ASSERT_EQ(Text(UnifiedText(Content(before), Content(after)).value()),
                      Run("diff --minimal -U3 --label old --label new before after"));
        } else {
            std::size_t changed = 0;
            for (auto const& change : changes)
                changed += change.oldEnd - change.oldBegin + change.newEnd - change.newBegin;
            ASSERT_EQ(std::to_string(changed) + "\n", Run("diff --minimal before after | grep -c '^[<>]'"));
        }
    }
}

TEST_F(RandomTexts, MergeAsDiff3Says) {
    int conflicts = 0;
    for (int round = 0; round < 150; ++round) {
        const auto base = MakeLines(20 + Below(60), 0);
        const std::string left = Edit(base, Below(5), 0);
        // With some changes in common, now and then.
        const std::string right = Edit(Below(3) == 0 ? SplitLines(left) : base, Below(5), 0);
        Write("base", Join(base));
        Write("left", left);
        Write("right", right);
        const auto merge = Merge(Join(base), left, right, {.showConflicts = true});
        std::string text = Text(merge.text);
        for (std::size_t mark = text.find("||||||| "); mark != std::string::npos; mark = text.find("||||||| "))
            text.erase(mark, text.find("=======\n", mark) - mark);
        ASSERT_EQ(text, Run("diff3 --merge --show-overlap -L left -L base -L right left base right"));
        ASSERT_EQ(merge.conflicts == 0, merge.result == TextMergeResult::Merged);
        ASSERT_EQ(Merge(Join(base), right, left).conflicts, merge.conflicts);
        conflicts += merge.conflicts > 0 ? 1 : 0;
    }
    EXPECT_TRUE(conflicts > 20 && conflicts < 130) << conflicts;
}

TEST_F(RandomTexts, OfAnyKindAreComparedInTime) {
    const int count = 100'000;
    auto different = MakeLines(count, 0);
    auto same = std::vector<std::string>(count, "same\n");
    auto few = MakeLines(count, 2);
    auto reversed = different;
    std::reverse(reversed.begin(), reversed.end());
    auto shuffled = different;
    std::shuffle(shuffled.begin(), shuffled.end(), std::mt19937(2));
    std::vector<std::string> every;
    for (int number = 0; number < count; number += 2)
        every.insert(every.end(), {different[static_cast<std::size_t>(number)], "same\n", "same\n"});
    for (auto const& [before, after] : {std::pair(&different, &reversed),
                                        {&different, &shuffled},
                                        {&few, &reversed},
                                        {&same, &few},
                                        {&few, &same},
                                        {&different, &every},
                                        {&every, &same},
                                        {&every, &few},
                                        {&shuffled, &reversed}}) {
        const auto changes = DiffTextLines(Content(Join(*before)), Content(Join(*after))).changes;
        ASSERT_EQ(Apply(changes, Join(*before), Join(*after)), Join(*after));
    }
    const auto others = MakeLines(count, 2);
    ASSERT_EQ(Apply(DiffTextLines(Content(Join(few)), Content(Join(others))).changes, Join(few), Join(others)),
              Join(others));
    different[10] = "left\n";
    const std::string left = Join(different);
    different[99'000] = "right\n";
    EXPECT_EQ(Merged(Join(reversed), Join(reversed), left), left);
}

} // namespace
} // namespace KivArchive
