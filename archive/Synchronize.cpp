#include "Changes.h"
#include "CommitsToCopy.h"
#include "ExchangedHeads.h"
#include "KivArchive/Upkeep.h"
#include "NamedFirst.h"

#include <algorithm>
#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

namespace {

/// How many identifiers are asked about at once, how many commits are taken together, and how much one change stores.
constexpr std::size_t batchSize = 1000;
constexpr std::size_t commitsTogether = 100;
constexpr std::uint64_t changeSize = 8 * largestWholeContent;

/// A tree or commit to be stored.
struct Arriving {
    ObjectType type = ObjectType::Tree;
    Buffer data;
    std::vector<Link> links;
    Id earlier;
};

[[noreturn]] void Fail(Failure kind, std::string const& sentence) {
    throw ArchiveError(kind, {}, sentence);
}

/// Reads all of @p ids, and checks that they are what they should be.
std::unordered_map<Id, Arriving> Fetch(IArchive& from, std::vector<Id> const& ids, ObjectType type) {
    std::unordered_map<Id, Arriving> fetched;
    for (std::size_t begin = 0; begin < ids.size(); begin += batchSize) {
        std::span<const Id> const batch(ids.data() + begin, std::min(batchSize, ids.size() - begin));
        from.Read(batch, [&](ArchivedObject const& object) {
            Arriving arriving{object.type, {}, {}, {}};
            arriving.data.Append(object.data.data(), object.data.size());
            if (object.type != type || !(Identify(object.type, object.data) == object.id) ||
                !ReadLinks(object.type, BytesOf(arriving.data), arriving.links))
                Fail(Failure::Damaged, "The archive to copy from has something that is not what its identifier says.");
            fetched.insert_or_assign(object.id, std::move(arriving));
        });
    }
    for (Id const& id : ids)
        if (fetched.count(id) == 0)
            Fail(Failure::Damaged, "The archive to copy from lacks something that it names, or has it damaged.");
    return fetched;
}

/// Copies commits with all that they bring.
class Copying {
public:
    Copying(IArchive& from, IArchive& to, SynchronizeOptions const& options, IProgress* progress)
        : from_(from), to_(to), options_(options), progress_(progress) {}

    [[nodiscard]] std::uint64_t CountStored() const noexcept { return stored_; }

    void Copy(std::span<const Id> commits, CommitsToCopy const& missing) {
        arriving_ = Fetch(from_, {commits.begin(), commits.end()}, ObjectType::Commit);
        FetchTrees(commits, missing);
        StoreBlobs();
        std::unordered_set<Id> const gone = GoneOfMerged(commits, missing);
        for (Id const& commit : commits) {
            StoreWithTrees(commit);
            RelyOnMerged(missing.FactsOf(commit), gone);
            change_.ancestry.push_back(missing.FactsOf(commit));
        }
        Flush();
        arriving_.clear();
        blobs_.clear();
        hasStored_.clear();
    }

private:
    struct Pair {
        Id id;
        Id earlier;
        /// The first of the commits that bring it.
        Id commit;
    };

    using LinksByName = std::unordered_map<std::string_view, Link const*>;

    /// What the commits have merged and the target lacks: it was collected, or is still to be copied.
    [[nodiscard]] std::unordered_set<Id> GoneOfMerged(std::span<const Id> commits, CommitsToCopy const& missing) {
        std::vector<Id> merged;
        for (Id const& commit : commits)
            AddMerged(missing.FactsOf(commit), merged);
        auto const gone = to_.FindMissing(merged);
        return {gone.begin(), gone.end()};
    }

    void RelyOnMerged(Ancestry const& facts, std::unordered_set<Id> const& gone) {
        std::vector<Id> merged;
        AddMerged(facts, merged);
        std::erase_if(merged, [&](Id const& id) { return gone.count(id) != 0 && hasStored_.count(id) == 0; });
        change_.relied.insert(change_.relied.end(), merged.begin(), merged.end());
    }

