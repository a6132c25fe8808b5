#include "KivVcs/Foundation.h"
#include "support/HostStream.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>
#include <limits>
#include <random>
#include <stdexcept>
#include <string>
#include <tuple>
#include <vector>

using namespace KivVcs;

namespace {

/// Counts living objects; a copy of a fragile one throws.
struct Tracked {
    explicit Tracked(int number = 7) : value(number) { ++alive; }
    Tracked(Tracked const& other) : value(other.value) {
        if (fragile)
            throw std::runtime_error("no copy");
        ++alive;
    }
    Tracked& operator=(Tracked const&) = default;
    ~Tracked() { --alive; }
    int value;
    static inline int alive = 0;
    static inline bool fragile = false;
};
struct Counted : KivUtils::reference_counted, Tracked {
    using Tracked::Tracked;
    virtual ~Counted() = default;
};
struct Derived : Counted {
    using Counted::Counted;
};

template <class T>
class CowPointer : public testing::Test {};
using Held = testing::Types<Tracked, Counted, Derived>;
TYPED_TEST_SUITE(CowPointer, Held);

TYPED_TEST(CowPointer, CopiesItsObjectOnlyForASharedWriter) {
    using Pointer = cow_ptr<TypeParam>;
    {
        Pointer null;
        EXPECT_EQ(null.write_if_there(), nullptr);
        EXPECT_TRUE(null == nullptr && null.use_count() == 0);
        EXPECT_EQ(null.write()->value, 7);

        auto first = immu::make<TypeParam>(1);
        const auto* const object = first.get();
        EXPECT_EQ(first.write_if_there(), object);
        Pointer second = first;
        EXPECT_EQ(second.use_count(), 2U);
        Tracked::fragile = true;
        EXPECT_THROW(second.write()->value = 2, std::runtime_error);
        Tracked::fragile = false;
        EXPECT_EQ(second, first);
        second.write()->value = 2;
        EXPECT_TRUE(first->value == 1 && first.get() == object && first.use_count() == 1 && second.use_count() == 1);
        second = *&second;
        first = std::move(second);
        EXPECT_EQ(first->value, 2);

        const Pointer adopted(std::make_unique<TypeParam>(3));
        EXPECT_EQ(Pointer(adopted)->value, 3);
        EXPECT_EQ(Pointer(std::unique_ptr<TypeParam>()), nullptr);
    }
    EXPECT_EQ(Tracked::alive, 0);
}

TEST(CowPointer, ConvertsToTheBaseAndHandsItsObjectToTheLastOwner) {
    auto derived = immu::make<Derived>(4);
    cow_ptr<Counted> base = derived;
    EXPECT_EQ(base.get(), derived.get());
    EXPECT_EQ(cow_ptr<Counted>::share(base.get()).use_count(), 3U);
    EXPECT_EQ(derived.release_if_last(), nullptr);
    EXPECT_EQ(derived, nullptr);
    EXPECT_EQ(base.release_if_last()->value, 4);

    struct Named {
        int name = 8;
    };
    struct Both : Tracked, Named {};
    cow_ptr<Both> both(emplace);
    const cow_ptr<Tracked> first = both;
    EXPECT_TRUE(first.use_count() == 2 && first.get() == both.get());
    EXPECT_THROW(cow_ptr<Named>{both}, std::invalid_argument);
    both.reset();
    EXPECT_EQ(first->value, 7);
    EXPECT_EQ(Tracked::alive, 1);
}

std::string ContentOf(Buffer const& buffer) {
    std::string content;
    for (auto const& chunk : buffer.LockForRead())
        content.append(reinterpret_cast<const char*>(chunk.data()), chunk.size());
    return content;
}

/// Buffers that share what they are made of, each beside a text that it should equal.
class RandomBuffers : public testing::Test {
protected:
    static constexpr std::size_t largestPiece = 70'000;

    RandomBuffers() : pool(2 * largestPiece, '\0') {
        for (char& byte : pool)
            byte = static_cast<char>(random());
    }

    std::size_t Below(std::size_t limit) { return random() % limit; }

