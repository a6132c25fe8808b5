#pragma once

/// @file
/// What all stored things have in common: identifiers, the packed form, its SHA-256 digest, and the helpers of every
/// format.

#include "KivVcs/Foundation.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

namespace KivVcs {

/// The SHA-256 digest of FIPS 180-4 over bytes fed in any number of pieces. Uses the processor's SHA instructions where
/// it has them. A value: a copy goes on from the same state. One digest is used by one thread at a time.
class KIVVCS_EXPORT SHADigest256 {
public:
    SHADigest256() noexcept;

    /// Feeds @p size bytes. @return false, feeding nothing, if @p data is null although @p size is not 0.
    bool InitData(const void* data, std::size_t size) noexcept;

    /// Compresses the 64 bytes collected last. `InitData` and `FinalDigest` call it whenever a block is full.
    void Transform() noexcept;

    /// Pads, finishes and writes the 32 digest bytes to @p out; after it, feeding starts a new digest.
    /// @return false, changing nothing, if @p out is null.
    bool FinalDigest(void* out) noexcept;

private:
    std::array<std::uint32_t, 8> state_{};
    std::array<std::uint8_t, 64> block_{};
    std::uint64_t fed_ = 0;
};

/// The identifier of an object: the hexadecimal text of the SHA-256 digest of its packed form, 64 lowercase digits. The
/// empty text is the null identifier: no object.
///
/// A value that holds the digest itself: copying it allocates nothing, comparing and hashing it visits no other memory.
/// Identifiers are equal when their texts are. Any number of threads may read one identifier.
class KIVVCS_EXPORT Id {
public:
    using Digest = std::array<std::uint8_t, 32>;

    /// The null identifier.
    Id() noexcept = default;
    /// The identifier of a packed form: hashes it.
    Id(Buffer const& packed);
    /// The identifier with the given text, whatever it is. @throws std::bad_alloc
    explicit Id(KivStringT<char16_t> const& text);
    /// The identifier whose text tells @p digest.
    [[nodiscard]] static Id FromDigest(Digest const& digest) noexcept { return {digest, HashOf(digest)}; }

    Id(Id const& other) noexcept
        : digest_(other.digest_), hash_(other.hash_), text_(Share(other)), tellsDigest_(other.tellsDigest_) {}
    Id(Id&& other) noexcept
        : digest_(other.digest_), hash_(std::exchange(other.hash_, hashOfNull)), text_(TakeText(other)),
          tellsDigest_(std::exchange(other.tellsDigest_, false)) {}
    Id& operator=(Id other) noexcept {
        digest_ = other.digest_;
        std::swap(hash_, other.hash_);
        std::swap(tellsDigest_, other.tellsDigest_);
        Text const* const mine = text_.load(std::memory_order_relaxed);
        text_.store(other.text_.load(std::memory_order_relaxed), std::memory_order_relaxed);
        other.text_.store(mine, std::memory_order_relaxed);
        return *this;
    }
    ~Id() {
        if (Text const* const text = text_.load(std::memory_order_acquire))
            Drop(text);
    }

    /// The text, made on first use; valid as long as this identifier, or a copy made of it afterwards, lives.
    /// @throws std::bad_alloc
    [[nodiscard]] KivStringT<char16_t> const& GetText() const;

    [[nodiscard]] bool IsEmpty() const noexcept {
        return !tellsDigest_ && text_.load(std::memory_order_relaxed) == nullptr;
    }

    /// A hash over a sample of the text, the same on every platform that has 64-bit `std::size_t`.
    [[nodiscard]] std::size_t Hash() const noexcept { return hash_; }

    /// The digest that the text tells; null if it is not 64 lowercase hexadecimal digits.
    [[nodiscard]] Digest const* GetDigest() const noexcept { return tellsDigest_ ? &digest_ : nullptr; }

    friend bool operator==(Id const& left, Id const& right) noexcept {
        if (left.hash_ != right.hash_ || left.tellsDigest_ != right.tellsDigest_)
            return false;
        // A text that tells a digest is always kept as one, so that the two kinds never have the same text.
        return left.tellsDigest_ ? left.digest_ == right.digest_ : HaveSameText(left, right);
    }

private:
    friend class CachedId;

    Id(Digest const& digest, std::size_t hash) noexcept : digest_(digest), hash_(hash), tellsDigest_(true) {}

    /// Spelled out only when somebody asks for it, since a repository holds an identifier for every object.
    struct Text;

    static constexpr auto hashOfNull = static_cast<std::size_t>(0x42c52834b230ef45U);

    static std::size_t HashOf(Digest const& digest) noexcept;
    static Text const* Share(Id const& other) noexcept {
        Text const* const text = other.text_.load(std::memory_order_acquire);
        if (text != nullptr)
            AddReference(text);
        return text;
    }
    static Text const* TakeText(Id& other) noexcept {
        Text const* const text = other.text_.load(std::memory_order_relaxed);
        other.text_.store(nullptr, std::memory_order_relaxed);
        return text;
    }
    static void AddReference(Text const* text) noexcept;
    static void Drop(Text const* text) noexcept;
    static bool HaveSameText(Id const& left, Id const& right) noexcept;

    Digest digest_{};
    std::size_t hash_ = hashOfNull;
    mutable std::atomic<Text const*> text_{nullptr};
    bool tellsDigest_ = false;
};

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

    CachedId id_;
    Published<Buffer> packedData_;
};

/// Takes over an object made by `new` on either side of the library's boundary; null gives null.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Object> dll_wrapped_shared(std::unique_ptr<Object> object);

/// What every object format uses.
namespace Helpers {

/// The SHA-256 digest of @p size bytes as 64 lowercase hexadecimal digits; the empty text if @p data is null, also for
/// size 0.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char16_t> ComputeEncodedSHA256Hash(const void* data, std::size_t size);

/// The same for the content of @p buffer, which may be empty.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char16_t> ComputeEncodedSHA256Hash(Buffer const& buffer);

/// Appends the content of @p source, sharing its large chunks.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, Buffer const& source);
/// Appends the bytes of @p text.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, KivStringViewT<char> text);
/// Appends the UTF-8 encoding of @p text up to its first U+0000.
KIVVCS_EXPORT void AppendToBuffer(Buffer& destination, KivStringViewT<char16_t> text);

/// The content as 8-bit text, zero bytes included; at most 2,147,483,647 bytes of it.
[[nodiscard]] KIVVCS_EXPORT KivStringT<char> StringAFromBuffer(Buffer const& buffer);

/// The rest of the stream as 8-bit text, at most 2,147,483,647 bytes of it; empty if the stream is not valid, has no
/// rest, or cannot be read. Takes no more memory than a multiple of what the stream really holds, whatever size it
/// claims.
KIVVCS_EXPORT KivStringT<char> StreamToStringA(StreamIO& stream);

/// Reads the header of a packed form, its zero byte included, which leaves the stream at the first data byte.
/// @return whether the header begins with @p expected; false if the stream is not valid or ends before a zero byte.
KIVVCS_EXPORT bool ShiftObjectIdentifier(StreamIO& stream, KivStringViewT<char> expected);

/// The segments between the "/" of @p path, in order, without the empty ones; views into @p path.
[[nodiscard]] KIVVCS_EXPORT std::vector<KivStringViewT<char16_t>> SplitVcsPath(KivStringViewT<char16_t> path);

} // namespace Helpers

} // namespace KivVcs

template <>
struct std::hash<KivVcs::Id> {
    std::size_t operator()(KivVcs::Id const& id) const noexcept { return id.Hash(); }
};
