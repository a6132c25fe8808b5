#include "Changes.h"
#include "listings/ReadTrees.h"

#include <KivUtils/Utf8.h>

#include <algorithm>

namespace KivArchive {

namespace {

using KivVcs::ChangeKind;
using KivVcs::Difference;

/// Two directories that are compared; null for none.
struct Pair {
    Id before;
    Id after;

    friend bool operator==(Pair const& left, Pair const& right) noexcept = default;
};

struct HashOfPair {
    std::size_t operator()(Pair const& pair) const noexcept { return pair.before.Hash() * 31U + pair.after.Hash(); }
};

/// A name that differs: as a file if it has a kind, as a directory if there is a pair below.
struct Entry {
    static constexpr std::size_t none = std::numeric_limits<std::size_t>::max();

    std::string name;
    ChangeKind kind = ChangeKind::Unchanged;
    Id oldId;
    Id newId;
    std::size_t below = none;
};

/// A pair that has been compared.
struct Compared {
    Pair pair;
    std::vector<Entry> entries;
    /// Whether a file differs in it or below.
    bool hasFiles = false;
    bool isDecided = false;
};

/// Compares the directories of two versions, each pair once, and then visits all places where these pairs are.
class Comparison {
public:
    Comparison(IArchive& archive, std::size_t atMost, IProgress* progress)
        : archive_(archive), atMost_(atMost), progress_(progress) {}

    /// Reads everything that differs. @return false if that is more than wanted
    bool Read(Id const& before, Id const& after) {
        if (before == after)
            return true;
        NumberOf({before, after});
        // New pairs are found while others are compared.
        for (std::size_t next = 0; next < pairs_.size();) {
            ReportProgress(progress_, {"comparing directories", next, 0}, {});
            std::size_t const end = std::min({next + listedAtOnce, pairs_.size(), std::max(next, atMost_)});
            if (end == next)
                return false;
            CompareBatch(next, end);
            next = end;
        }
        return true;
    }

    /// Calls @p add with the path and the entry of each file that differs. @return false if there are more than wanted
    template <class Add>
    bool ForEach(Add add) {
        if (pairs_.empty())
            return true;
        DecideWhereFilesAre();
        struct Frame {
            std::size_t number;
            std::size_t next = 0;
            std::size_t pathSize = 0;
        };
        std::string path;
        std::vector<Frame> open{{0}};
        for (std::size_t given = 0; !open.empty();) {
            Frame& frame = open.back();
            path.resize(frame.pathSize);
            std::vector<Entry> const& entries = pairs_[frame.number].entries;
            if (frame.next == entries.size()) {
                open.pop_back();
                continue;
            }
            Entry const& entry = entries[frame.next++];
            path += entry.name;
            if (entry.kind != ChangeKind::Unchanged && given++ == atMost_)
                return false;
            if (entry.kind != ChangeKind::Unchanged)
                add(path, entry);
            if (entry.below != Entry::none && pairs_[entry.below].hasFiles) {
                path += '/';
                open.push_back({entry.below, 0, path.size()});
            }
        }
        return true;
    }

private:
    std::size_t NumberOf(Pair const& pair) {
        auto const [number, isNew] = numbers_.try_emplace(pair, pairs_.size());
        if (isNew)
            pairs_.push_back({pair, {}, false, false});
        return number->second;
    }

    void CompareBatch(std::size_t begin, std::size_t end) {
        std::vector<Id> ids;
        for (std::size_t number = begin; number < end; ++number) {
            ids.push_back(pairs_[number].pair.before);
            ids.push_back(pairs_[number].pair.after);
        }
        TreeData const data(archive_, std::move(ids));
        for (std::size_t number = begin; number < end; ++number) {
            Pair const pair = pairs_[number].pair;
            pairs_[number].entries = Compare(pair, data);
        }
    }

    /// The names that differ, found by walking both lists of entries at once.
    std::vector<Entry> Compare(Pair const& pair, TreeData const& data) {
        std::vector<Entry> differing;
        PackedEntries before(data.At(pair.before));
        PackedEntries after(data.At(pair.after));
        bool hasBefore = before.Next();
        bool hasAfter = after.Next();
        while (hasBefore || hasAfter) {
            int const order = !hasBefore ? 1 : !hasAfter ? -1 : CompareNames(before.Get().name, after.Get().name);
            PackedEntry const* const mine = order <= 0 ? &before.Get() : nullptr;
            PackedEntry const* const theirs = order >= 0 ? &after.Get() : nullptr;
            bool const isSame = mine != nullptr && theirs != nullptr && mine->isTree == theirs->isTree &&
                                mine->digits == theirs->digits;
            if (!isSame)
                differing.push_back(EntryOf(mine, theirs));
            if (order <= 0)
                hasBefore = before.Next();
            if (order >= 0)
                hasAfter = after.Next();
        }
        if (!before.AreSound())
            ThrowUnrepresentableTree(pair.before);
        if (!after.AreSound())
            ThrowUnrepresentableTree(pair.after);
        return differing;
    }

