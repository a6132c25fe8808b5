#include "KivVcs/IRepository.h"
#include "objects/PathComponents.h"
#include "tree/SortedEntries.h"
#include "tree/StoredInstance.h"

#include <map>
#include <span>

namespace KivVcs {

using detail::EntryTable;
using detail::Held;
using detail::TreeAccess;

namespace {

using Name = KivStringViewT<char16_t>;

/// The last component of a path, and what is before it.
struct SplitPath {
    explicit SplitPath(Name path) noexcept {
        const char16_t* end = path.end();
        while (end != path.begin() && end[-1] == u'/')
            --end;
        const char16_t* begin = end;
        while (begin != path.begin() && begin[-1] != u'/')
            --begin;
        directory = Name(path.begin(), static_cast<int>(begin - path.begin()));
        name = Name(begin, static_cast<int>(end - begin));
    }

    Name directory;
    Name name;
};

/// Adds many blobs below a tree, each directory in one step. The new versions are made aside.
class BulkAddition {
public:
    BulkAddition(Tree const& root, array_view<BlobAtPath const> blobs) : blobs_(blobs) {
        directories_.push_back({.before = &root});
        SplitPath last{Name()};
        std::size_t directory = 0;
        for (std::size_t index = 0; index < blobs.size(); ++index) {
            const SplitPath path(blobs[index].path);
            if (!blobs[index].blob || path.name.IsEmpty())
                continue;
            // Most hosts give what is in one directory together.
            if (path.directory != last.directory)
                directory = FindDirectory(path.directory);
            directories_[directory].files.push_back({path.name, index});
            placed_.push_back(index);
            last = path;
        }
    }

    [[nodiscard]] bool IsEmpty() const noexcept { return placed_.empty(); }

    /// Stores blobs and directories. @return the new entries of the root
    [[nodiscard]] EntryTable Run(IRepository& repo) {
        ForEachWindow(placed_, [&](std::span<std::size_t const> window) { StoreBlobs(repo, window); });
        const std::vector<std::size_t> order = ListFromBelow();
        ForEachWindow(order, [&](std::span<std::size_t const> window) { StoreVersions(repo, window); });
        return MakeEntries(top);
    }

private:
    struct File {
        Name name;
        std::size_t index;
    };

    struct Directory {
        Name name{};
        std::size_t parent = top;
        /// The tree that is there already, or null.
        Tree const* before = nullptr;
        std::vector<File> files{};
        /// The new version, from when it is made on.
        cow_ptr<Tree> version{};
        /// The one that the parent's new version holds, from when that is made on.
        Tree const* entered = nullptr;
    };

    static constexpr std::size_t top = 0;

    /// Hands @p all to @p use in pieces that stay in the processor's caches while one thing after the other is done to them.
    template <class Use>
    static void ForEachWindow(std::span<std::size_t const> all, Use use) {
        constexpr std::size_t windowSize = 256;
        for (; !all.empty(); all = all.subspan(std::min(windowSize, all.size())))
            use(all.first(std::min(windowSize, all.size())));
    }

    std::size_t FindDirectory(Name path) {
        std::size_t found = 0;
        ForEachPathComponent(path, [&](Name name) {
            const auto [child, isNew] = children_.try_emplace({found, name}, directories_.size());
            if (isNew) {
                Tree const* const above = directories_[found].before;
                Held const* const held = above == nullptr ? nullptr : TreeAccess::Find(*above, name);
                directories_.push_back(
                    {.name = name, .parent = found, .before = held == nullptr ? nullptr : held->GetTree()});
            }
            found = child->second;
        });
        return found;
    }

    void StoreBlobs(IRepository& repo, std::span<std::size_t const> window) {
        std::vector<Object const*> own;
        for (const std::size_t index : window) {
            // Those of hosts' classes are asked when it is their turn.
            if (!blobs_[index].blob->IsOfHostClass())
                own.push_back(blobs_[index].blob.get());
        }
        Identify(own);
        stored_.resize(blobs_.size());
        for (const std::size_t index : window) {
            cow_ptr<Blob> const& blob = blobs_[index].blob;
            stored_[index] = StoredInstance(repo, *blob, [&blob] { return blob; });
        }
    }

    /// All directories but the root, each behind those in it, which come in the order of their names.
    [[nodiscard]] std::vector<std::size_t> ListFromBelow() const {
        std::vector<std::size_t> order;
        std::vector<std::size_t> open{top};
        while (!open.empty()) {
            const std::size_t directory = open.back();
            open.pop_back();
            order.push_back(directory);
            ForEachChild(directory, [&open](std::size_t child) { open.push_back(child); });
        }
        std::reverse(order.begin(), order.end());
        order.pop_back();
        return order;
    }

