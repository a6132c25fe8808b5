#include "KivVcs/SHADigest256.h"
#include "objects/Sha256Compression.h"

#include <algorithm>

namespace KivVcs {

Sha256::Compression Sha256::FastestCompression() noexcept {
    static Compression const fastest = [] {
        Compression const hardware = FindHardwareCompression();
        return hardware != nullptr ? hardware : CompressPortably;
    }();
    return fastest;
}

SHADigest256::SHADigest256() noexcept : state_(Sha256::initialState) {}

bool SHADigest256::InitData(const void* data, std::size_t size) noexcept {
    if (size == 0)
        return true;
    if (data == nullptr)
        return false;
    const auto* bytes = static_cast<const std::uint8_t*>(data);
    std::size_t const collected = fed_ % Sha256::blockSize;
    fed_ += size;
    if (collected != 0) {
        std::size_t const missing = std::min(Sha256::blockSize - collected, size);
        std::copy_n(bytes, missing, block_.begin() + collected);
        if (collected + missing < Sha256::blockSize)
            return true;
        Transform();
        bytes += missing;
        size -= missing;
    }
    std::size_t const blocks = size / Sha256::blockSize;
    if (blocks != 0)
        Sha256::FastestCompression()(state_, bytes, blocks);
    std::copy_n(bytes + blocks * Sha256::blockSize, size % Sha256::blockSize, block_.begin());
    return true;
}

void SHADigest256::Transform() noexcept {
    Sha256::FastestCompression()(state_, block_.data(), 1);
}

bool SHADigest256::FinalDigest(void* out) noexcept {
    if (out == nullptr)
        return false;
    constexpr std::size_t lengthPosition = Sha256::blockSize - sizeof(std::uint64_t);
    std::size_t collected = fed_ % Sha256::blockSize;
    block_[collected++] = 0x80;
    if (collected > lengthPosition) {
        std::fill(block_.begin() + collected, block_.end(), std::uint8_t{0});
        Transform();
        collected = 0;
    }
    std::fill(block_.begin() + collected, block_.begin() + lengthPosition, std::uint8_t{0});
    std::uint64_t const bits = fed_ * 8;
    for (std::size_t i = 0; i < sizeof bits; ++i)
        block_[lengthPosition + i] = static_cast<std::uint8_t>(bits >> (56 - 8 * i));
    Transform();

    auto* digest = static_cast<std::uint8_t*>(out);
    for (std::uint32_t const word : state_)
        for (int shift = 24; shift >= 0; shift -= 8)
            *digest++ = static_cast<std::uint8_t>(word >> shift);
    state_ = Sha256::initialState;
    fed_ = 0;
    return true;
}

} // namespace KivVcs
