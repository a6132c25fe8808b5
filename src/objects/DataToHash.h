#pragma once

#include "KivVcs/Object.h"

#include <vector>

namespace KivVcs::detail {

/// What the identifier of an object is the digest of: a type word and data.
struct DataToHash {
    Object const* object = nullptr;
    KivStringViewT<char> word{};
    /// Data that stay as they are until the digest is taken; null for `own`, which were put together for it.
    Buffer const* kept = nullptr;
    Buffer own{};

    [[nodiscard]] Buffer const& Data() const noexcept { return kept == nullptr ? own : *kept; }
    /// Gives the object the identifier that the digest of its packed form stands for.
    void Identify(Id::Digest const& digest) const noexcept { object->id_.Keep(Id::FromDigest(digest), false); }
    /// The same for one that has just been made, and that no other thread knows of.
    void IdentifyNew(Id::Digest const& digest) const noexcept { object->id_.KeepFirst(digest); }
};

/// Objects that may have to be identified before others whose packed forms show their identifiers.
class OpenObjects {
public:
    void Add(Object const* object) {
        if (object != nullptr && object->GetKnownDigest() == nullptr)
            list_.push_back(object);
    }

    [[nodiscard]] std::size_t Count() const noexcept { return list_.size(); }
    [[nodiscard]] Object const& TakeLast() noexcept {
        Object const* const last = list_.back();
        list_.pop_back();
        return *last;
    }

private:
    std::vector<Object const*> list_;
};

} // namespace KivVcs::detail
