#include "objects/Sha256Compression.h"
#include "objects/Sha256Lanes.h"

#if defined(__GNUC__) && (defined(__x86_64__) || defined(__i386__))

#include <cpuid.h>
#include <immintrin.h>
#include <utility>

namespace KivVcs::Sha256 {

namespace {

/// What is held of each message: two messages fill the registers, and each keeps the units busy that the other waits for.
template <std::size_t lanes>
using Lanes = __m128i[lanes];

/// Four rounds, and the part of the message schedule that later rounds need: the unit behind `_mm_sha256rnds2_epu32` is
/// slow, so the schedule's instructions run in its shadow.
template <std::size_t group, std::size_t lanes>
[[gnu::target("sha,sse4.1,ssse3"), gnu::always_inline]]
inline void FourRounds(Lanes<lanes>& abef, Lanes<lanes>& cdgh, Lanes<lanes> (&message)[4]) noexcept {
    auto& current = message[group % 4];
    auto& previous = message[(group + 3) % 4];
    auto& next = message[(group + 1) % 4];
    __m128i const constants = _mm_load_si128(reinterpret_cast<const __m128i*>(&roundConstants[4 * group]));
    Lanes<lanes> scheduled;
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        scheduled[lane] = _mm_add_epi32(current[lane], constants);
        cdgh[lane] = _mm_sha256rnds2_epu32(cdgh[lane], abef[lane], scheduled[lane]);
    }
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        if constexpr (group >= 3 && group < 15) {
            __m128i const earlier = _mm_alignr_epi8(current[lane], previous[lane], 4);
            next[lane] = _mm_sha256msg2_epu32(_mm_add_epi32(next[lane], earlier), current[lane]);
        }
        abef[lane] = _mm_sha256rnds2_epu32(abef[lane], cdgh[lane], _mm_shuffle_epi32(scheduled[lane], 0x0e));
        if constexpr (group >= 1 && group < 13)
            previous[lane] = _mm_sha256msg1_epu32(previous[lane], current[lane]);
    }
}

template <std::size_t lanes, std::size_t... groups>
[[gnu::target("sha,sse4.1,ssse3"), gnu::always_inline]]
inline void AllRounds(Lanes<lanes>& abef, Lanes<lanes>& cdgh, Lanes<lanes> (&message)[4],
                      std::index_sequence<groups...>) noexcept {
    (FourRounds<groups, lanes>(abef, cdgh, message), ...);
}

template <std::size_t lanes>
[[gnu::target("sha,sse4.1,ssse3"), gnu::always_inline]]
inline void CompressMessages(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    __m128i const bigEndian = _mm_set_epi64x(0x0c0d0e0f08090a0b, 0x0405060700010203);
    Lanes<lanes> abef;
    Lanes<lanes> cdgh;
    const std::uint8_t* next[lanes];
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        auto* const words = reinterpret_cast<const __m128i*>(states[lane]->data());
        __m128i const badc = _mm_shuffle_epi32(_mm_loadu_si128(words), 0xb1);
        __m128i const hgfe = _mm_shuffle_epi32(_mm_loadu_si128(words + 1), 0x1b);
        abef[lane] = _mm_alignr_epi8(badc, hgfe, 8);
        cdgh[lane] = _mm_blend_epi16(hgfe, badc, 0xf0);
        next[lane] = blocks[lane];
    }

    for (; count != 0; --count) {
        Lanes<lanes> abefBefore;
        Lanes<lanes> cdghBefore;
        Lanes<lanes> message[4];
        for (std::size_t lane = 0; lane < lanes; ++lane) {
            abefBefore[lane] = abef[lane];
            cdghBefore[lane] = cdgh[lane];
            for (std::size_t i = 0; i < 4; ++i)
                message[i][lane] =
                    _mm_shuffle_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(next[lane]) + i), bigEndian);
            next[lane] += blockSize;
        }
        AllRounds<lanes>(abef, cdgh, message, std::make_index_sequence<16>());
        for (std::size_t lane = 0; lane < lanes; ++lane) {
            abef[lane] = _mm_add_epi32(abef[lane], abefBefore[lane]);
            cdgh[lane] = _mm_add_epi32(cdgh[lane], cdghBefore[lane]);
        }
    }

    for (std::size_t lane = 0; lane < lanes; ++lane) {
        auto* const words = reinterpret_cast<__m128i*>(states[lane]->data());
        __m128i const feba = _mm_shuffle_epi32(abef[lane], 0x1b);
        __m128i const dchg = _mm_shuffle_epi32(cdgh[lane], 0xb1);
        _mm_storeu_si128(words, _mm_blend_epi16(feba, dchg, 0xf0));
        _mm_storeu_si128(words + 1, _mm_alignr_epi8(dchg, feba, 8));
    }
}

[[gnu::target("sha,sse4.1,ssse3")]]
void CompressByInstructions(State& state, const std::uint8_t* blocks, std::size_t count) noexcept {
    State* const states[]{&state};
    CompressMessages<1>(states, &blocks, count);
}

[[gnu::target("sha,sse4.1,ssse3")]]
void CompressPair(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    CompressMessages<2>(states, blocks, count);
}

} // namespace

Compression FindHardwareCompression() noexcept {
    constexpr unsigned ssse3 = 1U << 9;
    constexpr unsigned sse41 = 1U << 19;
    constexpr unsigned sha = 1U << 29;
    unsigned a = 0;
    unsigned b = 0;
    unsigned c = 0;
    unsigned d = 0;
    if (__get_cpuid(1, &a, &b, &c, &d) == 0 || (c & ssse3) == 0 || (c & sse41) == 0)
        return nullptr;
    if (__get_cpuid_count(7, 0, &a, &b, &c, &d) == 0 || (b & sha) == 0)
        return nullptr;
    return CompressByInstructions;
}

