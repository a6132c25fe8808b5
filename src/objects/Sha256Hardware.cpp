#include "objects/Sha256Compression.h"

#if defined(__GNUC__) && (defined(__x86_64__) || defined(__i386__))

#include <cpuid.h>
#include <immintrin.h>
#include <utility>

namespace KivVcs::Sha256 {

namespace {

/// Four rounds, and the part of the message schedule that later rounds need: the unit behind `_mm_sha256rnds2_epu32` is
/// slow, so the schedule's instructions run in its shadow.
template <std::size_t group>
[[gnu::target("sha,sse4.1,ssse3"), gnu::always_inline]]
inline void FourRounds(__m128i& abef, __m128i& cdgh, __m128i (&message)[4]) noexcept {
    __m128i& current = message[group % 4];
    __m128i& previous = message[(group + 3) % 4];
    __m128i& next = message[(group + 1) % 4];
    __m128i const constants = _mm_load_si128(reinterpret_cast<const __m128i*>(&roundConstants[4 * group]));
    __m128i const scheduled = _mm_add_epi32(current, constants);
    cdgh = _mm_sha256rnds2_epu32(cdgh, abef, scheduled);
    if constexpr (group >= 3 && group < 15)
        next = _mm_sha256msg2_epu32(_mm_add_epi32(next, _mm_alignr_epi8(current, previous, 4)), current);
    abef = _mm_sha256rnds2_epu32(abef, cdgh, _mm_shuffle_epi32(scheduled, 0x0e));
    if constexpr (group >= 1 && group < 13)
        previous = _mm_sha256msg1_epu32(previous, current);
}

template <std::size_t... groups>
[[gnu::target("sha,sse4.1,ssse3"), gnu::always_inline]]
inline void AllRounds(__m128i& abef, __m128i& cdgh, __m128i (&message)[4], std::index_sequence<groups...>) noexcept {
    (FourRounds<groups>(abef, cdgh, message), ...);
}

[[gnu::target("sha,sse4.1,ssse3")]]
void CompressByInstructions(State& state, const std::uint8_t* blocks, std::size_t count) noexcept {
    __m128i const bigEndian = _mm_set_epi64x(0x0c0d0e0f08090a0b, 0x0405060700010203);
    auto* const words = reinterpret_cast<__m128i*>(state.data());
    __m128i const badc = _mm_shuffle_epi32(_mm_loadu_si128(words), 0xb1);
    __m128i const hgfe = _mm_shuffle_epi32(_mm_loadu_si128(words + 1), 0x1b);
    __m128i abef = _mm_alignr_epi8(badc, hgfe, 8);
    __m128i cdgh = _mm_blend_epi16(hgfe, badc, 0xf0);

    for (; count != 0; --count, blocks += blockSize) {
        __m128i const abefBefore = abef;
        __m128i const cdghBefore = cdgh;
        __m128i message[4];
        for (std::size_t i = 0; i < 4; ++i)
            message[i] = _mm_shuffle_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(blocks) + i), bigEndian);
        AllRounds(abef, cdgh, message, std::make_index_sequence<16>());
        abef = _mm_add_epi32(abef, abefBefore);
        cdgh = _mm_add_epi32(cdgh, cdghBefore);
    }

    __m128i const feba = _mm_shuffle_epi32(abef, 0x1b);
    __m128i const dchg = _mm_shuffle_epi32(cdgh, 0xb1);
    _mm_storeu_si128(words, _mm_blend_epi16(feba, dchg, 0xf0));
    _mm_storeu_si128(words + 1, _mm_alignr_epi8(dchg, feba, 8));
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

} // namespace KivVcs::Sha256

// Clang offers the intrinsics only where everything is compiled for processors that have the instructions.
#elif defined(__AARCH64EL__) && (defined(__ARM_FEATURE_SHA2) || (defined(__linux__) && !defined(__clang__)))

#include <arm_neon.h>

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

inline void FourRounds(uint32x4_t& abcd, uint32x4_t& efgh, uint32x4_t message,
                       const std::uint32_t* constants) noexcept {
    uint32x4_t const scheduled = vaddq_u32(message, vld1q_u32(constants));
    uint32x4_t const abcdBefore = abcd;
    abcd = vsha256hq_u32(abcd, efgh, scheduled);
    efgh = vsha256h2q_u32(efgh, abcdBefore, scheduled);
}

/// The four words that follow the sixteen given.
inline uint32x4_t Extend(uint32x4_t first, uint32x4_t second, uint32x4_t third, uint32x4_t fourth) noexcept {
    return vsha256su1q_u32(vsha256su0q_u32(first, second), third, fourth);
}

inline uint32x4_t LoadBigEndian(const std::uint8_t* bytes) noexcept {
    return vreinterpretq_u32_u8(vrev32q_u8(vld1q_u8(bytes)));
}

void CompressByInstructions(State& state, const std::uint8_t* blocks, std::size_t count) noexcept {
    uint32x4_t abcd = vld1q_u32(state.data());
    uint32x4_t efgh = vld1q_u32(state.data() + 4);
    for (; count != 0; --count, blocks += blockSize) {
        uint32x4_t const abcdBefore = abcd;
        uint32x4_t const efghBefore = efgh;
        uint32x4_t first = LoadBigEndian(blocks);
        uint32x4_t second = LoadBigEndian(blocks + 16);
        uint32x4_t third = LoadBigEndian(blocks + 32);
        uint32x4_t fourth = LoadBigEndian(blocks + 48);
        const std::uint32_t* constants = roundConstants.data();
        for (int round = 0; round < 48; round += 16, constants += 16) {
            FourRounds(abcd, efgh, first, constants);
            first = Extend(first, second, third, fourth);
            FourRounds(abcd, efgh, second, constants + 4);
            second = Extend(second, third, fourth, first);
            FourRounds(abcd, efgh, third, constants + 8);
            third = Extend(third, fourth, first, second);
            FourRounds(abcd, efgh, fourth, constants + 12);
            fourth = Extend(fourth, first, second, third);
        }
        FourRounds(abcd, efgh, first, constants);
        FourRounds(abcd, efgh, second, constants + 4);
        FourRounds(abcd, efgh, third, constants + 8);
        FourRounds(abcd, efgh, fourth, constants + 12);
        abcd = vaddq_u32(abcd, abcdBefore);
        efgh = vaddq_u32(efgh, efghBefore);
    }
    vst1q_u32(state.data(), abcd);
    vst1q_u32(state.data() + 4, efgh);
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

#else

KivVcs::Sha256::Compression KivVcs::Sha256::FindHardwareCompression() noexcept {
    return nullptr;
}

#endif
