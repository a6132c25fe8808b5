#pragma once

/// @file
/// A growable byte buffer made of shared chunks.

#include "KivPlatform/Export.h"
#include "KivPlatform/counted_ptr.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace KivUtils::Memory {

/// The chunks of a buffer in order; their concatenation is its content. Each has `data()` and `size()`. Valid until the
/// buffer is changed or destroyed.
class BufferChunks {
public:
    using Chunk = std::span<const std::byte>;

    BufferChunks() noexcept = default;
    explicit BufferChunks(Chunk only) noexcept : only_(only), count_(only.empty() ? 0 : 1) {}
    BufferChunks(const Chunk* chunks, std::size_t count) noexcept : chunks_(chunks), count_(count) {}

    [[nodiscard]] const Chunk* begin() const noexcept { return chunks_ == nullptr ? &only_ : chunks_; }
    [[nodiscard]] const Chunk* end() const noexcept { return begin() + count_; }
    [[nodiscard]] std::size_t size() const noexcept { return count_; }

private:
    Chunk only_;
    const Chunk* chunks_ = nullptr;
    std::size_t count_ = 0;
};

/// A value of bytes, as large as a pointer: copying it shares its chunks and allocates nothing, appending one buffer to
/// another shares large chunks and copies only small ones, and bytes once appended never move while they are shared.
///
/// Everything that appends may throw `std::bad_alloc`, or `std::length_error` for a size that memory cannot hold; the
/// buffer is unchanged then.
///
/// Threads: the counts of shared chunks are atomic, so that distinct buffers may be used from different threads
/// whatever they share; one buffer is used like any value.
class KIVVCS_EXPORT Buffer {
public:
    Buffer() noexcept = default;
    /// @p size zero bytes.
    explicit Buffer(std::uint64_t size);

    /// Appends the @p size bytes at @p data, @p count times over. Memory is taken in exact size for the first bytes and
    /// grows by a bounded share of the content afterwards. The bytes may be the buffer's own.
    void Append(const void* data, std::uint64_t size, std::uint64_t count = 1);

    /// Appends the content of @p other, which may be this buffer; proportional to its chunks, not to its bytes.
    void Append(Buffer const& other) { Append(other, 0, other.GetSize()); }

    /// Appends the @p size bytes of @p other that begin at @p offset, or as many as there are.
    void Append(Buffer const& other, std::uint64_t offset, std::uint64_t size);

    /// Makes the content one chunk of @p size bytes and lets @p fill write them through the `std::byte*` that it is
    /// given.
    template <class Fill>
    [[nodiscard]] static Buffer Build(std::uint64_t size, Fill fill) {
        Buffer result;
        if (size > 0)
            fill(result.Allocate(size));
        return result;
    }

    /// The content as chunks, without copying.
    [[nodiscard]] BufferChunks LockForRead() const noexcept;

    /// The total number of bytes.
    [[nodiscard]] std::uint64_t GetSize() const noexcept;

    /// Copies the @p size bytes that begin at @p offset to @p destination; false, copying nothing, if there are fewer.
    /// Logarithmic in the number of chunks, plus the bytes copied.
    [[nodiscard]] bool Read(std::uint64_t offset, void* destination, std::uint64_t size) const noexcept;

    void Swap(Buffer& other) noexcept { content_.swap(other.content_); }

private:
    /// What a buffer points to: one block of bytes, or a chain of pieces of blocks.
    struct Content : KivPlatform::reference_counted {
        Content(bool chain, std::uint64_t bytes) noexcept : isChain(chain), size(bytes) {}

        bool isChain;
        std::uint64_t size;
    };
    struct Block;
    struct Chain;
    struct DestroyContent {
        void operator()(Content* content) const noexcept { Destroy(content); }
    };
    template <class T>
    using Handle = KivPlatform::counted_ptr<T, DestroyContent>;

    std::byte* Allocate(std::uint64_t size);
    void AppendOnce(const std::byte* data, std::size_t size);
    void AppendPiece(Block* owner, BufferChunks::Chunk piece);
    Chain& WritableChain();
    static void Destroy(Content* content) noexcept;

    Handle<Content> content_;
};

} // namespace KivUtils::Memory
