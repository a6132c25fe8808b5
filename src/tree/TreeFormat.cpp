#include "KivVcs/Helpers.h"
#include "KivVcs/IRepository.h"
#include "objects/PackedForm.h"
#include "tree/PackedEntries.h"

#include <array>
#include <map>

namespace KivVcs {

using detail::Entry;
using detail::TableNode;

namespace {

/// Trees with at least this many entries keep the packed form of each run of entries with the run, so that a version that
/// changes one entry packs one run anew; for smaller ones that would cost more memory than the entries themselves.
constexpr std::uint64_t fewestEntriesWithKeptRuns = 256;

bool KeepsRuns(TableNode const& root) noexcept {
    return root.ElementCount() >= fewestEntriesWithKeptRuns;
}

/// Feeds packed entries to a digest through a buffer of fixed size.
class PackedEntryFeed {
public:
    explicit PackedEntryFeed(IdDigest& digest) noexcept : digest_(digest) {}

    void Add(Entry const& entry) {
        const std::uint64_t most = detail::MostPackedSize(entry);
        if (most > bytes_.size()) {
            Flush();
            digest_.Feed(Buffer::Build(PackedSize(entry), [&entry](std::byte* bytes) {
                detail::PackEntry(entry, reinterpret_cast<char*>(bytes));
            }));
            return;
        }
        if (most > bytes_.size() - used_)
            Flush();
        used_ = static_cast<std::size_t>(detail::PackEntry(entry, bytes_.data() + used_) - bytes_.data());
    }

    void Flush() noexcept { digest_.Feed(bytes_.data(), std::exchange(used_, 0)); }

private:
    IdDigest& digest_;
    std::size_t used_ = 0;
    std::array<char, 4096> bytes_;
};

} // namespace

Id Tree::ComputeId() const {
    TableNode const* const root = entries_.Root();
    IdDigest digest("tree", root == nullptr ? 0 : root->Total().packedSize);
    if (root != nullptr && KeepsRuns(*root)) {
        detail::ForEachLeaf(root, [&digest](TableNode const& leaf) { digest.Feed(leaf.PackedRun()); });
        return digest.Finish();
    }
    PackedEntryFeed feed(digest);
    detail::ForEachLeaf(root, [&feed](TableNode const& leaf) {
        detail::ForEachPackedEntry(leaf, [&feed](Entry const& entry) { feed.Add(entry); });
    });
    feed.Flush();
    return digest.Finish();
}

Buffer const& Tree::GetData() const {
    return data_.GetOrMake([this] {
        Buffer data;
        TableNode const* const root = entries_.Root();
        if (root == nullptr)
            return data;
        if (KeepsRuns(*root)) {
            detail::ForEachLeaf(root, [&data](TableNode const& leaf) { data.Append(leaf.PackedRun()); });
            return data;
        }
        return Buffer::Build(root->Total().packedSize, [root](std::byte* bytes) {
            char* out = reinterpret_cast<char*>(bytes);
            detail::ForEachLeaf(root, [&out](TableNode const& leaf) {
                detail::ForEachPackedEntry(leaf, [&out](Entry const& entry) { out = detail::PackEntry(entry, out); });
            });
        });
    });
}

namespace {

using Loader = PortableVersion::Delegate<StreamIO(Id const&)>;

/// One entry of a tree's data as it was read.
struct ParsedEntry {
    KivStringViewT<char> type;
    KivStringViewT<char> name;
    KivStringViewT<char> id;
};

/// Takes the entry at @p position off @p data and moves to the next one; whatever is missing is cut off at the end of the data.
ParsedEntry ParseEntry(KivStringViewT<char> data, int& position) noexcept {
    const int length = data.GetLength();
    const auto findFrom = [data, length](KivStringViewT<char> wanted, int start) {
        const int found = data.Find(wanted, start);
        return found < 0 ? length : found;
    };
    const auto after = [length](int end) { return end < length ? end + 1 : length; };
    const int type = after(findFrom(" ", position));
    const int typeEnd = findFrom(" ", type);
    const int name = after(typeEnd);
    const int nameEnd = findFrom(KivStringViewT<char>("", 1), name);
    const int id = after(nameEnd);
    const KivStringViewT<char> idText = data.Mid(id, 64);
    position = id + idText.GetLength();
    return {data.Mid(type, typeEnd - type), data.Mid(name, nameEnd - name), idText};
}

/// Some order of identifiers. Those that packed forms name are the host's, and their hashes may all be equal.
struct InOrder {
    bool operator()(Id const& left, Id const& right) const {
        Id::Digest const* const mine = left.GetDigest();
        Id::Digest const* const theirs = right.GetDigest();
        if (mine == nullptr || theirs == nullptr)
            return mine == theirs ? left.GetText() < right.GetText() : theirs == nullptr;
        return *mine < *theirs;
    }
};

/// Reads a tree and everything below it, one tree at a time, with the trees that are being read on a list of its own: nesting
/// takes no stack.
class TreeReader {
public:
    TreeReader(IRepository& repo, Loader const& loader) noexcept : repo_(repo), loader_(loader) {}

