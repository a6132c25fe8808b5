#pragma once

/// @file
/// The near side of a `CachingArchive`: what is kept there, and what goes.

#include "Bytes.h"
#include "KivArchive/CachingArchive.h"

#include <mutex>
#include <unordered_map>

namespace KivArchive {

/// Keeps what has been read, and forgets what was not used for the longest time. Its failures count as having nothing.
/// Any number of threads may use it.
class NearArchive {
public:
    NearArchive(std::shared_ptr<IArchive> archive, std::uint64_t maximumBytes);
    NearArchive(NearArchive const&) = delete;
    NearArchive& operator=(NearArchive const&) = delete;
    /// Notes what was used.
    ~NearArchive();

    /// Those of @p ids that are here and sound are handed over. @return the others, each once
    std::vector<Id> Read(std::span<const Id> ids, ObjectReceiver const& receiver);
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids);
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size);

    void Keep(std::vector<NewObject> objects);
    /// @return whether it is here now
    bool KeepContent(Id const& id, StreamIO& content);
    void Drop(std::span<const Id> ids);
    /// Whether a content of so many bytes is worth keeping.
    [[nodiscard]] bool HasRoomFor(std::uint64_t size) const noexcept { return size <= maximumBytes_ / 4; }

    /// What the far archive said last; none if it was never asked, which is not the same as having nothing.
    void KeepBranches(std::vector<Branch> const& branches);
    [[nodiscard]] std::optional<std::vector<Branch>> ReadBranches();
    void KeepRecords(std::span<const KivStringT<char16_t>> names, std::vector<Record> const& records);
    /// The branches and records of a change that the far archive has taken.
    void KeepChanged(Change const& change);
    [[nodiscard]] std::optional<std::vector<Record>> ReadRecords(std::span<const KivStringT<char16_t>> names);
    void KeepAncestry(std::vector<Ancestry> const& facts);
    /// None if the facts of one of @p commits are not here.
    [[nodiscard]] std::optional<std::vector<Ancestry>> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                                    std::size_t more);

private:
    struct HashOfDigest {
        std::size_t operator()(Id::Digest const& digest) const noexcept;
    };
    /// The hour of the last use.
    using Uses = std::unordered_map<Id::Digest, std::uint64_t, HashOfDigest>;
    struct Candidate {
        std::uint64_t hour = 0;
        /// The number of the last use since this was made; 0 for none.
        std::uint64_t use = 0;
        ObjectInfo info;
    };

    void Use(std::span<const Id> ids);
    void KeepRecord(KivStringT<char16_t> const& name, Bytes const& value);
    void NoteStored(std::uint64_t bytes);
    [[nodiscard]] std::vector<Candidate> ListByUse();
    void RemoveOldest();
    void RemoveAll(std::span<const Id> ids);
    [[nodiscard]] Uses ReadUses();
    void WriteUses(Uses const& uses);
    void SaveUses();

    std::shared_ptr<IArchive> archive_;
    std::uint64_t maximumBytes_;
    std::mutex mutex_;
    /// Objects used since this was made, in order.
    std::unordered_map<Id, std::uint64_t> used_;
    std::uint64_t useCount_ = 0;
    /// Of each commit whose facts are here, how many it contains.
    std::unordered_map<Id, std::size_t> knownFacts_;
    /// How much may be stored before the size is looked at once more.
    std::uint64_t unwatched_ = 0;
    std::mutex removing_;
};

} // namespace KivArchive