LaneCompression FindPairCompression() noexcept {
    return {2, FindHardwareCompression() != nullptr ? CompressPair : nullptr};
}

} // namespace KivVcs::Sha256

// Clang offers the intrinsics only where everything is compiled for processors that have the instructions.
#elif defined(__AARCH64EL__) && (defined(__ARM_FEATURE_SHA2) || (defined(__linux__) && !defined(__clang__)))

#include <arm_neon.h>
#include <utility>

#if defined(__linux__)
#include <asm/hwcap.h>
#include <sys/auxv.h>
#endif

#if !defined(__clang__)
#pragma GCC push_options
#pragma GCC target("+crypto")
#endif

namespace KivVcs::Sha256 {

namespace {

/// The four words that follow the sixteen given.
inline uint32x4_t Extend(uint32x4_t first, uint32x4_t second, uint32x4_t third, uint32x4_t fourth) noexcept {
    return vsha256su1q_u32(vsha256su0q_u32(first, second), third, fourth);
}

inline uint32x4_t LoadBigEndian(const std::uint8_t* bytes) noexcept {
    return vreinterpretq_u32_u8(vrev32q_u8(vld1q_u8(bytes)));
}

template <std::size_t lanes>
using Lanes = uint32x4_t[lanes];

/// Four rounds, and the words in place of those that they used up.
template <std::size_t group, std::size_t lanes>
[[gnu::always_inline]] inline void FourRounds(Lanes<lanes>& abcd, Lanes<lanes>& efgh,
                                              Lanes<lanes> (&message)[4]) noexcept {
    uint32x4_t const constants = vld1q_u32(&roundConstants[4 * group]);
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        uint32x4_t& current = message[group % 4][lane];
        uint32x4_t const scheduled = vaddq_u32(current, constants);
        uint32x4_t const abcdBefore = abcd[lane];
        abcd[lane] = vsha256hq_u32(abcd[lane], efgh[lane], scheduled);
        efgh[lane] = vsha256h2q_u32(efgh[lane], abcdBefore, scheduled);
        if constexpr (group < 12)
            current = Extend(current, message[(group + 1) % 4][lane], message[(group + 2) % 4][lane],
                             message[(group + 3) % 4][lane]);
    }
}

template <std::size_t lanes, std::size_t... groups>
[[gnu::always_inline]] inline void AllRounds(Lanes<lanes>& abcd, Lanes<lanes>& efgh, Lanes<lanes> (&message)[4],
                                             std::index_sequence<groups...>) noexcept {
    (FourRounds<groups, lanes>(abcd, efgh, message), ...);
}

template <std::size_t lanes>
[[gnu::always_inline]] inline void CompressMessages(State* const* states, const std::uint8_t* const* blocks,
                                                    std::size_t count) noexcept {
    Lanes<lanes> abcd;
    Lanes<lanes> efgh;
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        abcd[lane] = vld1q_u32(states[lane]->data());
        efgh[lane] = vld1q_u32(states[lane]->data() + 4);
    }
    for (std::size_t block = 0; block < count; ++block) {
        Lanes<lanes> abcdBefore;
        Lanes<lanes> efghBefore;
        Lanes<lanes> message[4];
        for (std::size_t lane = 0; lane < lanes; ++lane) {
            abcdBefore[lane] = abcd[lane];
            efghBefore[lane] = efgh[lane];
            for (std::size_t i = 0; i < 4; ++i)
                message[i][lane] = LoadBigEndian(blocks[lane] + block * blockSize + 16 * i);
        }
        AllRounds<lanes>(abcd, efgh, message, std::make_index_sequence<16>());
        for (std::size_t lane = 0; lane < lanes; ++lane) {
            abcd[lane] = vaddq_u32(abcd[lane], abcdBefore[lane]);
            efgh[lane] = vaddq_u32(efgh[lane], efghBefore[lane]);
        }
    }
    for (std::size_t lane = 0; lane < lanes; ++lane) {
        vst1q_u32(states[lane]->data(), abcd[lane]);
        vst1q_u32(states[lane]->data() + 4, efgh[lane]);
    }
}

void CompressByInstructions(State& state, const std::uint8_t* blocks, std::size_t count) noexcept {
    State* const states[]{&state};
    CompressMessages<1>(states, &blocks, count);
}

void CompressPair(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept {
    CompressMessages<2>(states, blocks, count);
}

} // namespace

} // namespace KivVcs::Sha256

#if !defined(__clang__)
#pragma GCC pop_options
#endif

KivVcs::Sha256::Compression KivVcs::Sha256::FindHardwareCompression() noexcept {
#if defined(__linux__)
    if ((getauxval(AT_HWCAP) & HWCAP_SHA2) == 0)
        return nullptr;
#endif
    return CompressByInstructions;
}

KivVcs::Sha256::LaneCompression KivVcs::Sha256::FindPairCompression() noexcept {
    return {2, FindHardwareCompression() != nullptr ? CompressPair : nullptr};
}

#else

KivVcs::Sha256::Compression KivVcs::Sha256::FindHardwareCompression() noexcept {
    return nullptr;
}

KivVcs::Sha256::LaneCompression KivVcs::Sha256::FindPairCompression() noexcept {
    return {};
}

#endif
