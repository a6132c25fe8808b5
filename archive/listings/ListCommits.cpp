#include "Changes.h"
#include "Digits.h"
#include "listings/ReadTrees.h"

#include <KivUtils/Utf8.h>

#include <algorithm>

namespace KivArchive {

namespace {

constexpr std::int64_t ticksPerMinute = 600'000'000;

/// Decodes texts, and shares one that equals the last: most commits have the author of the one before.
class LastText {
public:
    [[nodiscard]] KivStringT<char16_t> const& Decode(std::string_view bytes) {
        if (bytes != bytes_) {
            text_ = KivUtils::FromUtf8(bytes);
            bytes_ = bytes;
        }
        return text_;
    }

private:
    std::string bytes_;
    KivStringT<char16_t> text_;
};

struct LastAuthor {
    LastText name;
    LastText email;
};

void SetTexts(CommitRecord& record, PackedCommit const& packed, LastAuthor& author) {
    record.state = CommitState::Sound;
    record.authorName = author.name.Decode(packed.authorName);
    record.authorEmail = author.email.Decode(packed.authorEmail);
    record.description = KivUtils::FromUtf8(packed.description);
    record.time = KivVcs::Time::FromTimeT(packed.seconds, KivVcs::TimeZone::Utc);
    record.bias = KivVcs::TimeDelta(packed.biasMinutes * ticksPerMinute);
}

void SetLinks(CommitRecord& record, Ancestry const& facts) {
    record.parent = facts.parent;
    record.tree = facts.tree;
    for (ContainedCommit const& contained : facts.contains)
        if (contained.how == Containment::Merged)
            record.merged.push_back(contained.id);
}

/// Reads the texts of records whose identifiers are set.
/// @param takesLinks returns whether the record with that number gets the links of its packed form, too
template <class TakesLinks>
void ReadTexts(IArchive& archive, std::span<CommitRecord> records, TakesLinks takesLinks) {
    std::unordered_map<Id, CommitRecord*> firsts;
    firsts.reserve(records.size());
    std::vector<Id> ids;
    ids.reserve(records.size());
    for (CommitRecord& record : records)
        if (firsts.emplace(record.id, &record).second)
            ids.push_back(record.id);
    LastAuthor author;
    auto const outcome = archive.Read(ids, [&](ArchivedObject const& object) {
        CommitRecord& record = *firsts.at(object.id);
        record.state = CommitState::Unrepresentable;
        auto const packed = object.type == ObjectType::Commit ? ReadPackedCommit(object.data) : std::nullopt;
        if (!packed)
            return;
        SetTexts(record, *packed, author);
        if (takesLinks(record)) {
            record.parent = packed->parent;
            record.tree = packed->tree;
        }
    });
    for (Id const& id : outcome.damaged)
        firsts.at(id)->state = CommitState::Damaged;
    if (ids.size() == records.size())
        return;
    for (CommitRecord& record : records)
        if (CommitRecord const* const first = firsts.at(record.id); first != &record)
            record = *first;
}

/// Facts in the order in which commits are listed.
class Order {
public:
    virtual ~Order() = default;
    /// The facts of the next commits, at most @p count; none at the end.
    [[nodiscard]] virtual std::vector<Ancestry> Next(std::size_t count) = 0;

protected:
    Order() = default;
    Order(Order const&) = default;
    Order& operator=(Order const&) = default;
};

/// One line of history, read as far as asked for.
class LineOrder final : public Order {
public:
    LineOrder(IArchive& archive, Id head) : archive_(archive), next_(std::move(head)) {}

