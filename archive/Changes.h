#pragma once

/// @file
/// What all archives do with identifiers and changes.

#include "Bytes.h"
#include "KivArchive/IArchive.h"

#include <KivVcs/SHADigest256.h>

#include <string>

namespace KivArchive {

/// The most bytes that a record may have.
inline constexpr std::uint64_t largestRecord = 16 * largestWholeContent;

/// The digest of an identifier that must be one. @throws std::invalid_argument
[[nodiscard]] Id::Digest const& DigestOf(Id const& id);

/// Checks what no archive can store: identifiers that should be digests and are not, and what is too large.
/// @throws std::invalid_argument, ArchiveError
void CheckChange(Change const& change, std::string const& file);

/// A digest that has been fed the header of a packed form. Its data is next.
[[nodiscard]] KivVcs::SHADigest256 BeginPackedForm(ObjectType type, std::uint64_t size);

[[noreturn]] void ThrowCollected(Id const& id, std::string const& file);

/// Throws if @p progress, which may be null, asks to stop.
void ReportProgress(IProgress* progress, Progress const& state, std::string const& file);

/// The bytes of @p data in one piece of memory, shared if they are in one already.
[[nodiscard]] Buffer Joined(Buffer const& data);

/// The bytes of a buffer that is in one piece.
[[nodiscard]] std::span<const std::byte> BytesOf(Buffer const& joined) noexcept;

/// Adds those of @p further that @p known does not have.
void AddContained(std::vector<ContainedCommit>& known, std::vector<ContainedCommit> const& further);

/// Whether both have the same bytes, or both are nothing.
[[nodiscard]] bool SameValue(std::optional<Buffer> const& left, std::optional<Buffer> const& right);

/// Names as they are stored, and back.
[[nodiscard]] Bytes BytesOfName(KivStringT<char16_t> const& name);
[[nodiscard]] KivStringT<char16_t> NameOfBytes(ByteView bytes);

} // namespace KivArchive
