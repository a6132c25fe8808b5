#include "KivVcs/Helpers.h"
#include "KivVcs/IRepository.h"
#include "objects/LaneDigests.h"
#include "objects/PackedForm.h"
#include "objects/PathComponents.h"
#include "tree/FormReader.h"
#include "tree/OwnTables.h"
#include "tree/SortedEntries.h"

#include <array>
#include <bitset>
#include <limits>
#include <map>
#include <span>
#include <string_view>

namespace KivVcs {

namespace {

using detail::PackedEntry;
using Loader = PortableVersion::Delegate<StreamIO(Id const&)>;

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

/// Whether an entry packs to the form that it was read from.
bool PacksAsRead(PackedEntry const& read, KivStringViewT<char16_t> name, Object const* held) {
    Id::Digest const* const shown = held == nullptr ? nullptr : held->GetKnownDigest();
    Id::Digest const* const asked = read.id.GetDigest();
    if (!read.isOurs || shown == nullptr || asked == nullptr || *shown != *asked)
        return false;
    // Of ill-formed names, which can be as long as what they are read as, the directory's form would be longer.
    return static_cast<std::size_t>(name.GetLength()) == read.name.size() ||
           DataEncoding::Utf8Encode(name) == ViewOf(read.name);
}

/// The directory that is being read, and its entries so far: in a table that grows at its end while they come in their
/// order, as they do in every form that a tree was packed to.
class GrowingDirectory {
public:
    template <class T>
    void Add(IRepository& repo, PackedEntry const& entry, cow_ptr<T> object) {
        KivStringT<char16_t> name = String::ToStringW(ViewOf(entry.name));
        if (name.IsEmpty())
            return LeaveOut();
        if (entry.name.find('/') != std::string_view::npos) {
            Gather();
            tree_.AddObjectToTree<T>(&repo, PathComponents(name), *object);
            return;
        }
        cow_ptr<T> stored = detail::TreeAccess::Stored(repo, std::move(object));
        packsAsRead_ = packsAsRead_ && PacksAsRead(entry, name, stored.get());
        if (isSorted_ && inOrder_.IsNext(name)) {
            inOrder_.Add(std::move(name), detail::Held(std::move(stored)));
        } else {
            Gather();
            detail::TreeAccess::Entries(tree_).Set(name, std::move(stored), &name);
        }
    }

    /// Says that an entry cannot be read.
    void LeaveOut() noexcept { packsAsRead_ = false; }

    /// The directory, whose entries are those of @p form.
    [[nodiscard]] cow_ptr<Tree> Take(Buffer const& form) {
        const bool packsAsRead = isSorted_ && packsAsRead_;
        Gather();
        auto tree = immu::make<Tree>(std::move(tree_));
        if (packsAsRead)
            detail::TreeAccess::IdentifyByForm(*tree, form);
        return tree;
    }

private:
    void Gather() {
        if (std::exchange(isSorted_, false))
            detail::TreeAccess::Entries(tree_) = inOrder_.Take();
    }

    detail::SortedEntries inOrder_;
    bool isSorted_ = true;
    bool packsAsRead_ = true;
    /// All entries, once one has come out of order.
    Tree tree_;
};

/// A blob that an entry of a directory names: it is found or read, and then entered.
struct NamedBlob {
    PackedEntry entry{};
    cow_ptr<Blob> blob{};
    bool isRead = false;
};

/// Has the blobs hashed that have just been read, in their order.
class ReadBlobs final : public DigestCustomer {
public:
    explicit ReadBlobs(std::span<NamedBlob const> blobs) noexcept
        : next_(blobs.data()), end_(blobs.data() + blobs.size()) {}

    bool Next(detail::DataToHash& next) override {
        while (next_ != end_ && !next_->isRead)
            ++next_;
        if (next_ == end_)
            return false;
        Blob const& blob = *(next_++)->blob;
        next.object = &blob;
        next.word = "blob";
        next.kept = &blob.GetData();
        return true;
    }
    void Take(detail::DataToHash const& hashed, Id::Digest const& digest) noexcept override {
        hashed.IdentifyNew(digest);
    }

private:
    NamedBlob const* next_;
    NamedBlob const* end_;
};

/// Reads a tree and everything below it, one entry at a time, with a frame of its own for each tree that is being read:
/// nesting takes no stack.
class TreeReader {
public:
    TreeReader(IRepository& repo, Loader const& loader) noexcept
        : repo_(repo), loader_(loader), ownTables_(detail::OwnTables::Behind(repo)) {}

