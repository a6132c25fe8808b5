#include "../src/objects/Sha256Lanes.h"
#include "support/Builders.h"
#include "support/HostStream.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>
#include <stdexcept>
#include <string>
#include <tuple>
#include <vector>

using namespace KivVcs;

namespace {

std::string Hex(SHADigest256& digest) {
    std::array<unsigned char, 32> bytes{};
    EXPECT_TRUE(digest.FinalDigest(bytes.data()));
    return Narrow(DataEncoding::HexEncode(bytes.data(), bytes.size()));
}

std::string const helloId = "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
std::string const emptyBlobId = "473a0f4c3be8a93681a267e3b1e9a7dcda1185436fe141f7749120a303721813";
std::string const emptyDigest = "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855";

TEST(Digest, MatchesThePublishedVectors) {
    const std::tuple<std::string, int, std::string> vectors[] = {
        {"", 1, emptyDigest},
        {"abc", 1, "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
        {"abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq", 1,
         "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1"},
        {"abcdefghbcdefghicdefghijdefghijkefghijklfghijklmghijklmnhijklmnoijklmnopjklmnopqklmnopqrlmnopqrsmnopqrstnopqr"
         "stu",
         1, "cf5b16a778af8380036ce59e7b0492370b249b11e8f07a51afac45037afee9d1"},
        {"a", 1'000'000, "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0"},
        {std::string(1000, 'a'), 1000, "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0"}};
    SHADigest256 digest;
    for (auto const& [message, count, expected] : vectors) {
        for (int round = 0; round < count; ++round)
            EXPECT_TRUE(digest.InitData(message.data(), message.size()));
        EXPECT_EQ(Hex(digest), expected);
    }
    EXPECT_TRUE(digest.InitData(nullptr, 0));
    EXPECT_FALSE(digest.InitData(nullptr, 1) || digest.FinalDigest(nullptr));
    EXPECT_EQ(Hex(digest), emptyDigest);
}

TEST(Digest, DoesNotDependOnHowTheMessageIsSplit) {
    std::string message;
    for (int index = 0; index < 200; ++index)
        message += static_cast<char>(index * 7 + 3);
    // The digests of all beginnings of the message stand for each other's correctness in one digest of their texts.
    std::string digests;
    for (std::size_t length = 0; length <= message.size(); ++length) {
        SHADigest256 whole;
        whole.InitData(message.data(), length);
        digests += Hex(whole);
        for (std::size_t first = 0; first <= length; ++first) {
            const std::size_t second = first + (length - first) / 2;
            SHADigest256 begun;
            begun.InitData(message.data(), first);
            SHADigest256 digest = begun;
            digest.InitData(message.data() + first, second - first);
            digest.InitData(message.data() + second, length - second);
            ASSERT_EQ(Hex(digest), digests.substr(digests.size() - 64)) << length << ' ' << first;
        }
    }
    EXPECT_EQ(Narrow(Helpers::ComputeEncodedSHA256Hash(digests.data(), digests.size())),
              "530566f39d545b371e5360fbfe251c0da6410ba297e67392dfaec0cb575d67ed");
}

TEST(Digest, IsTheSameWithAndWithoutTheProcessorsInstructions) {
    const Sha256::Compression hardware = Sha256::FindHardwareCompression();
#if (defined(__x86_64__) || defined(__i386__)) && !defined(__clang__)
    const bool hasInstructions = __builtin_cpu_supports("sha") && __builtin_cpu_supports("sse4.1");
    EXPECT_EQ(hardware != nullptr, hasInstructions && __builtin_cpu_supports("ssse3"));
#endif
    if (hardware == nullptr)
        GTEST_SKIP() << "this processor has no SHA-256 instructions that the library knows";
    std::mt19937 random(256);
    std::vector<std::uint8_t> bytes(64 * 40 + 16);
    for (int round = 0; round < 500; ++round) {
        for (auto& byte : bytes)
            byte = static_cast<std::uint8_t>(random());
        Sha256::State byInstructions = Sha256::initialState;
        byInstructions[random() % 8] ^= static_cast<std::uint32_t>(random());
        Sha256::State portable = byInstructions;
        const std::size_t misaligned = random() % 16;
        const std::size_t count = random() % 41;
        hardware(byInstructions, bytes.data() + misaligned, count);
        Sha256::CompressPortably(portable, bytes.data() + misaligned, count);
        ASSERT_EQ(byInstructions, portable);
    }
}

TEST(Digest, IsTheSameBesideOthers) {
    const Sha256::LaneCompression compressions[] = {Sha256::FindPairCompression(), Sha256::FindEightLanes(),
                                                    Sha256::FindSixteenLanes()};
    std::mt19937 random(512);
    std::vector<std::uint8_t> bytes(64 * 20 + 64);
    for (auto& byte : bytes)
        byte = static_cast<std::uint8_t>(random());
    for (auto const& [lanes, compress] : compressions) {
        for (std::size_t count = 0; compress != nullptr && count < 10 * 64; ++count) {
            std::vector<Sha256::State> alone(lanes, Sha256::initialState);
            for (auto& state : alone)
                state[random() % 8] = static_cast<std::uint32_t>(random());
            std::vector<Sha256::State> beside(alone);
            std::vector<Sha256::State*> states;
            std::vector<const std::uint8_t*> blocks;
            for (std::size_t lane = 0; lane < lanes; ++lane) {
                states.push_back(&beside[lane]);
                blocks.push_back(&bytes[random() % 640 / 64 * 64 + (count + lane) % 64]);
                Sha256::CompressPortably(alone[lane], blocks[lane], count / 64);
            }
            compress(states.data(), blocks.data(), count / 64);
            ASSERT_EQ(beside, alone) << lanes << ' ' << count;
        }
    }
}

TEST(Id, IsTheTextOfADigestAndHashesASampleOfIt) {
    const Id hello(Wide(helloId));
    EXPECT_EQ(Narrow(hello.GetText()), helloId);
    EXPECT_EQ(Id(BufferOf(std::string("blob 5\0hello", 12))), hello);
    EXPECT_EQ(Id::FromDigest(*hello.GetDigest()), hello);
    EXPECT_EQ(Narrow(Id(Buffer()).GetText()), emptyDigest);
    EXPECT_TRUE(Id() == Id(u"") && Id().IsEmpty() && Id().GetText() == u"" && Id() != hello);

    const std::tuple<KivStringT<char16_t>, std::uint64_t> hashes[] = {
        {u"", 0x42c52834b230ef45},
        {u"a", 0x9308980619d9f69f},
        {u"0123456789", 0x3f4c9555bd5c8f6b},
        {u"0123456789x", 0xcd8646e804c08411},
        {u"\u03B1\uFFFE\uFFFF", 0xf0771853c9063b3c},
        {Wide(emptyDigest), 0x2396d33c32c3f403},
        {Wide(helloId), 0x792c634526131e09},
        {Wide(helloId.substr(0, 63) + "g"), 0x792c634526131e72},
        {u"8AEC4E4876F854F688D0EBFC8F37598F38E5FD6903CCCC850CA36591175AEB60", 0x792bcb13b9d80262}};
    for (auto const& [text, hash] : hashes) {
        EXPECT_EQ(std::hash<Id>()(Id(text)), static_cast<std::size_t>(hash)) << Narrow(text);
        EXPECT_TRUE(Id(text).GetText() == text && Id(text) == Id(text + u""));
        for (auto const& other : hashes)
            EXPECT_EQ(Id(text) == Id(std::get<0>(other)), text == std::get<0>(other));
    }
}

TEST(Blob, PacksItsContentBehindTypeAndSize) {
    const std::tuple<std::string, std::string> blobs[] = {
        {"", emptyBlobId},
        {"hello", helloId},
        {std::string("\0\xFF\x80\n\0", 5), "46a2664cbf80709a83cf58a71211bab15d7815bcd07297d1fabd43f9c89623d9"},
        {std::string(100'000, 'Z'), "59dd672b0f8e28f633da606c83c452689907907f073452e69ac9da474b813ce1"}};
    for (auto const& [content, id] : blobs) {
        const Blob blob = MakeBlob(content);
        EXPECT_EQ(IdText(blob), id);
        const std::string packed = "blob " + std::to_string(content.size()) + '\0' + content;
        EXPECT_EQ(Bytes(blob.GetPackedData()), packed);
        EXPECT_EQ(&blob.GetPackedData(), &blob.GetPackedData());
        auto reader = ReaderOf(packed);
        const auto read = Blob::Deserialize(reader);
        EXPECT_TRUE(*read == blob && !(*read != blob) && Bytes(read->GetData()) == content);
    }
    EXPECT_EQ(MakeBlob(std::get<0>(blobs[2])).ToString(), u"blob 5\\0\\0\xFFFF\xFF80\n\\0");
    EXPECT_TRUE(Blob().GetHeader() == "blob" && Blob().GetStoragePrefix() == "100644");
    EXPECT_TRUE(MakeBlob("a") != MakeBlob("b"));

    Buffer packed = MakeBlob(std::get<0>(blobs[3])).GetPackedData();
    StreamIO reader(MemStream::CreateOnRef(packed));
    const auto read = Blob::Deserialize(reader);
    EXPECT_EQ(read->GetData().LockForRead().begin()->data(), (packed.LockForRead().end() - 1)->data());
}

TEST(Blob, IsReadBackFromWhateverFollowsItsHeader) {
    using namespace std::string_literals;
    const std::pair<std::string, bool> streams[] = {
        {"blob 10\0abc"s, true}, {"blob 1\0abc"s, true}, {"blobby 3\0\0"s, true},
        {"blob\0x"s, true},      {"tree 0\0"s, false},   {"blo\0b 3"s, false},
        {"blob 3"s, false},      {""s, false},           {" blob 0\0"s, false}};
    for (auto const& [bytes, readable] : streams) {
        auto host = ReaderOf(bytes);
        Buffer buffer = BufferOf(bytes);
        StreamIO memory(MemStream::CreateOnRef(buffer));
        for (auto const& blob : {Blob::Deserialize(host), Blob::Deserialize(memory)}) {
            EXPECT_EQ(blob != nullptr, readable) << bytes;
            EXPECT_EQ(blob ? Bytes(blob->GetData()) : "", readable ? bytes.substr(bytes.find('\0') + 1) : "");
        }
    }
    StreamIO invalid;
    auto lying = ReaderOf("blob 3\0abc"s, std::numeric_limits<std::uint64_t>::max());
    EXPECT_TRUE(Blob::Deserialize(invalid) == nullptr && Blob::Deserialize(lying) == nullptr);
}

/// Counts how often its data are asked for, and fails to give them on demand.
class Thing final : public Object {
public:
    KivStringT<char> GetHeader() const override { return "thing"; }
    KivStringT<char> GetStoragePrefix() const override { return ""; }
    Buffer const& GetData() const override {
        ++asked;
        if (broken)
            throw std::runtime_error("no data");
        return data;
    }
    Buffer data = BufferOf("abc");
    bool broken = false;
    mutable int asked = 0;
};

TEST(Object, CachesIdentifierAndPackedFormUntilItsStateIsReset) {
    const std::string id = "9b4e1c02742dc9757c4c278d85bf4667de02b692e2d0ebba4ba08db5422d5fb5";
    Thing thing;
    thing.broken = true;
    EXPECT_THROW(static_cast<void>(thing.GetId()), std::runtime_error);
    EXPECT_THROW(static_cast<void>(thing.GetPackedData()), std::runtime_error);
    thing.broken = false;
    EXPECT_EQ(IdText(thing), id);
    EXPECT_EQ(thing.GetPackedData().GetSize(), 11U);
    const int asked = thing.asked;
    thing.data.Append("d", 1);
    const Thing copy = thing;
    EXPECT_EQ(IdText(thing) + IdText(copy), id + id);
    EXPECT_EQ(Bytes(copy.GetPackedData()), std::string("thing 3\0abc", 11));
    EXPECT_EQ(thing.asked + copy.asked, 2 * asked);
    thing.ResetState();
    EXPECT_EQ(IdText(thing), "dd594ce1e440536e093d2643eb07c045cb29cac1a6e4f5852fd7be8ad140dcb3");
    EXPECT_TRUE(thing != copy && thing == thing && !thing.HasSameId(copy) &&
                Bytes(thing.GetPackedData()).back() == 'd');
}

TEST(Helpers, HashAppendAndReadTexts) {
    EXPECT_EQ(Narrow(Helpers::ComputeEncodedSHA256Hash("", 0)), emptyDigest);
    EXPECT_EQ(Narrow(Helpers::ComputeEncodedSHA256Hash(Buffer())), emptyDigest);
    EXPECT_EQ(Narrow(Helpers::ComputeEncodedSHA256Hash(BufferOf(std::string("blob 5\0hello", 12)))), helloId);
    EXPECT_TRUE(Helpers::ComputeEncodedSHA256Hash(nullptr, 0).IsEmpty() &&
                Helpers::ComputeEncodedSHA256Hash(nullptr, 3).IsEmpty());
    Buffer buffer;
    Helpers::AppendToBuffer(buffer, KivStringViewT<char>("a\0b", 3));
    Helpers::AppendToBuffer(buffer, KivStringViewT<char16_t>(u"\u00E9\0z", 3));
    Helpers::AppendToBuffer(buffer, KivStringViewT<char16_t>(u"\0z", 2));
    Helpers::AppendToBuffer(buffer, BufferOf("!"));
    const std::string content("a\0b\xC3\xA9!", 6);
    EXPECT_EQ(Bytes(buffer), content);
    EXPECT_EQ(Helpers::StringAFromBuffer(buffer), KivStringViewT<char>(content.data(), 6));

    const std::string large(300'000, 'l');
    const std::tuple<std::string, std::uint64_t, std::size_t> streams[] = {
        {large, large.size(), 299'997},
        {large, 70'000, 69'997},
        {"abc", 3, 0},
        {"abc", std::numeric_limits<std::uint64_t>::max(), 0}};
    for (auto const& [bytes, claimed, length] : streams) {
        auto reader = ReaderOf(bytes, claimed);
        std::array<char, 3> skipped{};
        ASSERT_TRUE(reader.Read(skipped.data(), 3));
        EXPECT_EQ(Helpers::StreamToStringA(reader), bytes.substr(3, length).c_str()) << claimed;
    }
    StreamIO invalid;
    EXPECT_TRUE(Helpers::StreamToStringA(invalid).IsEmpty());
}

TEST(Helpers, ShiftAHeaderAndCompareItsBeginning) {
    using namespace std::string_literals;
    const std::tuple<std::string, const char*, bool, std::uint64_t> headers[] = {
        {"commit 7\0x"s, "commit ", true, 9}, {"committed\0x"s, "commit ", false, 10},
        {"commit\0x"s, "commit ", false, 7},  {"xcommit \0"s, "commit ", false, 9},
        {"\0tree"s, "tree", false, 1},        {"\0"s, "", true, 1},
        {"tree 1"s, "tree", false, 6}};
    for (auto const& [bytes, expected, matches, position] : headers) {
        auto reader = ReaderOf(bytes);
        EXPECT_EQ(Helpers::ShiftObjectIdentifier(reader, expected), matches) << bytes;
        EXPECT_EQ(reader.GetPosition(), position) << bytes;
    }
    auto whole = ReaderOf("blob 3\0abc"s);
    EXPECT_TRUE(Helpers::ShiftObjectIdentifier(whole, {"blob 3\0", 7}));

    Buffer pieces(100'000);
    pieces.Append(BufferOf("blob 3\0abc"s + std::string(99'990, ' ') + "tree 1\0"s));
    StreamIO later(MemStream::CreateOnRef(pieces));
    std::string skipped(100'000, 'x');
    EXPECT_TRUE(later.Read(skipped.data(), skipped.size()) && Helpers::ShiftObjectIdentifier(later, "blob "));
}

TEST(Helpers, SplitPathsIntoViewsOfTheirSegments) {
    const std::tuple<const char16_t*, std::vector<const char16_t*>> paths[] = {{u"", {}},
                                                                               {u"/", {}},
                                                                               {u"//", {}},
                                                                               {u"a", {u"a"}},
                                                                               {u"/a//b/c/", {u"a", u"b", u"c"}},
                                                                               {u"a\\b/ /..", {u"a\\b", u" ", u".."}}};
    for (auto const& [text, expected] : paths) {
        const KivStringViewT<char16_t> path(text);
        const auto segments = Helpers::SplitVcsPath(path);
        ASSERT_EQ(segments.size(), expected.size()) << Narrow(path);
        for (std::size_t index = 0; index < segments.size(); ++index) {
            EXPECT_EQ(segments[index], expected[index]);
            EXPECT_TRUE(segments[index].begin() >= path.begin() && segments[index].end() <= path.end());
        }
    }
}

} // namespace
