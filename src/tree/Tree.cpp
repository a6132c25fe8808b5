#include "KivVcs/Tree.h"

#include "objects/PathComponents.h"
#include "tree/Node.h"
#include "tree/StoredInstance.h"

namespace KivVcs {

using detail::Held;

namespace {

using Components = array_view<KivStringViewT<char16_t> const>;

Tree const* SubtreeOf(Tree const& tree, KivStringViewT<char16_t> name) noexcept {
    Held const* const held = detail::TreeAccess::Find(tree, name);
    return held == nullptr ? nullptr : held->GetTree();
}

/// The tree below @p tree in which the last of @p components is looked up; null if there is none.
Tree const* HolderOf(Tree const& tree, Components components) noexcept {
    if (components.empty())
        return nullptr;
    Tree const* holder = &tree;
    for (std::size_t level = 0; holder != nullptr && level + 1 < components.size(); ++level)
        holder = SubtreeOf(*holder, components[level]);
    return holder;
}

} // namespace

Tree::Tree() noexcept = default;
Tree::Tree(Tree const& other) = default;
Tree::Tree(Tree&& other) noexcept = default;
Tree& Tree::operator=(Tree const& other) {
    return *this = Tree(other);
}
Tree& Tree::operator=(Tree&& other) noexcept = default;
Tree::~Tree() = default;

KivStringT<char> Tree::GetHeader() const {
    return "tree";
}

KivStringT<char> Tree::GetStoragePrefix() const {
    return "40000";
}

bool Tree::IsOfHostClass() const noexcept {
    return &typeid(*this) != &typeid(Tree);
}

cow_ptr<Tree> Tree::Copy() const {
    return immu::make<Tree>(*this);
}

cow_ptr<Tree> CopyOf(Tree const& tree) {
    cow_ptr<Tree> copy = tree.IsOfHostClass() ? tree.Copy() : nullptr;
    return copy.use_count() == 1 ? copy : immu::make<Tree>(tree);
}

void Tree::ResetState() {
    Object::ResetState();
    data_.Reset();
    trail_.Reset();
}

bool Tree::IsEmpty() const noexcept {
    return !entries_.Top();
}

std::uint64_t Tree::GetLocalObjectCount() const noexcept {
    return IsEmpty() ? 0 : entries_.Top()->Total().Objects();
}

std::uint64_t Tree::GetLocalBlobCount() const noexcept {
    return IsEmpty() ? 0 : entries_.Top()->Total().blobs;
}

template <class T, class Own>
cow_ptr<T> Tree::SetLocal(IRepository& repo, KivStringViewT<char16_t> name, T const& object, Own own) {
    if (name.IsEmpty())
        return nullptr;
    cow_ptr<T> stored = StoredInstance(repo, object, own);
    const std::uint64_t sizeBefore = IsEmpty() ? 0 : entries_.Top()->Total().packedSize;
    entries_.Set(name, stored);
    // As long as the packed form keeps its size, what the digest has passed before this entry stays valid.
    detail::DigestTrail trail = std::move(trail_);
    ResetState();
    if (entries_.Top()->Total().packedSize == sizeBefore) {
        trail.NoteChange(*entries_.Top(), name);
        trail_ = std::move(trail);
    }
    return stored;
}

template <class T>
cow_ptr<T> detail::TreeAccess::Stored(IRepository& repo, cow_ptr<T> object) {
    // Only the caller knows of an object that nobody else holds, so that it needs no copy.
    return StoredInstance(repo, *object,
                          [&object] { return object.use_count() == 1 ? std::move(object) : CopyOf(*object); });
}

template cow_ptr<Blob> detail::TreeAccess::Stored(IRepository&, cow_ptr<Blob>);
template cow_ptr<Tree> detail::TreeAccess::Stored(IRepository&, cow_ptr<Tree>);

std::vector<cow_ptr<Tree>> Tree::CopyWay(Components names) const {
    std::vector<cow_ptr<Tree>> way(names.size());
    Tree const* above = this;
    for (std::size_t level = 0; level < way.size(); ++level) {
        above = above == nullptr ? nullptr : SubtreeOf(*above, names[level]);
        if (above != nullptr && above->IsOfHostClass())
            way[level] = CopyOf(*above);
        else if (Tree* const copy = way[level].write(); above != nullptr) {
            copy->entries_ = above->entries_;
            copy->trail_ = above->trail_;
        }
    }
    return way;
}

void Tree::PutWayBack(IRepository* repo, Components names, std::vector<cow_ptr<Tree>> way, bool prunes) {
    for (std::size_t level = way.size(); level-- > 0;) {
        Tree& parent = level == 0 ? *this : *way[level - 1].write();
        cow_ptr<Tree>& tree = way[level];
        if (prunes && tree->IsEmpty())
            parent.EraseLocal(names[level]);
        else if (repo != nullptr)
            parent.SetLocal(*repo, names[level], *tree, [&tree] { return std::move(tree); });
    }
}

template <class T>
cow_ptr<T> Tree::AddObjectToTree(IRepository* repo, Components components, T const& object) {
    if (components.empty() || repo == nullptr)
        return nullptr;
    const auto leading = components.first(components.size() - 1);
    std::vector<cow_ptr<Tree>> way = CopyWay(leading);
    Tree& holder = way.empty() ? *this : *way.back().write();
    cow_ptr<T> added = holder.SetLocal(*repo, components.back(), object, [&object] { return CopyOf(object); });
    PutWayBack(repo, leading, std::move(way), false);
    return added;
}

template cow_ptr<Blob> Tree::AddObjectToTree(IRepository*, Components, Blob const&);
template cow_ptr<Tree> Tree::AddObjectToTree(IRepository*, Components, Tree const&);

cow_ptr<Blob> Tree::AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob) {
    return AddObjectToTree<Blob>(repo, PathComponents(path), blob);
}

