#pragma once

/// @file
/// Reading contents from an archive, within a byte budget.

#include "KivArchive/IArchive.h"

#include <list>
#include <memory>
#include <mutex>
#include <unordered_map>

namespace KivArchive {

/// Fetches contents, and caches those that were asked for last.
///
/// Threads: all operations may run concurrently. No lock is held while the archive is asked.
class Contents : public std::enable_shared_from_this<Contents> {
public:
    Contents(std::shared_ptr<IArchive> archive, std::uint64_t budget) : archive_(std::move(archive)), budget_(budget) {}

    /// The content, verified and not cached. @throws ArchiveError
    [[nodiscard]] Buffer Fetch(Id const& id);
    /// The content, cached as long as the budget allows.
    [[nodiscard]] Buffer Read(Id const& id);
    /// A stream that holds one window, which counts against the budget.
    [[nodiscard]] StreamIO Open(Id const& id);

    [[nodiscard]] IArchive& Archive() const noexcept { return *archive_; }

private:
    friend class BudgetedStream;

    struct Kept {
        Id id;
        Buffer content;
    };

    [[nodiscard]] std::optional<Buffer> FindKept(Id const& id);
    void Keep(Id const& id, Buffer const& content);
    void Reserve(std::uint64_t size);
    void Release(std::uint64_t size) noexcept;
    void MakeRoom() noexcept;

    std::shared_ptr<IArchive> archive_;
    std::uint64_t const budget_;
    std::mutex mutex_;
    /// The most recently used first.
    std::list<Kept> kept_;
    std::unordered_map<Id, std::list<Kept>::iterator> places_;
    std::uint64_t used_ = 0;
};

/// Files that were read together, and whose sizes are asked for together.
class ContentGroup {
public:
    ContentGroup(std::shared_ptr<Contents> contents, std::vector<Id> ids)
        : contents_(std::move(contents)), ids_(std::move(ids)) {}

    [[nodiscard]] std::shared_ptr<Contents> const& GetContents() const noexcept { return contents_; }
    /// @throws ArchiveError
    [[nodiscard]] std::uint64_t SizeOf(Id const& id);

private:
    std::shared_ptr<Contents> contents_;
    std::mutex mutex_;
    std::vector<Id> ids_;
    std::unordered_map<Id, std::uint64_t> sizes_;
};

} // namespace KivArchive
