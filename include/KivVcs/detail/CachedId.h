#pragma once

#include "KivVcs/Id.h"

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace KivVcs::detail {

/// An identifier that is computed on first use, by whichever thread comes first.
class CachedId {
public:
    CachedId() noexcept = default;
    CachedId(CachedId const& other) noexcept { Take(other); }
    CachedId(CachedId&& other) noexcept {
        Take(other);
        other.Reset();
    }
    CachedId& operator=(CachedId const& other) noexcept {
        if (this != &other) {
            Reset();
            Take(other);
        }
        return *this;
    }
    CachedId& operator=(CachedId&& other) noexcept {
        if (this != &other) {
            *this = other;
            other.Reset();
        }
        return *this;
    }
    ~CachedId() = default;

    [[nodiscard]] bool IsSet() const noexcept { return state_.load(std::memory_order_acquire) == State::Set; }

    /// The identifier, and the digest that it tells. @pre IsSet()
    [[nodiscard]] Id Get() const noexcept { return {digest_, hash_}; }
    [[nodiscard]] Id::Digest const& Digest() const noexcept { return digest_; }

    /// Whether both are there and equal; false tells nothing if one is missing.
    [[nodiscard]] bool Equals(CachedId const& other) const noexcept {
        return IsSet() && other.IsSet() && digest_ == other.digest_;
    }

    /// Keeps @p id, which must tell a digest, unless another thread is doing so.
    void Keep(Id const& id) const noexcept {
        State expected = State::Empty;
        if (!state_.compare_exchange_strong(expected, State::Writing, std::memory_order_relaxed))
            return;
        digest_ = *id.GetDigest();
        hash_ = id.Hash();
        state_.store(State::Set, std::memory_order_release);
    }

    void Reset() noexcept { state_.store(State::Empty, std::memory_order_relaxed); }

private:
    enum class State : std::uint8_t { Empty, Writing, Set };

    void Take(CachedId const& other) noexcept {
        if (!other.IsSet())
            return;
        digest_ = other.digest_;
        hash_ = other.hash_;
        state_.store(State::Set, std::memory_order_relaxed);
    }

    mutable std::atomic<State> state_{State::Empty};
    mutable Id::Digest digest_{};
    mutable std::size_t hash_ = 0;
};

} // namespace KivVcs::detail
