#include "Snapshot.h"

#include "Contents.h"
#include "Names.h"
#include "Problem.h"

#include <algorithm>
#include <climits>
#include <cstdlib>
#include <ctime>
#include <future>
#include <memory>
#include <unordered_set>

namespace vault {

using Kind = ScannedEntry::Kind;

namespace {

/// A file that was changed less than this before it was read may change again without showing it.
constexpr std::int64_t racyNanoseconds = 2'000'000'000;
/// Directories with longer paths, which are nested so deep that nobody made them by hand, are read every time.
constexpr std::size_t longestIndexedPath = 4096;
constexpr std::uint64_t mostPendingBytes = std::uint64_t{4} * 1024 * 1024;

std::int64_t Now() noexcept {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return static_cast<std::int64_t>(now.tv_sec) * 1'000'000'000 + now.tv_nsec;
}

bool IsContent(ScannedEntry const& entry) noexcept {
    return entry.kind == Kind::File || entry.kind == Kind::Link;
}

std::uint32_t ModeOf(FileState const& state) noexcept {
    return state.mode & 07777U;
}

class Snapshotter {
public:
    Snapshotter(IArchive& archive, SnapshotOptions const& options, Progress& progress)
        : archive_(archive), options_(options), progress_(progress), reader_(archive), begin_(Now()) {}

    Snapshot Take() {
        snapshot_.top = RealPath(options_.scan.top);
        // The index is read while the directory is looked at.
        indexed_ = std::async(std::launch::async, [this] {
                       before_ = ReadIndex(snapshot_.top);
                       if (!options_.readsAll)
                           index_ = StatIndex(before_);
                   }).share();
        auto scanning = options_.scan;
        scanning.isSaved = [this](std::string const& path) { return IsSaved(path); };
        scan_ = ScanDirectory(scanning);
        indexed_.get();
        AskAboutExcluded();
        states_.resize(scan_.directories.size());
        for (auto at = states_.size(); at-- > 0;)
            Recognize(at);
        Open();
        const bool isUnread = ReadWanted();
        for (auto at = states_.size(); at-- > 0;) {
            if (states_[at].isOpen)
                Build(at);
        }
        snapshot_.tree = states_.front().tree;
        snapshot_.problems.insert(snapshot_.problems.begin(), scan_.problems.begin(), scan_.problems.end());
        snapshot_.specials = scan_.specials;
        for (auto const& directory : scan_.directories)
            snapshot_.files += static_cast<std::uint64_t>(
                std::count_if(directory.entries.begin(), directory.entries.end(), IsContent));
        if (options_.stores && (isUnread || snapshot_.tree != options_.previous || before_.empty()))
            snapshot_.index = MakeIndex();
        return std::move(snapshot_);
    }

private:
    /// What is known of a scanned directory.
    struct State {
        /// Of each entry, once the directory is looked at more closely; null while it has to be read.
        std::vector<Id> ids;
        /// The states that were read, which may be later than the scanned ones.
        std::vector<FileState> states;
        /// The tree; null while it is not known.
        Id tree;
        Id previousTree;
        /// Of the last version, once the directory is looked at more closely.
        std::optional<Directory> previous;
        bool isOpen = false;
        /// The version has a stamp, which is not among the scanned files.
        bool isStamped = false;
    };

    bool IsSaved(std::string const& path) {
        if (options_.previous.IsEmpty())
            return false;
        indexed_.get();
        const auto known = index_.Has(options_.previous, path);
        return known ? *known : options_.scan.isSaved && options_.scan.isSaved(path);
    }

    void AskAboutExcluded() {
        if (scan_.excludedSaved.empty() || !options_.removesExcluded || !options_.removesExcluded(scan_.excludedSaved))
            return;
        const std::unordered_set<std::string> gone(scan_.excludedSaved.begin(), scan_.excludedSaved.end());
        for (auto& directory : scan_.directories)
            std::erase_if(directory.entries,
                          [&](ScannedEntry const& entry) { return gone.contains(directory.path + entry.name); });
    }

