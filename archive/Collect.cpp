#include "KivArchive/Upkeep.h"
#include "ObjectIndex.h"

#include <deque>
#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

namespace {

/// How many trees and commits are read at once.
constexpr std::size_t batchSize = 1000;

/// Everything that was marked at least @p grace ago.
std::unordered_set<Id> ReadMarks(IArchive& archive, std::chrono::seconds grace) {
    std::unordered_set<Id> marked;
    for (Id after;;) {
        auto const page = archive.ListMarked(grace, after, pageSize);
        marked.insert(page.begin(), page.end());
        if (page.size() < pageSize)
            return marked;
        after = page.back();
    }
}

/// Finds all that some roots reach, along what objects name and what commits have merged.
class Walk {
public:
    Walk(IArchive& archive, ObjectIndex const& index, IProgress* progress)
        : archive_(archive), index_(index), progress_(progress), reached_(index.Size()) {}

    [[nodiscard]] bool HasReached(std::size_t number) const noexcept { return reached_[number]; }
    [[nodiscard]] bool HasReached(Id const& id) const {
        auto const number = index_.Find(id);
        return number ? reached_[*number] : later_.count(id) != 0;
    }
    [[nodiscard]] std::uint64_t CountReached() const noexcept { return count_; }

    /// Reaches @p roots and all that they lead to.
    /// @param needsAll whether it is a failure if something cannot be read; otherwise the walk goes on without it
    void From(std::vector<Id> const& roots, bool needsAll) {
        for (Id const& root : roots)
            Reach(root, true);
        while (!open_.empty()) {
            ReportProgress(progress_, {"looking for what is reached", count_, index_.Size()}, {});
            std::size_t const size = std::min(open_.size(), batchSize);
            std::vector<Id> const batch(open_.end() - static_cast<std::ptrdiff_t>(size), open_.end());
            open_.resize(open_.size() - size);
            Enter(batch, needsAll);
        }
    }

private:
    void Reach(Id const& id, bool isEntered) {
        auto const number = index_.Find(id);
        bool const isNew = number ? !reached_[*number] : later_.insert(id).second;
        if (!isNew)
            return;
        if (number)
            reached_[*number] = true;
        ++count_;
        if (isEntered)
            open_.push_back(id);
    }

    void Enter(std::vector<Id> const& batch, bool needsAll) {
        std::vector<Id> commits;
        ReadOutcome const outcome = archive_.Read(batch, [&](ArchivedObject const& object) {
            if (object.type == ObjectType::Commit)
                commits.push_back(object.id);
            std::vector<Link> links;
            if (!ReadLinks(object.type, object.data, links) && needsAll)
                ThrowUnreadable();
            for (Link const& link : links)
                Reach(link.id, link.type != ObjectType::Blob);
        });
        if (needsAll && !(outcome.damaged.empty() && outcome.missing.empty()))
            ThrowUnreadable();
        for (Ancestry const& facts : archive_.ReadAncestry(commits, Follow::Parents, 0))
            for (ContainedCommit const& contained : facts.contains)
                if (contained.how == Containment::Merged && index_.Find(contained.id))
                    Reach(contained.id, true);
    }

    [[noreturn]] static void ThrowUnreadable() {
        throw ArchiveError(Failure::Damaged, {},
                           "Something that a branch reaches cannot be read, so that nothing can be collected.");
    }

    IArchive& archive_;
    ObjectIndex const& index_;
    IProgress* progress_;
    std::vector<bool> reached_;
    /// What was stored after the index was made.
    std::unordered_set<Id> later_;
    std::vector<Id> open_;
    std::uint64_t count_ = 0;
};

/// Puts objects into an order in which each comes before those that it names.
class TopDown {
public:
    TopDown(IArchive& archive, std::vector<Id> const& ids) : archive_(archive) {
        for (Id const& id : ids)
            namedBy_.emplace(id, 0);
        for (std::size_t begin = 0; begin < ids.size(); begin += batchSize) {
            std::span<const Id> const batch(ids.data() + begin, std::min(batchSize, ids.size() - begin));
            for (auto const& [id, links] : LinksOf(batch))
                for (Id const& link : links)
                    ++namedBy_.at(link);
        }
        for (Id const& id : ids)
            if (namedBy_.at(id) == 0)
                ready_.push_back(id);
    }

    [[nodiscard]] std::size_t Size() const noexcept { return namedBy_.size(); }

    /// The next @p count of them, or as many as are left, which nothing names but what comes before or with them.
    [[nodiscard]] std::vector<Id> Next(std::size_t count) {
        std::vector<Id> next;
        while (!ready_.empty() && next.size() < count) {
            std::vector<Id> batch;
            for (; !ready_.empty() && next.size() + batch.size() < count && batch.size() < batchSize;
                 ready_.pop_front())
                batch.push_back(ready_.front());
            for (auto const& [id, links] : LinksOf(batch))
                for (Id const& link : links)
                    if (--namedBy_.at(link) == 0)
                        ready_.push_back(link);
            next.insert(next.end(), batch.begin(), batch.end());
        }
        return next;
    }

private:
    /// What each of @p ids names, of the objects that are put in order.
    [[nodiscard]] std::unordered_map<Id, std::vector<Id>> LinksOf(std::span<const Id> ids) {
        std::unordered_map<Id, std::vector<Id>> found;
        archive_.Read(ids, [&](ArchivedObject const& object) {
            std::vector<Link> links;
            static_cast<void>(ReadLinks(object.type, object.data, links));
            auto& named = found[object.id];
            for (Link const& link : links)
                if (namedBy_.count(link.id) != 0)
                    named.push_back(link.id);
        });
        return found;
    }