    /// Level by level, so that the number of calls depends on the depth only.
    void FetchTrees(std::span<const Id> commits, CommitsToCopy const& missing) {
        std::vector<Id> parents;
        for (Id const& commit : commits)
            if (Id const& parent = missing.FactsOf(commit).parent; !parent.IsEmpty())
                parents.push_back(parent);
        std::unordered_map<Id, Id> treesOf;
        for (Ancestry const& facts : from_.ReadAncestry(parents, Follow::Parents, 0))
            treesOf.emplace(facts.commit, facts.tree);
        std::vector<Pair> level;
        for (Id const& commit : commits) {
            Ancestry const& facts = missing.FactsOf(commit);
            Id tree;
            Id parentId;
            for (Link const& link : arriving_.at(commit).links)
                (link.type == ObjectType::Tree ? tree : parentId) = link.id;
            if (!(tree == facts.tree) || !(parentId == facts.parent))
                Fail(Failure::Damaged, "The archive to copy from knows another ancestry than its versions have.");
            if (!tree.IsEmpty())
                level.push_back({tree, treesOf[facts.parent], commit});
        }
        while (!level.empty())
            level = FetchLevel(std::move(level));
    }

    std::vector<Pair> FetchLevel(std::vector<Pair> level) {
        ReportProgress(progress_, {"reading directories", stored_, 0}, {});
        std::erase_if(level, [this](Pair const& pair) { return arriving_.count(pair.id) != 0; });
        std::unordered_set<Id> const missing = Missing(level);
        std::erase_if(level, [&](Pair const& pair) { return missing.count(pair.id) == 0; });
        std::vector<Id> wanted(missing.begin(), missing.end());
        auto trees = Fetch(from_, wanted, ObjectType::Tree);
        auto const before = FetchEarlier(level, trees);
        std::vector<Pair> blobs;
        std::vector<Pair> next;
        for (Pair const& pair : level) {
            auto const tree = trees.find(pair.id);
            if (tree == trees.end() || arriving_.count(pair.id) != 0)
                continue;
            LinksByName earlier;
            for (auto const* known : {&before, &std::as_const(arriving_), &std::as_const(trees)})
                if (auto const found = known->find(pair.earlier); found != known->end() && earlier.empty())
                    for (Link const& link : found->second.links)
                        earlier.emplace(link.name, &link);
            AddNewEntries(tree->second.links, earlier, pair.commit, next, blobs);
            tree->second.earlier = pair.earlier;
        }
        for (auto& [id, tree] : trees)
            arriving_.try_emplace(id, std::move(tree));
        std::unordered_set<Id> const missingBlobs = Missing(blobs);
        for (Pair const& pair : blobs)
            if (missingBlobs.count(pair.id) != 0 && wantedBlobs_.insert(pair.id).second)
                blobs_.push_back(pair);
        return next;
    }

    /// Adds the entries that the earlier tree does not have, each with what that one has under its name.
    void AddNewEntries(std::vector<Link> const& entries, LinksByName const& earlier, Id const& commit,
                       std::vector<Pair>& trees, std::vector<Pair>& blobs) const {
        for (Link const& link : entries) {
            CheckName(link.name, commit);
            auto const same = earlier.find(link.name);
            Id const earlierId = same != earlier.end() && same->second->type == link.type ? same->second->id : Id();
            // What the earlier tree names, too, is there or is copied with it.
            if (!(earlierId == link.id))
                (link.type == ObjectType::Tree ? trees : blobs).push_back({link.id, earlierId, commit});
        }
    }

    /// The trees that those of a level replace, except those that are copied themselves.
    [[nodiscard]] std::unordered_map<Id, Arriving> FetchEarlier(std::vector<Pair> const& level,
                                                                std::unordered_map<Id, Arriving> const& trees) {
        std::vector<Id> earlier;
        for (Pair const& pair : level)
            if (!pair.earlier.IsEmpty() && trees.count(pair.earlier) == 0 && arriving_.count(pair.earlier) == 0)
                earlier.push_back(pair.earlier);
        // They only save asking, so that it does not matter if the source lacks one.
        auto const missing = from_.FindMissing(earlier);
        std::unordered_set<Id> const gone(missing.begin(), missing.end());
        std::erase_if(earlier, [&gone](Id const& id) { return gone.count(id) != 0; });
        return Fetch(from_, earlier, ObjectType::Tree);
    }

