#pragma once

#include "KivVcs/Id.h"
#include "KivVcs/detail/PublishedWord.h"

#include <cstdint>

namespace KivVcs::detail {

/// An identifier that is computed on first use, by whichever thread comes first, and what kind of object it is that of:
/// one of the library's classes, or one of a class that a host derived.
///
/// A copy takes it along before anybody knows of which class the copy will be. It is valid in an object of that kind only:
/// an object of the other kind ignores it and replaces it by the one that it computes itself. An identifier that a host
/// has assigned stays with its object and is not copied.
class CachedId {
public:
    CachedId() noexcept = default;
    CachedId(CachedId const&) = delete;
    CachedId& operator=(CachedId const&) = delete;
    ~CachedId() = default;

    /// Whether there is an identifier that is known to be that of a library's object, or that a host has assigned.
    [[nodiscard]] bool IsOwn() const noexcept { return state_.Get() >= State::Own; }
    /// Whether there is one that will be, should the object be a library's.
    [[nodiscard]] bool IsCopied() const noexcept { return state_.Get() == State::Copied; }
    /// Whether there is one that counts, should the object be of a host's class.
    [[nodiscard]] bool IsHosts() const noexcept { return state_.Get() == State::Hosts; }

    /// The identifier, and its digest. @pre there is one
    [[nodiscard]] Id Get() const noexcept { return Id::FromDigest(digest_); }
    [[nodiscard]] Id::Digest const& Digest() const noexcept { return digest_; }

    /// Keeps an identifier from now on, whatever changes.
    void Assign(Id const& id) noexcept {
        digest_ = *id.GetDigest();
        state_.Set(State::Assigned);
    }

    /// Says that the object with a copied identifier is a library's.
    void Confirm() const noexcept {
        State known = State::Copied;
        static_cast<void>(state_.Replace(known, State::Own));
    }

    /// Keeps @p id, which must be a digest, for an object of the given kind, unless another thread is doing so.
    void Keep(Id const& id, bool isHosts) const noexcept {
        State known = state_.Get();
        if (known == State::Writing || known == (isHosts ? State::Hosts : State::Own) ||
            !state_.Replace(known, State::Writing))
            return;
        digest_ = *id.GetDigest();
        state_.Publish(isHosts ? State::Hosts : State::Own);
    }

    /// Keeps the first identifier of a library's object that no other thread knows of yet: takes no atomic exchange.
    void KeepFirst(Id::Digest const& digest) const noexcept {
        digest_ = digest;
        state_.Publish(State::Own);
    }

    /// Takes along what @p other, that of an object of the given kind, has. @pre there is none here
    void Copy(CachedId const& other, bool isHosts) noexcept {
        if (isHosts ? !other.IsHosts() : !other.IsOwn() && !other.IsCopied())
            return;
        digest_ = other.digest_;
        state_.Set(isHosts ? State::Hosts : State::Copied);
    }

    void Reset() noexcept {
        if (state_.Get() != State::Assigned)
            state_.Set(State::Empty);
    }

private:
    enum class State : std::uint32_t { Empty, Writing, Copied, Hosts, Own, Assigned };

    // Nothing here is aligned to more than four bytes, so that an object has all of it right behind its use count.
    PublishedWord<State> state_;
    mutable Id::Digest digest_{};
};

} // namespace KivVcs::detail
