#include "support/Builders.h"
#include "support/HostStream.h"

#include <gtest/gtest.h>

#include <iomanip>
#include <set>

/// Texts, contents and identifiers as hosts write and read them.

namespace KivVcs {
namespace {

template <class T>
std::string Printed(T const& value) {
    std::ostringstream stream;
    stream << value;
    return stream.str();
}

TEST(HostTexts, GoInAndOutAsUtf8AndPrintWhateverTheyAre) {
    const std::string bytes("caf\303\251\0\360\237\230\200", 10);
    const KivStringT<char16_t> text(u"caf\u00E9\0\U0001F600", 7);
    EXPECT_EQ(FromUtf8(bytes), text);
    EXPECT_EQ(ToUtf8(text), bytes);
    EXPECT_EQ(ToUtf8(FromUtf8("\xFF")), "\xEF\xBF\xBD");
    EXPECT_EQ(ToUtf8(KivStringT<char16_t>(u"\xD800", 1)), "\xED\xA0\x80");

    EXPECT_EQ(Printed(text), bytes);
    EXPECT_EQ(Printed(KivStringViewT<char16_t>(text).Mid(3)), bytes.substr(3));
    EXPECT_EQ(Printed(KivStringT<char>("a\0b", 3)), std::string("a\0b", 3));
    EXPECT_EQ(Printed(KivStringViewT<char>("abc", 2)), "ab");
    EXPECT_EQ(Printed(KivStringViewT<char16_t>()), "");
    std::ostringstream padded;
    padded << std::setw(4) << std::left << KivStringT<char16_t>(u"ab") << '|';
    EXPECT_EQ(padded.str(), "ab  |");
    static_assert(!std::is_convertible_v<std::string, KivStringT<char16_t>>);
    static_assert(!std::is_convertible_v<const char*, KivStringViewT<char16_t>>);
    static_assert(std::is_convertible_v<std::nullptr_t, KivStringViewT<char16_t>>);
}

/// What no longer gives bytes after some, without being at its end.
class BrokenBuffer : public std::stringbuf {
public:
    using std::stringbuf::stringbuf;

protected:
    int_type underflow() override { throw std::runtime_error("unreadable"); }
};

TEST(HostContents, AreCopiedFromMemoryAndStreamsAndComeBackInEveryForm) {
    // printf 'blob 5\0hello' | sha256sum
    const Id hello = *Id::Parse("8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60");
    EXPECT_EQ(Blob::CopyText("hello").GetId(), hello);
    EXPECT_EQ(Blob::CopyBytes("hello", 5).GetId(), hello);
    EXPECT_EQ(Blob::CopyBytes(std::as_bytes(std::span("hello").first(5))).GetId(), hello);

    std::istringstream lines("skipped\nhello");
    lines.ignore(8);
    EXPECT_EQ(Blob::CopyRest(lines)->GetId(), hello);
    EXPECT_EQ(Blob::CopyRest(lines)->CopyToString(), "");
    std::istringstream failed;
    failed.setstate(std::ios::failbit);
    EXPECT_FALSE(Blob::CopyRest(failed));
    BrokenBuffer broken;
    std::istream unreadable(&broken);
    EXPECT_FALSE(Blob::CopyRest(unreadable));

    auto host = ReaderOf("..hello");
    char skipped[2];
    ASSERT_TRUE(host.Read(skipped, 2));
    EXPECT_EQ(Blob::CopyRest(host)->GetId(), hello);
    auto claimsMore = ReaderOf("hello", 6);
    EXPECT_FALSE(Blob::CopyRest(claimsMore));
    StreamIO none;
    EXPECT_FALSE(Blob::CopyRest(none));

    const std::string large = std::string(200'000, 'x') + '\0' + std::string(100'000, 'y');
    std::istringstream largeStream(large);
    auto blob = std::make_unique<Blob>(*Blob::CopyRest(largeStream));
    EXPECT_EQ(blob->CopyToString(), large);
    std::string joined;
    for (auto const& chunk : blob->GetChunks())
        joined.append(reinterpret_cast<const char*>(chunk.data()), chunk.size());
    EXPECT_EQ(joined, large);
    StreamIO stream = blob->OpenStream();
    blob.reset();
    EXPECT_EQ(stream.GetSize(), large.size());
    EXPECT_EQ(Blob::CopyRest(stream)->CopyToString(), large);
}

TEST(HostIds, ReadEitherCaseAndAreOrderedAsTheirTexts) {
    const std::string digits = "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
    const std::string capitals = "8AEC4E4876F854F688D0EBFC8F37598F38E5FD6903CCCC850CA36591175AEB60";
    ASSERT_TRUE(Id::Parse(digits));
    EXPECT_EQ(Id::Parse(digits), Id::Parse(capitals));
    EXPECT_EQ(Printed(*Id::Parse(capitals)), digits);
    EXPECT_EQ(Printed(Id()), "");
    for (std::string const& wrong : {std::string(), digits.substr(1), digits + "0", "g" + digits.substr(1),
                                     "\xE1" + digits.substr(1), " " + digits.substr(1)})
        EXPECT_FALSE(Id::Parse(wrong)) << wrong;

    const std::set<std::string> texts{"",
                                      "8",
                                      digits,
                                      digits + "0",
                                      digits.substr(0, 63),
                                      "branch",
                                      capitals,
                                      std::string(64, '0'),
                                      std::string(64, 'f'),
                                      "9"};
    std::set<Id> ids;
    for (auto const& text : texts)
        ids.insert(Id(Wide(text)));
    std::vector<std::string> printed;
    printed.reserve(ids.size());
    for (auto const& id : ids)
        printed.push_back(Printed(id));
    EXPECT_EQ(printed, std::vector<std::string>(texts.begin(), texts.end()));
}

TEST(HostIds, HaveShortFormsThatAreUniqueInAStorage) {
    MemObjectsStorage storage;
    std::map<std::string, int> beginnings;
    std::vector<Id> ids;
    for (int number = 0; number < 2'000; ++number) {
        storage.AddBlob(immu::make<Blob>(Blob::CopyText(std::to_string(number))));
        ids.push_back(Blob::CopyText(std::to_string(number)).GetId());
        for (std::size_t length = 1; length <= 64; ++length)
            ++beginnings[Printed(ids.back()).substr(0, length)];
    }
    const ShortIds shortIds(storage);
    for (auto const& id : ids) {
        const std::string shortest = shortIds.ShortFormOf(id, 0);
        EXPECT_EQ(beginnings[shortest], 1);
        ASSERT_GT(shortest.size(), 1U);
        EXPECT_GT(beginnings[shortest.substr(0, shortest.size() - 1)], 1);
        EXPECT_EQ(shortIds.Find(shortest), std::vector<Id>{id});
        EXPECT_EQ(shortIds.ShortFormOf(id), Printed(id).substr(0, std::max<std::size_t>(7, shortest.size())));
    }
    EXPECT_EQ(shortIds.Find("a").size(), static_cast<std::size_t>(beginnings["a"]));
    EXPECT_EQ(shortIds.Find("A"), shortIds.Find("a"));
    EXPECT_TRUE(shortIds.Find("").empty());
    EXPECT_TRUE(shortIds.Find("xyz").empty());
    const Id unknown = Blob::CopyText("unknown").GetId();
    EXPECT_TRUE(shortIds.Find(shortIds.ShortFormOf(unknown)).empty());
    EXPECT_EQ(ShortIds(MemObjectsStorage()).ShortFormOf(unknown), Printed(unknown).substr(0, 7));
}

} // namespace
} // namespace KivVcs
