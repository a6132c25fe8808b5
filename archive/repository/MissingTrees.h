#pragma once

/// @file
/// Which directories and files publishing has to store.

#include "KivArchive/IArchive.h"
#include "SmallTable.h"

#include <KivVcs/Commit.h>

namespace KivArchive {

using KivVcs::Blob;
using KivVcs::cow_ptr;
using KivVcs::Tree;

/// A directory that may have to be stored, with its entries, of which those are left out that the directory it replaces
/// has, too.
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
    /// The directory that it replaces, which is in the archive or will be; null if there is none.
    cow_ptr<Tree> earlier;
    /// The number of the directory that it is in; `none` for a root.
    std::size_t holder = none;
    KivStringT<char16_t> name;
    std::size_t depth = 0;
    std::vector<File> files;
    std::vector<std::size_t> subdirectories;
    bool isListed = false;
};

/// Looks for what the archive lacks of some trees, from the top down: a directory that is there is not entered. Asks
/// with one batch for whatever differs from earlier versions, and with one for each level of what is wholly new.
class MissingTrees {
public:
    explicit MissingTrees(IArchive& archive) : archive_(archive) {}

    /// @param earlier the root that @p root replaces, which is in the archive or will be; may be null
    /// @throws ArchiveError of kind `Unrepresentable`, as everything here
    void Add(cow_ptr<Tree> root, cow_ptr<Tree> earlier);
    /// Asks the archive about all that was added.
    /// @param isNew whether a few small objects that differ from earlier versions are taken for missing without asking
    void Find(bool isNew);

    [[nodiscard]] bool IsMissing(Id const& id) const { return missing_.Contains(id); }
    /// The number of a directory, which must have been looked for.
    [[nodiscard]] std::size_t NumberOf(Id const& id) const { return *numbers_.Find(id); }
    [[nodiscard]] NewDirectory const& At(std::size_t number) const { return directories_[number]; }
    /// Throws because an entry of a directory cannot be stored, naming its path.
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
    /// How many directories `Find` has passed.
    std::size_t looked_ = 0;
    SmallTable<Id, std::size_t> numbers_;
    std::vector<Id> toAskFor_;
    SmallSet<Id> asked_;
    SmallSet<Id> missing_;
};

} // namespace KivArchive
