#pragma once

/// @file
/// What all stored things have in common: an identifier and a packed form.

#include "KivVcs/Id.h"
#include "KivVcs/detail/CachedId.h"
#include "KivVcs/detail/KeptForm.h"

#include <cstdint>
#include <cstring>
#include <memory>
#include <utility>

namespace KivVcs {

namespace detail {
struct DataToHash;
class Identification;
class OpenObjects;
} // namespace detail

/// The interface of all stored objects. The order of its operations is part of the binary interface.
class KIVVCS_EXPORT IObject : public KivUtils::reference_counted {
public:
    /// Whether both objects have the same identifier, and so the same content.
    virtual bool operator==(IObject const& other) const = 0;
    virtual bool operator!=(IObject const& other) const = 0;
    /// The identifier of the packed form. That of a commit asks for its parent's, one call deeper for each: a host that
    /// overrides this for commits asks for it as it makes them.
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
/// valid until then, or until the object dies. A copy carries what is kept. All that is kept is of one state: a packed form
/// that is asked for after the identifier is the one that the identifier was computed from, even if the content changed
/// without `ResetState`.
///
/// Hosts may derive from the library's classes and override what they like: of such an object everything is asked of
/// its virtual operations. Objects of exactly `Blob`, `Tree` or `Commit` are known to do as those classes do.
///
/// An object that has to be changed or stored apart from a shared one is copied by `CopyOf`, which `cow_ptr::write` uses,
/// too. A host's class that holds more than its base overrides `Copy`, as `return immu::make<HostBlob>(*this);`.
///
/// Threads: all `const` operations may run concurrently on one object. A change needs exclusive use of the object.
/// @throws std::bad_alloc from everything that computes; the object is as before then. What a host's operations throw
/// passes through likewise.
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

    /// Whether a host derived the class of this object. False for objects of exactly `Blob`, `Tree` and `Commit`.
    [[nodiscard]] virtual bool IsOfHostClass() const noexcept { return true; }

    /// The digest of the identifier, valid until `ResetState`; null if that would have to be asked for: of an
    /// object of a host's class that was made without it, and of one whose identifier has not been computed yet.
    [[nodiscard]] Id::Digest const* GetKnownDigest() const noexcept {
        if (id_.IsOwn())
            return &id_.Digest();
        return id_.IsCopied() ? ConfirmCopiedDigest() : nullptr;
    }

    /// Whether both objects have the same identifier: by the known digests, otherwise by `GetId` of both. An object has
    /// its own identifier, which is not asked for.
    [[nodiscard]] bool HasSameId(Object const& other) const {
        Id::Digest const* const mine = GetKnownDigest();
        Id::Digest const* const theirs = other.GetKnownDigest();
        return mine != nullptr && theirs != nullptr ? *mine == *theirs : this == &other || GetId() == other.GetId();
    }

    /// A number that is the same for equal identifiers and different for nearly all others; by the known digest, otherwise
    /// by `GetId`.
    [[nodiscard]] std::uint64_t GetIdPrefix() const {
        Id::Digest const* const known = GetKnownDigest();
        return known == nullptr ? PrefixOf(GetId()) : PrefixOf(*known);
    }

protected:
    Object() noexcept = default;
    /// An object of which the host knows the identifier; `ResetState` leaves it as it is.
    explicit Object(Id::Digest const& digest) noexcept { id_.Assign(Id::FromDigest(digest)); }
    Object(Object const& other) : IObject(other) { TakeKept(other); }
    Object(Object&& other) noexcept : IObject(other) { TakeKept(std::move(other)); }
    Object& operator=(Object const& other) {
        if (this != &other) {
            detail::KeptForm form;
            form.Copy(other.packedData_, other.IsOfHostClass());
            Object::ResetState();
            id_.Copy(other.id_, other.IsOfHostClass());
            packedData_.Swap(form);
        }
        return *this;
    }
    Object& operator=(Object&& other) noexcept {
        if (this != &other) {
            Object::ResetState();
            TakeKept(std::move(other));
        }
        return *this;
    }

    /// Whether the identifier has been computed since the last change.
    [[nodiscard]] bool IsIdentified() const noexcept {
        return GetKnownDigest() != nullptr || (id_.IsHosts() && IsOfHostClass());
    }

    /// The identifier of an object of one of the library's classes, without its packed form being put together.
    [[nodiscard]] Id ComputePackedId() const;

private:
    friend class detail::Identification;
    friend struct detail::DataToHash;

    /// Computes the identifier of an object of one of the library's classes; not called for objects of hosts' classes.
    [[nodiscard]] virtual Id ComputeId() const;
    /// Adds the objects whose identifiers the packed form shows, as far as this object holds them.
    virtual void ListParts(detail::OpenObjects& parts) const;
    /// For objects of the library's classes: the size of the data that the identifier is computed from, if that may be done
    /// beside others, and these data; nothing if `ComputeId` has to do it.
    [[nodiscard]] virtual optional<std::uint64_t> GetSizeToHash() const noexcept;
    virtual void GetDataToHash(detail::DataToHash& data) const;

    [[nodiscard]] Id::Digest const* ConfirmCopiedDigest() const noexcept;
    void TakeKept(Object const& other) {
        const bool isHosts = other.IsOfHostClass();
        packedData_.Copy(other.packedData_, isHosts);
        id_.Copy(other.id_, isHosts);
    }
    void TakeKept(Object&& other) noexcept {
        packedData_.Swap(other.packedData_);
        id_.Copy(other.id_, other.IsOfHostClass());
        other.id_.Reset();
    }
    static std::uint64_t PrefixOf(Id::Digest const& digest) noexcept {
        std::uint64_t prefix = 0;
        std::memcpy(&prefix, digest.data(), sizeof prefix);
        return prefix;
    }
    static std::uint64_t PrefixOf(Id const& id) noexcept {
        Id::Digest const* const digest = id.GetDigest();
        return digest == nullptr ? id.Hash() : PrefixOf(*digest);
    }

    detail::CachedId id_;
    detail::KeptForm packedData_;
};

/// Computes the identifiers of many objects, those that their packed forms show included, in less time than one after the
/// other: several are hashed at once. What a packed form shows is identified first; otherwise the largest objects come
/// first.
///
/// Null pointers and repeated ones are allowed. Objects of hosts' classes are asked for theirs by `GetId`, in the given
/// order as far as one does not show the other. What is deferred is not fetched. Takes no stack for nested directories or
/// long histories.
///
/// Threads: as `GetId` of each of the objects; several threads may identify the same ones.
/// @throws std::bad_alloc and what hosts' objects throw; every object has its identifier then, or none yet
KIVVCS_EXPORT void Identify(array_view<Object const* const> objects);

/// Takes over an object made by `new` on either side of the library's boundary; null gives null.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Object> dll_wrapped_shared(std::unique_ptr<Object> object);

} // namespace KivVcs
