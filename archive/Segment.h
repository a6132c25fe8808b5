#pragma once

/// @file
/// Segments, which hold stored forms: many small ones or one large one. docs/archive.md describes their bytes.

#include "Compression.h"
#include "KivArchive/IArchive.h"

#include <atomic>
#include <memory>
#include <optional>

namespace KivArchive {

/// What is stored. A large content is stored as the list of its pieces' digests.
enum class StoredType : std::uint8_t { Blob, Tree, Commit, Piece, LargeBlob };

enum class Encoding : std::uint8_t {
    Removed,    ///< The form is gone; the member is left so that the others keep their numbers.
    Plain,      ///< The form as it is.
    Shared,     ///< In the frame that the segment's members share.
    Difference, ///< A difference to the form of another member, its base.
};

/// Where a stored form is.
struct Place {
    std::uint64_t segment = 0;
    std::uint64_t member = 0;

    friend auto operator<=>(Place const& left, Place const& right) noexcept = default;
};

/// Where the base of a difference is. Segments that are stored together get their numbers only then: a base in one of
/// them is named by its distance, how many segments before this one it is.
struct Base {
    bool isDistance = false;
    std::uint64_t segment = 0;
    std::uint64_t member = 0;
};

struct Member {
    StoredType type = StoredType::Blob;
    Encoding encoding = Encoding::Removed;
    /// Whether the form is that of `CompactTree` or `CompactCommit`.
    bool isCompact = false;
    /// The size of the data, and of the stored form.
    std::uint64_t size = 0;
    std::uint64_t formSize = 0;
    /// How many versions its path has had since the last one that is no difference; 0 for that one.
    std::uint64_t generation = 0;
    Base base;
    /// The bytes that only this member has; empty if it is shared.
    ByteView own;
    /// Where it begins in the decompressed frame.
    std::uint64_t sharedOffset = 0;
};

/// The form of one segment, parsed. Any number of threads may read it.
class Segment {
public:
    enum class Verified : std::uint8_t { Now, Later };

    /// @param verified `Later` leaves it to `Verify` to find out whether @p form is as it was stored
    /// @throws Malformed unless @p form could have been made by a `SegmentBuilder`
    Segment(std::uint64_t number, Bytes form, Verified verified = Verified::Now);
    Segment(Segment const&) = delete;
    Segment& operator=(Segment const&) = delete;
    ~Segment() = default;

    /// Hashes the form, the first time only. @throws Malformed unless it is as it was stored
    void Verify() const;

    [[nodiscard]] std::uint64_t Number() const noexcept { return number_; }
    /// The beginning of the form's digest, which tells it from other forms.
    [[nodiscard]] std::uint64_t Check() const noexcept { return check_; }
    [[nodiscard]] std::uint64_t FormSize() const noexcept { return form_.size(); }
    [[nodiscard]] std::span<const Member> Members() const noexcept { return members_; }
    /// @throws Malformed if there is no such member, or if it is removed
    [[nodiscard]] Member const& At(std::uint64_t member) const;
    /// Where the base of a difference is.
    [[nodiscard]] Place BaseOf(Member const& member) const;
    /// The forms of all shared members, one after the other. @throws Malformed
    [[nodiscard]] Bytes DecompressShared(Compressor& compressor) const;

private:
    std::uint64_t number_;
    Bytes form_;
    std::uint64_t check_ = 0;
    mutable std::atomic<bool> isVerified_{false};
    std::vector<Member> members_;
    std::uint64_t sharedSize_ = 0;
    bool isSharedCompressed_ = false;
    ByteView shared_;
};

/// Makes the form of a segment. The bytes added must stay valid until then.
class SegmentBuilder {
public:
    /// @param own the bytes of a plain member or a difference, or the form of a shared member; empty for a removed one
    /// @return the number of the member
    std::uint64_t Add(Member const& member, ByteView own);
    [[nodiscard]] bool IsEmpty() const noexcept { return members_.empty(); }
    [[nodiscard]] std::span<const Member> Members() const noexcept { return members_; }
    /// How many bytes have been added.
    [[nodiscard]] std::uint64_t GetSize() const noexcept { return size_; }
    [[nodiscard]] Bytes Make(Compressor& compressor) const;

private:
    std::vector<Member> members_;
    std::uint64_t size_ = 0;
};

/// Makes the form of a segment of one member. @param own as above
[[nodiscard]] Bytes MakeSegment(Member const& member, ByteView own, Compressor& compressor);

/// The digest of bytes that are no object's: of a piece of a content.
[[nodiscard]] Id DigestOfBytes(ByteView bytes);

/// The data that a stored form stands for.
[[nodiscard]] Bytes ExpandForm(Member const& member, ByteView form);
/// The @p size bytes of data that a compact form of a tree or commit stands for.
[[nodiscard]] Bytes ExpandForm(StoredType type, ByteView form, std::uint64_t size);

} // namespace KivArchive
