#pragma once

/// @file
/// Digests as the 64 lowercase hexadecimal digits that packed forms show.

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace KivArchive {

inline constexpr std::size_t digestSize = 32;
inline constexpr std::size_t digitCount = 2 * digestSize;

/// What a character stands for; `noDigit` for those that are none.
inline constexpr std::uint8_t noDigit = 0x80;
inline constexpr auto digitValues = [] {
    std::array<std::uint8_t, 256> values{};
    values.fill(noDigit);
    for (std::uint8_t digit = 0; digit < 10; ++digit)
        values[static_cast<std::size_t>('0') + digit] = digit;
    for (std::uint8_t digit = 10; digit < 16; ++digit)
        values[static_cast<std::size_t>('a') + digit - 10U] = digit;
    return values;
}();

/// Writes the digest that 64 digits stand for; false if they are none.
inline bool ReadDigits(const char* digits, std::byte* digest) noexcept {
    unsigned wrong = 0;
    for (std::size_t i = 0; i < digestSize; ++i) {
        unsigned const high = digitValues[static_cast<unsigned char>(digits[2 * i])];
        unsigned const low = digitValues[static_cast<unsigned char>(digits[2 * i + 1])];
        wrong |= high | low;
        digest[i] = static_cast<std::byte>(high << 4U | low);
    }
    return (wrong & noDigit) == 0;
}

} // namespace KivArchive