    cow_ptr<Tree> Read(Id const& id) {
        cow_ptr<Tree> result;
        if (Open(id, result) == Opened::Finished)
            return result;
        while (!open_.empty()) {
            OpenTree& current = open_.back();
            if (current.position < current.data.GetLength()) {
                ReadEntry(current);
                continue;
            }
            Close(repo_.SyncWithStorage(immu::make<Tree>(std::move(current.tree))), result);
        }
        return result;
    }

private:
    /// A tree whose entries are being read.
    struct OpenTree {
        Id id;
        KivStringT<char> data;
        int position = 0;
        Tree tree;
        /// The name of the entry whose subtree is being read.
        KivStringT<char16_t> name;
    };

    enum class Opened { Finished, Pushed };

    /// Finds the tree @p id, or begins to read it. What was read is remembered, since a repository need not store it nor
    /// under the identifier that was asked for: every tree is read once only, however often it is named. Those being read
    /// count as not loadable, which ends cycles.
    Opened Open(Id const& id, cow_ptr<Tree>& result) {
        result = id.IsEmpty() ? nullptr : repo_.GetTreeFromStorage(id);
        if (id.IsEmpty() || result || !loader_)
            return Opened::Finished;
        if (const auto known = opened_.find(id); known != opened_.end()) {
            result = known->second;
            return Opened::Finished;
        }
        if (open_.size() == deepestLoadedNesting)
            return Opened::Finished;
        opened_.emplace(id, nullptr);
        StreamIO stream = loader_(id);
        if (!Helpers::ShiftObjectIdentifier(stream, "tree"))
            return Opened::Finished;
        KivStringT<char> data = Helpers::StreamToStringA(stream);
        if (data.IsEmpty())
            return Opened::Finished;
        open_.push_back({id, std::move(data), 0, {}, {}});
        return Opened::Pushed;
    }

    void ReadEntry(OpenTree& current) {
        const ParsedEntry entry = ParseEntry(current.data, current.position);
        if (entry.type == "tree") {
            current.name = String::ToStringW(entry.name);
            cow_ptr<Tree> child;
            if (Open(ReadId(entry.id), child) == Opened::Finished)
                AddChild(child);
        } else if (entry.type == "blob") {
            if (cow_ptr<Blob> blob = FindOrReadBlob(ReadId(entry.id)))
                detail::TableAccess::AddRead(current.tree, repo_, String::ToStringW(entry.name), std::move(blob));
        } else {
            cow_ptr<Tree> none;
            Close(nullptr, none);
        }
    }

    cow_ptr<Blob> FindOrReadBlob(Id const& id) {
        if (cow_ptr<Blob> stored = repo_.GetBlobFromStorage(id))
            return stored;
        if (const auto known = misnamed_.find(id); known != misnamed_.end())
            return known->second;
        StreamIO stream = loader_(id);
        cow_ptr<Blob> blob = Blob::Deserialize(stream);
        if (!blob || blob->GetId() != id)
            misnamed_.emplace(id, blob);
        return blob;
    }

    void AddChild(cow_ptr<Tree> const& child) {
        if (child)
            detail::TableAccess::AddRead(open_.back().tree, repo_, open_.back().name, child);
    }

    /// Ends the innermost tree with @p read as its result, which goes to its parent, or to @p result for the outermost one.
    void Close(cow_ptr<Tree> read, cow_ptr<Tree>& result) {
        opened_[open_.back().id] = read;
        open_.pop_back();
        if (open_.empty())
            result = std::move(read);
        else
            AddChild(read);
    }

    IRepository& repo_;
    Loader const& loader_;
    std::vector<OpenTree> open_;
    std::map<Id, cow_ptr<Tree>, InOrder> opened_;
    /// What was read for identifiers of blobs under which no repository will hold it.
    std::map<Id, cow_ptr<Blob>, InOrder> misnamed_;
};

} // namespace

cow_ptr<Tree> Tree::Deserialize(Id const& id, IRepository* repo, Loader loader) {
    return repo == nullptr ? nullptr : TreeReader(*repo, loader).Read(id);
}

} // namespace KivVcs