    Entry EntryOf(PackedEntry const* before, PackedEntry const* after) {
        Entry entry;
        entry.name = (before != nullptr ? before : after)->name;
        entry.oldId = before != nullptr ? before->GetId() : Id();
        entry.newId = after != nullptr ? after->GetId() : Id();
        bool const wasTree = before != nullptr && before->isTree;
        bool const isTree = after != nullptr && after->isTree;
        bool const wasFile = before != nullptr && !wasTree;
        bool const isFile = after != nullptr && !isTree;
        if (wasFile && isFile)
            entry.kind = ChangeKind::Changed;
        else if (wasFile)
            entry.kind = isTree ? ChangeKind::FileBecameDirectory : ChangeKind::Removed;
        else if (isFile)
            entry.kind = wasTree ? ChangeKind::DirectoryBecameFile : ChangeKind::Added;
        if (wasTree || isTree)
            entry.below = NumberOf({wasTree ? entry.oldId : Id(), isTree ? entry.newId : Id()});
        return entry;
    }

    /// Bottom-up, so that pairs without any file, which may be in very many places, are not visited.
    void DecideWhereFilesAre() {
        struct Frame {
            std::size_t number;
            std::size_t next = 0;
        };
        std::vector<bool> isOpen(pairs_.size());
        std::vector<Frame> open{{0}};
        while (!open.empty()) {
            Frame& frame = open.back();
            Compared& compared = pairs_[frame.number];
            isOpen[frame.number] = true;
            if (frame.next == compared.entries.size()) {
                compared.hasFiles = HasFiles(compared.entries);
                compared.isDecided = true;
                isOpen[frame.number] = false;
                open.pop_back();
                continue;
            }
            std::size_t const below = compared.entries[frame.next++].below;
            if (below == Entry::none || pairs_[below].isDecided)
                continue;
            if (isOpen[below])
                throw ArchiveError(Failure::Damaged, {}, "A directory contains itself.");
            open.push_back({below});
        }
    }

    [[nodiscard]] bool HasFiles(std::vector<Entry> const& entries) const noexcept {
        return std::any_of(entries.begin(), entries.end(), [this](Entry const& entry) {
            return entry.kind != ChangeKind::Unchanged || (entry.below != Entry::none && pairs_[entry.below].hasFiles);
        });
    }

    IArchive& archive_;
    std::size_t atMost_;
    IProgress* progress_;
    std::vector<Compared> pairs_;
    std::unordered_map<Pair, std::size_t, HashOfPair> numbers_;
};

} // namespace

DifferenceList ListDifferences(IArchive& archive, Id const& before, Id const& after,
                               KivVcs::DifferenceOptions const& options, IProgress* progress) {
    DifferenceList list;
    Comparison comparison(archive, options.atMost, progress);
    bool const isAllRead = comparison.Read(before, after);
    bool const isAllGiven = comparison.ForEach([&](std::string const& path, Entry const& entry) {
        list.differences.push_back({entry.kind, KivUtils::FromUtf8(path), {}, entry.oldId, entry.newId});
    });
    list.isComplete = isAllRead && isAllGiven;
    // The visit is in the order of paths, except where one directory's name is the beginning of another name.
    std::sort(list.differences.begin(), list.differences.end(),
              [](Difference const& left, Difference const& right) { return left.path < right.path; });
    if (options.findRenames)
        KivVcs::PairRenames(list.differences);
    return list;
}

FileList ListFiles(IArchive& archive, Id const& tree, std::size_t atMost, IProgress* progress) {
    FileList list;
    Comparison comparison(archive, atMost, progress);
    bool const isAllRead = comparison.Read({}, tree);
    bool const isAllGiven = comparison.ForEach([&](std::string const& path, Entry const& entry) {
        list.files.push_back({KivUtils::FromUtf8(path), entry.newId, false});
    });
    list.isComplete = isAllRead && isAllGiven;
    std::sort(list.files.begin(), list.files.end(),
              [](EntryRecord const& left, EntryRecord const& right) { return left.path < right.path; });
    return list;
}

} // namespace KivArchive
