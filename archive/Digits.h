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

/// Writes the digest that 64 digits stand for; false if they are none.
inline bool ReadDigits(const char* digits, std::byte* digest) noexcept {
    // Without branches, for several digits at once.
    std::array<std::uint8_t, digitCount> values{};
    std::uint8_t wrong = 0;
    for (std::size_t i = 0; i < digitCount; ++i) {
        auto const number = static_cast<std::uint8_t>(digits[i] - '0');
        auto const letter = static_cast<std::uint8_t>(digits[i] - 'a');
        auto const isNumber = static_cast<std::uint8_t>(number < 10);
        wrong |= static_cast<std::uint8_t>(isNumber == 0 && letter >= 6);
        values[i] = isNumber != 0 ? number : static_cast<std::uint8_t>(letter + 10);
    }
    for (std::size_t i = 0; i < digestSize; ++i)
        digest[i] = static_cast<std::byte>(values[2 * i] << 4U | values[2 * i + 1]);
    return wrong == 0;
}

} // namespace KivArchive
