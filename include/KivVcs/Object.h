#pragma once

/// @file
/// What all stored things have in common: an identifier and a packed form.

#include "KivVcs/Id.h"
#include "KivVcs/detail/CachedId.h"
#include "KivVcs/detail/Published.h"

#include <cstdint>
#include <cstring>
#include <memory>

namespace KivVcs {

/// The interface of all stored objects. The order of its operations is part of the binary interface.
class KIVVCS_EXPORT IObject : public KivUtils::reference_counted {
public:
    /// Whether both objects have the same identifier, and so the same content.
    virtual bool operator==(IObject const& other) const = 0;
    virtual bool operator!=(IObject const& other) const = 0;
    /// The identifier of the packed form.
    virtual Id GetId() const = 0;
    /// The type word: "blob", "tree" or "commit".
    [[nodiscard]] virtual KivStringT<char> GetHeader() const = 0;
    /// The mode word that a tree's packed form shows for such an entry; empty for commits.
    [[nodiscard]] virtual KivStringT<char> GetStoragePrefix() const = 0;
    /// The type word, a blank, the size of the data in decimal, a zero byte, the data.
    virtual Buffer const& GetPackedData() const = 0;
    /// The data of the packed form.
    virtual Buffer const& GetData() const = 0;
    /// The packed form for display: a zero byte as `\0`, every other byte as one code unit, sign-extended.
    [[nodiscard]] virtual KivStringT<char16_t> ToString() const = 0;
    virtual ~IObject();
    /// Drops what is cached of the content; to be called after every change.
    virtual void ResetState() = 0;

protected:
    IObject() = default;
    IObject(IObject const&) = default;
    IObject& operator=(IObject const&) = default;
};

/// The base of blobs, trees and commits: caches the identifier and the packed form of the content.
///
/// What is asked for is computed on first use and kept until `ResetState`; references to packed forms and data are
/// valid until then, or until the object dies. A copy carries the caches.
///
/// Threads: all `const` operations may run concurrently on one object. A change needs exclusive use of the object.
/// @throws std::bad_alloc from everything that computes; the object is as before then.
class KIVVCS_EXPORT Object : public IObject {
public:
    bool operator==(IObject const& other) const override;
    bool operator!=(IObject const& other) const override;
    bool operator==(Object const& other) const { return *this == static_cast<IObject const&>(other); }
    bool operator!=(Object const& other) const { return *this != static_cast<IObject const&>(other); }
    Id GetId() const override;
    Buffer const& GetPackedData() const override;
    [[nodiscard]] KivStringT<char16_t> ToString() const override;
    void ResetState() override;

    /// Whether both objects have the same identifier; without touching it when they are one object.
    [[nodiscard]] bool HasSameId(Object const& other) const;

    /// A part of the identifier that tells nearly all objects apart.
    [[nodiscard]] std::uint64_t GetIdPrefix() const {
        Id::Digest const* const known = GetKnownDigest();
        return known == nullptr ? PrefixOf(*Object::GetId().GetDigest()) : PrefixOf(*known);
    }

    /// The digest that the identifier tells, valid until `ResetState`; null if the identifier has not been computed.
    [[nodiscard]] Id::Digest const* GetKnownDigest() const noexcept { return id_.IsSet() ? &id_.Digest() : nullptr; }

protected:
    Object() noexcept = default;
    Object(Object const&) = default;
    Object(Object&&) noexcept = default;
    Object& operator=(Object const& other) {
        // First what may fail, so that the identifier stays that of the content.
        packedData_ = other.packedData_;
        id_ = other.id_;
        return *this;
    }
    Object& operator=(Object&&) noexcept = default;

    /// The identifier of what `GetPackedData` gives. Overridden where it can be had without putting the packed form
    /// together.
    [[nodiscard]] virtual Id ComputeId() const;

    /// Whether the identifier has been computed since the last change.
    [[nodiscard]] bool IsIdentified() const noexcept { return id_.IsSet(); }

private:
    static std::uint64_t PrefixOf(Id::Digest const& digest) noexcept {
        std::uint64_t prefix = 0;
        std::memcpy(&prefix, digest.data(), sizeof prefix);
        return prefix;
    }

    detail::CachedId id_;
    detail::Published<Buffer> packedData_;
};

/// Takes over an object made by `new` on either side of the library's boundary; null gives null.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Object> dll_wrapped_shared(std::unique_ptr<Object> object);

} // namespace KivVcs
