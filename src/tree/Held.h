#pragma once

#include "KivVcs/Tree.h"

#include <cstdint>

namespace KivVcs::detail {

/// What a directory holds under one name: a blob, a subtree, rarely both; or nothing. A null handle is held, and counts,
/// like any other.
///
/// As large as a pointer, since a repository has one for every file of every directory: the kind is in the lowest bits of
/// the address, and only a name that holds both costs an object of its own.
class Held {
public:
    Held() noexcept = default;
    explicit Held(cow_ptr<Blob> blob) noexcept : word_(WordOf(cow_ptr<Object>(std::move(blob))) | blobBit) {}
    explicit Held(cow_ptr<Tree> tree) noexcept : word_(WordOf(cow_ptr<Object>(std::move(tree))) | treeBit) {}
    Held(cow_ptr<Blob> blob, cow_ptr<Tree> tree)
        : word_(WordOf(immu::make<Both>(std::move(blob), std::move(tree))) | blobBit | treeBit) {}
    Held(Held const& other) noexcept : word_(other.word_) {
        static_cast<void>(HasBoth() ? WordOf(cow_ptr<Both>::share(As<Both>()))
                                    : WordOf(cow_ptr<Object>::share(As<Object>())));
    }
    Held(Held&& other) noexcept : word_(std::exchange(other.word_, 0)) {}
    Held& operator=(Held other) noexcept {
        std::swap(word_, other.word_);
        return *this;
    }
    ~Held() {
        if (HasBoth())
            static_cast<void>(cow_ptr<Both>::attach(As<Both>()));
        else
            static_cast<void>(cow_ptr<Object>::attach(As<Object>()));
    }

    [[nodiscard]] bool IsNothing() const noexcept { return word_ == 0; }
    [[nodiscard]] bool HasBlob() const noexcept { return (word_ & blobBit) != 0; }
    [[nodiscard]] bool HasTree() const noexcept { return (word_ & treeBit) != 0; }
    [[nodiscard]] bool HasBoth() const noexcept { return (word_ & kindBits) == kindBits; }

    [[nodiscard]] Blob const* GetBlob() const noexcept {
        if (HasBoth())
            return As<Both>()->blob.get();
        return HasBlob() ? static_cast<Blob const*>(As<Object>()) : nullptr;
    }
    [[nodiscard]] Tree const* GetTree() const noexcept {
        if (HasBoth())
            return As<Both>()->tree.get();
        return HasTree() ? static_cast<Tree const*>(As<Object>()) : nullptr;
    }
    /// What a packed form shows: a blob hides the subtree even if it is null.
    [[nodiscard]] Object const* Packed() const noexcept { return HasBoth() ? As<Both>()->blob.get() : As<Object>(); }
    /// What a lookup by name finds: the subtree if there is no blob, or only a null one.
    [[nodiscard]] Object const* Visible() const noexcept {
        Object const* const packed = Packed();
        return packed != nullptr ? packed : GetTree();
    }

    /// Whether both are the same objects, and not only equal ones.
    [[nodiscard]] bool IsSame(Held const& other) const noexcept { return word_ == other.word_; }

    /// The same with another blob, or with another subtree. @throws std::bad_alloc if it is both then
    [[nodiscard]] Held With(cow_ptr<Blob> blob) const {
        return HasTree() ? Held(std::move(blob), cow_ptr<Tree>::share(GetTree())) : Held(std::move(blob));
    }
    [[nodiscard]] Held With(cow_ptr<Tree> tree) const {
        return HasBlob() ? Held(cow_ptr<Blob>::share(GetBlob()), std::move(tree)) : Held(std::move(tree));
    }

    /// Gives up what is held. The result is the subtree, and the last handle to it if this was the last to hold it.
    /// @pre HasTree()
    [[nodiscard]] cow_ptr<Tree> GiveUp() noexcept {
        auto tree = HasBoth() ? cow_ptr<Tree>::share(GetTree()) : cow_ptr<Tree>::attach(GetTree());
        Held given;
        std::swap(word_, given.word_);
        if (!given.HasBoth())
            given.word_ = 0;
        return tree;
    }

private:
    static constexpr std::uintptr_t blobBit = 1;
    static constexpr std::uintptr_t treeBit = 2;
    static constexpr std::uintptr_t kindBits = blobBit | treeBit;

    struct Both final : KivUtils::reference_counted {
        Both(cow_ptr<Blob> heldBlob, cow_ptr<Tree> heldTree) noexcept
            : blob(std::move(heldBlob)), tree(std::move(heldTree)) {}

        cow_ptr<Blob> blob;
        cow_ptr<Tree> tree;
    };

    template <class T>
    [[nodiscard]] static std::uintptr_t WordOf(cow_ptr<T> held) noexcept {
        static_assert(alignof(T) > kindBits);
        return reinterpret_cast<std::uintptr_t>(held.detach());
    }
    template <class T>
    [[nodiscard]] T const* As() const noexcept {
        return reinterpret_cast<T const*>(word_ & ~kindBits);
    }

    std::uintptr_t word_ = 0;
};

} // namespace KivVcs::detail
