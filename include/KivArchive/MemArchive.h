#pragma once

/// @file
/// An archive in memory.

#include "KivArchive/IArchive.h"

#include <memory>

namespace KivArchive {

/// An archive that lives as long as this object: for tests, and in front of slower archives. Large buffers are shared,
/// not copied.
class KIVARCHIVE_EXPORT MemArchive final : public IArchive {
public:
    /// The time that marks are given, counted from any moment.
    using Clock = std::function<std::chrono::seconds()>;

    /// An empty archive. An empty clock stands for the system's steady one.
    explicit MemArchive(Clock clock = {});
    MemArchive(MemArchive const&) = delete;
    MemArchive& operator=(MemArchive const&) = delete;
    ~MemArchive() override;

    [[nodiscard]] std::vector<Id> FindMissing(std::span<const Id> ids) override;
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids) override;
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override;
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
