#pragma once

/// @file
/// Compression with zstd, and the differences between stored forms.

#include "Bytes.h"

#include <memory>

namespace KivArchive {

/// Compresses and decompresses. Used by one thread at a time.
class Compressor {
public:
    /// @throws std::bad_alloc
    Compressor();
    Compressor(Compressor const&) = delete;
    Compressor& operator=(Compressor const&) = delete;
    ~Compressor();

    /// Appends the compressed @p bytes to @p to. They may refer to @p prefix, which decompressing them takes, too.
    /// @return false, appending nothing, if they take @p limit bytes or more
    bool Compress(ByteView bytes, ByteView prefix, std::size_t limit, Bytes& to);

    /// Decompresses exactly @p size bytes to @p to. @throws Malformed if @p bytes are no frame of that size
    void Decompress(ByteView bytes, ByteView prefix, std::byte* to, std::size_t size);

private:
    struct Contexts;
    std::unique_ptr<Contexts> contexts_;
};

/// Whether @p bytes claim to be a frame of @p size bytes, and are not too few for it: checked before memory is
/// allocated.
[[nodiscard]] bool CanDecompressTo(ByteView bytes, std::uint64_t size) noexcept;

/// Appends the difference that turns @p base into @p form: how many bytes both begin and end with alike, and the bytes
/// of @p form between: as they are up to @p mostPlain of them, if that stays below @p limit, otherwise compressed with
/// those of @p base as prefix where that makes them fewer.
/// @return false, leaving @p to as it was, if that takes @p limit bytes or more
[[nodiscard]] bool AppendDifference(Compressor& compressor, ByteView base, ByteView form, std::size_t limit,
                                    std::size_t mostPlain, Bytes& to);

/// The form of @p size bytes that @p difference turns @p base into. @throws Malformed
[[nodiscard]] Bytes ApplyDifference(Compressor& compressor, ByteView base, ByteView difference, std::size_t size);

} // namespace KivArchive
