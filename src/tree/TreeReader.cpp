#include "KivVcs/Helpers.h"
#include "KivVcs/IRepository.h"
#include "objects/PackedForm.h"
#include "objects/PathComponents.h"
#include "tree/EntryPacker.h"
#include "tree/SortedEntries.h"

#include <limits>
#include <map>
#include <string_view>

namespace KivVcs {

namespace {

using Loader = PortableVersion::Delegate<StreamIO(Id const&)>;

/// Takes the text up to the next @p end off @p rest, and the end with it; all of it if there is none.
std::string_view TakeUntil(std::string_view& rest, char end) noexcept {
    const std::string_view taken = rest.substr(0, rest.find(end));
    rest.remove_prefix(std::min(taken.size() + 1, rest.size()));
    return taken;
}

/// Takes mode and type of an entry off @p rest. @return the type
std::string_view TakeType(std::string_view& rest) noexcept {
    // Most are those that our own blobs have.
    if (rest.starts_with(detail::blobWords)) {
        rest.remove_prefix(detail::blobWords.size());
        return "blob";
    }
    TakeUntil(rest, ' ');
    return TakeUntil(rest, ' ');
}

/// How much of a packed form is taken at most.
constexpr std::size_t longestText = std::numeric_limits<int>::max();

KivStringViewT<char> ViewOf(std::string_view text) noexcept {
    return {text.data(), static_cast<int>(text.size())};
}

/// The rest of @p stream in one piece, shared with the loader's memory where that has it so; empty if it cannot be read.
Buffer ReadInOnePiece(StreamIO& stream) {
    Buffer data;
    if (!stream.ReadRest(data))
        return {};
    if (data.LockForRead().size() <= 1)
        return data;
    return Buffer::Build(data.GetSize(), [&data](std::byte* bytes) { (void)data.Read(0, bytes, data.GetSize()); });
}

/// The directory that is being read, and its entries so far: in a table that grows at its end while they come in their
/// order, as they do in every form that a tree was packed to.
class GrowingDirectory {
public:
    template <class T>
    void Add(IRepository& repo, std::string_view packedName, cow_ptr<T> object) {
        KivStringT<char16_t> name = String::ToStringW(ViewOf(packedName));
        if (name.IsEmpty())
            return;
        if (packedName.find('/') != std::string_view::npos) {
            Gather();
            tree_.AddObjectToTree<T>(&repo, PathComponents(name), *object);
            return;
        }
        cow_ptr<T> stored = detail::TreeAccess::Stored(repo, std::move(object));
        if (isSorted_ && inOrder_.IsNext(name)) {
            inOrder_.Add(std::move(name), detail::Held(std::move(stored)));
        } else {
            Gather();
            detail::TreeAccess::Entries(tree_).Set(name, std::move(stored), &name);
        }
    }

    [[nodiscard]] Tree Take() {
        Gather();
        return std::move(tree_);
    }

private:
    void Gather() {
        if (std::exchange(isSorted_, false))
            detail::TreeAccess::Entries(tree_) = inOrder_.Take();
    }

    detail::SortedEntries inOrder_;
    bool isSorted_ = true;
    /// All entries, once one has come out of order.
    Tree tree_;
};

/// Reads a tree and everything below it, one entry at a time, with a frame of its own for each tree that is being read:
/// nesting takes no stack.
class TreeReader {
public:
    TreeReader(IRepository& repo, Loader const& loader) noexcept : repo_(repo), loader_(loader) {}

    cow_ptr<Tree> Read(Id const& id) {
        BeginTree(id);
        while (!frames_.empty())
            NextEntry();
        return std::move(outermost_);
    }

private:
    struct Frame {
        Frame(Id treeId, Buffer form) : id(std::move(treeId)), data(std::move(form)), rest(TextOf(data)) {}

        Id id;
        Buffer data;
        /// What has not been read yet.
        std::string_view rest;
        GrowingDirectory directory{};
        /// The name of the entry whose subtree is being read.
        std::string_view name{};
    };

    /// A blob of the innermost frame that has been found or read, but not entered.
    struct WaitingBlob {
        std::string_view name;
        Id id;
        cow_ptr<Blob> blob;
        bool isRead;
    };

    static constexpr std::size_t maximumWaiting = 32;
    static constexpr std::uint64_t maximumWaitingBytes = 1 << 19;

    static std::string_view TextOf(Buffer const& data) noexcept {
        const auto chunk = *data.LockForRead().begin();
        return {reinterpret_cast<const char*>(chunk.data()), std::min(chunk.size(), longestText)};
    }

    /// Finds the tree @p id or opens a frame for it.
    void BeginTree(Id const& id) {
        cow_ptr<Tree> known = id.IsEmpty() ? nullptr : repo_.GetTreeFromStorage(id);
        if (known || id.IsEmpty() || !loader_)
            return FinishChild(known);
        if (const auto read = trees_.find(id); read != trees_.end())
            return FinishChild(read->second);
        if (frames_.size() == deepestLoadedNesting)
            return FinishChild(nullptr);
        trees_.emplace(id, nullptr);
        StreamIO stream = loader_(id);
        if (!Helpers::ShiftObjectIdentifier(stream, "tree"))
            return FinishChild(nullptr);
        if (Buffer data = ReadInOnePiece(stream); data.GetSize() == 0)
            FinishChild(nullptr);
        else
            frames_.emplace_back(id, std::move(data));
    }