    void Change(Buffer& buffer, std::string& model) {
        const std::size_t other = Below(4);
        const std::string source = models[other];
        const std::size_t offset = Below(source.size() + 2);
        const std::size_t size = Below(source.size() + 2);
        switch (Below(6)) {
        case 0: {
            const std::size_t sizes[] = {1, 40, 511, 512, 5000, largestPiece};
            const auto bytes = pool.substr(Below(largestPiece), 1 + Below(sizes[Below(6)]));
            buffer.Append(bytes.data(), bytes.size(), 2);
            model += bytes + bytes;
            break;
        }
        case 1:
            buffer.Append(buffers[other], offset, size);
            model += source.substr(std::min(offset, source.size()), size);
            break;
        case 2:
            if (const auto chunks = buffer.LockForRead(); chunks.size() != 0) {
                const auto own = *(chunks.begin() + Below(chunks.size()));
                model.append(std::string(reinterpret_cast<const char*>(own.data()), own.size()));
                buffer.Append(own.data(), own.size());
            }
            break;
        case 3: {
            std::string part(size, '\0');
            ASSERT_EQ(buffers[other].Read(offset, part.data(), size), offset + size <= source.size());
            ASSERT_TRUE(offset + size > source.size() || part == source.substr(offset, size));
            break;
        }
        case 4:
            model = pool.substr(Below(largestPiece), Below(2) == 0 ? 500 : 20'000);
            buffer = Buffer::Adopt(std::string(model));
            break;
        default:
            buffer = buffers[other];
            model = source;
        }
    }

    std::mt19937 random{20};
    std::string pool;
    std::array<Buffer, 4> buffers;
    std::array<std::string, 4> models;
};

TEST_F(RandomBuffers, BehaveLikeTextsWhateverTheyShare) {
    for (int step = 0; step < 3000; ++step) {
        const std::size_t changed = Below(4);
        ASSERT_NO_FATAL_FAILURE(Change(buffers[changed], models[changed]));
        if (models[changed].size() > 200'000) {
            buffers[changed] = Buffer(3);
            models[changed].assign(3, '\0');
        }
        for (std::size_t index = 0; index < buffers.size(); ++index)
            ASSERT_TRUE(buffers[index].GetSize() == models[index].size() && ContentOf(buffers[index]) == models[index]);
    }
}

TEST(Buffer, SharesLargeChunksAndNeverMovesThem) {
    Buffer original(100'000);
    const auto* const bytes = original.LockForRead().begin()->data();
    Buffer framed;
    framed.Append("head", 4);
    framed.Append(original);
    Buffer copy = original;
    original.Append("more", 4);
    copy.Append("another", 7);
    EXPECT_EQ((framed.LockForRead().end() - 1)->data(), bytes);
    EXPECT_EQ(original.LockForRead().begin()->data(), bytes);
    EXPECT_EQ(copy.LockForRead().begin()->data(), bytes);
    const std::string zeros(100'000, '\0');
    EXPECT_TRUE(ContentOf(framed) == "head" + zeros && ContentOf(original) == zeros + "more");
    EXPECT_THROW(copy.Append("x", 1, std::numeric_limits<std::uint64_t>::max()), std::length_error);
    EXPECT_THROW(Buffer{std::numeric_limits<std::uint64_t>::max()}, std::length_error);
    copy.Append(nullptr, 5);
    EXPECT_EQ(ContentOf(copy), zeros + "another");
}

template <class... Memory>
concept Adoptable = requires(Memory&&... memory) { Buffer::Adopt(std::forward<Memory>(memory)...); };

TEST(Buffer, AdoptsWhatIsOwnedAndNothingElse) {
    std::vector<std::byte> bytes(1000, std::byte{'v'});
    const void* const at = bytes.data();
    Buffer adopted = Buffer::Adopt(std::move(bytes));
    const Buffer copy = adopted;
    adopted.Append("more", 4);
    EXPECT_TRUE(bytes.empty() && copy.LockForRead().begin()->data() == at); // NOLINT(bugprone-use-after-move)
    EXPECT_EQ(ContentOf(copy), std::string(1000, 'v'));
    EXPECT_EQ(ContentOf(adopted), std::string(1000, 'v') + "more");

    for (const std::size_t size : {std::size_t{511}, std::size_t{70'000}}) {
        const std::string text(size, 't');
        int given = 0;
        const auto giveBack = [&given](const void* memory) noexcept { given += memory == nullptr ? 100 : 1; };
        std::unique_ptr<const void, decltype(giveBack)> memory(text.data(), giveBack);
        {
            Buffer framed;
            framed.Append(Buffer::Adopt(std::move(memory), text.size()), 1, size);
            EXPECT_EQ(ContentOf(framed), text.substr(1));
            EXPECT_TRUE(memory == nullptr && given == (size < 512 ? 1 : 0)); // NOLINT(bugprone-use-after-move)
        }
        EXPECT_EQ(given, 1);
    }
    EXPECT_EQ(Buffer::Adopt(std::unique_ptr<char[]>(), 5).GetSize(), 0U);

    static_assert(Adoptable<std::string> && Adoptable<std::vector<char>> && Adoptable<std::unique_ptr<char[]>, int>);
    static_assert(!Adoptable<std::string&> && !Adoptable<const std::string> && !Adoptable<std::string_view>);
    static_assert(!Adoptable<std::vector<std::byte>&> && !Adoptable<std::span<std::byte>>);
    static_assert(!Adoptable<std::byte*, int> && !Adoptable<const char*> && !Adoptable<std::vector<int>>);
    static_assert(!Adoptable<std::unique_ptr<char[]>&, int> && !Adoptable<std::unique_ptr<int[]>, int>);
    static_assert(!std::is_convertible_v<std::string, Buffer> &&
                  !std::is_convertible_v<std::vector<std::byte>, Buffer>);
}

TEST(Stream, ReadsAndAppendsAtIndependentPositions) {
    Buffer buffer;
    StreamIO reader(MemStream::CreateOnRef(buffer));
    const Stream writer = MemStream::CreateOnRef(buffer);
    IStream* const sink = writer;
    std::array<char, 8> bytes{};
    EXPECT_TRUE(reader && reader.Read(bytes.data(), 0) && !reader.Read(bytes.data(), 1));
    EXPECT_TRUE(sink->Write("abcdef", 6));
    EXPECT_TRUE(reader.Read(bytes.data(), 4));
    EXPECT_FALSE(reader.Read(bytes.data(), 3));
    EXPECT_TRUE(reader.GetPosition() == 4 && reader.GetSize() == 6 && sink->GetPosition() == 0);
    std::uint64_t copied = 0;
    EXPECT_TRUE(reader.CopyTo(sink, &copied));
    EXPECT_EQ(copied, 2U);
    EXPECT_TRUE(reader.Read(bytes.data() + 4, 2));
    EXPECT_STREQ(bytes.data(), "abcdef");
    EXPECT_EQ(buffer.GetSize(), 8U);

    StreamIO invalid;
    EXPECT_FALSE(invalid || invalid.Read(bytes.data(), 0) || invalid.CopyTo(sink, &copied) || Stream());
    EXPECT_EQ(invalid.GetSize() + invalid.GetPosition() + copied, 0U);
}

TEST(Stream, CopiesWhatAHostHoldsWhateverSizeItClaims) {
    constexpr std::uint64_t largest = std::numeric_limits<std::uint64_t>::max();
    const std::tuple<std::size_t, std::uint64_t, std::size_t, bool, std::size_t> cases[] = {
        {150'000, 150'000, 150'000, true, 150'000},
        {50'000, 7, 50'000, true, 7},
        {3, largest, 9, false, 0},
        {150'000, 150'000, 149'999, false, 131'072}};
    for (auto const& [held, claimed, room, success, expected] : cases) {
        StreamIO reader = ReaderOf(std::string(held, 'x'), claimed);
        HostStream destination("", 0, room);
        std::uint64_t copied = 99;
        EXPECT_EQ(reader.CopyTo(&destination, &copied), success) << claimed;
        EXPECT_EQ(copied, expected);
        EXPECT_EQ(destination.Bytes(), std::string(expected, 'x'));
    }
    EXPECT_FALSE(ReaderOf("abc").CopyTo(nullptr, nullptr));
}

TEST(Time, CountsWholeSecondsAlsoBefore1970AndBeyond2038) {
    const auto at = [](std::int64_t seconds) { return Time::FromTimeT(seconds, TimeZone::Utc); };
    const auto secondsOf = [](Time time) { return time.ToTimeT(TimeZone::Utc); };
    for (std::int64_t seconds : {0LL, 1LL, -1LL, -2208988800LL, 253402300800LL, 922337203685LL, -922337203685LL})
        EXPECT_EQ(secondsOf(at(seconds)), seconds);
    EXPECT_EQ(secondsOf(at(std::numeric_limits<std::int64_t>::min())), -922337203685);
    EXPECT_TRUE(at(1) == Time(10'000'000) && secondsOf(Time(19'999'999)) == 1 && at(-1) > at(4102444800));
    EXPECT_EQ(secondsOf(Time(static_cast<std::uint64_t>(-1))), -1);
    EXPECT_NEAR(static_cast<double>(secondsOf(Time::Now())), static_cast<double>(std::time(nullptr)), 2.0);
}

// Where programs can choose their time zone.
#if !defined(_WIN32) && !defined(__EMSCRIPTEN__)
TEST(Time, KnowsTheLocalOffsetOfAnyTime) {
    const std::int64_t times[] = {-2208988800, -14182940, 1700000000, 1720000000, 2147483648, 4118083200};
    const std::pair<const char*, std::array<std::int64_t, 6>> cases[] = {
        {"UTC", {}},
        {"Asia/Kathmandu", {20476, 19800, 20700, 20700, 20700, 20700}},
        {"America/St_Johns", {-12652, -9000, -12600, -9000, -12600, -9000}},
        {"Pacific/Kiritimati", {-37760, -38400, 50400, 50400, 50400, 50400}}};
    const char* const zoneBefore = std::getenv("TZ");
    const std::string restored = zoneBefore == nullptr ? "" : zoneBefore;
    for (auto const& [zone, offsets] : cases) {
        setenv("TZ", zone, 1);
        for (std::size_t index = 0; index < std::size(times); ++index)
            EXPECT_EQ(DateTime::GetCurrentTimezoneBias(Time::FromTimeT(times[index], TimeZone::Utc)).GetTicks(),
                      offsets[index] * 10'000'000)
                << zone << ' ' << times[index];
    }
    // Given up again, and noticed by the next conversion. Nothing but the offset of the system tells which one that is.
    unsetenv("TZ");
    const auto bias = DateTime::GetCurrentTimezoneBias(Time::FromTimeT(1700000000, TimeZone::Utc));
    tzset();
    const std::time_t now = 1700000000;
    std::tm calendar{};
    localtime_r(&now, &calendar);
    EXPECT_EQ(bias.GetTicks(), calendar.tm_gmtoff * 10'000'000);
    if (zoneBefore != nullptr)
        setenv("TZ", restored.c_str(), 1);
}
#endif

} // namespace
