#include "repository/MissingTrees.h"

#include <algorithm>

namespace KivArchive {

namespace {

constexpr std::size_t maximumUnasked = 16;
constexpr std::size_t usualDirectories = 4;
constexpr std::uint64_t largestUnasked = std::uint64_t{64} * 1024;

/// The null identifier for null.
template <class T>
Id IdOf(cow_ptr<T> const& object) {
    return object ? object->GetId() : Id();
}

} // namespace

void MissingTrees::Add(cow_ptr<Tree> root, cow_ptr<Tree> earlier) {
    NewDirectory directory;
    directory.id = root->GetId();
    directory.tree = std::move(root);
    directory.earlier = std::move(earlier);
    CheckEntry(NewDirectory::none, {}, *directory.tree, "tree", "40000");
    // Few entries differ from an earlier version, and most of them are new.
    bool const isListed = static_cast<bool>(directory.earlier);
    std::size_t const number = AddDirectory(std::move(directory));
    if (isListed)
        List(number);
}

void MissingTrees::Find(bool isNew) {
    if (isNew && AreFewAndSmall()) {
        for (Id const& id : toAskFor_)
            missing_.Add(id);
        toAskFor_.clear();
        return;
    }
    while (!toAskFor_.empty()) {
        for (Id const& id : archive_.FindMissing(std::exchange(toAskFor_, {})))
            missing_.Add(id);
        // Directories that this adds are asked for with the next batch before they are listed.
        for (std::size_t const end = directories_.size(); looked_ < end; ++looked_)
            if (IsMissing(directories_[looked_].id) && !directories_[looked_].isListed)
                List(looked_);
    }
}

/// Whether storing all of it costs less than asking for it first.
bool MissingTrees::AreFewAndSmall() const {
    return toAskFor_.size() <= maximumUnasked &&
           std::all_of(directories_.begin(), directories_.end(), [](NewDirectory const& directory) {
               return directory.isListed && !directory.tree->IsOfHostClass() &&
                      std::all_of(directory.files.begin(), directory.files.end(), [](NewDirectory::File const& file) {
                          return !file.blob->IsOfHostClass() && file.blob->GetData().GetSize() <= largestUnasked;
                      });
           });
}

std::size_t MissingTrees::AddDirectory(NewDirectory directory) {
    if (!numbers_.Add(directory.id, directories_.size()))
        return *numbers_.Find(directory.id);
    if (directories_.empty()) {
        directories_.reserve(usualDirectories);
        toAskFor_.reserve(maximumUnasked);
    }
    if (directory.depth > KivVcs::deepestLoadedNesting)
        Refuse(directory.holder, directory.name, "lies too deep");
    toAskFor_.push_back(directory.id);
    directories_.push_back(std::move(directory));
    return directories_.size() - 1;
}

void MissingTrees::List(std::size_t number) {
    // A list instead of recursion: directories may be nested deeper than a thread's stack allows.
    for (std::vector<std::size_t> open{number}; !open.empty();) {
        std::size_t const next = open.back();
        open.pop_back();
        if (directories_[next].isListed)
            continue;
        directories_[next].isListed = true;
        ListFiles(next);
        ListSubdirectories(next);
        bool const isWhole = !directories_[next].earlier;
        for (std::size_t const subdirectory : directories_[next].subdirectories)
            if (isWhole ? ListsWholeNow(subdirectory) : directories_[subdirectory].earlier != nullptr)
                open.push_back(subdirectory);
    }
}

/// Lets a directory below one that is listed whole be listed whole, too. It may have been added before, to list only
/// what differs from an earlier version, and so without what the archive may lack.
/// @return whether to list it now, since `Find` has passed it already
bool MissingTrees::ListsWholeNow(std::size_t number) {
    NewDirectory& directory = directories_[number];
    if (!directory.earlier)
        return false;
    directory.earlier = nullptr;
    directory.isListed = false;
    directory.files.clear();
    return number < looked_ && IsMissing(directory.id);
}

void MissingTrees::ListFiles(std::size_t number) {
    NewDirectory& directory = directories_[number];
    auto const names =
        directory.earlier ? directory.tree->GetLocalBlobDiffs(directory.earlier) : directory.tree->GetLocalBlobPaths();
    for (auto const& name : names) {
        cow_ptr<Blob> blob = directory.tree->GetLocalBlob(name);
        if (!blob)
            continue;
        CheckEntry(number, name, *blob, "blob", "100644");
        NewDirectory::File file{blob, blob->GetId(), {}, name};
        if (directory.earlier)
            file.earlier = IdOf(directory.earlier->GetLocalBlob(name));
        if (asked_.Add(file.id))
            toAskFor_.push_back(file.id);
        directory.files.push_back(std::move(file));
    }
}

void MissingTrees::ListSubdirectories(std::size_t number) {
    NewDirectory const& directory = directories_[number];
    auto const names = directory.earlier ? directory.tree->GetLocalTreeDiffs(directory.earlier)
                                         : directory.tree->GetLocalSubtreePaths();
    std::vector<std::size_t> subdirectories;
    for (auto const& name : names) {
        // Not before the loop, since adding moves the directories.
        NewDirectory const& holder = directories_[number];
        NewDirectory subdirectory;
        subdirectory.tree = holder.tree->GetLocalTree(name);
        if (!subdirectory.tree)
            continue;
        CheckEntry(number, name, *subdirectory.tree, "tree", "40000");
        subdirectory.id = subdirectory.tree->GetId();
        subdirectory.earlier = holder.earlier ? holder.earlier->GetLocalTree(name) : nullptr;
        subdirectory.holder = number;
        subdirectory.name = name;
        subdirectory.depth = holder.depth + 1;
        subdirectories.push_back(AddDirectory(std::move(subdirectory)));
    }
    directories_[number].subdirectories = std::move(subdirectories);
}

void MissingTrees::CheckEntry(std::size_t number, KivStringT<char16_t> const& name, KivVcs::Object const& object,
                              std::string_view word, std::string_view mode) const {
    KivStringViewT<char16_t> const text = name;
    if (text.Find(u"/") >= 0)
        Refuse(number, name, "has a \"/\" in its name");
    if (std::find(text.begin(), text.end(), u'\0') != text.end())
        Refuse(number, name, "has a U+0000 in its name");
    if (number != NewDirectory::none && directories_[number].tree->GetLocalBlob(name) &&
        directories_[number].tree->GetLocalTree(name))
        Refuse(number, name, "is a directory that a file of the same name hides");
    if (!object.IsOfHostClass())
        return;
    if (std::string_view(object.GetHeader().GetString()) != word ||
        std::string_view(object.GetStoragePrefix().GetString()) != mode)
        Refuse(number, name, "is of another type than a file or a directory");
    if (object.GetId().GetDigest() == nullptr)
        Refuse(number, name, "has an identifier that is no digest");
}

void MissingTrees::Refuse(std::size_t directory, KivStringViewT<char16_t> name, const char* why) const {
    throw ArchiveError(Failure::Unrepresentable, {}, "\"" + PathOf(directory, name) + "\" " + why + ".");
}

std::string MissingTrees::PathOf(std::size_t directory, KivStringViewT<char16_t> name) const {
    std::vector<std::string> names{KivVcs::ToUtf8(name)};
    for (; directory != NewDirectory::none && directories_[directory].holder != NewDirectory::none;
         directory = directories_[directory].holder)
        names.push_back(KivVcs::ToUtf8(directories_[directory].name));
    std::string path;
    for (; !names.empty(); names.pop_back())
        path += (path.empty() ? "" : "/") + names.back();
    // `what()` ends at the first zero byte.
    for (std::size_t zero = path.find('\0'); zero != std::string::npos; zero = path.find('\0', zero))
        path.replace(zero, 1, "\\0");
    return path;
}

} // namespace KivArchive