    /// Reads the next entry of the innermost frame, or finishes it.
    void NextEntry() {
        Frame& frame = frames_.back();
        if (frame.rest.empty()) {
            EnterWaiting();
            return FinishFrame(repo_.SyncWithStorage(immu::make<Tree>(frame.directory.Take())));
        }
        const std::string_view type = TakeType(frame.rest);
        const std::string_view name = TakeUntil(frame.rest, '\0');
        const Id id = ReadId(ViewOf(frame.rest.substr(0, idLength)));
        frame.rest.remove_prefix(std::min(idLength, frame.rest.size()));
        if (type == "blob")
            return FindOrReadBlob(name, id);
        EnterWaiting();
        if (type == "tree") {
            frame.name = name;
            BeginTree(id);
        } else {
            FinishFrame(nullptr);
        }
    }

    void FinishFrame(cow_ptr<Tree> tree) {
        trees_[frames_.back().id] = tree;
        frames_.pop_back();
        FinishChild(tree);
    }

    /// Enters a subtree, unless it is null, where the innermost frame waits for it.
    void FinishChild(cow_ptr<Tree> const& tree) {
        if (frames_.empty())
            outermost_ = tree;
        else if (tree)
            frames_.back().directory.Add(repo_, frames_.back().name, tree);
    }

    void FindOrReadBlob(std::string_view name, Id const& id) {
        // One that is named again is asked for when it has been stored.
        if (waiting_.size() == maximumWaiting || waitingBytes_ > maximumWaitingBytes || IsWaiting(id))
            EnterWaiting();
        if (cow_ptr<Blob> stored = repo_.GetBlobFromStorage(id))
            return Wait({name, id, std::move(stored), false});
        if (const auto read = misnamedBlobs_.find(id); read != misnamedBlobs_.end()) {
            if (read->second)
                Wait({name, id, read->second, false});
            return;
        }
        StreamIO stream = loader_(id);
        cow_ptr<Blob> blob = Blob::Deserialize(stream);
        if (blob)
            Wait({name, id, std::move(blob), true});
        else
            misnamedBlobs_.emplace(id, nullptr);
    }

    void Wait(WaitingBlob blob) {
        if (blob.isRead) {
            waitingBytes_ += blob.blob->GetData().GetSize();
            waitingHashes_ |= HashBit(blob.id);
        }
        waiting_.push_back(std::move(blob));
    }

    [[nodiscard]] static std::uint64_t HashBit(Id const& id) noexcept {
        Id::Digest const* const digest = id.GetDigest();
        return std::uint64_t{1} << (digest == nullptr ? 0 : digest->back() % 64);
    }

    [[nodiscard]] bool IsWaiting(Id const& id) const {
        return (waitingHashes_ & HashBit(id)) != 0 &&
               std::any_of(waiting_.begin(), waiting_.end(),
                           [&](auto const& blob) { return blob.isRead && blob.id == id; });
    }

    /// Whether a blob that has been identified is the one that was asked for.
    [[nodiscard]] static bool IsAsNamed(WaitingBlob const& waiting) noexcept {
        Id::Digest const* const wanted = waiting.id.GetDigest();
        Id::Digest const* const own = waiting.blob->GetKnownDigest();
        return wanted != nullptr && own != nullptr && *wanted == *own;
    }

    /// Identifies the blobs that wait, all at once, and enters them in their order.
    void EnterWaiting() {
        for (WaitingBlob const& waiting : waiting_) {
            if (waiting.isRead)
                unidentified_.push_back(waiting.blob.get());
        }
        Identify(unidentified_);
        unidentified_.clear();
        for (WaitingBlob& waiting : waiting_) {
            if (waiting.isRead && !IsAsNamed(waiting))
                misnamedBlobs_.emplace(waiting.id, waiting.blob);
            frames_.back().directory.Add(repo_, waiting.name, std::move(waiting.blob));
        }
        waiting_.clear();
        waitingBytes_ = waitingHashes_ = 0;
    }

    IRepository& repo_;
    Loader const& loader_;
    std::vector<Frame> frames_;
    std::vector<WaitingBlob> waiting_;
    std::vector<Object const*> unidentified_;
    std::uint64_t waitingBytes_ = 0;
    /// A bit for each hash, so that most identifiers are known not to wait without a look at those that do.
    std::uint64_t waitingHashes_ = 0;
    cow_ptr<Tree> outermost_;
    /// What was read, since a repository need not store it nor under the identifier that was asked for: every form is read
    /// once however often it is named. Trees that are being read count as not loadable, which ends cycles. Ordered, since the
    /// identifiers are the host's, and their hashes may all be equal.
    std::map<Id, cow_ptr<Tree>> trees_;
    /// The same for blobs, as far as no repository will hold them under that identifier.
    std::map<Id, cow_ptr<Blob>> misnamedBlobs_;
};

} // namespace

cow_ptr<Tree> Tree::Deserialize(Id const& id, IRepository* repo, Loader loader) {
    return repo == nullptr ? nullptr : TreeReader(*repo, loader).Read(id);
}

} // namespace KivVcs
