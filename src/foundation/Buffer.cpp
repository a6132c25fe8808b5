#include "KivUtils/Buffer.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>
#include <vector>

namespace KivUtils::Memory {

namespace {

/// A single block grows by copying up to this size; beyond it new bytes go into further blocks and nothing is copied.
constexpr std::size_t largestCopiedBlock = 65536;

/// Room for what follows @p written bytes at the end of @p content: it doubles, so that few bytes between pieces that are
/// shared do not take room for many, up to a part of the whole.
std::size_t RoomForGrowth(std::uint64_t content, std::uint64_t written) noexcept {
    return static_cast<std::size_t>(
        std::clamp<std::uint64_t>(2 * written, 512, std::clamp<std::uint64_t>(content / 8, 4096, 1U << 20U)));
}

} // namespace

/// Bytes in the same allocation as their header, unless they are adopted. They are written once; what a piece shows never
/// changes.
struct Buffer::Block : Content {
    using Content::Content;

    /// A block of @p size bytes, which are the caller's to write, with room for @p further ones.
    static Handle<Block> Make(std::size_t size, std::size_t further) {
        if (size > std::numeric_limits<std::size_t>::max() / 2)
            throw std::length_error("buffer larger than the address space");
        return Handle<Block>(::new (::operator new(sizeof(Block) + size + further)) Block(Kind::Block, size, further));
    }

    [[nodiscard]] const std::byte* Bytes() const noexcept;
    [[nodiscard]] BufferChunks::Chunk Chunk() const noexcept { return {Bytes(), static_cast<std::size_t>(size)}; }

    /// Where a block that has not adopted its bytes has them. @pre nobody else sees what is written
    [[nodiscard]] std::byte* OwnBytes() noexcept { return reinterpret_cast<std::byte*>(this + 1); }
    void Write(const std::byte* data, std::size_t count) noexcept {
        std::memcpy(OwnBytes() + size, data, count);
        size += count;
        room = (room - count) & maximumRoom;
    }
};

struct Buffer::AdoptedBlock final : Block {
    AdoptedBlock(std::unique_ptr<Owner> keeper, std::uint64_t count) noexcept
        : Block(Kind::Adopted, count, 0), owner(std::move(keeper)) {}

    std::unique_ptr<Owner> owner;
    const std::byte* bytes = nullptr;
};

const std::byte* Buffer::Block::Bytes() const noexcept {
    return kind == Kind::Adopted ? static_cast<AdoptedBlock const*>(this)->bytes
                                 : reinterpret_cast<const std::byte*>(this + 1);
}

struct Buffer::Chain final : Content {
    Chain() noexcept : Content(Kind::Chain, 0, 0) {}

    /// Makes room for one more piece, so that adding it cannot fail half-way.
    void Reserve() {
        const std::size_t count = chunks.size() + 1;
        if (count <= chunks.capacity() && count <= ends.capacity() && count <= owners.capacity())
            return;
        const std::size_t more = std::max(count, 2 * chunks.size());
        chunks.reserve(more);
        ends.reserve(more);
        owners.reserve(more);
    }

    /// Adds a piece of a block. @pre there is room
    void Add(Handle<Block> owner, BufferChunks::Chunk piece) noexcept {
        size += piece.size();
        chunks.push_back(piece);
        ends.push_back(size);
        owners.push_back(std::move(owner));
    }

    void Share(Block* owner, BufferChunks::Chunk piece) {
        Reserve();
        Add(Handle<Block>(owner), piece);
    }

    /// The bytes that can be written after the last piece without anybody else seeing them.
    [[nodiscard]] std::size_t RoomAtEnd() const noexcept {
        if (owners.empty() || owners.back().use_count() != 1)
            return 0;
        const auto* pieceEnd = chunks.back().data() + chunks.back().size();
        return pieceEnd == owners.back()->Bytes() + owners.back()->size ? owners.back()->room : 0;
    }

    /// The size of the last piece if nobody else has it.
    [[nodiscard]] std::size_t OwnAtEnd() const noexcept {
        return owners.empty() || owners.back().use_count() != 1 ? 0 : chunks.back().size();
    }

