#include "Fuzzing.h"

#include "objects/Sha256Lanes.h"

#include <array>

/// Hashing several messages beside each other, held against one stream.
///
/// An input is a sequence of messages of 0 to 300 bytes, each a byte for where it begins, at any alignment, two for its
/// length, and one for how it is cut and what is put before it.

namespace KivVcs::Fuzzing {
namespace {

struct Message {
    std::size_t begin;
    std::size_t length;
    unsigned cut;
};

std::vector<std::uint8_t> MakeSource() {
    std::vector<std::uint8_t> source(2048);
    for (std::size_t index = 0; index < source.size(); ++index)
        source[index] = static_cast<std::uint8_t>(index * 2654435761U >> 13U);
    return source;
}

/// The whole blocks of as many messages as there are lanes, where they lie.
void CompareCompressions(std::vector<std::uint8_t> const& source, std::vector<Message> const& messages) {
    for (auto const& [lanes, compress] :
         {Sha256::FindPairCompression(), Sha256::FindEightLanes(), Sha256::FindSixteenLanes()}) {
        for (std::size_t first = 0; compress != nullptr && first < messages.size(); first += lanes) {
            std::array<Sha256::State, Sha256::maximumLanes> beside;
            beside.fill(Sha256::initialState);
            auto alone = beside;
            std::array<Sha256::State*, Sha256::maximumLanes> states{};
            std::array<const std::uint8_t*, Sha256::maximumLanes> blocks{};
            const std::size_t count = messages[first].length / Sha256::blockSize;
            for (std::size_t lane = 0; lane < lanes; ++lane) {
                states[lane] = &beside[lane];
                blocks[lane] = &source[messages[(first + lane) % messages.size()].begin];
                Sha256::CompressPortably(alone[lane], blocks[lane], count);
            }
            compress(states.data(), blocks.data(), count);
            Require(beside == alone, "lanes compress as one stream does");
        }
    }
}

void CompareIdentifiers(std::vector<std::uint8_t> const& source, std::vector<Message> const& messages) {
    Buffer shared;
    shared.Append(source.data(), source.size());
    std::vector<Blob> blobs;
    std::vector<Object const*> objects;
    for (auto const& [begin, length, cut] : messages) {
        Buffer content;
        // Large pieces are hashed where they lie, and what follows them is put together.
        if (cut % 4 == 3)
            content.Append(shared, begin, 512 + cut);
        content.Append(source.data() + begin, std::min<std::size_t>(length, cut));
        content.Append(source.data() + begin, length - std::min<std::size_t>(length, cut));
        blobs.emplace_back(std::move(content));
    }
    for (Blob const& blob : blobs)
        objects.push_back(&blob);
    Identify(objects);
    for (Blob const& blob : blobs) {
        Require(blob.GetKnownDigest() != nullptr, "what is identified is known");
        Require(blob.GetId() == Id(Blob(blob.GetData()).GetPackedData()), "lanes hash as one stream does");
    }
}

void Run(Input input) {
    static const std::vector<std::uint8_t> source = MakeSource();
    std::vector<Message> messages;
    while (!input.IsUsedUp()) {
        const std::size_t begin = input.Byte();
        const std::size_t length = (input.Byte() + 256 * (input.Byte() % 2)) % 301;
        messages.push_back({begin, length, input.Byte()});
    }
    CompareCompressions(source, messages);
    CompareIdentifiers(source, messages);
}

} // namespace
} // namespace KivVcs::Fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    KivVcs::Fuzzing::Run({data, size});
    return 0;
}
