#include "objects/Sha256Lanes.h"

// GCC does not align large vectors on the stack where Windows unwinds it, and with 32 bits there are too few registers.
#if defined(__has_builtin) && defined(__x86_64__) && !defined(_WIN32)
#if __has_builtin(__builtin_shufflevector)
#define KIVVCS_HAS_VECTORS
#endif
#endif

#if defined(KIVVCS_HAS_VECTORS)

#include <cstring>
#include <utility>

// How vectors are passed to functions depends on the processor; all of these functions are inlined.
#pragma GCC diagnostic ignored "-Wpsabi"

namespace KivVcs::Sha256 {

namespace {

/// An element for each message.
using EightLanes [[gnu::vector_size(32)]] = std::uint32_t;
using SixteenLanes [[gnu::vector_size(64)]] = std::uint32_t;

template <class Vector>
constexpr std::size_t lanesOf = sizeof(Vector) / sizeof(std::uint32_t);

template <class Vector>
[[gnu::always_inline]] inline Vector RotateRight(Vector const& words, int bits) noexcept {
    return words >> bits | words << (32 - bits);
}

/// `Round` of all messages.
template <class Vector>
[[gnu::always_inline]] inline void VectorRound(Vector const& a, Vector const& b, Vector const& c, Vector& d,
                                               Vector const& e, Vector const& f, Vector const& g, Vector& h,
                                               Vector const& scheduled) noexcept {
    h += (RotateRight(e, 6) ^ RotateRight(e, 11) ^ RotateRight(e, 25)) + (g ^ (e & (f ^ g))) + scheduled;
    d += h;
    h += (RotateRight(a, 2) ^ RotateRight(a, 13) ^ RotateRight(a, 22)) + ((a & b) | (c & (a | b)));
}

/// Swaps the elements of @p low whose index has the bit @p distance with those of @p high that are as far before.
template <std::size_t distance, class Vector, std::size_t... index>
[[gnu::always_inline]] inline void SwapElements(Vector& low, Vector& high, std::index_sequence<index...>) noexcept {
    constexpr std::size_t count = sizeof...(index);
    Vector const swapped =
        __builtin_shufflevector(low, high, ((index & distance) == 0 ? index : index - distance + count)...);
    high = __builtin_shufflevector(low, high, ((index & distance) == 0 ? index + distance : index + count)...);
    low = swapped;
}

template <std::size_t distance, std::size_t rows, class Vector>
[[gnu::always_inline]] inline void SwapRows(Vector* matrix) noexcept {
    for (std::size_t row = 0; row < rows; ++row) {
        if ((row & distance) == 0)
            SwapElements<distance>(matrix[row], matrix[row + distance], std::make_index_sequence<lanesOf<Vector>>());
    }
}

/// Transposes each square of a matrix that is as high as a square.
template <std::size_t rows, class Vector>
[[gnu::always_inline]] inline void Transpose(Vector* matrix) noexcept {
    if constexpr (rows > 8)
        SwapRows<8, rows>(matrix);
    SwapRows<4, rows>(matrix);
    SwapRows<2, rows>(matrix);
    SwapRows<1, rows>(matrix);
}

/// The words of a block of each message; the sixteen of one message were read beside each other.
template <class Vector>
[[gnu::always_inline]] inline void LoadBlocks(Vector (&schedule)[16], const std::uint8_t* const* blocks,
                                              std::size_t offset) noexcept {
    constexpr std::size_t lanes = lanesOf<Vector>;
    for (std::size_t first = 0; first < 16; first += lanes) {
        for (std::size_t lane = 0; lane < lanes; ++lane) {
            Vector words;
            std::memcpy(&words, blocks[lane] + offset + first * sizeof(std::uint32_t), sizeof words);
            schedule[first + lane] = (RotateRight(words, 8) & 0xff00ff00) | (RotateRight(words, 24) & 0x00ff00ff);
        }
        Transpose<lanes>(schedule + first);
    }
}

template <class Vector>
[[gnu::always_inline]] inline void ExtendSchedule(Vector (&schedule)[16]) noexcept {
    for (std::size_t i = 0; i < 16; ++i) {
        Vector const early = schedule[(i + 1) % 16];
        Vector const late = schedule[(i + 14) % 16];
        schedule[i] += (RotateRight(early, 7) ^ RotateRight(early, 18) ^ early >> 3) + schedule[(i + 9) % 16] +
                       (RotateRight(late, 17) ^ RotateRight(late, 19) ^ late >> 10);
    }
}

/// Between the states of the messages and a vector for each of their eight words.
template <class Vector>
[[gnu::always_inline]] inline void LoadStates(Vector (&words)[8], State const* const* states) noexcept {
    for (std::size_t lane = 0; lane < lanesOf<Vector>; ++lane)
        std::memcpy(reinterpret_cast<char*>(&words[lane % 8]) + lane / 8 * sizeof(State), states[lane], sizeof(State));
    Transpose<8>(words);
}

template <class Vector>
[[gnu::always_inline]] inline void StoreStates(Vector (&words)[8], State* const* states) noexcept {
    Transpose<8>(words);
    for (std::size_t lane = 0; lane < lanesOf<Vector>; ++lane)
        std::memcpy(states[lane], reinterpret_cast<const char*>(&words[lane % 8]) + lane / 8 * sizeof(State),
                    sizeof(State));
}

template <class Vector>
[[gnu::always_inline]] inline void CompressVectors(State* const* states, const std::uint8_t* const* blocks,
                                                   std::size_t count) noexcept {
    Vector state[8];
    LoadStates(state, states);
    for (std::size_t block = 0; block < count; ++block) {
        Vector schedule[16];
        LoadBlocks(schedule, blocks, block * blockSize);
        auto [a, b, c, d, e, f, g, h] = state;
        for (std::size_t first = 0; first < 64; first += 16) {
            if (first != 0)
                ExtendSchedule(schedule);
            for (std::size_t i = 0; i < 16; i += 8) {
                const std::uint32_t* const constants = &roundConstants[first + i];
                VectorRound<Vector>(a, b, c, d, e, f, g, h, schedule[i] + constants[0]);
                VectorRound<Vector>(h, a, b, c, d, e, f, g, schedule[i + 1] + constants[1]);
                VectorRound<Vector>(g, h, a, b, c, d, e, f, schedule[i + 2] + constants[2]);
                VectorRound<Vector>(f, g, h, a, b, c, d, e, schedule[i + 3] + constants[3]);
                VectorRound<Vector>(e, f, g, h, a, b, c, d, schedule[i + 4] + constants[4]);
                VectorRound<Vector>(d, e, f, g, h, a, b, c, schedule[i + 5] + constants[5]);
                VectorRound<Vector>(c, d, e, f, g, h, a, b, schedule[i + 6] + constants[6]);
                VectorRound<Vector>(b, c, d, e, f, g, h, a, schedule[i + 7] + constants[7]);
            }
        }
        Vector const compressed[8]{a, b, c, d, e, f, g, h};
        for (std::size_t i = 0; i < 8; ++i)
            state[i] += compressed[i];
    }
    StoreStates(state, states);
}

[[gnu::target("avx2")]]
void CompressEightLanes(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    CompressVectors<EightLanes>(states, blocks, count);
}

[[gnu::target("avx512f")]]
void CompressSixteenLanes(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    CompressVectors<SixteenLanes>(states, blocks, count);
}

} // namespace

LaneCompression FindEightLanes() noexcept {
    return {8, __builtin_cpu_supports("avx2") ? CompressEightLanes : nullptr};
}

LaneCompression FindSixteenLanes() noexcept {
    return {16, __builtin_cpu_supports("avx512f") ? CompressSixteenLanes : nullptr};
}

} // namespace KivVcs::Sha256

#else

KivVcs::Sha256::LaneCompression KivVcs::Sha256::FindEightLanes() noexcept {
    return {};
}

KivVcs::Sha256::LaneCompression KivVcs::Sha256::FindSixteenLanes() noexcept {
    return {};
}

#endif
