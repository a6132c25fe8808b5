#pragma once

#include "objects/Sha256Compression.h"

/// Compressing several messages beside each other: one stream leaves most of a processor's units idle.
namespace KivVcs::Sha256 {

inline constexpr std::size_t maximumLanes = 16;

/// A compression that takes blocks of several messages at once.
struct LaneCompression {
    /// How many messages it takes.
    std::size_t lanes = 1;
    /// Compresses @p count consecutive blocks of each message; they need no alignment. Idle lanes have a state and blocks,
    /// too.
    void (*compress)(State* const* states, const std::uint8_t* const* blocks, std::size_t count) noexcept = nullptr;
};

/// Two messages by the processor's own instructions; null if this processor has none that we know.
[[nodiscard]] LaneCompression FindPairCompression() noexcept;

/// As many messages as a vector has elements, in eight and in sixteen lanes; null if this processor has no such vectors, or
/// we do not know that it is faster for them.
[[nodiscard]] LaneCompression FindEightLanes() noexcept;
[[nodiscard]] LaneCompression FindSixteenLanes() noexcept;

} // namespace KivVcs::Sha256
