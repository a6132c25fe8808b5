#include "objects/LaneDigests.h"

#include "objects/PackedForm.h"
#include "objects/Sha256Lanes.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <span>

namespace KivVcs {

namespace {

using Sha256::blockSize;
using Sha256::LaneCompression;
using Sha256::maximumLanes;

/// The message of one lane: a packed form and its padding, as runs of blocks that lie in memory one after the other.
class Lane {
public:
    Sha256::State state = Sha256::initialState;
    detail::DataToHash form{};

    /// Begins the message of `form`.
    void Begin() noexcept {
        Buffer const& data = form.Data();
        state = Sha256::initialState;
        auto* const begin = reinterpret_cast<char*>(staged_.data());
        const auto header = static_cast<std::size_t>(WritePackedHeader(form.word, data.GetSize(), begin) - begin);
        messageSize_ = header + data.GetSize();
        // Only what is short is put together as a whole; the rest of what is long is hashed where it lies.
        if (messageSize_ <= maximumStaged)
            return StageAll(header, data);
        chunks_ = data.LockForRead();
        chunk_ = chunks_.begin();
        rest_ = *chunk_;
        isLastRun_ = false;
        StageFrom(header, blockSize);
    }

    /// The blocks that are there; none when the message has ended.
    [[nodiscard]] std::size_t Blocks() const noexcept { return blocks_; }
    [[nodiscard]] const std::uint8_t* Next() const noexcept { return next_; }

    void Skip(std::size_t blocks) noexcept {
        next_ += blocks * blockSize;
        blocks_ -= blocks;
        if (blocks_ == 0 && !isLastRun_)
            FindBlocks();
    }

    [[nodiscard]] Id::Digest Digest() const noexcept {
        Id::Digest digest;
        for (std::size_t index = 0; index < state.size(); ++index) {
            const std::uint32_t word = state[index];
            const std::array<std::uint8_t, 4> bytes{
                static_cast<std::uint8_t>(word >> 24), static_cast<std::uint8_t>(word >> 16),
                static_cast<std::uint8_t>(word >> 8), static_cast<std::uint8_t>(word)};
            std::memcpy(digest.data() + sizeof bytes * index, bytes.data(), sizeof bytes);
        }
        return digest;
    }

private:
    using Chunk = Memory::BufferChunks::Chunk;

    static constexpr std::size_t maximumStaged = 8 * blockSize;

    void StageAll(std::size_t staged, Buffer const& data) noexcept {
        for (auto const& chunk : data.LockForRead()) {
            std::memcpy(staged_.data() + staged, chunk.data(), chunk.size());
            staged += chunk.size();
        }
        next_ = staged_.data();
        blocks_ = Pad(staged) / blockSize;
    }

    void FindBlocks() noexcept {
        if (rest_.size() < blockSize)
            return StageFrom(0, maximumStaged);
        next_ = reinterpret_cast<const std::uint8_t*>(rest_.data());
        blocks_ = rest_.size() / blockSize;
        Consume(blocks_ * blockSize);
    }

    void Consume(std::size_t size) noexcept {
        rest_ = rest_.subspan(size);
        while (rest_.empty() && chunk_ != chunks_.end() && ++chunk_ != chunks_.end())
            rest_ = *chunk_;
    }

    /// Puts blocks together of the @p staged bytes that are there and those that follow, up to @p end, or to the padding.
    void StageFrom(std::size_t staged, std::size_t end) noexcept {
        while (staged < end && !rest_.empty()) {
            const std::size_t taken = std::min(end - staged, rest_.size());
            std::memcpy(staged_.data() + staged, rest_.data(), taken);
            staged += taken;
            Consume(taken);
        }
        if (rest_.empty())
            staged = Pad(staged);
        next_ = staged_.data();
        blocks_ = staged / blockSize;
    }