    std::vector<Ancestry> Next(std::size_t count) override {
        if (next_.IsEmpty() || count == 0)
            return {};
        auto line = archive_.ReadAncestry({&next_, 1}, Follow::Parents, count - 1);
        // A head without facts is listed all the same; further down, a commit without facts ends the line.
        if (line.empty() && isFirst_)
            line.push_back({next_, {}, {}, {}});
        isFirst_ = false;
        next_ = line.empty() ? Id() : line.back().parent;
        return line;
    }

private:
    IArchive& archive_;
    Id next_;
    bool isFirst_ = true;
};

/// All that the heads lead to: no commit before one that leads to it, and lines of history in one piece where that
/// allows it.
class GraphOrder final : public Order {
public:
    GraphOrder(IArchive& archive, std::span<const Id> heads, Follow follow) : follow_(follow) {
        facts_ = archive.ReadAncestry(heads, follow, std::numeric_limits<std::size_t>::max());
        for (std::size_t number = 0; number < facts_.size(); ++number)
            numbers_.emplace(facts_[number].commit, number);
        // Heads without facts are shown, and lead nowhere.
        for (Id const& head : heads)
            if (numbers_.emplace(head, facts_.size()).second)
                facts_.push_back({head, {}, {}, {}});
        leadingHere_.resize(facts_.size());
        isGiven_.resize(facts_.size());
        for (Ancestry const& facts : facts_)
            ForEachLink(facts, [this](std::size_t number) { ++leadingHere_[number]; });
        for (std::size_t number = facts_.size(); number-- > 0;)
            if (leadingHere_[number] == 0)
                ready_.push_back(number);
    }

    std::vector<Ancestry> Next(std::size_t count) override {
        std::vector<Ancestry> next;
        while (next.size() < count && Advance())
            next.push_back(facts_[given_]);
        return next;
    }

private:
    template <class Use>
    void ForEachLink(Ancestry const& facts, Use use) const {
        auto const follow = [&](Id const& id) {
            if (auto const found = numbers_.find(id); found != numbers_.end())
                use(found->second);
        };
        for (ContainedCommit const& contained : facts.contains)
            if (follow_ == Follow::Everything || (follow_ == Follow::Reachable && contained.how == Containment::Merged))
                follow(contained.id);
        if (!facts.parent.IsEmpty())
            follow(facts.parent);
    }

    bool Advance() {
        // Commits that were rebased there and back lead to each other: the first one left is as good as any.
        for (; ready_.empty() && firstLeft_ < facts_.size(); ++firstLeft_)
            if (!isGiven_[firstLeft_])
                ready_.push_back(firstLeft_);
        if (ready_.empty())
            return false;
        given_ = ready_.back();
        ready_.pop_back();
        isGiven_[given_] = true;
        ForEachLink(facts_[given_], [this](std::size_t number) {
            if (--leadingHere_[number] == 0 && !isGiven_[number])
                ready_.push_back(number);
        });
        return true;
    }

