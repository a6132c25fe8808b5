#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

/// The compression function of SHA-256: what changes the state by one 64-byte block after the other.
namespace KivVcs::Sha256 {

inline constexpr std::size_t blockSize = 64;

using State = std::array<std::uint32_t, 8>;

/// Compresses @p count consecutive blocks; they need no alignment.
using Compression = void (*)(State& state, const std::uint8_t* blocks, std::size_t count) noexcept;

/// The compression by the processor's own instructions; null if this processor has none that we know.
[[nodiscard]] Compression FindHardwareCompression() noexcept;
/// The same, or the portable one.
[[nodiscard]] Compression FastestCompression() noexcept;

inline constexpr State initialState{0x6a09e667, 0xbb67ae85, 0x3c6ef372, 0xa54ff53a,
                                    0x510e527f, 0x9b05688c, 0x1f83d9ab, 0x5be0cd19};

alignas(16) inline constexpr std::array<std::uint32_t, 64> roundConstants{
    0x428a2f98, 0x71374491, 0xb5c0fbcf, 0xe9b5dba5, 0x3956c25b, 0x59f111f1, 0x923f82a4, 0xab1c5ed5,
    0xd807aa98, 0x12835b01, 0x243185be, 0x550c7dc3, 0x72be5d74, 0x80deb1fe, 0x9bdc06a7, 0xc19bf174,
    0xe49b69c1, 0xefbe4786, 0x0fc19dc6, 0x240ca1cc, 0x2de92c6f, 0x4a7484aa, 0x5cb0a9dc, 0x76f988da,
    0x983e5152, 0xa831c66d, 0xb00327c8, 0xbf597fc7, 0xc6e00bf3, 0xd5a79147, 0x06ca6351, 0x14292967,
    0x27b70a85, 0x2e1b2138, 0x4d2c6dfc, 0x53380d13, 0x650a7354, 0x766a0abb, 0x81c2c92e, 0x92722c85,
    0xa2bfe8a1, 0xa81a664b, 0xc24b8b70, 0xc76c51a3, 0xd192e819, 0xd6990624, 0xf40e3585, 0x106aa070,
    0x19a4c116, 0x1e376c08, 0x2748774c, 0x34b0bcb5, 0x391c0cb3, 0x4ed8aa4a, 0x5b9cca4f, 0x682e6ff3,
    0x748f82ee, 0x78a5636f, 0x84c87814, 0x8cc70208, 0x90befffa, 0xa4506ceb, 0xbef9a3f7, 0xc67178f2};

/// One round; instead of moving all eight variables along, the callers rotate the arguments.
constexpr void Round(std::uint32_t a, std::uint32_t b, std::uint32_t c, std::uint32_t& d, std::uint32_t e,
                     std::uint32_t f, std::uint32_t g, std::uint32_t& h, std::uint32_t scheduled) noexcept {
    h += (std::rotr(e, 6) ^ std::rotr(e, 11) ^ std::rotr(e, 25)) + (g ^ (e & (f ^ g))) + scheduled;
    d += h;
    h += (std::rotr(a, 2) ^ std::rotr(a, 13) ^ std::rotr(a, 22)) + ((a & b) | (c & (a | b)));
}

/// The compression in plain C++, for processors of either byte order. Inline so that tests can hold it against the
/// hardware's.
constexpr void CompressPortably(State& state, const std::uint8_t* blocks, std::size_t count) noexcept {
    for (; count != 0; --count, blocks += blockSize) {
        std::array<std::uint32_t, 64> schedule{};
        for (std::size_t i = 0; i < 16; ++i) {
            const std::uint8_t* const bytes = blocks + 4 * i;
            schedule[i] =
                std::uint32_t{bytes[0]} << 24 | std::uint32_t{bytes[1]} << 16 | std::uint32_t{bytes[2]} << 8 | bytes[3];
        }
        for (std::size_t i = 16; i < schedule.size(); ++i) {
            std::uint32_t const early = schedule[i - 15];
            std::uint32_t const late = schedule[i - 2];
            schedule[i] = schedule[i - 16] + (std::rotr(early, 7) ^ std::rotr(early, 18) ^ early >> 3) +
                          schedule[i - 7] + (std::rotr(late, 17) ^ std::rotr(late, 19) ^ late >> 10);
        }
        auto [a, b, c, d, e, f, g, h] = state;
        for (std::size_t i = 0; i < schedule.size(); i += 8) {
            Round(a, b, c, d, e, f, g, h, schedule[i] + roundConstants[i]);
            Round(h, a, b, c, d, e, f, g, schedule[i + 1] + roundConstants[i + 1]);
            Round(g, h, a, b, c, d, e, f, schedule[i + 2] + roundConstants[i + 2]);
            Round(f, g, h, a, b, c, d, e, schedule[i + 3] + roundConstants[i + 3]);
            Round(e, f, g, h, a, b, c, d, schedule[i + 4] + roundConstants[i + 4]);
            Round(d, e, f, g, h, a, b, c, schedule[i + 5] + roundConstants[i + 5]);
            Round(c, d, e, f, g, h, a, b, schedule[i + 6] + roundConstants[i + 6]);
            Round(b, c, d, e, f, g, h, a, schedule[i + 7] + roundConstants[i + 7]);
        }
        State const compressed{a, b, c, d, e, f, g, h};
        for (std::size_t i = 0; i < state.size(); ++i)
            state[i] += compressed[i];
    }
}

} // namespace KivVcs::Sha256
