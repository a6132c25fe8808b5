#include "KivArchive/ArchivedBlob.h"

#include "repository/Contents.h"

namespace KivArchive {

ArchivedBlob::ArchivedBlob(Id::Digest const& digest, std::shared_ptr<ContentGroup> group) noexcept
    : Blob(digest), group_(std::move(group)) {}

ArchivedBlob::ArchivedBlob(ArchivedBlob const& other) : Blob(*other.GetKnownDigest()), group_(other.group_) {
    if (Buffer const* const content = other.content_.load(std::memory_order_acquire))
        content_.store(std::make_unique<Buffer>(*content).release(), std::memory_order_relaxed);
}

ArchivedBlob::~ArchivedBlob() {
    std::unique_ptr<Buffer const> const content(content_.load(std::memory_order_acquire));
}

Buffer const& ArchivedBlob::GetData() const {
    if (Buffer const* const content = content_.load(std::memory_order_acquire))
        return *content;
    auto fetched = std::make_unique<Buffer const>(group_->GetContents()->Fetch(GetId()));
    Buffer const* held = nullptr;
    // If several threads fetch at once, all use the content of the first.
    if (content_.compare_exchange_strong(held, fetched.get(), std::memory_order_acq_rel, std::memory_order_acquire))
        held = fetched.release();
    return *held;
}

std::uint64_t ArchivedBlob::GetSize() const {
    Buffer const* const content = content_.load(std::memory_order_acquire);
    return content != nullptr ? content->GetSize() : group_->SizeOf(GetId());
}

Buffer ArchivedBlob::ReadContent() const {
    Buffer const* const content = content_.load(std::memory_order_acquire);
    return content != nullptr ? *content : group_->GetContents()->Read(GetId());
}

StreamIO ArchivedBlob::OpenContent() const {
    Buffer const* const content = content_.load(std::memory_order_acquire);
    return content != nullptr ? StreamIO(KivVcs::MemStream::CreateOnCopy(*content))
                              : group_->GetContents()->Open(GetId());
}

bool ArchivedBlob::IsContentHeld() const noexcept {
    return content_.load(std::memory_order_acquire) != nullptr;
}

KivVcs::cow_ptr<KivVcs::Blob> ArchivedBlob::Copy() const {
    return KivVcs::immu::make<ArchivedBlob>(*this);
}

} // namespace KivArchive
