#pragma once

/// @file
/// Trees and commits with their identifiers in 32 bytes instead of 64 digits, and without what they repeat.

#include "Bytes.h"

#include <optional>

namespace KivArchive {

/// Each entry as one byte (0 a file, 1 a directory), the name, a zero byte and the digest. None if @p data is not what
/// trees are packed to, byte for byte, so that unpacking could not give it back.
[[nodiscard]] std::optional<Bytes> CompactTree(ByteView data);

/// The inverse. @param size the size of the data @throws Malformed if @p form is no compact form of that much data
[[nodiscard]] Bytes ExpandTree(ByteView form, std::uint64_t size);

/// One byte (1 with, 0 without a parent), the digests, and the text behind "author ", without the line of the
/// committer, who is the author. None as above.
[[nodiscard]] std::optional<Bytes> CompactCommit(ByteView data);
[[nodiscard]] Bytes ExpandCommit(ByteView form, std::uint64_t size);

} // namespace KivArchive