    template <class Use>
    void ForEachChild(std::size_t directory, Use use) const {
        for (auto child = children_.lower_bound({directory, Name()});
             child != children_.end() && child->first.first == directory; ++child)
            use(child->second);
    }

    void StoreVersions(IRepository& repo, std::span<std::size_t const> window) {
        std::vector<Object const*> versions;
        for (const std::size_t number : window)
            versions.push_back(&MakeVersion(number));
        Identify(versions);
        for (const std::size_t number : window)
            StoreVersion(repo, directories_[number]);
    }

    Tree const& MakeVersion(std::size_t number) {
        EntryTable entries = MakeEntries(number);
        Directory& directory = directories_[number];
        if (directory.before != nullptr && directory.before->IsOfHostClass())
            directory.version = CopyOf(*directory.before);
        Tree& version = *directory.version.write();
        TreeAccess::Entries(version) = std::move(entries);
        version.ResetState();
        return version;
    }

    [[nodiscard]] EntryTable MakeEntries(std::size_t number) {
        Directory const& directory = directories_[number];
        ForEachChild(number,
                     [this](std::size_t child) { directories_[child].entered = directories_[child].version.get(); });
        if (directory.before == nullptr || directory.before->IsEmpty())
            return MakeNewEntries(number);
        EntryTable entries = TreeAccess::Entries(*directory.before);
        AddTo(entries, number);
        return entries;
    }

    void AddTo(EntryTable& entries, std::size_t number) const {
        for (File const& file : directories_[number].files)
            entries.Set(file.name, stored_[file.index]);
        ForEachChild(number,
                     [&](std::size_t child) { entries.Set(directories_[child].name, directories_[child].version); });
    }

    /// The entries of a directory that has none yet.
    [[nodiscard]] EntryTable MakeNewEntries(std::size_t number) {
        std::vector<File>& files = directories_[number].files;
        const auto isBefore = [](File const& left, File const& right) { return left.name < right.name; };
        if (!std::is_sorted(files.begin(), files.end(), isBefore))
            std::stable_sort(files.begin(), files.end(), isBefore);
        detail::SortedEntries entries;
        auto file = files.begin();
        // Of one name the last blob stays.
        const auto takeBlob = [&] {
            while (std::next(file) != files.end() && std::next(file)->name == file->name)
                ++file;
            return std::move(stored_[(file++)->index]);
        };
        const auto addFile = [&] {
            const Name name = file->name;
            entries.Add(name.ToString(), Held(takeBlob()));
        };
        ForEachChild(number, [&](std::size_t child) {
            Directory const& subdirectory = directories_[child];
            while (file != files.end() && file->name < subdirectory.name)
                addFile();
            Held held(subdirectory.version);
            if (file != files.end() && file->name == subdirectory.name)
                held = held.With(takeBlob());
            entries.Add(subdirectory.name.ToString(), std::move(held));
        });
        while (file != files.end())
            addFile();
        return entries.Take();
    }

    void StoreVersion(IRepository& repo, Directory& directory) {
        const cow_ptr<Tree> made = std::exchange(
            directory.version, StoredInstance(repo, *directory.version, [&directory] { return directory.version; }));
        if (directory.entered == nullptr || directory.entered == directory.version.get())
            return;
        // The parent has been made, too, and holds another one, whose packed form is the same if it shows the same.
        const bool showsTheSame = directory.version && !directory.version->IsOfHostClass() &&
                                  !directory.entered->IsOfHostClass() &&
                                  directory.version->HasSameId(*directory.entered);
        Tree& parent = *directories_[directory.parent].version.write();
        TreeAccess::Entries(parent).Set(directory.name, directory.version);
        if (!showsTheSame)
            parent.ResetState();
    }

    array_view<BlobAtPath const> blobs_;
    /// The blobs that are added, and the storage's instances of them.
    std::vector<std::size_t> placed_;
    std::vector<cow_ptr<Blob>> stored_;
    std::vector<Directory> directories_;
    /// Directories by that which they are in, and by name.
    std::map<std::pair<std::size_t, Name>, std::size_t> children_;
};

} // namespace

bool Tree::AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs) {
    if (repo == nullptr)
        return false;
    BulkAddition addition(*this, blobs);
    if (addition.IsEmpty())
        return false;
    entries_ = addition.Run(*repo);
    ResetState();
    return true;
}

} // namespace KivVcs
