#pragma once

/// @file
/// The hash function of identifiers.

#include "KivPlatform/Export.h"

#include <array>
#include <cstddef>
#include <cstdint>

namespace KivVcs {

class IdDigest;

/// The SHA-256 digest of FIPS 180-4 over bytes fed in any number of pieces. Uses the processor's SHA instructions where
/// it has them. A value: a copy goes on from the same state. One digest is used by one thread at a time.
class KIVVCS_EXPORT SHADigest256 {
public:
    SHADigest256() noexcept;

    /// Feeds @p size bytes. @return false, feeding nothing, if @p data is null although @p size is not 0.
    bool InitData(const void* data, std::size_t size) noexcept;

    /// Compresses the 64 bytes collected last. `InitData` and `FinalDigest` call it whenever a block is full.
    void Transform() noexcept;

    /// Pads, finishes and writes the 32 digest bytes to @p out; after it, feeding starts a new digest.
    /// @return false, changing nothing, if @p out is null.
    bool FinalDigest(void* out) noexcept;

private:
    friend class IdDigest;

    std::array<std::uint32_t, 8> state_{};
    std::array<std::uint8_t, 64> block_{};
    std::uint64_t fed_ = 0;
};

} // namespace KivVcs