    [[nodiscard]] std::unordered_set<Id> Missing(std::vector<Pair> const& pairs) {
        std::vector<Id> ids;
        ids.reserve(pairs.size());
        for (Pair const& pair : pairs)
            ids.push_back(pair.id);
        auto const missing = to_.FindMissing(ids);
        return {missing.begin(), missing.end()};
    }

    void CheckName(std::string_view name, Id const& commit) const {
        if (!options_.acceptsName)
            return;
        auto const text = KivVcs::String::ToStringW(KivStringViewT<char>(name.data(), static_cast<int>(name.size())));
        if (!options_.acceptsName(text))
            Fail(Failure::Unrepresentable, "Version " + KivVcs::ToUtf8(commit.GetText()) + " has the name \"" +
                                               std::string(name) + "\", which cannot be had here.");
    }

    void StoreBlobs() {
        std::unordered_map<Id, Id> earlier;
        for (Pair const& pair : blobs_)
            earlier.emplace(pair.id, pair.earlier);
        for (std::size_t begin = 0; begin < blobs_.size(); begin += batchSize) {
            std::vector<Id> batch;
            for (std::size_t i = begin; i < std::min(begin + batchSize, blobs_.size()); ++i)
                batch.push_back(blobs_[i].id);
            std::vector<Id> large;
            std::size_t given = 0;
            from_.Read(batch, [&](ArchivedObject const& object) {
                ++given;
                if (object.type != ObjectType::Blob)
                    Fail(Failure::Damaged, "The archive to copy from has something else for a file.");
                if (object.data.empty() && object.size > 0) {
                    large.push_back(object.id);
                    return;
                }
                if (!(Identify(object.type, object.data) == object.id))
                    Fail(Failure::Damaged, "The archive to copy from has a file that is not what its identifier says.");
                Buffer data;
                data.Append(object.data.data(), object.data.size());
                Add({object.id, object.type, std::move(data), earlier.at(object.id)});
            });
            if (given < batch.size())
                Fail(Failure::Damaged, "The archive to copy from lacks a file, or has it damaged.");
            for (Id const& id : large)
                StoreLarge(id, earlier.at(id));
        }
        wantedBlobs_.clear();
    }

    void StoreLarge(Id const& id, Id const& earlier) {
        StreamIO content = ContentStream(from_, id);
        if (!content || !to_.StoreContent(id, content, earlier, progress_))
            Fail(Failure::Damaged, "The archive to copy from has a file that is not what its identifier says.");
        ++stored_;
    }

    /// Stores a tree or commit after all that it names.
    void StoreWithTrees(Id const& root) {
        VisitNamedFirst<Id>(
            {&root, 1},
            [this](Id const& id, std::vector<Id>& named) {
                auto const found = arriving_.find(id);
                if (found == arriving_.end() || hasStored_.count(id) != 0)
                    return false;
                for (Link const& link : found->second.links)
                    if (link.type == ObjectType::Tree)
                        named.push_back(link.id);
                return true;
            },
            [this](Id const& id) {
                Arriving const& object = arriving_.at(id);
                hasStored_.insert(id);
                for (Link const& link : object.links)
                    change_.relied.push_back(link.id);
                Add({id, object.type, object.data, object.earlier});
            });
    }

    void Add(NewObject object) {
        size_ += object.data.GetSize();
        ++stored_;
        change_.objects.push_back(std::move(object));
        if (size_ > changeSize)
            Flush();
    }

    void Flush() {
        ReportProgress(progress_, {"storing objects", stored_, 0}, {});
        to_.Apply(change_);
        change_ = {};
        size_ = 0;
    }

