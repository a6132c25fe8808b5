#pragma once

/// @file
/// Writing stored forms to bytes, and reading them.

#include <cstddef>
#include <cstdint>
#include <exception>
#include <span>
#include <vector>

namespace KivArchive {

using Bytes = std::vector<std::byte>;
using ByteView = std::span<const std::byte>;

/// Thrown if a stored form is not one that this library writes.
struct Malformed final : std::exception {
    [[nodiscard]] const char* what() const noexcept override { return "a stored form is malformed"; }
};

inline void Append(Bytes& bytes, ByteView more) {
    bytes.insert(bytes.end(), more.begin(), more.end());
}

inline void Append(Bytes& bytes, std::byte byte) {
    bytes.push_back(byte);
}

/// Seven bits a byte, the lowest first, the highest bit of all but the last set.
inline void AppendNumber(Bytes& bytes, std::uint64_t number) {
    for (; number >= 0x80; number >>= 7U)
        bytes.push_back(static_cast<std::byte>(number | 0x80U));
    bytes.push_back(static_cast<std::byte>(number));
}

/// Reads from the front of bytes that may hold anything.
class ByteReader {
public:
    explicit ByteReader(ByteView bytes) noexcept : rest_(bytes) {}

    /// @throws Malformed if fewer bytes are left; so does everything here
    [[nodiscard]] ByteView Take(std::uint64_t size) {
        if (size > rest_.size())
            throw Malformed();
        ByteView const taken = rest_.first(static_cast<std::size_t>(size));
        rest_ = rest_.subspan(taken.size());
        return taken;
    }

    [[nodiscard]] std::uint8_t TakeByte() { return static_cast<std::uint8_t>(Take(1).front()); }

    [[nodiscard]] std::uint64_t TakeNumber() {
        std::uint64_t number = 0;
        for (unsigned shift = 0; shift < 63; shift += 7) {
            std::uint8_t const byte = TakeByte();
            number |= static_cast<std::uint64_t>(byte & 0x7FU) << shift;
            if (byte < 0x80)
                return number;
        }
        throw Malformed();
    }

    [[nodiscard]] ByteView Rest() const noexcept { return rest_; }

private:
    ByteView rest_;
};

} // namespace KivArchive