    /// Takes what the index has for a directory of which everything looks as it did then. Those below come first.
    void Recognize(std::size_t at) {
        auto const& directory = scan_.directories[at];
        auto listing = index_.Find(directory.path);
        if (!listing || listing->Mode() != directory.state.mode)
            return;
        for (auto const& entry : directory.entries) {
            if (entry.kind == Kind::Special)
                continue;
            const auto known = listing->Next();
            if (!known || known->name != entry.name)
                return;
            const bool isSame = entry.kind == Kind::Directory ? !states_[entry.directory].tree.IsEmpty() &&
                                                                    states_[entry.directory].tree == known->GetId()
                                                              : IsContent(entry) && known->state == entry.state;
            if (!isSame)
                return;
        }
        if (!listing->Next())
            states_[at].tree = listing->Tree();
    }

    /// Takes what the index has for those files of a directory that look as they did then.
    void RecognizeFiles(std::size_t at) {
        auto const& entries = scan_.directories[at].entries;
        auto& ids = states_[at].ids;
        ids.resize(entries.size());
        auto listing = index_.Find(scan_.directories[at].path);
        auto known = listing ? listing->Next() : std::nullopt;
        for (std::size_t i = 0; i < entries.size() && known; ++i) {
            while (known && ComesBefore(known->name, entries[i].name))
                known = listing->Next();
            if (known && known->name == entries[i].name && IsContent(entries[i]) && known->state == entries[i].state)
                ids[i] = known->GetId();
        }
    }

    /// Finds the last version's directories for all that is not known to be as it was, from the top.
    void Open() {
        std::vector<std::size_t> level{0};
        states_.front().previousTree = options_.previous;
        while (!level.empty()) {
            std::vector<Id> trees;
            std::erase_if(level, [this](std::size_t at) {
                return !states_[at].tree.IsEmpty() && states_[at].tree == states_[at].previousTree;
            });
            if (level.empty())
                break;
            trees.reserve(level.size());
            for (const auto at : level)
                trees.push_back(states_[at].previousTree);
            const auto read = reader_.Read(trees);
            std::vector<std::size_t> next;
            for (const auto at : level) {
                auto& state = states_[at];
                state.isOpen = true;
                RecognizeFiles(at);
                // One that is damaged is saved anew.
                const auto found = read.find(state.previousTree);
                if (found == read.end())
                    state.previousTree = Id();
                state.previous = found == read.end() ? Directory() : found->second;
                for (auto const& entry : scan_.directories[at].entries) {
                    if (entry.kind != Kind::Directory)
                        continue;
                    auto const* const before = state.previous->Find(entry.name);
                    if (before != nullptr && before->isDirectory)
                        states_[entry.directory].previousTree = before->id;
                    next.push_back(entry.directory);
                }
            }
            level = std::move(next);
        }
    }