    IArchive& from_;
    IArchive& to_;
    SynchronizeOptions const& options_;
    IProgress* progress_;
    std::unordered_map<Id, Arriving> arriving_;
    std::vector<Pair> blobs_;
    std::unordered_set<Id> wantedBlobs_;
    std::unordered_set<Id> hasStored_;
    Change change_;
    std::uint64_t size_ = 0;
    std::uint64_t stored_ = 0;
};

/// Adds the facts that @p to lacks. @return the number of commits that they are of
std::uint64_t CopyAncestry(IArchive& from, IArchive& to, IProgress* progress) {
    std::uint64_t copied = 0;
    for (Id after;;) {
        ReportProgress(progress, {"copying ancestry", copied, 0}, {});
        auto const page = from.ListAncestry(after, batchSize);
        std::vector<Id> ids;
        ids.reserve(page.size());
        for (Ancestry const& facts : page)
            ids.push_back(facts.commit);
        std::unordered_map<Id, std::size_t> known;
        for (Ancestry const& facts : to.ReadAncestry(ids, Follow::Parents, 0))
            known.emplace(facts.commit, facts.contains.size());
        Change change;
        for (Ancestry const& facts : page)
            if (auto const found = known.find(facts.commit);
                found == known.end() || found->second < facts.contains.size())
                change.ancestry.push_back(facts);
        if (!change.ancestry.empty())
            to.Apply(change);
        copied += change.ancestry.size();
        if (page.size() < batchSize)
            return copied;
        after = page.back().commit;
    }
}

/// Adds the records of the heads that are brought.
void RecordHeads(IArchive& from, SynchronizeOptions const& options, std::vector<Branch> const& heads, Change& change) {
    for (Branch const& head : heads)
        for (SynchronizedBranch const& branch : options.branches) {
            if (!(branch.from == head.name))
                continue;
            auto const facts = from.ReadAncestry({&head.head, 1}, Follow::Parents, 0);
            Id const tree = facts.empty() ? Id() : facts.front().tree;
            change.records.push_back(
                {RecordOf({branch.to.IsEmpty() ? branch.from : branch.to, head.head, tree}), false, {}});
        }
}

void MoveBranches(IArchive& from, IArchive& to, SynchronizeOptions const& options, std::vector<Branch> const& heads) {
    Change change;
    for (Record& record : from.ReadRecords(options.records))
        change.records.push_back({std::move(record), false, {}});
    RecordHeads(from, options, heads, change);
    for (;;) {
        change.branches.clear();
        auto const present = to.ReadBranches();
        for (Branch const& head : heads)
            for (SynchronizedBranch const& branch : options.branches) {
                if (!(branch.from == head.name) || branch.to.IsEmpty())
                    continue;
                auto const now = std::find_if(present.begin(), present.end(),
                                              [&](Branch const& one) { return one.name == branch.to; });
                change.branches.push_back({branch.to, now == present.end() ? Id() : now->head, head.head});
            }
        if (to.Apply(change).applied)
            return;
    }
}

} // namespace

SynchronizeReport Synchronize(IArchive& from, IArchive& to, SynchronizeOptions const& options, IProgress* progress) {
    SynchronizeReport report;
    std::vector<Id> heads;
    for (Branch const& branch : from.ReadBranches())
        if (std::any_of(options.branches.begin(), options.branches.end(),
                        [&](SynchronizedBranch const& wanted) { return wanted.from == branch.name; })) {
            report.heads.push_back(branch);
            heads.push_back(branch.head);
        }
    CommitsToCopy const missing(from, to, heads, progress);
    Copying copying(from, to, options, progress);
    std::span<const Id> rest(missing.InOrder());
    for (; !rest.empty(); rest = rest.subspan(std::min(commitsTogether, rest.size())))
        copying.Copy(rest.first(std::min(commitsTogether, rest.size())), missing);
    report.objects = copying.CountStored();
    report.ancestries = CopyAncestry(from, to, progress);
    MoveBranches(from, to, options, report.heads);
    return report;
}

} // namespace KivArchive
