#pragma once

/// @file
/// Trees and commits with identifiers of 32 bytes instead of 64 digits, and without what they repeat.

#include "Bytes.h"

#include <optional>

namespace KivArchive {

/// The form of a tree: each entry as one byte (0 a file, 1 a directory), the name, a zero byte and the digest.
/// @return nothing if @p data is not exactly what trees are packed to, so that expanding could not restore it
[[nodiscard]] std::optional<Bytes> CompactTree(ByteView data);

/// The data that a form stands for. @param size its size @throws Malformed if @p form is none of that much data
[[nodiscard]] Bytes ExpandTree(ByteView form, std::uint64_t size);

/// The form of a commit: one byte (1 with, 0 without a parent), the digests, and the text after "author ", without the
/// committer's line, which repeats the author's. Nothing in the same case.
[[nodiscard]] std::optional<Bytes> CompactCommit(ByteView data);
[[nodiscard]] Bytes ExpandCommit(ByteView form, std::uint64_t size);

} // namespace KivArchive
