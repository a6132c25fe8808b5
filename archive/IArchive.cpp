#include "Changes.h"

#include <algorithm>

namespace KivArchive {

namespace {

Id Finish(KivVcs::SHADigest256& digest) {
    Id::Digest bytes{};
    digest.FinalDigest(bytes.data());
    return Id::FromDigest(bytes);
}

/// Fetches a content window by window. Does not give its last bytes unless the whole matches the identifier.
class Content final : public KivVcs::IStream {
public:
    Content(IArchive& archive, Id id, std::uint64_t size)
        : archive_(archive), id_(std::move(id)), size_(size), digest_(BeginPackedForm(ObjectType::Blob, size)) {}

    bool Read(void* destination, std::uint64_t size) override {
        if (size > size_ - position_)
            return false;
        auto* to = static_cast<std::byte*>(destination);
        while (size > 0) {
            std::uint64_t const inWindow = position_ - windowBegin_;
            if (inWindow == window_.GetSize()) {
                if (!Fetch())
                    return false;
                continue;
            }
            std::uint64_t const count = std::min(size, window_.GetSize() - inWindow);
            if (!window_.Read(inWindow, to, count))
                return false;
            to += count;
            position_ += count;
            size -= count;
        }
        return true;
    }
    bool Write(const void* /*source*/, std::uint64_t /*size*/) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return size_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    bool Fetch() {
        constexpr std::uint64_t windowSize = 4 * largestWholeContent;
        // The last window is released first, so that there are never two.
        window_ = Buffer();
        windowBegin_ = position_;
        auto window = archive_.ReadContent(id_, position_, windowSize);
        if (!window || window->GetSize() != std::min(windowSize, size_ - position_))
            return false;
        for (auto const& chunk : window->LockForRead())
            digest_.InitData(chunk.data(), chunk.size());
        if (position_ + window->GetSize() == size_ && !(Finish(digest_) == id_))
            return false;
        window_ = std::move(*window);
        return true;
    }

    IArchive& archive_;
    Id id_;
    std::uint64_t size_;
    std::uint64_t position_ = 0;
    Buffer window_;
    std::uint64_t windowBegin_ = 0;
    KivVcs::SHADigest256 digest_;
};

} // namespace

IArchive::~IArchive() = default;

Id Identify(ObjectType type, std::span<const std::byte> data) {
    KivVcs::SHADigest256 digest = BeginPackedForm(type, data.size());
    digest.InitData(data.data(), data.size());
    return Finish(digest);
}

Id Identify(ObjectType type, Buffer const& data) {
    KivVcs::SHADigest256 digest = BeginPackedForm(type, data.GetSize());
    for (auto const& chunk : data.LockForRead())
        digest.InitData(chunk.data(), chunk.size());
    return Finish(digest);
}

StreamIO ContentStream(IArchive& archive, Id const& id) {
    auto const described = archive.Describe({&id, 1});
    if (described.empty() || described.front().type != ObjectType::Blob)
        return {};
    return StreamIO(KivVcs::Stream(std::make_unique<Content>(archive, id, described.front().size)));
}

} // namespace KivArchive