    IArchive& archive_;
    std::unordered_map<Id, std::size_t> namedBy_;
    std::deque<Id> ready_;
};

/// Removes objects, each before those that it names. Hosts may begin to use one meanwhile, which takes its mark away:
/// it stays then, with all that it reaches.
class Removal {
public:
    Removal(IArchive& archive, Walk& kept, CollectOptions const& options, IProgress* progress)
        : archive_(archive), kept_(kept), options_(options), progress_(progress) {}

    /// @return how many of @p doomed have been removed
    std::uint64_t Run(std::vector<Id> const& doomed) {
        TopDown order(archive_, doomed);
        std::uint64_t removed = 0;
        for (auto slice = order.Next(options_.slice); !slice.empty(); slice = order.Next(options_.slice)) {
            ReportProgress(progress_, {"removing objects", removed, order.Size()}, {});
            removed += Remove(std::move(slice));
        }
        return removed;
    }

private:
    std::size_t Remove(std::vector<Id> slice) {
        for (;;) {
            std::erase_if(slice, [this](Id const& id) { return kept_.HasReached(id); });
            if (slice.empty())
                return 0;
            std::vector<Id> const used = archive_.Remove(slice, options_.grace);
            if (used.empty())
                return slice.size();
            kept_.From(used, false);
        }
    }

    IArchive& archive_;
    Walk& kept_;
    CollectOptions const& options_;
    IProgress* progress_;
};

template <class Call>
void InPages(std::vector<Id> const& ids, Call call) {
    for (std::size_t begin = 0; begin < ids.size(); begin += pageSize)
        call(std::span<const Id>(ids.data() + begin, std::min(pageSize, ids.size() - begin)));
}

/// One collection. Marks are read before anything else, so that what is used after that is found out by removing it,
/// since its mark is gone.
class Collecting {
public:
    Collecting(IArchive& archive, CollectOptions const& options, IProgress* progress)
        : archive_(archive), options_(options), progress_(progress), due_(ReadMarks(archive, options.grace)),
          marked_(ReadMarks(archive, std::chrono::seconds(0))), index_(archive, progress),
          walk_(archive, index_, progress) {}

    CollectReport Run() {
        Reach();
        report_.reached = walk_.CountReached();
        Mark();
        report_.removed = Removal(archive_, walk_, options_, progress_).Run(Doomed());
        while (std::uint64_t const rest = archive_.Compact(options_.sliceBytes))
            ReportProgress(progress_, {"giving space back", 0, rest}, {});
        return report_;
    }

private:
    void Reach() {
        std::vector<Id> roots = options_.kept;
        for (Branch const& branch : archive_.ReadBranches())
            roots.push_back(branch.head);
        walk_.From(roots, true);
        // Trees of heads exchanged were not always kept: some may be gone.
        std::vector<Id> exchanged;
        for (ExchangedHead const& head : ReadExchangedHeads(archive_))
            if (!head.tree.IsEmpty() && index_.Find(head.tree))
                exchanged.push_back(head.tree);
        walk_.From(exchanged, false);
    }

    /// Marks what is not reached and unmarks what is.
    void Mark() {
        std::vector<Id> unmarked;
        for (Id const& id : marked_)
            if (walk_.HasReached(id))
                unmarked.push_back(id);
        std::vector<Id> newlyMarked;
        for (std::size_t number = 0; number < index_.Size(); ++number) {
            Id const id = index_.At(number);
            if (walk_.HasReached(number) || due_.count(id) != 0)
                continue;
            young_.push_back(id);
            if (marked_.count(id) == 0)
                newlyMarked.push_back(id);
        }
        // An object can only be removed along with what names it, which must be marked, too.
        if (newlyMarked.size() > options_.mostMarked)
            newlyMarked = TopDown(archive_, newlyMarked).Next(options_.mostMarked);
        InPages(unmarked, [this](std::span<const Id> page) { archive_.Unmark(page); });
        InPages(newlyMarked, [this](std::span<const Id> page) { archive_.Mark(page); });
        report_.unmarked = unmarked.size();
        report_.marked = newlyMarked.size();
    }

    /// What is due and not reached, not even by what is not due yet.
    [[nodiscard]] std::vector<Id> Doomed() {
        walk_.From(young_, false);
        std::vector<Id> doomed;
        for (Id const& id : due_)
            if (!walk_.HasReached(id))
                doomed.push_back(id);
        return doomed;
    }

    IArchive& archive_;
    CollectOptions const& options_;
    IProgress* progress_;
    std::unordered_set<Id> due_;
    std::unordered_set<Id> marked_;
    ObjectIndex index_;
    Walk walk_;
    std::vector<Id> young_;
    CollectReport report_;
};

} // namespace

CollectReport Collect(IArchive& archive, CollectOptions const& options, IProgress* progress) {
    return Collecting(archive, options, progress).Run();
}

} // namespace KivArchive
