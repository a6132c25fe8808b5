#pragma once

/// @file
/// Files whose content stays in an archive until it is asked for.

#include "KivArchive/IArchive.h"

#include <KivVcs/Blob.h>

#include <atomic>
#include <memory>

namespace KivArchive {

class ContentGroup;

/// A blob that knows its identifier and fetches its content when asked for it.
///
/// There are three ways to the content: `GetData` keeps it until the blob dies, `ReadContent` returns it as a value,
/// and `OpenContent` as a stream that holds at most a few MiB. The latter two share the byte budget of the repository
/// that the blob comes from. The blob keeps the archive alive, not the repository.
///
/// Threads: all `const` operations may run concurrently.
/// @throws ArchiveError from everything that fetches, `Collected` if the content is not there any more and `Damaged` if
/// it does not match the identifier; std::bad_alloc. After a failure the next call tries again
class KIVARCHIVE_EXPORT ArchivedBlob final : public KivVcs::Blob {
public:
    /// For repositories, which make one group for the files of each directory that they read.
    ArchivedBlob(Id::Digest const& digest, std::shared_ptr<ContentGroup> group) noexcept;
    ArchivedBlob(ArchivedBlob const& other);
    ArchivedBlob& operator=(ArchivedBlob const&) = delete;
    ~ArchivedBlob() override;

    /// The content, fetched by the first call and kept until the blob dies.
    [[nodiscard]] Buffer const& GetData() const override;

    /// The size of the content, without fetching it. The first call asks the archive for the sizes of all files that
    /// were read along with this one.
    [[nodiscard]] std::uint64_t GetSize() const;

    /// The content as a value. It may be cached, within the budget.
    [[nodiscard]] Buffer ReadContent() const;

    /// The content as a stream. Reading its last bytes fails unless the whole content matches the identifier.
    [[nodiscard]] StreamIO OpenContent() const;

    /// Whether `GetData` has fetched the content.
    [[nodiscard]] bool IsContentHeld() const noexcept;

protected:
    [[nodiscard]] KivVcs::cow_ptr<KivVcs::Blob> Copy() const override;

private:
    std::shared_ptr<ContentGroup> group_;
    /// Null until the content has been asked for.
    mutable std::atomic<Buffer const*> content_{nullptr};
};

} // namespace KivArchive
