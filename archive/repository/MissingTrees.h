#pragma once

/// @file
/// The directories and files that some commits bring.

#include "KivArchive/IArchive.h"

#include <KivVcs/Commit.h>

#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

using KivVcs::Blob;
using KivVcs::cow_ptr;
using KivVcs::Tree;

/// A directory that may have to be stored, with those of its entries that the directory that it replaces does not have.
struct NewDirectory {
    static constexpr auto none = static_cast<std::size_t>(-1);

    struct File {
        cow_ptr<Blob> blob;
        Id id;
        Id earlier;
        KivStringT<char16_t> name;
    };

    cow_ptr<Tree> tree;
    Id id;
    /// What it replaces, which is or will be in the archive; null if there is nothing.
    cow_ptr<Tree> earlier;
    /// Where it is, by number; a root is nowhere.
    std::size_t holder = none;
    KivStringT<char16_t> name;
    std::size_t depth = 0;
    std::vector<File> files;
    std::vector<std::size_t> subdirectories;
    bool isListed = false;
};

/// Looks for what the archive lacks of trees, from the top: a directory that is there is not entered. One batch for each
/// level below what is new; what differs from an earlier version is asked for in one batch.
class MissingTrees {
public:
    explicit MissingTrees(IArchive& archive) : archive_(archive) {}

    /// @param earlier the root that @p root replaces, which is or will be in the archive; may be null
    /// @throws ArchiveError of kind `Unrepresentable`, as everything here
    void Add(cow_ptr<Tree> root, cow_ptr<Tree> earlier);
    /// Asks the archive about all that was added.
    /// @param isNew whether a few small things that differ from earlier versions are taken for missing unasked
    void Find(bool isNew);

    [[nodiscard]] bool IsMissing(Id const& id) const { return missing_.contains(id); }
    /// The number of a directory that was looked for.
    [[nodiscard]] std::size_t NumberOf(Id const& id) const { return numbers_.at(id); }
    [[nodiscard]] NewDirectory const& At(std::size_t number) const { return directories_[number]; }
    /// Says by its path that an entry of a directory cannot be shown.
    [[noreturn]] void Refuse(std::size_t directory, KivStringViewT<char16_t> name, const char* why) const;

private:
    [[nodiscard]] bool AreFewAndSmall() const;
    void List(std::size_t number);
    [[nodiscard]] bool ListsWholeNow(std::size_t number);
    void ListFiles(std::size_t number);
    void ListSubdirectories(std::size_t number);
    std::size_t AddDirectory(NewDirectory directory);
    void CheckEntry(std::size_t number, KivStringT<char16_t> const& name, KivVcs::Object const& object,
                    std::string_view word, std::string_view mode) const;
    [[nodiscard]] std::string PathOf(std::size_t directory, KivStringViewT<char16_t> name) const;

    IArchive& archive_;
    std::vector<NewDirectory> directories_;
    /// How many directories have been looked at since the archive was asked about them.
    std::size_t looked_ = 0;
    std::unordered_map<Id, std::size_t> numbers_;
    std::vector<Id> toAskFor_;
    std::unordered_set<Id> asked_;
    std::unordered_set<Id> missing_;
};

} // namespace KivArchive
