#pragma once

#include "KivVcs/Id.h"

namespace KivVcs::detail {

class Node;

/// What a large tree keeps of the computation of its identifier: the states of the digest on the way through its packed
/// form. A copy is handed them, and goes on from the last one before the first entry that an edit has changed, as long as
/// the form keeps its size. As large as a pointer, which is null for trees that have never been large.
///
/// Threads: the `const` operations may run concurrently, and copies be made. Everything else needs exclusive use.
class DigestTrail {
public:
    DigestTrail() noexcept;
    DigestTrail(DigestTrail const& other);
    DigestTrail(DigestTrail&& other) noexcept;
    DigestTrail& operator=(DigestTrail other) noexcept;
    ~DigestTrail();

    /// Says that the entry @p name shows another object, in as many bytes.
    void NoteChange(KivStringT<char16_t> const& name) noexcept;
    void Reset() noexcept;
    [[nodiscard]] bool IsEmpty() const noexcept { return trail_.Get() == nullptr; }

    /// The identifier of a tree of the entries below @p top, none of which show hosts' objects.
    [[nodiscard]] Id ComputeId(Node const& top) const;

private:
    struct Checkpoints;
    struct Trail;

    Published<Trail> trail_;
};

} // namespace KivVcs::detail