    /// @return whether anything had to be read
    bool ReadWanted() {
        std::vector<WantedContent> wanted;
        std::vector<std::pair<std::size_t, std::size_t>> places;
        // In the order of the paths, which is that of the versions.
        std::vector<std::size_t> rest{0};
        while (!rest.empty()) {
            const auto at = rest.back();
            rest.pop_back();
            auto& state = states_[at];
            if (!state.isOpen)
                continue;
            auto const& directory = scan_.directories[at];
            state.states.resize(directory.entries.size());
            const auto firstBelow = rest.size();
            for (std::size_t i = 0; i < directory.entries.size(); ++i) {
                auto const& entry = directory.entries[i];
                state.states[i] = entry.state;
                if (entry.kind == Kind::Directory)
                    rest.push_back(entry.directory);
                if (!IsContent(entry) || !state.ids[i].IsEmpty())
                    continue;
                auto const* const before = state.previous->Find(entry.name);
                wanted.push_back(
                    {&directory.path, &entry, before && !before->isDirectory ? before->id : Id(), {}, {}, {}});
                places.emplace_back(at, i);
            }
            std::reverse(rest.begin() + static_cast<std::ptrdiff_t>(firstBelow), rest.end());
        }
        snapshot_.stored = ReadContents(options_.scan.top, wanted, options_.stores ? &archive_ : nullptr, progress_);
        for (std::size_t i = 0; i < wanted.size(); ++i) {
            auto& state = states_[places[i].first];
            state.ids[places[i].second] = wanted[i].id;
            state.states[places[i].second] = wanted[i].state;
            if (!wanted[i].problem.empty())
                snapshot_.problems.push_back(PrintableName(*wanted[i].directory + wanted[i].entry->name) + ": " +
                                             wanted[i].problem);
        }
        return !wanted.empty();
    }

    /// Makes the tree of a directory whose directories have theirs.
    void Build(std::size_t at) {
        auto const& scanned = scan_.directories[at];
        auto& state = states_[at];
        Directory directory;
        for (std::size_t i = 0; i < scanned.entries.size(); ++i) {
            auto const* const before = state.previous->Find(scanned.entries[i].name);
            if (auto entry = MakeEntry(scanned.entries[i], state, i, before))
                directory.entries.push_back(*std::move(entry));
        }
        if (options_.stamp)
            Stamp(directory, state);
        directory.own = Attributes{false, ModeOf(scanned.state), scanned.state.modified};
        auto const& previousOwn = state.previous->own;
        const bool isLike = previousOwn && previousOwn->IsLike(*directory.own) && !state.previousTree.IsEmpty();
        if (isLike && directory.entries == state.previous->entries) {
            state.tree = state.previousTree;
            return;
        }
        auto packed = Pack(directory);
        state.tree = packed.tree.id;
        Keep(std::move(packed), directory, state);
    }

    std::optional<Entry> MakeEntry(ScannedEntry const& scanned, State const& state, std::size_t i,
                                   Entry const* before) {
        const auto asBefore = [before] { return before == nullptr ? std::nullopt : std::optional(*before); };
        switch (scanned.kind) {
        case Kind::Directory:
            return Entry{scanned.name, true, states_[scanned.directory].tree, {}};
        case Kind::Special:
            return std::nullopt;
        case Kind::Unreadable:
        case Kind::Elsewhere:
            return asBefore();
        case Kind::File:
        case Kind::Link:
            break;
        }
        if (state.ids[i].IsEmpty())
            return asBefore();
        auto const& file = state.states[i];
        Attributes attributes{scanned.kind == Kind::Link, ModeOf(file), file.modified};
        // A touched file is no change.
        if (before != nullptr && before->id == state.ids[i] && before->attributes &&
            before->attributes->IsLike(attributes))
            attributes = *before->attributes;
        return Entry{scanned.name, false, state.ids[i], attributes};
    }

