#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <type_traits>

namespace KivUtils {

/// The lowercase hexadecimal digit of a number below 16.
template <class Unit>
[[nodiscard]] constexpr Unit HexDigit(unsigned number) noexcept {
    return static_cast<Unit>("0123456789abcdef"[number]);
}

/// Writes two digits for each byte, and returns the end of what was written.
template <class Unit, std::size_t byteCount>
Unit* WriteHexDigits(std::array<std::uint8_t, byteCount> const& bytes, Unit* out) noexcept {
#if defined(__wasm__) && !defined(__wasm_simd128__)
    // Without vectors, eight digits at a time in one word.
    static_assert(byteCount % 4 == 0);
    constexpr std::uint64_t ones = 0x0101010101010101U;
    for (std::size_t index = 0; index < byteCount; index += 4) {
        std::uint64_t word = 0;
        for (std::size_t byte = 0; byte < 4; ++byte)
            word |= std::uint64_t{bytes[index + byte]} << 16 * byte;
        word = (word >> 4U & 0x000F000F000F000FU) | (word & 0x000F000F000F000FU) << 8U;
        word += ones * '0' + ((word + ones * 6) >> 4U & ones) * ('a' - '0' - 10);
        for (std::size_t digit = 0; digit < 8; ++digit)
            *out++ = static_cast<Unit>(word >> 8 * digit & 0xFF);
    }
    return out;
#else
    // Plain arithmetic in two loops of fixed length, which compilers turn into a few vector instructions.
    std::array<std::uint8_t, 2 * byteCount> numbers;
    for (std::size_t index = 0; index < byteCount; ++index) {
        numbers[2 * index] = static_cast<std::uint8_t>(bytes[index] >> 4);
        numbers[2 * index + 1] = static_cast<std::uint8_t>(bytes[index] & 15);
    }
    for (std::size_t index = 0; index < numbers.size(); ++index)
        out[index] = static_cast<Unit>(numbers[index] + (numbers[index] > 9 ? 'a' - 10 : '0'));
    return out + numbers.size();
#endif
}

/// Reads two lowercase digits for each byte; false if there is anything else among them.
template <class Unit, std::size_t byteCount>
[[nodiscard]] bool ReadHexDigits(const Unit* digits, std::array<std::uint8_t, byteCount>& bytes) noexcept {
    using Number = std::conditional_t<sizeof(Unit) == 1, std::uint8_t, std::uint16_t>;
    static_assert(sizeof(Unit) == sizeof(Number));
    // As above: every digit is taken, and a wrong one noticed at the end.
    std::array<Number, 2 * byteCount> numbers;
    std::memcpy(numbers.data(), digits, sizeof numbers);
    constexpr auto all = static_cast<Number>(-1);
    Number wrong = 0;
    for (Number& digit : numbers) {
        const auto number = static_cast<Number>(digit - '0');
        const auto letter = static_cast<Number>(digit - 'a');
        const auto isNumber = static_cast<Number>(number <= 9 ? all : 0);
        const auto isLetter = static_cast<Number>(letter <= 5 ? all : 0);
        wrong = static_cast<Number>(wrong | ~(isNumber | isLetter));
        digit = static_cast<Number>((number & isNumber) | ((letter + 10) & isLetter));
    }
    for (std::size_t index = 0; index < byteCount; ++index)
        bytes[index] = static_cast<std::uint8_t>(numbers[2 * index] << 4 | numbers[2 * index + 1]);
    return wrong == 0;
}

} // namespace KivUtils
