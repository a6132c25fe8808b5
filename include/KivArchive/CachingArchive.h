#pragma once

/// @file
/// A near archive in front of one that is far away.

#include "KivArchive/IArchive.h"

#include <memory>

namespace KivArchive {

struct CachingOptions {
    /// The near archive takes at most so many bytes, and a little more until that is noticed; what was not used for the
    /// longest time goes first.
    std::uint64_t maximumBytes = std::uint64_t{1024} * 1024 * 1024;
    /// How long the far archive is not asked again after it could not be reached.
    std::chrono::milliseconds pause{2000};
};

/// An archive that reads each object from another one once, compares it with its identifier, and keeps it nearer: in a
/// `SqliteArchive` in the user's cache directory, say, where the other one is a `PostgresArchive`.
///
/// Objects never change, so that what is near is right. Everything else is asked of the far archive each time, branches and
/// what is missing there above all, and everything is stored there; what is stored is kept near, too. So only `Describe`,
/// `Read` and `ReadContent` may do without the far archive, and may give what has been collected there meanwhile.
///
/// While the far archive cannot be reached (`Failure::Unavailable`), reading calls go on with what is near, where it was read
/// or stored before: objects, branches, records and ancestry. `IsAway` says so. What is not near and everything that stores
/// fails with the far archive's failure then.
///
/// The near archive holds objects without what they name, so that it is good for nothing else. It may be thrown away at any
/// time, and several caches may share it on one machine. If it fails the far archive is read instead.
///
/// Threads: as every archive.
class KIVARCHIVE_EXPORT CachingArchive final : public IArchive {
public:
    /// Neither may be null.
    CachingArchive(std::shared_ptr<IArchive> near, std::shared_ptr<IArchive> far, CachingOptions const& options = {});
    CachingArchive(CachingArchive const&) = delete;
    CachingArchive& operator=(CachingArchive const&) = delete;
    /// Notes in the near archive what was used.
    ~CachingArchive() override;

    /// Whether the far archive could not be reached when it was asked last, so that what has been given since then may be
    /// old.
    [[nodiscard]] bool IsAway() const noexcept;

    [[nodiscard]] std::vector<Id> FindMissing(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids) override;
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override;
    /// Brings the whole content, unless it is larger than a quarter of the near archive may be.
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override;
    bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) override;
    ChangeOutcome Apply(Change const& change) override;
    [[nodiscard]] std::vector<Branch> ReadBranches() override;
    [[nodiscard]] std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) override;
    [[nodiscard]] std::vector<KivStringT<char16_t>> ListRecords() override;
    [[nodiscard]] std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                     std::size_t more) override;
    [[nodiscard]] std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) override;
    [[nodiscard]] std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) override;
    void Mark(std::span<const Id> ids) override;
    void Unmark(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) override;
    std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) override;
    std::uint64_t Compact(std::uint64_t bytes) override;
    [[nodiscard]] ArchiveStatistics GetStatistics() override;

private:
    struct State;
    std::unique_ptr<State> state_;
};

} // namespace KivArchive