cow_ptr<Tree> Tree::AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree) {
    return AddObjectToTree<Tree>(repo, PathComponents(path), tree);
}

cow_ptr<Object> Tree::AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id) {
    if (repo == nullptr)
        return nullptr;
    if (const cow_ptr<Blob> blob = repo->GetBlobFromStorage(id))
        return AddBlob(repo, path, *blob);
    if (const cow_ptr<Tree> tree = repo->GetTreeFromStorage(id))
        return AddTree(repo, path, *tree);
    return nullptr;
}

bool Tree::RemoveObject(IRepository* repo, KivStringViewT<char16_t> path) {
    return RemoveObjectFromTree(repo, PathComponents(path));
}

bool Tree::RemoveObjectFromTree(IRepository* repo, Components components) {
    if (components.empty())
        return false;
    const auto leading = components.first(components.size() - 1);
    const KivStringViewT<char16_t> name = components.back();
    Tree const* const holder = HolderOf(*this, components);
    if (holder == nullptr || name.IsEmpty() || !holder->LocalObjectExists(name))
        return false;
    std::vector<cow_ptr<Tree>> way = CopyWay(leading);
    (way.empty() ? *this : *way.back().write()).EraseLocal(name);
    PutWayBack(repo, leading, std::move(way), true);
    return true;
}

void Tree::EraseLocal(KivStringViewT<char16_t> name) {
    entries_.Erase(name);
    ResetState();
}

bool Tree::LocalObjectExists(KivStringViewT<char16_t> name) const noexcept {
    return entries_.Find(name) != nullptr;
}

cow_ptr<Object> Tree::GetLocalObject(KivStringViewT<char16_t> name) const noexcept {
    Held const* const held = entries_.Find(name);
    return cow_ptr<Object>::share(held == nullptr ? nullptr : held->Visible());
}

cow_ptr<Blob> Tree::GetLocalBlob(KivStringViewT<char16_t> name) const noexcept {
    Held const* const held = entries_.Find(name);
    return cow_ptr<Blob>::share(held == nullptr ? nullptr : held->GetBlob());
}

cow_ptr<Tree> Tree::GetLocalTree(KivStringViewT<char16_t> name) const noexcept {
    return cow_ptr<Tree>::share(SubtreeOf(*this, name));
}

cow_ptr<Object> Tree::GetDeepObject(KivStringViewT<char16_t> path) const {
    return GetDeepObject(PathComponents(path));
}

cow_ptr<Object> Tree::GetDeepObject(Components components) const noexcept {
    Tree const* const holder = HolderOf(*this, components);
    return holder == nullptr ? nullptr : holder->GetLocalObject(components.back());
}

cow_ptr<Blob> Tree::GetDeepBlob(KivStringViewT<char16_t> path) const {
    return GetDeepBlob(PathComponents(path));
}

cow_ptr<Blob> Tree::GetDeepBlob(Components components) const noexcept {
    Tree const* const holder = HolderOf(*this, components);
    return holder == nullptr ? nullptr : holder->GetLocalBlob(components.back());
}

cow_ptr<Tree> Tree::GetDeepTree(KivStringViewT<char16_t> path) const {
    return GetDeepTree(PathComponents(path));
}

cow_ptr<Tree> Tree::GetDeepTree(Components components) const noexcept {
    Tree const* const holder = HolderOf(*this, components);
    return holder == nullptr ? nullptr : holder->GetLocalTree(components.back());
}

optional<Id> Tree::GetIdByPath(KivStringViewT<char16_t> path) const {
    const cow_ptr<Object> object = GetDeepObject(path);
    return object ? optional<Id>(object->GetId()) : std::nullopt;
}

cow_ptr<Tree> dll_wrapped_shared(std::unique_ptr<Tree> tree) {
    return cow_ptr<Tree>(std::move(tree));
}

} // namespace KivVcs
