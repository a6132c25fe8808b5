#include "KivVcs/Foundation.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <string>
#include <tuple>
#include <utility>

using namespace KivVcs;

namespace {

using Text = KivStringT<char>;
using Wide = KivStringT<char16_t>;

Wide Units(std::initializer_list<int> units) {
    Wide text;
    for (int unit : units)
        text += static_cast<char16_t>(unit);
    return text;
}

TEST(Text, CopiesShareTheirCharactersUntilOneChanges) {
    Text original("branch");
    Text copy = original;
    EXPECT_EQ(static_cast<const void*>(copy.GetString()), original.GetString());
    EXPECT_EQ(static_cast<const void*>(copy.Mid(-3, 99).GetString()), original.GetString());
    copy += '/';
    copy += copy;
    copy += copy.GetString() + copy.GetLength() / 2;
    EXPECT_EQ(original, "branch");
    copy += '!';
    const Text withRoomToGrow = copy;
    copy += '?';
    EXPECT_EQ(withRoomToGrow, "branch/branch/branch/!");
    const Text moved = std::move(copy);
    EXPECT_EQ(moved, "branch/branch/branch/!?");
    copy = original;
    copy = *&copy;
    EXPECT_EQ(copy + "/" + moved.Left(1), "branch/b");

    Wide wide(Text("\x01z\x80\xFF"));
    wide += '\xE9';
    EXPECT_EQ(wide, Units({1, 'z', 0x80, 0xFF, 0xE9}));
    for (int count = 0; count < 100'000; ++count)
        wide += u'x';
    EXPECT_EQ(wide.GetLength(), 100'005);
    EXPECT_EQ(wide.GetAt(100'005), u'\0');
    EXPECT_EQ(Text(nullptr, 5) + Text("abc", -1) + static_cast<const char*>(nullptr), "");
}

TEST(Text, ComparesTextsAndNeverPointers) {
    const std::string elsewhere = "name";
    const Text name("name");
    EXPECT_TRUE(name == elsewhere.c_str() && elsewhere.c_str() == name && name == "name" && "name" == name);
    EXPECT_TRUE(KivStringViewT<char>("name") == name && name != "Name" && "nam" != name && !name.IsEmpty());
    EXPECT_TRUE(Wide(u"name") == u"name" && u"name" == Wide(Text("name")) && u"names" > Wide(u"name"));
    EXPECT_FALSE(name != elsewhere.c_str());
    EXPECT_NE(Text("a\0b", 3), Text("a\0c", 3));

    // Ascending by unsigned code units, a prefix first; U+1F600 starts with 0xD83D.
    const Text narrow[] = {"", "A", "Ab", "B", "a", "\x7F", "\x80", "\xC3\xA9", "\xFF"};
    const Wide wide[] = {Units({0}), u"a", u"\u00E9", u"\u20AC", u"\U0001F600", u"\uFFFD"};
    for (std::size_t i = 0; i < std::size(narrow); ++i)
        for (std::size_t j = 0; j < std::size(narrow); ++j)
            EXPECT_EQ(narrow[i].Compare(narrow[j]) <=> 0, i <=> j) << i << ' ' << j;
    for (std::size_t i = 0; i < std::size(wide); ++i)
        for (std::size_t j = 0; j < std::size(wide); ++j)
            EXPECT_EQ(wide[i] <=> wide[j], i <=> j) << i << ' ' << j;
    EXPECT_EQ(std::hash<Wide>()(u"name"), std::hash<KivStringViewT<char16_t>>()(Wide(u"name")));
}

TEST(Text, SearchesAndSubstringsClipTheirArguments) {
    constexpr int largest = std::numeric_limits<int>::max();
    const Text text("a/bb/a/");
    const std::tuple<const char*, int, int> searches[] = {{"/", 0, 1},  {"/", 2, 4},  {"/", -9, 1},
                                                          {"/", 7, -1}, {"a/", 1, 5}, {"b", largest, -1},
                                                          {"", 7, 7},   {"", 8, -1},  {"a/bb/a//", 0, -1}};
    for (auto const& [needle, start, found] : searches)
        EXPECT_EQ(text.Find(needle, start), found) << needle << ' ' << start;
    const std::tuple<int, int, const char*> parts[] = {{-5, 3, "a/b"},         {5, 99, "a/"}, {7, 1, ""},
                                                       {largest, largest, ""}, {1, -1, ""},   {1, 0, ""},
                                                       {2, largest, "bb/a/"},  {0, 1, "a"}};
    for (auto const& [start, count, part] : parts)
        EXPECT_EQ(text.Mid(start, count), part) << start << ' ' << count;
    EXPECT_EQ(text.Mid(5) + text.Left(-1), "a/");
    EXPECT_TRUE(text.StartsWith("a/bb") && !text.StartsWith("a/bb/a//") && !text.StartsWith("b"));
}

TEST(Text, FormatsLikePrintf) {
    const auto narrow = [](KivStringViewT<char> format, auto... arguments) {
        Text text("before");
        text.FormatInternal(format, arguments...);
        return text;
    };
    EXPECT_EQ(narrow("%.*s %lu", 4, "blobby", std::uint64_t{18446744073709551615U}), "blob 18446744073709551615");
    EXPECT_EQ(narrow("%.*s|", 9, "blob"), "blob|");
    EXPECT_EQ(narrow("%d %d", std::numeric_limits<std::int64_t>::min(), 0), "-9223372036854775808 0");
    EXPECT_EQ(narrow("%%%s%", "s"), "%s");
    EXPECT_EQ(narrow("%s-%d"), "-");
    Wide wide;
    wide.FormatInternal(u"%s <%s> %d %02d%02d %03d %10d%9d", Wide(u"\u00E9"), u"b", 1700000000, 5, -7, -7, 42, 9);
    EXPECT_EQ(wide, u"\u00E9 <b> 1700000000 05-7 -07         42        9");
    wide.FormatInternal(u"%s!", static_cast<const char16_t*>(wide));
    EXPECT_EQ(wide, u"\u00E9 <b> 1700000000 05-7 -07         42        9!");
}

TEST(Encoding, EveryTextSurvivesUtf8) {
    Wide text;
    for (int unit = 0; unit < 0x10000; ++unit) {
        const Wide one = Units({unit});
        ASSERT_EQ(String::ToStringW(DataEncoding::Utf8Encode(KivStringViewT<char16_t>(one))), one);
        text += static_cast<char16_t>(unit);
    }
    text += u"\U00010000 \U0001F600 \U0010FFFF ";
    text += Units({0xDC00, 0xD800, 'x', 0xD800, 0xD800, 0xDC00, 0xDBFF});
    const Text encoded = DataEncoding::Utf8Encode(KivStringViewT<char16_t>(text));
    EXPECT_EQ(static_cast<std::size_t>(encoded.GetLength()), DataEncoding::Utf8Length(text));
    EXPECT_EQ(String::ToStringW(encoded), text);
    EXPECT_EQ(DataEncoding::Utf8Encode(u"\u00E9\u20AC\U00010000\U0010FFFF"),
              "\xC3\xA9\xE2\x82\xAC\xF0\x90\x80\x80\xF4\x8F\xBF\xBF");
    EXPECT_EQ(DataEncoding::Utf8Encode(Units({0xDC00, 0xD83D})), "\xED\xB0\x80\xED\xA0\xBD");
    // A view keeps its zeros, while a string is taken as the NUL-terminated text that it is.
    EXPECT_EQ(DataEncoding::Utf8Encode(Units({'a', 0, 'b'})), "a");
    EXPECT_EQ(DataEncoding::Utf8Encode(Units({'a', 0, 'b'}).GetString()), "a");
    EXPECT_EQ(DataEncoding::Utf8Encode(KivStringViewT<char16_t>(u"a\0b", 3)), Text("a\0b", 3));
}

TEST(Encoding, EveryByteOutsideAWellFormedSequenceDecodesToAReplacement) {
    EXPECT_EQ(
        String::ToStringW("a\x80z|\xC0\x80|\xC1\xBF|\xC3|\xE0\x80\x80|\xE2\x82|\xE2(\xA1|\xF0\x8F\xBF\xBF|"
                          "\xF4\x90\x80\x80|\xF0\x9F\x98|\xFF\xFE|\xF8\x90\x80\x80|\xC3\xA9|\xF0\x9F\x98\x80\xE2\x82"),
        u"a\uFFFDz|\uFFFD\uFFFD|\uFFFD\uFFFD|\uFFFD|\uFFFD\uFFFD\uFFFD|\uFFFD\uFFFD|\uFFFD(\uFFFD|"
        u"\uFFFD\uFFFD\uFFFD\uFFFD|\uFFFD\uFFFD\uFFFD\uFFFD|\uFFFD\uFFFD\uFFFD|\uFFFD\uFFFD|\uFFFD\uFFFD\uFFFD\uFFFD|"
        u"\u00E9|"
        u"\U0001F600\uFFFD\uFFFD");
}

TEST(Encoding, NumbersStopAtTheFirstOtherCharacterAndAreClamped) {
    for (const char* text : {"", "-", "x1", " 1", "--1", "-0"})
        EXPECT_TRUE(String::Int64FromString(Wide(Text(text))) == 0 && String::IntFromString(Wide(Text(text))) == 0)
            << text;
    using limits = std::numeric_limits<std::int64_t>;
    const std::pair<const char*, std::int64_t> cases[] = {{"+07x9", 7},
                                                          {"-12.5", -12},
                                                          {"2147483647", 2147483647},
                                                          {"2147483648", 2147483648},
                                                          {"-2147483648", -2147483648LL},
                                                          {"-2147483649", -2147483649LL},
                                                          {"9223372036854775807", limits::max()},
                                                          {"9223372036854775808", limits::max()},
                                                          {"-9223372036854775808", limits::min()},
                                                          {"-99999999999999999999", limits::min()}};
    for (auto const& [text, number] : cases) {
        EXPECT_EQ(String::Int64FromString(Wide(Text(text))), number) << text;
        EXPECT_EQ(String::IntFromString(Wide(Text(text))), std::clamp<std::int64_t>(number, -2147483648LL, 2147483647))
            << text;
    }
    EXPECT_EQ(DataEncoding::HexEncode("\x00\x9F\xF0\x0A", 4) + DataEncoding::HexEncode(nullptr, 4), u"009ff00a");
}

} // namespace