    /// Stamps a directory whose content, stamps aside, is not that of the last version; otherwise takes its stamp over.
    void Stamp(Directory& directory, State& state) {
        const auto isStamp = [](Entry const& entry) { return entry.name == stampName && !entry.isDirectory; };
        std::erase_if(directory.entries, isStamp);
        auto before = state.previous->entries;
        std::erase_if(before, isStamp);
        Entry stamp{std::string(stampName), false, {}, Attributes{false, 0644, *options_.stamp * 1'000'000'000}};
        if (before == directory.entries) {
            auto const* const earlier = state.previous->Find(stampName);
            if (earlier == nullptr)
                return;
            stamp = *earlier;
        } else {
            auto content = BufferOf(std::to_string(*options_.stamp));
            stamp.id = KivArchive::Identify(KivArchive::ObjectType::Blob, content);
            Add({stamp.id, KivArchive::ObjectType::Blob, std::move(content), {}});
        }
        state.isStamped = true;
        directory.entries.insert(
            std::upper_bound(directory.entries.begin(), directory.entries.end(), stamp,
                             [](Entry const& left, Entry const& right) { return ComesBefore(left.name, right.name); }),
            stamp);
    }

    void Keep(PackedDirectory packed, Directory const& directory, State const& state) {
        std::unordered_set<Id> vouchedFor;
        if (!state.previousTree.IsEmpty()) {
            snapshot_.change.relied.push_back(state.previousTree);
            for (auto const& entry : state.previous->entries)
                vouchedFor.insert(entry.id);
        }
        for (auto const& entry : directory.entries) {
            if (!vouchedFor.contains(entry.id) && !pending_.contains(entry.id))
                snapshot_.change.relied.push_back(entry.id);
        }
        for (std::size_t i = 0; i < packed.attributes.size(); ++i) {
            if (packed.attributes.size() == state.previous->attributeContents.size())
                packed.attributes[i].earlier = state.previous->attributeContents[i];
            Add(std::move(packed.attributes[i]));
        }
        packed.tree.earlier = state.previousTree;
        Add(std::move(packed.tree));
        if (options_.stores && pendingBytes_ > mostPendingBytes) {
            snapshot_.stored += snapshot_.change.objects.size();
            archive_.Apply(snapshot_.change);
            snapshot_.change = {};
            pending_.clear();
            pendingBytes_ = 0;
        }
    }

    void Add(NewObject object) {
        if (!pending_.insert(object.id).second)
            return;
        pendingBytes_ += object.data.GetSize();
        snapshot_.change.objects.push_back(std::move(object));
    }

    /// What the next save can take for granted.
    [[nodiscard]] std::string MakeIndex() const {
        StatIndexWriter writer;
        for (std::size_t at = 0; at < states_.size(); ++at) {
            if (scan_.directories[at].path.size() > longestIndexedPath)
                continue;
            const auto known = states_[at].isOpen ? std::nullopt : index_.Find(scan_.directories[at].path);
            if (known)
                writer.Copy(*known);
            else
                AddTo(writer, at);
        }
        return writer.Bytes();
    }

    void AddTo(StatIndexWriter& writer, std::size_t at) const {
        auto const& directory = scan_.directories[at];
        auto const& state = states_[at];
        bool isWhole = !state.isStamped;
        writer.Begin(directory.path, directory.state.mode);
        for (std::size_t i = 0; i < directory.entries.size(); ++i) {
            auto const& entry = directory.entries[i];
            if (entry.kind == Kind::Directory) {
                writer.AddFile(entry.name, {}, states_[entry.directory].tree);
                continue;
            }
            if (entry.kind == Kind::Special)
                continue;
            auto const& file = state.states[i];
            const bool isRacy = std::max(file.modified, file.changed) > begin_ - racyNanoseconds;
            if (IsContent(entry) && !state.ids[i].IsEmpty() && !isRacy)
                writer.AddFile(entry.name, file, state.ids[i]);
            else
                isWhole = false;
        }
        writer.End(isWhole ? state.tree : Id());
    }

    IArchive& archive_;
    SnapshotOptions const& options_;
    Progress& progress_;
    TreeReader reader_;
    std::int64_t begin_;
    /// The index, and what it is read from.
    std::string before_;
    StatIndex index_;
    Scan scan_;
    std::vector<State> states_;
    Snapshot snapshot_;
    std::unordered_set<Id> pending_;
    std::uint64_t pendingBytes_ = 0;
    /// The last member, so that it goes first: its destructor waits for the thread that reads the index into the others.
    std::shared_future<void> indexed_;
};

} // namespace

Snapshot TakeSnapshot(IArchive& archive, SnapshotOptions const& options, Progress& progress) {
    return Snapshotter(archive, options, progress).Take();
}

} // namespace vault
