#pragma once

#include "KivArchive/IArchive.h"

namespace KivArchive {

/// An archive that passes every call on to another one. Derived classes count or change calls.
class ForwardingArchive : public IArchive {
public:
    std::vector<Id> FindMissing(std::span<const Id> ids) override { return Reach().FindMissing(ids); }
    std::vector<ObjectInfo> Describe(std::span<const Id> ids) override { return Reach().Describe(ids); }
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override {
        return Reach().Read(ids, receiver);
    }
    std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override {
        return Reach().ReadContent(id, offset, size);
    }
    bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) override {
        return Reach().StoreContent(id, content, earlier, progress);
    }
    ChangeOutcome Apply(Change const& change) override { return Reach().Apply(change); }
    std::vector<Branch> ReadBranches() override { return Reach().ReadBranches(); }
    std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) override {
        return Reach().ReadRecords(names);
    }
    std::vector<KivStringT<char16_t>> ListRecords() override { return Reach().ListRecords(); }
    std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow, std::size_t more) override {
        return Reach().ReadAncestry(commits, follow, more);
    }
    std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) override {
        return Reach().ListAncestry(after, limit);
    }
    std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) override {
        return Reach().ListObjects(after, limit);
    }
    void Mark(std::span<const Id> ids) override { Reach().Mark(ids); }
    void Unmark(std::span<const Id> ids) override { Reach().Unmark(ids); }
    std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) override {
        return Reach().ListMarked(grace, after, limit);
    }
    std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) override {
        return Reach().Remove(ids, grace);
    }
    std::uint64_t Compact(std::uint64_t bytes) override { return Reach().Compact(bytes); }
    ArchiveStatistics GetStatistics() override { return Reach().GetStatistics(); }

protected:
    /// Returns the other archive, once for each call.
    virtual IArchive& Reach() = 0;
};

} // namespace KivArchive
