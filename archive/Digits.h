#pragma once

/// @file
/// Digests as the 64 lowercase hexadecimal digits of packed forms.

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace KivArchive {

inline constexpr std::size_t digestSize = 32;
inline constexpr std::size_t digitCount = 2 * digestSize;

/// Writes the digest that 64 digits stand for. @return false if one of them is no such digit
inline bool ReadDigits(const char* digits, std::byte* digest) noexcept {
    // Without a branch for each digit, so that compilers read several at once.
    std::array<std::uint8_t, digitCount> values{};
    std::uint8_t wrong = 0;
    for (std::size_t i = 0; i < digitCount; ++i) {
        auto const number = static_cast<std::uint8_t>(digits[i] - '0');
        auto const letter = static_cast<std::uint8_t>(digits[i] - 'a');
        auto const isNumber = static_cast<std::uint8_t>(number < 10);
        wrong |= static_cast<std::uint8_t>(isNumber == 0 && letter >= 6);
        values[i] = isNumber != 0 ? number : static_cast<std::uint8_t>(letter + 10);
    }
    // Two digits as one number, so that these are put together for several bytes at once, too.
    constexpr bool isFirstLower = std::endian::native == std::endian::little;
    std::array<std::uint16_t, digestSize> pairs{};
    std::memcpy(pairs.data(), values.data(), values.size());
    for (std::size_t i = 0; i < digestSize; ++i)
        digest[i] = static_cast<std::byte>(isFirstLower ? pairs[i] << 4U | pairs[i] >> 8U : pairs[i] >> 4U | pairs[i]);
    return wrong == 0;
}

} // namespace KivArchive
