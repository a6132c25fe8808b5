#pragma once

/// @file
/// What every object format uses.

#include "KivVcs/Foundation.h"

#include <cstddef>
#include <string_view>
#include <vector>

/// What every object format uses.
namespace KivVcs::Helpers {

/// The SHA-256 digest of @p size bytes as 64 lowercase hexadecimal digits; the empty text if @p data is null, also for
/// size 0.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char16_t> ComputeEncodedSHA256Hash(const void* data, std::size_t size);

/// The same for the content of @p buffer, which may be empty.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char16_t> ComputeEncodedSHA256Hash(Buffer const& buffer);

/// Appends the content of @p source, sharing its large chunks.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, Buffer const& source);
/// Appends the bytes of @p text.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, KivStringViewT<char> text);
template <KivPlatform::StandardEightBitText T>
void AppendToBuffer(Buffer& destination, T const& text) {
    const std::string_view bytes = text;
    destination.Append(bytes.data(), bytes.size());
}
/// Appends the UTF-8 encoding of @p text up to its first U+0000.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, KivStringViewT<char16_t> text);

/// The content as 8-bit text, zero bytes included; at most 2,147,483,647 bytes of it.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char> StringAFromBuffer(Buffer const& buffer);

/// The rest of the stream as 8-bit text, at most 2,147,483,647 bytes of it; empty if the stream is not valid, has no
/// rest, or cannot be read. Takes no more memory than a multiple of what the stream really holds, whatever size it
/// claims.
KIVVCS_EXPORT KivStringT<char> StreamToStringA(StreamIO& stream);

/// Reads the header of a packed form, its zero byte included, which leaves the stream at the first data byte.
/// @return whether the header begins with @p expected; false if the stream is not valid or ends before a zero byte.
KIVVCS_EXPORT bool ShiftObjectIdentifier(StreamIO& stream, KivStringViewT<char> expected);

/// The segments between the "/" of @p path, in order, without the empty ones; views into @p path.
[[nodiscard]] KIVVCS_EXPORT std::vector<KivStringViewT<char16_t>> SplitVcsPath(KivStringViewT<char16_t> path);

} // namespace KivVcs::Helpers
