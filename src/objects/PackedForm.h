#pragma once

#include "KivVcs/Id.h"
#include "KivVcs/SHADigest256.h"

#include <algorithm>
#include <tuple>

namespace KivVcs {

/// What precedes the data in a packed form: the type word, a blank, the data's size in decimal, a zero byte.
void AppendPackedHeader(Buffer& packed, KivStringViewT<char> word, std::uint64_t size);

/// Writes the same to @p out, at most 22 bytes and the word, and returns the end of what was written.
char* WritePackedHeader(KivStringViewT<char> word, std::uint64_t size, char* out) noexcept;

/// How long an identifier is there.
inline constexpr std::size_t idLength = 2 * std::tuple_size_v<Id::Digest>;

/// The text up to its first U+0000, beyond which packed forms show nothing.
inline KivStringViewT<char16_t> UntilZero(KivStringViewT<char16_t> text) noexcept {
    const char16_t* const end = std::find(text.begin(), text.end(), u'\0');
    return text.Left(static_cast<int>(end - text.begin()));
}

/// Writes the digits of @p digest as packed forms show them, and returns the end of what was written. Unlike
/// `Id::GetText` it leaves nothing behind.
char* WriteDigits(Id::Digest const& digest, char* out) noexcept;

/// The identifier of @p text, as packed forms show it. @throws std::bad_alloc
[[nodiscard]] Id ReadId(KivStringViewT<char> text);

/// Computes the identifier of a packed form that is fed piece by piece instead of being put together.
class IdDigest {
public:
    /// Begins the packed form of @p size bytes of data of the type @p word.
    IdDigest(KivStringViewT<char> word, std::uint64_t size) noexcept;

    /// The state after a number of whole blocks, from which another digest of the same beginning can go on.
    using State = std::array<std::uint32_t, 8>;
    static constexpr std::uint64_t blockSize = 64;
    IdDigest(State const& state, std::uint64_t fed) noexcept {
        digest_.state_ = state;
        digest_.fed_ = fed;
    }
    [[nodiscard]] std::uint64_t GetFed() const noexcept { return digest_.fed_; }
    /// @pre `GetFed()` is a number of whole blocks
    [[nodiscard]] State const& GetState() const noexcept { return digest_.state_; }

    void Feed(const void* data, std::size_t size) noexcept { digest_.InitData(data, size); }
    void Feed(Buffer const& data) noexcept;

    [[nodiscard]] Id Finish() noexcept;

private:
    SHADigest256 digest_;
};

} // namespace KivVcs
