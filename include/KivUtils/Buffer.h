#pragma once

/// @file
/// A growable byte buffer made of shared chunks.

#include "KivPlatform/Export.h"
#include "KivPlatform/counted_ptr.h"

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

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

/// The types that stand for bytes.
template <class T>
concept OneByte = std::same_as<T, std::byte> || std::same_as<T, char> || std::same_as<T, unsigned char>;

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

    /// A buffer of the bytes that @p bytes owns, which are not copied: they are taken over with all of the container's
    /// capacity, and stay until no buffer shares them. Bytes appended later are stored elsewhere. Fewer than 512 bytes
    /// are copied after all, since that takes less memory. Either way @p bytes is empty afterwards.
    /// @throws std::bad_alloc, leaving @p bytes as it was
    template <OneByte Byte, class Allocator>
    [[nodiscard]] static Buffer Adopt(std::vector<Byte, Allocator>&& bytes) {
        return AdoptFrom(bytes, bytes.size(), [](auto const& owned) { return owned.data(); });
    }
    template <OneByte Byte, class Traits, class Allocator>
    [[nodiscard]] static Buffer Adopt(std::basic_string<Byte, Traits, Allocator>&& text) {
        return AdoptFrom(text, text.size(), [](auto const& owned) { return owned.data(); });
    }
    /// The same for any other memory: the @p size bytes at `memory.get()`, which nobody changes any more and which the
    /// deleter gives back. Null memory has no bytes.
    template <class T, class Deleter>
        requires(std::is_void_v<T> || OneByte<std::remove_cv_t<std::remove_extent_t<T>>>)
    [[nodiscard]] static Buffer Adopt(std::unique_ptr<T, Deleter>&& memory, std::uint64_t size) {
        return AdoptFrom(memory, memory == nullptr ? 0 : size, [](auto const& owned) { return owned.get(); });
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
    enum class Kind : std::uint32_t { Block, Adopted, Chain };

    /// What a buffer points to: one block of bytes of its own, one of adopted bytes, or a chain of pieces of blocks.
    struct Content : KivPlatform::reference_counted {
        Content(Kind what, std::uint64_t bytes, std::size_t further) noexcept
            : kind(what), room(further & maximumRoom), size(bytes) {}

        static constexpr std::uint32_t maximumRoom = (1U << 30U) - 1;

        Kind kind : 2;
        /// How many bytes a block can take behind those that it has.
        std::uint32_t room : 30;
        std::uint64_t size;
    };
    /// Owns adopted bytes.
    struct Owner {
        Owner() noexcept = default;
        Owner(Owner const&) = delete;
        Owner& operator=(Owner const&) = delete;
        virtual ~Owner() = default;
    };
    template <class Memory>
    struct OwnerOf final : Owner {
        std::optional<Memory> memory;
    };
    struct Block;
    struct AdoptedBlock;
    struct Chain;
    struct DestroyContent {
        void operator()(Content* content) const noexcept { Destroy(content); }
    };
    template <class T>
    using Handle = KivPlatform::counted_ptr<T, DestroyContent>;

    /// Smaller pieces are copied: sharing one costs about as much memory as it holds.
    static constexpr std::size_t smallestSharedPiece = 512;

    template <class Memory, class BytesOf>
    [[nodiscard]] static Buffer AdoptFrom(Memory& memory, std::uint64_t size, BytesOf bytesOf) {
        static_assert(std::is_nothrow_move_constructible_v<Memory>, "so that what it holds is never lost half-way");
        Buffer result;
        if (size < smallestSharedPiece) {
            result.Append(bytesOf(memory), size);
            const Memory last(std::move(memory));
            return result;
        }
        auto owner = std::make_unique<OwnerOf<Memory>>();
        auto& owned = owner->memory;
        result.Own(std::move(owner), size);
        result.ShowOwned(bytesOf(owned.emplace(std::move(memory))));
        return result;
    }
    void Own(std::unique_ptr<Owner> owner, std::uint64_t size);
    void ShowOwned(const void* bytes) noexcept;

    std::byte* Allocate(std::uint64_t size);
    void AppendOnce(const std::byte* data, std::size_t size);
    void AppendPiece(Block* owner, BufferChunks::Chunk piece);
    Chain& WritableChain();
    static void Destroy(Content* content) noexcept;

    Handle<Content> content_;
};

} // namespace KivUtils::Memory
