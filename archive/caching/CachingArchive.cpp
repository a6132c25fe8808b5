#include "KivArchive/CachingArchive.h"

#include "Changes.h"
#include "caching/NearArchive.h"

#include <algorithm>
#include <atomic>

namespace KivArchive {

namespace {

/// How much that was read is kept at once.
constexpr std::uint64_t keptAtOnce = 4 * largestWholeContent;

Buffer BufferOf(std::span<const std::byte> data) {
    Buffer buffer;
    buffer.Append(data.data(), data.size());
    return buffer;
}

} // namespace

struct CachingArchive::State {
    using Clock = std::chrono::steady_clock;

    State(std::shared_ptr<IArchive> nearArchive, std::shared_ptr<IArchive> farArchive,
          CachingOptions const& givenOptions)
        : near(std::move(nearArchive), givenOptions.maximumBytes), far(std::move(farArchive)),
          pause(std::chrono::duration_cast<Clock::duration>(givenOptions.pause).count()) {}

    /// Calls `ask(far)`, and notes whether it could be reached.
    template <class Ask>
    auto AskFar(Ask ask) {
        if (IsPausing())
            throw ArchiveError(Failure::Unavailable, {}, "The archive could not be reached a moment ago.");
        try {
            auto answer = ask(*far);
            awaySince = 0;
            return answer;
        } catch (ArchiveError const& error) {
            if (error.GetKind() == Failure::Unavailable)
                awaySince = std::max<Clock::rep>(1, Clock::now().time_since_epoch().count());
            throw;
        }
    }

    /// The same, or what `seen()` gives while it cannot be reached. Where that is none, nothing is known.
    template <class Ask, class Seen>
    auto AskFarOr(Ask ask, Seen seen) {
        try {
            return AskFar(ask);
        } catch (ArchiveError const& error) {
            if (error.GetKind() != Failure::Unavailable)
                throw;
            if (auto answer = TrySeen(seen))
                return *std::move(answer);
            throw;
        }
    }

    /// None if the near archive fails, too.
    template <class Seen>
    static auto TrySeen(Seen seen) -> decltype(seen()) {
        try {
            return seen();
        } catch (ArchiveError const&) {
            return std::nullopt;
        }
    }

    /// Whether it was found to be away a short time ago.
    [[nodiscard]] bool IsPausing() const noexcept {
        Clock::rep const since = awaySince;
        return since != 0 && Clock::now().time_since_epoch().count() - since < pause;
    }

    NearArchive near;
    std::shared_ptr<IArchive> far;
    Clock::rep const pause;
    /// 0 while it is there.
    std::atomic<Clock::rep> awaySince{0};
};

CachingArchive::CachingArchive(std::shared_ptr<IArchive> near, std::shared_ptr<IArchive> far,
                               CachingOptions const& options)
    : state_(std::make_unique<State>(std::move(near), std::move(far), options)) {}

CachingArchive::~CachingArchive() = default;

bool CachingArchive::IsAway() const noexcept {
    return state_->awaySince != 0;
}

std::vector<Id> CachingArchive::FindMissing(std::span<const Id> ids) {
    return state_->AskFar([ids](IArchive& far) { return far.FindMissing(ids); });
}

std::vector<ObjectInfo> CachingArchive::Describe(std::span<const Id> ids) {
    auto described = state_->near.Describe(ids);
    if (described.size() == ids.size())
        return described;
    std::vector<Id> others(ids.begin(), ids.end());
    std::erase_if(others, [&described](Id const& id) {
        return std::any_of(described.begin(), described.end(), [&id](ObjectInfo const& info) { return info.id == id; });
    });
    auto const further = state_->AskFar([&others](IArchive& far) { return far.Describe(others); });
    described.insert(described.end(), further.begin(), further.end());
    return described;
}

ReadOutcome CachingArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    std::vector<Id> const others = state_->near.Read(ids, receiver);
    if (others.empty())
        return {};
    std::vector<Id> damaged;
    std::vector<NewObject> kept;
    std::uint64_t size = 0;
    auto const receive = [&](ArchivedObject const& object) {
        bool const isLarge = object.data.empty() && object.size > 0;
        if (!isLarge && !(Identify(object.type, object.data) == object.id)) {
            damaged.push_back(object.id);
            return;
        }
        if (!isLarge) {
            kept.push_back({object.id, object.type, BufferOf(object.data), {}});
            size += object.size;
        }
        if (size > keptAtOnce) {
            state_->near.Keep(std::exchange(kept, {}));
            size = 0;
        }
        receiver(object);
    };
    ReadOutcome outcome = state_->AskFar([&](IArchive& far) { return far.Read(others, receive); });
    state_->near.Keep(std::move(kept));
    outcome.damaged.insert(outcome.damaged.end(), damaged.begin(), damaged.end());
    return outcome;
}

