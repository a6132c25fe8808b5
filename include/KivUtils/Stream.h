#pragma once

/// @file
/// Sequential access to bytes: the stream interface, its owning handle, the reader over it, and streams on buffers.

#include "KivPlatform/Export.h"
#include "KivUtils/Buffer.h"

#include <cstdint>
#include <memory>

namespace KivUtils {

namespace Serialization {
class StreamIO;
}

/// A byte stream with one read position. Hosts implement it to serve packed forms from wherever they keep them.
class KIVVCS_EXPORT IStream {
public:
    IStream() = default;
    IStream(IStream const&) = delete;
    IStream& operator=(IStream const&) = delete;
    virtual ~IStream();

    /// Reads exactly @p size bytes at the position and moves past them; false if they could not be read.
    virtual bool Read(void* destination, std::uint64_t size) = 0;
    /// Appends @p size bytes at the stream's end; false if they could not be written.
    virtual bool Write(const void* source, std::uint64_t size) = 0;
    /// The total number of bytes.
    [[nodiscard]] virtual std::uint64_t GetSize() const = 0;
    /// The number of bytes before the read position.
    [[nodiscard]] virtual std::uint64_t GetPosition() const = 0;
};

/// Owns a stream, or nothing. Move-only. A stream, which moves on when it is read, belongs to one thread at a time.
class Stream {
public:
    Stream() noexcept = default;
    explicit Stream(std::unique_ptr<IStream> stream) noexcept : stream_(std::move(stream)) {}

    explicit operator bool() const noexcept { return stream_ != nullptr; }
    operator IStream*() const noexcept { return stream_.get(); }

private:
    std::unique_ptr<IStream> stream_;
};

/// A stream on a buffer: reads it from its beginning, appends at its end.
class KIVVCS_EXPORT MemStream final : public IStream {
public:
    /// On a buffer that somebody else owns and that must outlive the stream.
    [[nodiscard]] static Stream CreateOnRef(Memory::Buffer& buffer);
    /// On a buffer of its own, which shares the chunks of @p content: nothing has to outlive the stream.
    /// @throws std::bad_alloc
    [[nodiscard]] static Stream CreateOnCopy(Memory::Buffer content);

    bool Read(void* destination, std::uint64_t size) override;
    /// @throws std::bad_alloc
    bool Write(const void* source, std::uint64_t size) override;
    [[nodiscard]] std::uint64_t GetSize() const override { return buffer_.GetSize(); }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

    /// Appends everything from the position on to @p destination, sharing large chunks with it, moves to the end and
    /// returns the number of bytes. @throws std::bad_alloc
    std::uint64_t ShareRest(Memory::Buffer& destination);

    /// The bytes from the position to the end of the chunk that it is in.
    [[nodiscard]] Memory::BufferChunks::Chunk GetNearBytes() const noexcept;
    /// Moves past @p size of them.
    void Skip(std::uint64_t size) noexcept { position_ += size; }

private:
    friend class Serialization::StreamIO;

    explicit MemStream(Memory::Buffer& buffer) noexcept : buffer_(buffer) {}
    explicit MemStream(Memory::Buffer&& content) noexcept : own_(std::move(content)), buffer_(own_) {}

    Memory::Buffer own_;
    Memory::Buffer& buffer_;
    std::uint64_t position_ = 0;
};

namespace Serialization {

/// A sequential reader that owns its stream. Move-only. Test its validity before anything else: on an invalid reader
/// every operation fails or gives 0.
class KIVVCS_EXPORT StreamIO {
public:
    StreamIO() noexcept = default;
    explicit StreamIO(Stream stream) noexcept : stream_(std::move(stream)) {}

    /// Whether there is a stream.
    explicit operator bool() const noexcept { return static_cast<bool>(stream_); }

    /// Reads exactly @p size bytes at the position and moves past them; false if they could not be read.
    bool Read(void* destination, std::uint64_t size);
    [[nodiscard]] std::uint64_t GetSize() const;
    [[nodiscard]] std::uint64_t GetPosition() const;

    /// Copies everything from the position to the end into @p destination, in pieces, so that a stream that claims more
    /// than it holds costs no more memory than what it holds.
    /// @param copied receives the number of bytes copied, unless null.
    /// @return false if there is no stream or destination, or if reading or writing failed on the way.
    bool CopyTo(IStream* destination, std::uint64_t* copied);

    /// Appends everything from the position to the end to @p destination, sharing the large chunks of a stream on a
    /// buffer. @return false if there is no stream, or if reading failed on the way.
    bool ReadRest(Memory::Buffer& destination);

    /// The stream if it is one on a buffer, otherwise null.
    [[nodiscard]] MemStream* GetMemStream() const noexcept;

private:
    Stream stream_;
};

} // namespace Serialization

} // namespace KivUtils
