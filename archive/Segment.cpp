#include "Segment.h"

#include "CompactForms.h"

#include <KivVcs/SHADigest256.h>

#include <algorithm>
#include <cstring>

namespace KivArchive {

namespace {

constexpr std::size_t checkSize = 8;
constexpr std::byte formatOfSegments{1};
constexpr std::uint64_t largestForm = std::uint64_t{1} << 30U;

Id::Digest Sha256(ByteView bytes) {
    KivVcs::SHADigest256 digest;
    digest.InitData(bytes.data(), bytes.size());
    Id::Digest result{};
    digest.FinalDigest(result.data());
    return result;
}

// The first byte of a member: three bits of type, two of encoding, one for a compact form.
constexpr unsigned typeBits = 3;
constexpr unsigned encodingBits = 2;

std::byte HeadOf(Member const& member) {
    auto const type = static_cast<unsigned>(member.type);
    auto const encoding = static_cast<unsigned>(member.encoding);
    auto const compact = static_cast<unsigned>(member.isCompact);
    return static_cast<std::byte>(type | encoding << typeBits | compact << (typeBits + encodingBits));
}

Member TakeHead(ByteReader& reader) {
    unsigned const head = reader.TakeByte();
    unsigned const type = head & ((1U << typeBits) - 1U);
    Member member;
    member.type = static_cast<StoredType>(type);
    member.encoding = static_cast<Encoding>(head >> typeBits & ((1U << encodingBits) - 1U));
    member.isCompact = (head >> (typeBits + encodingBits)) == 1;
    bool const mayBeCompact = member.type == StoredType::Tree || member.type == StoredType::Commit;
    if (type > static_cast<unsigned>(StoredType::LargeBlob) || head >> (typeBits + encodingBits + 1) != 0 ||
        (member.isCompact && !mayBeCompact))
        throw Malformed();
    return member;
}

void AppendMember(Bytes& form, Member const& member) {
    Append(form, HeadOf(member));
    if (member.encoding == Encoding::Removed)
        return;
    AppendNumber(form, member.size);
    // All other forms have the size of their data.
    if (member.isCompact || member.type == StoredType::LargeBlob)
        AppendNumber(form, member.formSize);
    if (member.encoding != Encoding::Difference)
        return;
    AppendNumber(form, member.own.size());
    AppendNumber(form, member.generation);
    AppendNumber(form, member.base.segment << 1U | static_cast<unsigned>(member.base.isDistance));
    AppendNumber(form, member.base.member);
}

/// Reads a member. Its own bytes follow all members: until then `own` has their number, but refers to others of @p
/// form.
Member TakeMember(ByteReader& reader, ByteView form) {
    Member member = TakeHead(reader);
    auto const setOwnSize = [&](std::uint64_t size) { member.own = ByteReader(form).Take(size); };
    if (member.encoding == Encoding::Removed)
        return member;
    member.size = reader.TakeNumber();
    member.formSize = member.isCompact || member.type == StoredType::LargeBlob ? reader.TakeNumber() : member.size;
    if (member.formSize > largestForm)
        throw Malformed();
    if (member.encoding == Encoding::Plain)
        setOwnSize(member.formSize);
    if (member.encoding != Encoding::Difference)
        return member;
    setOwnSize(reader.TakeNumber());
    member.generation = reader.TakeNumber();
    std::uint64_t const base = reader.TakeNumber();
    member.base = {(base & 1U) != 0, base >> 1U, reader.TakeNumber()};
    if (member.generation == 0)
        throw Malformed();
    return member;
}

Bytes MakeSegmentOf(std::span<const Member> members, std::uint64_t ownSize, Compressor& compressor) {
    // Some numbers for each member.
    constexpr std::size_t headSize = 32;
    Bytes form;
    form.reserve(checkSize + headSize * (members.size() + 1) + static_cast<std::size_t>(ownSize));
    form.resize(checkSize);
    Append(form, formatOfSegments);
    AppendNumber(form, members.size());
    for (Member const& member : members)
        AppendMember(form, member);
    std::size_t const flag = form.size();
    Append(form, std::byte{0});
    Bytes shared;
    for (Member const& member : members)
        Append(member.encoding == Encoding::Shared ? shared : form, member.own);
    // What hardly becomes smaller is stored as it is, which is faster to read.
    if (!shared.empty() && compressor.Compress(shared, {}, shared.size() - shared.size() / 16, form))
        form[flag] = std::byte{1};
    else
        Append(form, shared);
    Id::Digest const digest = Sha256(ByteView(form).subspan(checkSize));
    std::copy_n(std::as_bytes(std::span(digest)).begin(), checkSize, form.begin());
    return form;
}

} // namespace

Id DigestOfBytes(ByteView bytes) {
    return Id::FromDigest(Sha256(bytes));
}

Segment::Segment(std::uint64_t number, Bytes form, Verified verified) : number_(number), form_(std::move(form)) {
    ByteReader reader(form_);
    std::memcpy(&check_, reader.Take(checkSize).data(), checkSize);
    if (reader.TakeByte() != static_cast<std::uint8_t>(formatOfSegments))
        throw Malformed();
    std::uint64_t const count = reader.TakeNumber();
    // Each takes at least a byte.
    if (count > reader.Rest().size())
        throw Malformed();
    members_.reserve(static_cast<std::size_t>(count));
    for (std::uint64_t i = 0; i < count; ++i) {
        Member member = TakeMember(reader, form_);
        if (member.encoding == Encoding::Shared) {
            member.sharedOffset = sharedSize_;
            sharedSize_ += member.formSize;
        }
        members_.push_back(member);
    }
    isSharedCompressed_ = reader.TakeByte() != 0;
    for (Member& member : members_)
        member.own = reader.Take(member.own.size());
    shared_ = reader.Rest();
    bool const fits = isSharedCompressed_ ? CanDecompressTo(shared_, sharedSize_) : shared_.size() == sharedSize_;
    if (!fits)
        throw Malformed();
    if (verified == Verified::Now)
        Verify();
}

void Segment::Verify() const {
    if (isVerified_)
        return;
    Id::Digest const digest = Sha256(ByteView(form_).subspan(checkSize));
    if (std::memcmp(digest.data(), &check_, checkSize) != 0)
        throw Malformed();
    isVerified_ = true;
}

Member const& Segment::At(std::uint64_t member) const {
    if (member >= members_.size() || members_[static_cast<std::size_t>(member)].encoding == Encoding::Removed)
        throw Malformed();
    return members_[static_cast<std::size_t>(member)];
}

Place Segment::BaseOf(Member const& member) const {
    if (!member.base.isDistance)
        return {member.base.segment, member.base.member};
    if (member.base.segment > number_)
        throw Malformed();
    return {number_ - member.base.segment, member.base.member};
}

Bytes Segment::DecompressShared(Compressor& compressor) const {
    Bytes shared(static_cast<std::size_t>(sharedSize_));
    if (isSharedCompressed_)
        compressor.Decompress(shared_, {}, shared.data(), shared.size());
    else
        std::copy(shared_.begin(), shared_.end(), shared.begin());
    return shared;
}

std::uint64_t SegmentBuilder::Add(Member const& member, ByteView own) {
    members_.push_back(member);
    members_.back().own = own;
    size_ += own.size();
    return members_.size() - 1;
}

Bytes SegmentBuilder::Make(Compressor& compressor) const {
    return MakeSegmentOf(members_, size_, compressor);
}

Bytes MakeSegment(Member const& member, ByteView own, Compressor& compressor) {
    Member whole = member;
    whole.own = own;
    return MakeSegmentOf({&whole, 1}, own.size(), compressor);
}

Bytes ExpandForm(Member const& member, ByteView form) {
    return member.isCompact ? ExpandForm(member.type, form, member.size) : Bytes(form.begin(), form.end());
}

Bytes ExpandForm(StoredType type, ByteView form, std::uint64_t size) {
    return type == StoredType::Tree ? ExpandTree(form, size) : ExpandCommit(form, size);
}

} // namespace KivArchive
