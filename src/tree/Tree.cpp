#include "KivVcs/Tree.h"

#include "KivVcs/IRepository.h"
#include "objects/PathComponents.h"
#include "tree/TableNode.h"

namespace KivVcs {

using detail::FindEntry;

namespace {

using Components = array_view<KivStringViewT<char16_t> const>;

/// How a repository looks up the objects of a kind.
cow_ptr<Blob> FindStored(IRepository& repo, Id const& id, Blob const*) {
    return repo.GetBlobFromStorage(id);
}

cow_ptr<Tree> FindStored(IRepository& repo, Id const& id, Tree const*) {
    return repo.GetTreeFromStorage(id);
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

void Tree::ResetState() {
    Object::ResetState();
    data_.Reset();
}

bool Tree::IsEmpty() const noexcept {
    return entries_.Root() == nullptr;
}

std::uint64_t Tree::GetLocalObjectCount() const noexcept {
    return IsEmpty() ? 0 : entries_.Root()->ElementCount();
}

std::uint64_t Tree::GetLocalBlobCount() const noexcept {
    return IsEmpty() ? 0 : entries_.Root()->Total().blobs;
}

template <class T>
cow_ptr<T> Tree::SetLocalObject(IRepository& repo, KivStringViewT<char16_t> name, T const& object) {
    if (name.IsEmpty())
        return nullptr;
    cow_ptr<T> stored = FindStored(repo, object.GetId(), &object);
    if (!stored)
        stored = immu::make<T>(object);
    stored = repo.SyncWithStorage(std::move(stored));
    entries_.Set(name, stored);
    ResetState();
    return stored;
}

template <class T>
void detail::TableAccess::AddRead(Tree& tree, IRepository& repo, KivStringT<char16_t> const& name, cow_ptr<T> object) {
    if (name.IsEmpty() || name.Find(u"/") >= 0) {
        tree.AddObjectToTree<T>(&repo, PathComponents(name), *object);
        return;
    }
    // Only the caller knows of an object that nobody else holds, so that it needs no copy.
    cow_ptr<T> stored = FindStored(repo, object->GetId(), object.get());
    if (!stored)
        stored = object.use_count() == 1 ? std::move(object) : immu::make<T>(*object);
    tree.entries_.Set(name, repo.SyncWithStorage(std::move(stored)));
    tree.ResetState();
}

template void detail::TableAccess::AddRead(Tree&, IRepository&, KivStringT<char16_t> const&, cow_ptr<Blob>);
template void detail::TableAccess::AddRead(Tree&, IRepository&, KivStringT<char16_t> const&, cow_ptr<Tree>);

void Tree::SetLocalTree(IRepository& repo, KivStringViewT<char16_t> name, cow_ptr<Tree> tree) {
    if (name.IsEmpty())
        return;
    cow_ptr<Tree> stored = repo.GetTreeFromStorage(tree->GetId());
    entries_.Set(name, repo.SyncWithStorage(stored ? std::move(stored) : std::move(tree)));
    ResetState();
}

template <class T>
cow_ptr<T> Tree::AddObjectToTree(IRepository* repo, Components components, T const& object) {
    if (components.empty() || repo == nullptr)
        return nullptr;
    if (components.size() == 1)
        return SetLocalObject(*repo, components[0], object);

    // Private copies of the trees below this one on the way; what is missing becomes a new tree.
    std::vector<cow_ptr<Tree>> way(components.size() - 1);
    Tree const* above = this;
    for (std::size_t level = 0; level < way.size(); ++level) {
        detail::Entry const* const entry =
            above == nullptr ? nullptr : FindEntry(above->entries_.Root(), components[level], true);
        above = entry == nullptr ? nullptr : entry->TreeChild();
        Tree* const copy = way[level].write();
        if (above != nullptr)
            copy->entries_ = above->entries_;
    }
    cow_ptr<T> result = way.back().write()->SetLocalObject(*repo, components.back(), object);
    for (std::size_t level = way.size(); level-- > 0;) {
        Tree& parent = level == 0 ? *this : *way[level - 1].write();
        parent.SetLocalTree(*repo, components[level], std::move(way[level]));
    }
    return result;
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
    const cow_ptr<Tree> holder = leading.empty() ? nullptr : GetDeepTree(leading);
    if (!leading.empty() && !holder)
        return false;
    if (name.IsEmpty() || !(holder ? *holder : *this).LocalObjectExists(name))
        return false;
    if (leading.empty()) {
        entries_.Erase(name);
        ResetState();
        return true;
    }

    std::vector<cow_ptr<Tree>> way(leading.size());
    Tree const* above = this;
    for (std::size_t level = 0; level < way.size(); ++level) {
        above = FindEntry(above->entries_.Root(), leading[level], true)->TreeChild();
        way[level].write()->entries_ = above->entries_;
    }
    way.back().write()->entries_.Erase(name);
    for (std::size_t level = way.size(); level-- > 0;) {
        Tree& parent = level == 0 ? *this : *way[level - 1].write();
        if (way[level]->IsEmpty()) {
            parent.entries_.Erase(leading[level]);
            parent.ResetState();
        } else if (repo != nullptr) {
            parent.SetLocalTree(*repo, leading[level], std::move(way[level]));
        }
    }
    return true;
}

bool Tree::LocalObjectExists(KivStringViewT<char16_t> name) const noexcept {
    return FindEntry(entries_.Root(), name, false) != nullptr || FindEntry(entries_.Root(), name, true) != nullptr;
}

cow_ptr<Object> Tree::GetLocalObject(KivStringViewT<char16_t> name) const noexcept {
    if (cow_ptr<Blob> blob = GetLocalBlob(name))
        return blob;
    return GetLocalTree(name);
}

cow_ptr<Blob> Tree::GetLocalBlob(KivStringViewT<char16_t> name) const noexcept {
    detail::Entry const* const entry = FindEntry(entries_.Root(), name, false);
    return cow_ptr<Blob>::share(entry == nullptr ? nullptr : entry->BlobChild());
}

cow_ptr<Tree> Tree::GetLocalTree(KivStringViewT<char16_t> name) const noexcept {
    detail::Entry const* const entry = FindEntry(entries_.Root(), name, true);
    return cow_ptr<Tree>::share(entry == nullptr ? nullptr : entry->TreeChild());
}

cow_ptr<Object> Tree::GetDeepObject(KivStringViewT<char16_t> path) const {
    return GetDeepObject(PathComponents(path));
}

cow_ptr<Object> Tree::GetDeepObject(Components components) const noexcept {
    if (components.size() <= 1)
        return components.empty() ? nullptr : GetLocalObject(components[0]);
    const cow_ptr<Tree> holder = GetDeepTree(components.first(components.size() - 1));
    return holder ? holder->GetLocalObject(components.back()) : nullptr;
}

cow_ptr<Blob> Tree::GetDeepBlob(KivStringViewT<char16_t> path) const {
    return GetDeepBlob(PathComponents(path));
}

cow_ptr<Blob> Tree::GetDeepBlob(Components components) const noexcept {
    if (components.size() <= 1)
        return components.empty() ? nullptr : GetLocalBlob(components[0]);
    const cow_ptr<Tree> holder = GetDeepTree(components.first(components.size() - 1));
    return holder ? holder->GetLocalBlob(components.back()) : nullptr;
}

cow_ptr<Tree> Tree::GetDeepTree(KivStringViewT<char16_t> path) const {
    return GetDeepTree(PathComponents(path));
}

cow_ptr<Tree> Tree::GetDeepTree(Components components) const noexcept {
    if (components.empty())
        return nullptr;
    Tree const* tree = this;
    for (KivStringViewT<char16_t> name : components) {
        detail::Entry const* const entry = FindEntry(tree->entries_.Root(), name, true);
        if (entry == nullptr || entry->TreeChild() == nullptr)
            return nullptr;
        tree = entry->TreeChild();
    }
    return cow_ptr<Tree>::share(tree);
}

optional<Id> Tree::GetIdByPath(KivStringViewT<char16_t> path) const {
    const cow_ptr<Object> object = GetDeepObject(path);
    return object ? optional<Id>(object->GetId()) : std::nullopt;
}

cow_ptr<Tree> dll_wrapped_shared(std::unique_ptr<Tree> tree) {
    return cow_ptr<Tree>(std::move(tree));
}

} // namespace KivVcs
