#pragma once

/// @file
/// What all archives do with identifiers and changes before they store anything.

#include "Bytes.h"
#include "KivArchive/IArchive.h"

#include <KivVcs/SHADigest256.h>

#include <string>

namespace KivArchive {

/// A record has at most so many bytes.
inline constexpr std::uint64_t largestRecord = 16 * largestWholeContent;

/// The digest of an identifier that must be one. @throws std::invalid_argument
[[nodiscard]] Id::Digest const& DigestOf(Id const& id);

/// Throws unless @p change can be stored anywhere: all its identifiers are digests where they have to be, and nothing is
/// too large. @throws std::invalid_argument, ArchiveError
void CheckChange(Change const& change, std::string const& file);

/// A digest that has taken the header of a packed form, and goes on with its data.
[[nodiscard]] KivVcs::SHADigest256 BeginPackedForm(ObjectType type, std::uint64_t size);

[[noreturn]] void ThrowCollected(Id const& id, std::string const& file);

/// Throws if @p progress, which may be null, asks to stop.
void ReportProgress(IProgress* progress, Progress const& state, std::string const& file);

/// The content as one piece of memory, sharing @p data where it is one already.
[[nodiscard]] Buffer Joined(Buffer const& data);

/// The bytes of a buffer that is one piece.
[[nodiscard]] std::span<const std::byte> BytesOf(Buffer const& joined) noexcept;

/// Adds to @p known those of @p further that it does not have.
void AddContained(std::vector<ContainedCommit>& known, std::vector<ContainedCommit> const& further);

/// Whether both are the same bytes, or both none.
[[nodiscard]] bool SameValue(std::optional<Buffer> const& left, std::optional<Buffer> const& right);

/// The bytes that names are stored as, and the name that they stand for.
[[nodiscard]] Bytes BytesOfName(KivStringT<char16_t> const& name);
[[nodiscard]] KivStringT<char16_t> NameOfBytes(ByteView bytes);

} // namespace KivArchive
