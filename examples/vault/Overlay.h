#pragma once

#include <KivArchive/MemArchive.h>

namespace vault {

/// An archive with some objects more, which are kept in memory.
class Overlay final : public KivArchive::IArchive {
public:
    using Ids = std::span<const KivVcs::Id>;

    explicit Overlay(IArchive& archive) noexcept : archive_(archive) {}

    /// Keeps what @p change has.
    void Add(KivArchive::Change const& change);

    std::vector<KivVcs::Id> FindMissing(Ids ids) override;
    std::vector<KivArchive::ObjectInfo> Describe(Ids ids) override;
    KivArchive::ReadOutcome Read(Ids ids, KivArchive::ObjectReceiver const& receiver) override;
    std::optional<KivVcs::Buffer> ReadContent(KivVcs::Id const& id, std::uint64_t offset, std::uint64_t size) override;

    // Everything else is the archive's.
    bool StoreContent(KivVcs::Id const& id, KivVcs::StreamIO& content, KivVcs::Id const& earlier,
                      KivArchive::IProgress* progress) override {
        return archive_.StoreContent(id, content, earlier, progress);
    }
    KivArchive::ChangeOutcome Apply(KivArchive::Change const& change) override { return archive_.Apply(change); }
    std::vector<KivArchive::Branch> ReadBranches() override { return archive_.ReadBranches(); }
    std::vector<KivArchive::Record> ReadRecords(std::span<const KivVcs::KivStringT<char16_t>> names) override {
        return archive_.ReadRecords(names);
    }
    std::vector<KivVcs::KivStringT<char16_t>> ListRecords() override { return archive_.ListRecords(); }
    std::vector<KivArchive::Ancestry> ReadAncestry(Ids commits, KivArchive::Follow follow, std::size_t more) override {
        return archive_.ReadAncestry(commits, follow, more);
    }
    std::vector<KivArchive::Ancestry> ListAncestry(KivVcs::Id const& after, std::size_t limit) override {
        return archive_.ListAncestry(after, limit);
    }
    std::vector<KivArchive::ObjectInfo> ListObjects(KivVcs::Id const& after, std::size_t limit) override {
        return archive_.ListObjects(after, limit);
    }
    void Mark(Ids ids) override { archive_.Mark(ids); }
    void Unmark(Ids ids) override { archive_.Unmark(ids); }
    std::vector<KivVcs::Id> ListMarked(std::chrono::seconds grace, KivVcs::Id const& after,
                                       std::size_t limit) override {
        return archive_.ListMarked(grace, after, limit);
    }
    std::vector<KivVcs::Id> Remove(Ids ids, std::chrono::seconds grace) override { return archive_.Remove(ids, grace); }
    std::uint64_t Compact(std::uint64_t bytes) override { return archive_.Compact(bytes); }
    KivArchive::ArchiveStatistics GetStatistics() override { return archive_.GetStatistics(); }

private:
    IArchive& archive_;
    KivArchive::MemArchive added_;
};

} // namespace vault