    void WriteAtEnd(const std::byte* data, std::size_t count) noexcept {
        owners.back()->Write(data, count);
        chunks.back() = {chunks.back().data(), chunks.back().size() + count};
        size += count;
        ends.back() = size;
    }

    std::vector<BufferChunks::Chunk> chunks;
    std::vector<std::uint64_t> ends;
    std::vector<Handle<Block>> owners;
};

void Buffer::Destroy(Content* content) noexcept {
    switch (content->kind) {
    case Kind::Chain:
        delete static_cast<Chain*>(content);
        return;
    case Kind::Adopted:
        delete static_cast<AdoptedBlock*>(content);
        return;
    case Kind::Block:
        break;
    }
    auto* block = static_cast<Block*>(content);
    block->~Block();
    ::operator delete(block);
}

void Buffer::Own(std::unique_ptr<Owner> owner, std::uint64_t size) {
    content_ = Handle<Content>(std::make_unique<AdoptedBlock>(std::move(owner), size).release());
}

void Buffer::ShowOwned(const void* bytes) noexcept {
    static_cast<AdoptedBlock*>(content_.get())->bytes = static_cast<const std::byte*>(bytes);
}

Buffer::Buffer(std::uint64_t size) {
    if (size > 0)
        std::memset(Allocate(size), 0, static_cast<std::size_t>(size));
}

std::uint64_t Buffer::GetSize() const noexcept {
    return content_ ? content_->size : 0;
}

BufferChunks Buffer::LockForRead() const noexcept {
    if (!content_)
        return {};
    if (content_->kind != Kind::Chain)
        return BufferChunks(static_cast<Block*>(content_.get())->Chunk());
    auto const& chain = static_cast<Chain const&>(*content_);
    return {chain.chunks.data(), chain.chunks.size()};
}

bool Buffer::Read(std::uint64_t offset, void* destination, std::uint64_t size) const noexcept {
    if (offset > GetSize() || size > GetSize() - offset)
        return false;
    if (size == 0)
        return true;
    auto* out = static_cast<std::byte*>(destination);
    if (content_->kind != Kind::Chain) {
        std::memcpy(out, static_cast<Block*>(content_.get())->Bytes() + offset, static_cast<std::size_t>(size));
        return true;
    }
    auto const& chain = static_cast<Chain const&>(*content_);
    auto piece =
        static_cast<std::size_t>(std::upper_bound(chain.ends.begin(), chain.ends.end(), offset) - chain.ends.begin());
    auto rest = static_cast<std::size_t>(size);
    for (auto skip = static_cast<std::size_t>(offset - (chain.ends[piece] - chain.chunks[piece].size())); rest > 0;
         ++piece) {
        const auto chunk = chain.chunks[piece].subspan(std::exchange(skip, 0));
        const std::size_t count = std::min(rest, chunk.size());
        std::memcpy(out, chunk.data(), count);
        out += count;
        rest -= count;
    }
    return true;
}

std::byte* Buffer::Allocate(std::uint64_t size) {
    if (size > std::numeric_limits<std::size_t>::max() / 2)
        throw std::length_error("buffer larger than the address space");
    auto block = Block::Make(static_cast<std::size_t>(size), 0);
    std::byte* const bytes = block->OwnBytes();
    content_ = std::move(block);
    return bytes;
}

void Buffer::Append(const void* data, std::uint64_t size, std::uint64_t count) {
    if (data == nullptr || size == 0 || count == 0)
        return;
    if (count > std::numeric_limits<std::size_t>::max() / 2 / size)
        throw std::length_error("buffer larger than the address space");
    // Appended to a copy, which shares the old bytes: they stay where they are if they are the source, and nothing has
    // happened if memory runs out. A single append needs no copy: it changes nothing before it has all that it needs.
    if (count == 1) {
        AppendOnce(static_cast<const std::byte*>(data), static_cast<std::size_t>(size));
        return;
    }
    Buffer result(*this);
    while (count-- > 0)
        result.AppendOnce(static_cast<const std::byte*>(data), static_cast<std::size_t>(size));
    Swap(result);
}

void Buffer::AppendOnce(const std::byte* data, std::size_t size) {
    const bool unique = content_.use_count() == 1;
    if (unique && content_->kind != Kind::Chain && content_->room >= size) {
        static_cast<Block*>(content_.get())->Write(data, size);
        return;
    }
    const auto held = static_cast<std::size_t>(GetSize());
    if ((!content_ || content_->kind != Kind::Chain) && held + size <= largestCopiedBlock) {
        // The first bytes are taken as the only ones; from the second append on the room doubles.
        const std::size_t joined = held + size;
        auto grown =
            Block::Make(joined, held == 0 ? 0 : std::max(joined, std::min(2 * held, largestCopiedBlock)) - joined);
        if (held > 0)
            std::memcpy(grown->OwnBytes(), static_cast<Block*>(content_.get())->Bytes(), held);
        std::memcpy(grown->OwnBytes() + held, data, size);
        content_ = std::move(grown);
        return;
    }
    if (!content_) {
        std::memcpy(Allocate(size), data, size);
        return;
    }
    Chain& chain = WritableChain();
    chain.Reserve();
    const std::size_t fitting = std::min(size, chain.RoomAtEnd());
    Handle<Block> further;
    if (size > fitting) {
        const std::size_t rest = size - fitting;
        further = Block::Make(rest, std::max(rest, RoomForGrowth(held, chain.OwnAtEnd())) - rest);
        std::memcpy(further->OwnBytes(), data + fitting, rest);
    }
    if (fitting > 0)
        chain.WriteAtEnd(data, fitting);
    if (further) {
        const auto piece = further->Chunk();
        chain.Add(std::move(further), piece);
    }
}

void Buffer::Append(Buffer const& other, std::uint64_t offset, std::uint64_t size) {
    size = std::min(size, other.GetSize() - std::min(offset, other.GetSize()));
    if (size == 0)
        return;
    if (!content_) {
        // The other buffer is another one then, and keeps what it shows meanwhile.
        if (size == other.GetSize()) {
            *this = other;
            return;
        }
        if (other.content_->kind != Kind::Chain) {
            auto* block = static_cast<Block*>(other.content_.get());
            return AppendPiece(
                block, block->Chunk().subspan(static_cast<std::size_t>(offset), static_cast<std::size_t>(size)));
        }
    }
    const Buffer source(other);
    if (source.content_->kind != Kind::Chain) {
        auto* block = static_cast<Block*>(source.content_.get());
        AppendPiece(block, block->Chunk().subspan(static_cast<std::size_t>(offset), static_cast<std::size_t>(size)));
        return;
    }
    // Several pieces go to a copy, so that nothing has happened if memory runs out between two of them.
    auto const& chain = static_cast<Chain const&>(*source.content_);
    Buffer result(*this);
    auto index =
        static_cast<std::size_t>(std::upper_bound(chain.ends.begin(), chain.ends.end(), offset) - chain.ends.begin());
    for (auto skip = static_cast<std::size_t>(offset - (chain.ends[index] - chain.chunks[index].size())); size > 0;
         ++index) {
        auto piece = chain.chunks[index].subspan(std::exchange(skip, 0));
        piece = piece.first(static_cast<std::size_t>(std::min<std::uint64_t>(piece.size(), size)));
        result.AppendPiece(chain.owners[index].get(), piece);
        size -= piece.size();
    }
    Swap(result);
}

void Buffer::AppendPiece(Block* owner, BufferChunks::Chunk piece) {
    if (piece.size() >= smallestSharedPiece)
        WritableChain().Share(owner, piece);
    else
        AppendOnce(piece.data(), piece.size());
}

Buffer::Chain& Buffer::WritableChain() {
    if (content_ && content_->kind == Kind::Chain && content_.use_count() == 1)
        return static_cast<Chain&>(*content_);
    auto chain = std::make_unique<Chain>();
    if (content_ && content_->kind == Kind::Chain) {
        chain = std::make_unique<Chain>(static_cast<Chain const&>(*content_));
    } else if (content_) {
        auto* block = static_cast<Block*>(content_.get());
        chain->Share(block, block->Chunk());
    }
    content_ = Handle<Content>(chain.release());
    return static_cast<Chain&>(*content_);
}

} // namespace KivUtils::Memory