    cow_ptr<Tree> Read(Id const& id) {
        BeginTree(id);
        while (!frames_.empty())
            ReadNext();
        return std::move(outermost_);
    }

private:
    using ReadTrees = std::map<Id, cow_ptr<Tree>>;

    struct Frame {
        Frame(ReadTrees::iterator place, Buffer form) : read(place), data(std::move(form)), rest(TextOf(data)) {}

        /// Where the tree belongs once it has been read.
        ReadTrees::iterator read;
        Buffer data;
        detail::FormReader rest;
        GrowingDirectory directory{};
        /// The entry whose subtree is being read.
        PackedEntry entry{};
    };

    static constexpr std::size_t maximumAtOnce = 32;
    static constexpr std::uint64_t maximumBytesAtOnce = 1 << 19;
    /// With more bytes it matters which blobs are hashed first.
    static constexpr std::uint64_t maximumBytesInOrder = 1 << 16;

    static std::string_view TextOf(Buffer const& data) noexcept {
        const auto chunk = *data.LockForRead().begin();
        return {reinterpret_cast<const char*>(chunk.data()), std::min(chunk.size(), longestText)};
    }

    /// Finds the tree @p id or opens a frame for it.
    void BeginTree(Id const& id) {
        cow_ptr<Tree> known = id.IsEmpty() ? nullptr : repo_.GetTreeFromStorage(id);
        if (known || id.IsEmpty() || !loader_)
            return FinishChild(known);
        auto read = trees_.lower_bound(id);
        if (read != trees_.end() && read->first == id)
            return FinishChild(read->second);
        if (frames_.size() == deepestLoadedNesting)
            return FinishChild(nullptr);
        read = trees_.emplace_hint(read, id, nullptr);
        StreamIO stream = loader_(id);
        if (!Helpers::ShiftObjectIdentifier(stream, "tree"))
            return FinishChild(nullptr);
        if (Buffer data = ReadInOnePiece(stream); data.GetSize() == 0)
            FinishChild(nullptr);
        else
            frames_.emplace_back(read, std::move(data));
    }

    /// Reads what comes next in the innermost frame, or finishes it.
    void ReadNext() {
        if (ReadNextBlobs() == blobs_.size())
            return;
        Frame& frame = frames_.back();
        if (frame.rest.AtEnd())
            return FinishFrame(repo_.SyncWithStorage(frame.directory.Take(frame.data)));
        if (!frame.rest.TakeType("tree", frame.entry))
            return FinishFrame(nullptr);
        frame.rest.TakeNameAndId(frame.entry);
        BeginTree(frame.entry.id);
    }

    void FinishFrame(cow_ptr<Tree> tree) {
        frames_.back().read->second = tree;
        frames_.pop_back();
        FinishChild(tree);
    }

    /// Enters a subtree, unless it is null, where the innermost frame waits for it.
    void FinishChild(cow_ptr<Tree> const& tree) {
        if (frames_.empty())
            outermost_ = tree;
        else if (tree)
            frames_.back().directory.Add(repo_, frames_.back().entry, tree);
        else
            frames_.back().directory.LeaveOut();
    }

    /// Reads the blobs that come next, as far as they are not stored, and enters them: a number of them at a time, so that
    /// they are hashed beside each other. @return how many
    std::size_t ReadNextBlobs() {
        detail::FormReader& rest = frames_.back().rest;
        detail::ObjectTable<Blob> const* const ownTable = ownTables_.Of<Blob>();
        std::size_t count = 0;
        for (; count < blobs_.size() && !rest.AtEnd() && rest.TakeType("blob", blobs_[count].entry); ++count) {
            PackedEntry& entry = blobs_[count].entry;
            rest.TakeNameAndId(entry);
            if (ownTable != nullptr && entry.id.GetDigest() != nullptr)
                ownTable->Prefetch(*entry.id.GetDigest());
        }
        for (entered_ = read_ = 0; read_ < count; ++read_)
            FindOrRead(blobs_[read_]);
        EnterRead();
        return count;
    }

