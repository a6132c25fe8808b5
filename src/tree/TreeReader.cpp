#include "KivVcs/Helpers.h"
#include "KivVcs/IRepository.h"
#include "objects/PackedForm.h"
#include "tree/Node.h"

#include <map>

namespace KivVcs {

namespace {

using Loader = PortableVersion::Delegate<StreamIO(Id const&)>;

/// Takes the text up to the next @p end off @p rest, and the end with it; all of it if there is none.
KivStringViewT<char> TakeUntil(KivStringViewT<char>& rest, KivStringViewT<char> end) noexcept {
    const int found = rest.Find(end);
    const KivStringViewT<char> taken = found < 0 ? rest : rest.Left(found);
    rest = found < 0 ? KivStringViewT<char>() : rest.Mid(found + 1);
    return taken;
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
        Id id;
        KivStringT<char> data;
        /// What has not been read yet.
        KivStringViewT<char> rest = data;
        Tree tree{};
        /// The name of the entry whose subtree is being read.
        KivStringT<char16_t> name{};
    };

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
        if (KivStringT<char> data = Helpers::StreamToStringA(stream); data.IsEmpty())
            FinishChild(nullptr);
        else
            frames_.push_back({id, std::move(data)});
    }

    /// Reads the next entry of the innermost frame, or finishes it.
    void NextEntry() {
        Frame& frame = frames_.back();
        if (frame.rest.IsEmpty())
            return FinishFrame(repo_.SyncWithStorage(immu::make<Tree>(std::move(frame.tree))));
        TakeUntil(frame.rest, " ");
        const KivStringViewT<char> type = TakeUntil(frame.rest, " ");
        const KivStringViewT<char> name = TakeUntil(frame.rest, KivStringViewT<char>("", 1));
        const KivStringViewT<char> id = frame.rest.Left(64);
        frame.rest = frame.rest.Mid(64);
        if (type == "tree") {
            frame.name = String::ToStringW(name);
            BeginTree(ReadId(id));
        } else if (type == "blob") {
            if (cow_ptr<Blob> blob = FindOrReadBlob(ReadId(id)))
                detail::TreeAccess::AddRead(frame.tree, repo_, String::ToStringW(name), std::move(blob));
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
            detail::TreeAccess::AddRead(frames_.back().tree, repo_, frames_.back().name, tree);
    }

    cow_ptr<Blob> FindOrReadBlob(Id const& id) {
        if (cow_ptr<Blob> stored = repo_.GetBlobFromStorage(id))
            return stored;
        if (const auto read = misnamedBlobs_.find(id); read != misnamedBlobs_.end())
            return read->second;
        StreamIO stream = loader_(id);
        cow_ptr<Blob> blob = Blob::Deserialize(stream);
        if (!blob || blob->GetId() != id)
            misnamedBlobs_.emplace(id, blob);
        return blob;
    }

    IRepository& repo_;
    Loader const& loader_;
    std::vector<Frame> frames_;
    cow_ptr<Tree> outermost_;
    /// What was read, since a repository need not store it nor under the identifier that was asked for: every form is read
    /// once however often it is named. Trees that are being read count as not loadable, which ends cycles.
    std::map<Id, cow_ptr<Tree>, InOrder> trees_;
    /// The same for blobs, as far as no repository will hold them under that identifier.
    std::map<Id, cow_ptr<Blob>, InOrder> misnamedBlobs_;
};

} // namespace

cow_ptr<Tree> Tree::Deserialize(Id const& id, IRepository* repo, Loader loader) {
    return repo == nullptr ? nullptr : TreeReader(*repo, loader).Read(id);
}

} // namespace KivVcs