    /// Ends the message after the @p staged bytes. @return the size of its last blocks
    [[nodiscard]] std::size_t Pad(std::size_t staged) noexcept {
        const std::size_t size = (staged + 9 + blockSize - 1) / blockSize * blockSize;
        staged_[staged] = 0x80;
        std::fill(staged_.begin() + static_cast<std::ptrdiff_t>(staged) + 1,
                  staged_.begin() + static_cast<std::ptrdiff_t>(size) - 8, std::uint8_t{0});
        for (std::size_t i = 0; i < 8; ++i)
            staged_[size - 1 - i] = static_cast<std::uint8_t>(messageSize_ * 8 >> (8 * i));
        isLastRun_ = true;
        return size;
    }

    const std::uint8_t* next_ = nullptr;
    std::size_t blocks_ = 0;
    bool isLastRun_ = false;
    std::uint64_t messageSize_ = 0;
    Memory::BufferChunks chunks_{};
    const Chunk* chunk_ = nullptr;
    /// Of the chunk that is being read, what has not been read yet.
    Chunk rest_{};
    std::array<std::uint8_t, maximumStaged + blockSize> staged_;
};

void CompressOne(Sha256::State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    Sha256::FastestCompression()(*states[0], blocks[0], count);
}

struct Choice {
    /// From how many messages on it is faster than what takes fewer, with idle lanes.
    std::size_t worthwhile;
    LaneCompression compression;
};

/// What is fast on this processor, the one with the most lanes first. Sixteen lanes take as long as eleven messages by the
/// instructions for SHA-256, which are faster than eight lanes; those take as long as two messages in plain C++.
std::array<Choice, 4> const& Choices() noexcept {
    static std::array<Choice, 4> const choices = [] {
        const bool hasInstructions = Sha256::FindHardwareCompression() != nullptr;
        return std::array<Choice, 4>{{{hasInstructions ? 12U : 3U, Sha256::FindSixteenLanes()},
                                      {3, hasInstructions ? LaneCompression() : Sha256::FindEightLanes()},
                                      {2, Sha256::FindPairCompression()},
                                      {1, {1, CompressOne}}}};
    }();
    return choices;
}

LaneCompression const& FastestFor(std::size_t messages) noexcept {
    const auto isFastest = [messages](Choice const& choice) {
        return choice.compression.compress != nullptr && choice.worthwhile <= messages;
    };
    return std::find_if(Choices().begin(), Choices().end(), isFastest)->compression;
}

/// Compresses what is there of the first messages, up to where the first of them has no more blocks in one place.
/// @return of how many messages
std::size_t Compress(std::span<Lane* const> messages) noexcept {
    LaneCompression const& fastest = FastestFor(messages.size());
    messages = messages.first(std::min(messages.size(), fastest.lanes));
    std::size_t count = messages[0]->Blocks();
    for (Lane const* message : messages)
        count = std::min(count, message->Blocks());
    Sha256::State idle{};
    std::array<Sha256::State*, maximumLanes> states;
    std::array<const std::uint8_t*, maximumLanes> blocks;
    states.fill(&idle);
    blocks.fill(messages[0]->Next());
    for (std::size_t i = 0; i < messages.size(); ++i) {
        states[i] = &messages[i]->state;
        blocks[i] = messages[i]->Next();
    }
    fastest.compress(states.data(), blocks.data(), count);
    for (Lane* message : messages)
        message->Skip(count);
    return messages.size();
}

} // namespace

void DigestBesideEachOther(DigestCustomer& customer) {
    std::array<Lane, maximumLanes> lanes;
    std::array<Lane*, maximumLanes> busy{};
    std::size_t busyCount = 0;
    const auto begin = [&](Lane& lane) {
        lane.form = {};
        if (!customer.Next(lane.form))
            return false;
        lane.Begin();
        return true;
    };
    const std::size_t lanesUsed = FastestFor(maximumLanes).lanes;
    while (busyCount < lanesUsed && begin(lanes[busyCount])) {
        busy[busyCount] = &lanes[busyCount];
        ++busyCount;
    }
    while (busyCount > 0) {
        for (std::size_t i = Compress({busy.data(), busyCount}); i-- > 0;) {
            if (busy[i]->Blocks() > 0)
                continue;
            customer.Take(busy[i]->form, busy[i]->Digest());
            if (!begin(*busy[i]))
                busy[i] = busy[--busyCount];
        }
    }
}

} // namespace KivVcs