    void FindOrRead(NamedBlob& named) {
        Id const& id = named.entry.id;
        // One that is named again is asked for when it has been stored.
        if (readBytes_ > maximumBytesAtOnce || IsRead(id))
            EnterRead();
        named.isRead = false;
        named.blob = FindStored(id);
        if (named.blob)
            return;
        if (const auto read = misnamedBlobs_.find(id); read != misnamedBlobs_.end()) {
            named.blob = read->second;
            return;
        }
        StreamIO stream = loader_(id);
        named.blob = Blob::Deserialize(stream);
        named.isRead = named.blob != nullptr;
        if (named.isRead) {
            readBytes_ += named.blob->GetData().GetSize();
            readDigests_.set(LastByteOf(id));
        } else {
            misnamedBlobs_.emplace(id, nullptr);
        }
    }

    [[nodiscard]] cow_ptr<Blob> FindStored(Id const& id) const {
        detail::ObjectTable<Blob> const* const ownTable = ownTables_.Of<Blob>();
        if (ownTable == nullptr || id.GetDigest() == nullptr)
            return repo_.GetBlobFromStorage(id);
        return cow_ptr<Blob>::share(ownTable->PlaceOf(*id.GetDigest()).object);
    }

    [[nodiscard]] static std::size_t LastByteOf(Id const& id) noexcept {
        Id::Digest const* const digest = id.GetDigest();
        return digest == nullptr ? 0 : digest->back();
    }

    /// Whether a blob of that identifier has been read, but not entered.
    [[nodiscard]] bool IsRead(Id const& id) const {
        return readDigests_.test(LastByteOf(id)) &&
               std::any_of(blobs_.data() + entered_, blobs_.data() + read_,
                           [&](NamedBlob const& named) { return named.isRead && named.entry.id == id; });
    }

    /// Whether a blob that has been identified is the one that was asked for.
    [[nodiscard]] static bool IsAsNamed(NamedBlob const& named) noexcept {
        Id::Digest const* const wanted = named.entry.id.GetDigest();
        Id::Digest const* const own = named.blob->GetKnownDigest();
        return wanted != nullptr && own != nullptr && *wanted == *own;
    }

    /// Identifies the blobs that have been read, all at once, and enters what is there in its order.
    void EnterRead() {
        const std::span<NamedBlob> read = std::span(blobs_).subspan(entered_, read_ - entered_);
        IdentifyRead(read);
        readBytes_ = 0;
        readDigests_.reset();
        GrowingDirectory& directory = frames_.back().directory;
        for (NamedBlob& named : read) {
            if (named.isRead && !IsAsNamed(named))
                misnamedBlobs_.emplace(named.entry.id, named.blob);
            if (named.blob)
                directory.Add(repo_, named.entry, std::move(named.blob));
            else
                directory.LeaveOut();
        }
        entered_ = read_;
    }

    void IdentifyRead(std::span<NamedBlob const> read) const {
        if (readBytes_ <= maximumBytesInOrder) {
            ReadBlobs blobs(read);
            return DigestBesideEachOther(blobs);
        }
        std::vector<Object const*> blobs;
        blobs.reserve(read.size());
        for (NamedBlob const& named : read) {
            if (named.isRead)
                blobs.push_back(named.blob.get());
        }
        Identify(blobs);
    }

    IRepository& repo_;
    Loader const& loader_;
    detail::OwnTables ownTables_;
    std::vector<Frame> frames_;
    /// Blobs of the innermost frame: how many of them have been found or read, and how many of these are entered.
    std::array<NamedBlob, maximumAtOnce> blobs_{};
    std::size_t read_ = 0;
    std::size_t entered_ = 0;
    std::uint64_t readBytes_ = 0;
    /// The last bytes of the digests of those between, so that most identifiers are known not to be there without a look at
    /// them.
    std::bitset<256> readDigests_;
    cow_ptr<Tree> outermost_;
    /// What was read, since a repository need not store it nor under the identifier that was asked for: every form is read
    /// once however often it is named. Trees that are being read count as not loadable, which ends cycles. Ordered, since the
    /// identifiers are the host's, and their hashes may all be equal.
    ReadTrees trees_;
    /// The same for blobs, as far as no repository will hold them under that identifier.
    std::map<Id, cow_ptr<Blob>> misnamedBlobs_;
};

} // namespace

cow_ptr<Tree> Tree::Deserialize(Id const& id, IRepository* repo, Loader loader) {
    return repo == nullptr ? nullptr : TreeReader(*repo, loader).Read(id);
}

} // namespace KivVcs
