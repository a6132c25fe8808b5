#pragma once

/// @file
/// zstd, and the difference of one form to another one.

#include "Bytes.h"

#include <memory>

namespace KivArchive {

/// Compresses and decompresses; used by one thread at a time.
class Compressor {
public:
    /// @throws std::bad_alloc
    Compressor();
    Compressor(Compressor const&) = delete;
    Compressor& operator=(Compressor const&) = delete;
    ~Compressor();

    /// Appends the compressed @p bytes to @p to, in which they may refer to @p prefix.
    /// @return false, appending nothing, if that does not take less than @p limit bytes
    bool Compress(ByteView bytes, ByteView prefix, std::size_t limit, Bytes& to);

    /// Decompresses exactly @p size bytes to @p to. @throws Malformed if @p bytes hold no such frame
    void Decompress(ByteView bytes, ByteView prefix, std::byte* to, std::size_t size);

private:
    struct Contexts;
    std::unique_ptr<Contexts> contexts_;
};

/// Whether @p bytes claim to be a frame of @p size bytes and may be; asked before memory is taken for them.
[[nodiscard]] bool CanDecompressTo(ByteView bytes, std::uint64_t size) noexcept;

/// Appends the difference that makes @p form of @p base: how many bytes both begin and end with alike, and what is
/// between, compressed with the base's part for reference.
/// @return false, leaving @p to as it was, if that takes @p limit bytes or more
[[nodiscard]] bool AppendDifference(Compressor& compressor, ByteView base, ByteView form, std::size_t limit, Bytes& to);

/// The form of @p size bytes that @p difference makes of @p base. @throws Malformed
[[nodiscard]] Bytes ApplyDifference(Compressor& compressor, ByteView base, ByteView difference, std::size_t size);

} // namespace KivArchive