std::optional<Buffer> CachingArchive::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    if (auto content = state_->near.ReadContent(id, offset, size))
        return content;
    return state_->AskFar([&](IArchive& far) -> std::optional<Buffer> {
        StreamIO content = ContentStream(far, id);
        if (!content)
            return std::nullopt;
        if (state_->near.HasRoomFor(content.GetSize()) && state_->near.KeepContent(id, content))
            if (auto kept = state_->near.ReadContent(id, offset, size))
                return kept;
        return far.ReadContent(id, offset, size);
    });
}

bool CachingArchive::StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) {
    return state_->AskFar([&](IArchive& far) { return far.StoreContent(id, content, earlier, progress); });
}

ChangeOutcome CachingArchive::Apply(Change const& change) {
    ChangeOutcome outcome = state_->AskFar([&change](IArchive& far) { return far.Apply(change); });
    if (outcome.applied) {
        state_->near.Keep(change.objects);
        state_->near.KeepAncestry(change.ancestry);
        state_->near.KeepChanged(change);
    }
    return outcome;
}

std::vector<Branch> CachingArchive::ReadBranches() {
    return state_->AskFarOr(
        [this](IArchive& far) {
            auto branches = far.ReadBranches();
            state_->near.KeepBranches(branches);
            return branches;
        },
        [this] { return state_->near.ReadBranches(); });
}

std::vector<Record> CachingArchive::ReadRecords(std::span<const KivStringT<char16_t>> names) {
    return state_->AskFarOr(
        [&](IArchive& far) {
            auto records = far.ReadRecords(names);
            state_->near.KeepRecords(names, records);
            return records;
        },
        [&] { return state_->near.ReadRecords(names); });
}

std::vector<Ancestry> CachingArchive::ReadAncestry(std::span<const Id> commits, Follow follow, std::size_t more) {
    return state_->AskFarOr(
        [&](IArchive& far) {
            auto facts = far.ReadAncestry(commits, follow, more);
            state_->near.KeepAncestry(facts);
            return facts;
        },
        [&] { return state_->near.ReadAncestry(commits, follow, more); });
}

std::vector<KivStringT<char16_t>> CachingArchive::ListRecords() {
    return state_->AskFar([](IArchive& far) { return far.ListRecords(); });
}

std::vector<Ancestry> CachingArchive::ListAncestry(Id const& after, std::size_t limit) {
    return state_->AskFar([&](IArchive& far) { return far.ListAncestry(after, limit); });
}

std::vector<ObjectInfo> CachingArchive::ListObjects(Id const& after, std::size_t limit) {
    return state_->AskFar([&](IArchive& far) { return far.ListObjects(after, limit); });
}

void CachingArchive::Mark(std::span<const Id> ids) {
    state_->AskFar([ids](IArchive& far) { return far.Mark(ids), true; });
}

void CachingArchive::Unmark(std::span<const Id> ids) {
    state_->AskFar([ids](IArchive& far) { return far.Unmark(ids), true; });
}

std::vector<Id> CachingArchive::ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) {
    return state_->AskFar([&](IArchive& far) { return far.ListMarked(grace, after, limit); });
}

std::vector<Id> CachingArchive::Remove(std::span<const Id> ids, std::chrono::seconds grace) {
    auto kept = state_->AskFar([&](IArchive& far) { return far.Remove(ids, grace); });
    if (kept.empty())
        state_->near.Drop(ids);
    return kept;
}

std::uint64_t CachingArchive::Compact(std::uint64_t bytes) {
    return state_->AskFar([bytes](IArchive& far) { return far.Compact(bytes); });
}

ArchiveStatistics CachingArchive::GetStatistics() {
    return state_->AskFar([](IArchive& far) { return far.GetStatistics(); });
}

} // namespace KivArchive
