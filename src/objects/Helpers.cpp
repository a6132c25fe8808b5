#include "KivVcs/Helpers.h"

#include "KivVcs/SHADigest256.h"
#include "objects/PathComponents.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>

namespace KivVcs::Helpers {

namespace {

KivStringT<char16_t> EncodedDigest(SHADigest256& digest) {
    std::array<std::byte, 32> bytes;
    digest.FinalDigest(bytes.data());
    return DataEncoding::HexEncode(bytes.data(), bytes.size());
}

constexpr std::uint64_t longestText = std::numeric_limits<int>::max();

} // namespace

KivStringT<char16_t> ComputeEncodedSHA256Hash(const void* data, std::size_t size) {
    SHADigest256 digest;
    if (data == nullptr || !digest.InitData(data, size))
        return {};
    return EncodedDigest(digest);
}

KivStringT<char16_t> ComputeEncodedSHA256Hash(Buffer const& buffer) {
    SHADigest256 digest;
    for (auto const& chunk : buffer.LockForRead())
        digest.InitData(chunk.data(), chunk.size());
    return EncodedDigest(digest);
}

void AppendToBuffer(Buffer& destination, Buffer const& source) {
    destination.Append(source);
}

void AppendToBuffer(Buffer& destination, KivStringViewT<char> text) {
    destination.Append(text.GetString(), static_cast<std::uint64_t>(text.GetLength()));
}

void AppendToBuffer(Buffer& destination, KivStringViewT<char16_t> text) {
    const int end = text.Find(KivStringViewT<char16_t>(u"", 1));
    AppendToBuffer(destination, DataEncoding::Utf8Encode(end < 0 ? text : text.Left(end)));
}

KivStringT<char> StringAFromBuffer(Buffer const& buffer) {
    const auto length = static_cast<int>(std::min(buffer.GetSize(), longestText));
    return KivStringT<char>::Build(length, [&buffer, length](char* text) {
        // The length is the buffer's own, so that reading it cannot fail.
        static_cast<void>(buffer.Read(0, text, static_cast<std::uint64_t>(length)));
    });
}

KivStringT<char> StreamToStringA(StreamIO& stream) {
    if (!stream || stream.GetPosition() >= stream.GetSize())
        return {};
    std::uint64_t rest = std::min(stream.GetSize() - stream.GetPosition(), longestText);
    // The claimed size is believed piece by piece only: each is at most 64 KiB longer than what has been read already.
    KivStringT<char> text;
    for (std::uint64_t piece = 65536; rest > 0; piece *= 2) {
        piece = std::min(piece, rest);
        bool complete = false;
        const auto part = KivStringT<char>::Build(static_cast<int>(piece), [&stream, &complete, piece](char* bytes) {
            complete = stream.Read(bytes, piece);
        });
        if (!complete)
            return {};
        if (text.IsEmpty())
            text = part;
        else
            text += part;
        rest -= piece;
    }
    return text;
}

bool ShiftObjectIdentifier(StreamIO& stream, KivStringViewT<char> expected) {
    // Bytes that lie in memory are looked at there instead of being read one by one.
    if (MemStream* const bytes = stream.GetMemStream()) {
        const auto near = bytes->GetNearBytes();
        const void* const end = near.empty() ? nullptr : std::memchr(near.data(), 0, near.size());
        if (end != nullptr) {
            const auto length = static_cast<std::size_t>(static_cast<const std::byte*>(end) - near.data()) + 1;
            const auto compared = std::min(length, static_cast<std::size_t>(expected.GetLength()));
            bytes->Skip(length);
            return KivStringViewT<char>(reinterpret_cast<const char*>(near.data()), static_cast<int>(compared)) ==
                   expected;
        }
    }
    // Nothing but the expected beginning is compared, so that a header of any length takes no memory.
    bool matches = true;
    for (int position = 0;;) {
        char byte = '\0';
        if (!stream.Read(&byte, 1))
            return false;
        if (position < expected.GetLength())
            matches = byte == expected[position++] && matches;
        if (byte == '\0')
            return matches && position == expected.GetLength();
    }
}

std::vector<KivStringViewT<char16_t>> SplitVcsPath(KivStringViewT<char16_t> path) {
    std::vector<KivStringViewT<char16_t>> segments;
    // Deeper paths are rare, and growing from nothing would allocate at every other segment.
    segments.reserve(8);
    ForEachPathComponent(path, [&segments](KivStringViewT<char16_t> segment) { segments.push_back(segment); });
    return segments;
}

} // namespace KivVcs::Helpers
