#pragma once

#include "KivVcs/Id.h"

#include <array>
#include <limits>
#include <vector>

namespace KivVcs::detail {

class Node;

/// What a large tree keeps of the computation of its identifier, and a smaller one of which an entry has been replaced: the
/// states of the digest on the way through its packed form. A copy takes them over, and goes on from the last one before the
/// first entry that an edit has changed, as long as the form keeps its size. As large as a pointer, which is null for trees that
/// keep nothing.
///
/// Threads: the `const` operations may run concurrently, and copies be made. Everything else needs exclusive use.
class DigestTrail {
public:
    /// Says that the entry @p name below @p top shows another object, in as many bytes.
    void NoteChange(Node const& top, KivStringViewT<char16_t> name) noexcept;
    void Reset() noexcept { trail_.Reset(); }
    [[nodiscard]] bool IsEmpty() const noexcept { return trail_.Get() == nullptr; }

    /// Whether a packed form of that size is large enough for it although no entry has been replaced.
    [[nodiscard]] static bool IsFor(std::uint64_t size) noexcept { return size >= large; }
    /// The identifier of a tree of the entries below @p top, none of which show hosts' objects.
    [[nodiscard]] Id ComputeId(Node const& top) const;

private:
    static constexpr std::uint64_t large = 131072;
    /// Large enough where an entry has been replaced.
    static constexpr std::uint64_t largeForEdits = 4096;
    static constexpr std::uint64_t smallestStep = 1024;

    /// The states of one form at every step.
    struct Checkpoints final : KivUtils::reference_counted {
        std::uint64_t packedSize = 0;
        std::vector<std::array<std::uint32_t, 8>> states;
    };

    /// What a tree has computed, and what it was handed: that of the tree that it was made from.
    struct Trail {
        Trail() noexcept = default;
        Trail(Trail const& other) noexcept {
            if (Checkpoints const* const own = other.computed.Get()) {
                handed = cow_ptr<Checkpoints>::share(own);
            } else {
                handed = other.handed;
                firstChanged = other.firstChanged;
            }
        }
        Trail(Trail&& other) noexcept = default;
        Trail& operator=(Trail const&) = delete;
        ~Trail() = default;

        cow_ptr<Checkpoints> handed;
        /// The first byte of the form that may differ from what it was there; the largest number if none does.
        std::uint64_t firstChanged = std::numeric_limits<std::uint64_t>::max();
        Published<Checkpoints> computed;
    };

    /// The trail, begun if there is none.
    Trail const& Begin() const; // NOLINT(modernize-use-nodiscard)
    void TryBegin() const noexcept;

    Published<Trail> trail_;
};

} // namespace KivVcs::detail