    Follow follow_;
    std::vector<Ancestry> facts_;
    std::unordered_map<Id, std::size_t> numbers_;
    std::vector<std::size_t> leadingHere_;
    std::vector<bool> isGiven_;
    std::vector<std::size_t> ready_;
    std::size_t firstLeft_ = 0;
    std::size_t given_ = 0;
};

/// Keeps the commits in which @p path differs from their parent.
void KeepChanging(IArchive& archive, KivStringT<char16_t> const& path, std::vector<Ancestry>& commits) {
    std::unordered_map<Id, Id> trees;
    std::vector<Id> parents;
    for (Ancestry const& facts : commits) {
        trees.emplace(facts.commit, facts.tree);
        if (!facts.parent.IsEmpty())
            parents.push_back(facts.parent);
    }
    std::erase_if(parents, [&](Id const& id) { return trees.count(id) != 0; });
    for (Ancestry const& facts : archive.ReadAncestry(parents, Follow::Parents, 0))
        trees.emplace(facts.commit, facts.tree);
    auto const parentTree = [&](Ancestry const& facts) {
        auto const found = trees.find(facts.parent);
        return found == trees.end() ? Id() : found->second;
    };
    // Where the root trees are the same, there is nothing to look up.
    std::erase_if(commits, [&](Ancestry const& facts) { return facts.tree == parentTree(facts); });
    std::unordered_map<Id, Id> entries;
    std::vector<Id> asked;
    for (Ancestry const& facts : commits)
        for (Id const& tree : {facts.tree, parentTree(facts)})
            if (entries.try_emplace(tree).second)
                asked.push_back(tree);
    for (FoundEntry const& found : FindEntries(archive, asked, path))
        entries[found.tree] = found.entry.id;
    std::erase_if(commits,
                  [&](Ancestry const& facts) { return entries.at(facts.tree) == entries.at(parentTree(facts)); });
}

/// Passes the records of @p commits on. @return false if the receiver ended the listing
bool PassOn(IArchive& archive, std::span<const Ancestry> commits, CommitReceiver const& receiver) {
    std::vector<CommitRecord> records(commits.size());
    for (std::size_t i = 0; i < records.size(); ++i) {
        records[i].id = commits[i].commit;
        SetLinks(records[i], commits[i]);
    }
    ReadTexts(archive, records, [](CommitRecord const&) { return false; });
    return std::all_of(records.begin(), records.end(), receiver);
}

/// The identifier whose digits begin with @p digits and go on with @p rest; null if there is none.
Id Completed(std::string_view digits, char rest) {
    if (digits.empty() || digits.size() > digitCount)
        return {};
    std::string all(digits);
    all.resize(digitCount, rest);
    return Id::Parse(all).value_or(Id());
}

/// The identifier before @p id in their order; null for the first one.
Id Before(Id const& id) {
    Id::Digest digest = *id.GetDigest();
    for (auto byte = digest.rbegin(); byte != digest.rend(); ++byte)
        if ((*byte)-- != 0)
            return Id::FromDigest(digest);
    return {};
}

} // namespace

void ListCommits(IArchive& archive, std::span<const Id> heads, CommitListOptions const& options,
                 CommitReceiver const& receiver, IProgress* progress) {
    std::vector<Id> begins(heads.begin(), heads.end());
    std::erase_if(begins, [](Id const& id) { return id.IsEmpty(); });
    std::unique_ptr<Order> order;
    if (begins.size() == 1 && options.follow == Follow::Parents)
        order = std::make_unique<LineOrder>(archive, begins.front());
    else
        order = std::make_unique<GraphOrder>(archive, begins, options.follow);
    constexpr std::size_t fewAtFirst = 50;
    std::uint64_t given = 0;
    auto batchSize = static_cast<std::size_t>(std::min<std::uint64_t>(
        options.atMost, options.atMost < std::numeric_limits<std::uint64_t>::max() ? listedAtOnce : fewAtFirst));
    for (auto batch = order->Next(batchSize); !batch.empty(); batch = order->Next(batchSize)) {
        ReportProgress(progress, {"listing versions", given, 0}, {});
        if (options.changing)
            KeepChanging(archive, *options.changing, batch);
        batch.resize(static_cast<std::size_t>(std::min<std::uint64_t>(batch.size(), options.atMost - given)));
        given += batch.size();
        if (!PassOn(archive, batch, receiver) || given == options.atMost)
            return;
        batchSize = std::min(2 * batchSize, listedAtOnce);
        if (!options.changing)
            batchSize = static_cast<std::size_t>(std::min<std::uint64_t>(batchSize, options.atMost - given));
    }
}

std::vector<CommitRecord> ReadCommits(IArchive& archive, std::span<const Id> commits) {
    std::unordered_map<Id, Ancestry> known;
    for (Ancestry& facts : archive.ReadAncestry(commits, Follow::Parents, 0)) {
        Id const id = facts.commit;
        known.emplace(id, std::move(facts));
    }
    std::vector<CommitRecord> records(commits.size());
    for (std::size_t i = 0; i < records.size(); ++i) {
        records[i].id = commits[i];
        if (auto const facts = known.find(commits[i]); facts != known.end())
            SetLinks(records[i], facts->second);
    }
    for (std::span<CommitRecord> rest(records); !rest.empty();) {
        auto const batch = rest.first(std::min(listedAtOnce, rest.size()));
        ReadTexts(archive, batch, [&](CommitRecord const& record) { return known.count(record.id) == 0; });
        rest = rest.subspan(batch.size());
    }
    return records;
}

std::vector<Id> FindCommits(IArchive& archive, std::string_view digits, std::size_t atMost) {
    Id const first = Completed(digits, '0');
    Id const last = Completed(digits, 'f');
    if (first.IsEmpty())
        return {};
    std::vector<Id> found;
    for (Ancestry const& facts :
         archive.ListAncestry(Before(first), first == last ? std::min<std::size_t>(atMost, 1) : atMost))
        if (first <= facts.commit && facts.commit <= last)
            found.push_back(facts.commit);
    return found;
}

} // namespace KivArchive
