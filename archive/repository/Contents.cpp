#include "repository/Contents.h"

#include "repository/Unreadable.h"

namespace KivArchive {

namespace {

/// The most bytes that a stream over a content holds.
constexpr std::uint64_t windowSize = 4 * largestWholeContent;

ObjectInfo DescribeContent(IArchive& archive, Id const& id) {
    auto const described = archive.Describe({&id, 1});
    if (described.empty())
        ThrowUnreadable(archive.FindMissing({&id, 1}).empty() ? Failure::Damaged : Failure::Collected, "file", id);
    if (described.front().type != ObjectType::Blob)
        ThrowUnreadable(Failure::Unrepresentable, "file", id);
    return described.front();
}

Buffer FetchLarge(IArchive& archive, Id const& id, std::uint64_t size) {
    StreamIO stream = ContentStream(archive, id);
    bool isWhole = stream && stream.GetSize() == size;
    Buffer content = Buffer::Build(isWhole ? size : 0, [&](std::byte* bytes) { isWhole = stream.Read(bytes, size); });
    if (!isWhole)
        ThrowUnreadable(Failure::Damaged, "file", id);
    return content;
}

} // namespace

/// The stream of a content. Keeps the archive alive, and takes its share of the budget.
class BudgetedStream final : public KivVcs::IStream {
public:
    BudgetedStream(std::shared_ptr<Contents> contents, Id const& id)
        : contents_(std::move(contents)), stream_(ContentStream(*contents_->archive_, id)) {
        if (!stream_)
            ThrowUnreadable(Failure::Collected, "file", id);
        contents_->Reserve(windowSize);
    }
    BudgetedStream(BudgetedStream const&) = delete;
    BudgetedStream& operator=(BudgetedStream const&) = delete;
    ~BudgetedStream() override { contents_->Release(windowSize); }

    bool Read(void* destination, std::uint64_t size) override { return stream_.Read(destination, size); }
    bool Write(const void* /*source*/, std::uint64_t /*size*/) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return stream_.GetSize(); }
    [[nodiscard]] std::uint64_t GetPosition() const override { return stream_.GetPosition(); }

private:
    std::shared_ptr<Contents> contents_;
    StreamIO stream_;
};

Buffer Contents::Fetch(Id const& id) {
    Buffer content;
    bool isWhole = false;
    std::uint64_t largeSize = 0;
    ReadOutcome const outcome = archive_->Read({&id, 1}, [&](ArchivedObject const& object) {
        if (object.type != ObjectType::Blob)
            ThrowUnreadable(Failure::Unrepresentable, "file", id);
        isWhole = true;
        largeSize = object.data.empty() ? object.size : 0;
        content = Buffer();
        content.Append(object.data.data(), object.data.size());
    });
    if (!isWhole)
        ThrowUnreadable(outcome.damaged.empty() ? Failure::Collected : Failure::Damaged, "file", id);
    return largeSize == 0 ? content : FetchLarge(*archive_, id, largeSize);
}

Buffer Contents::Read(Id const& id) {
    if (auto kept = FindKept(id))
        return std::move(*kept);
    Buffer content = Fetch(id);
    Keep(id, content);
    return content;
}

StreamIO Contents::Open(Id const& id) {
    if (auto kept = FindKept(id))
        return StreamIO(KivVcs::MemStream::CreateOnCopy(std::move(*kept)));
    if (DescribeContent(*archive_, id).size <= largestWholeContent)
        return StreamIO(KivVcs::MemStream::CreateOnCopy(Read(id)));
    return StreamIO(KivVcs::Stream(std::make_unique<BudgetedStream>(shared_from_this(), id)));
}

std::optional<Buffer> Contents::FindKept(Id const& id) {
    std::scoped_lock const lock(mutex_);
    auto const place = places_.find(id);
    if (place == places_.end())
        return std::nullopt;
    kept_.splice(kept_.begin(), kept_, place->second);
    return kept_.front().content;
}

void Contents::Keep(Id const& id, Buffer const& content) {
    if (content.GetSize() > budget_)
        return;
    std::scoped_lock const lock(mutex_);
    if (places_.contains(id))
        return;
    std::list<Kept> added{{id, content}};
    places_.emplace(id, added.begin());
    kept_.splice(kept_.begin(), added);
    used_ += content.GetSize();
    MakeRoom();
}

void Contents::Reserve(std::uint64_t size) {
    std::scoped_lock const lock(mutex_);
    used_ += size;
    MakeRoom();
}

void Contents::Release(std::uint64_t size) noexcept {
    std::scoped_lock const lock(mutex_);
    used_ -= size;
}

void Contents::MakeRoom() noexcept {
    for (; used_ > budget_ && !kept_.empty(); kept_.pop_back()) {
        used_ -= kept_.back().content.GetSize();
        places_.erase(kept_.back().id);
    }
}

std::uint64_t ContentGroup::SizeOf(Id const& id) {
    std::scoped_lock const lock(mutex_);
    if (!ids_.empty()) {
        for (ObjectInfo const& info : contents_->Archive().Describe(ids_))
            sizes_.insert_or_assign(info.id, info.size);
        ids_ = {};
    }
    auto found = sizes_.find(id);
    if (found == sizes_.end())
        found = sizes_.emplace(id, DescribeContent(contents_->Archive(), id).size).first;
    return found->second;
}

} // namespace KivArchive
