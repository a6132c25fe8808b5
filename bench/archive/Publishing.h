#pragma once

/// @file
/// A small host of the archive: versions of named contents, published one after the other.

#include <KivArchive/KivArchive.h>

#include <map>
#include <string>
#include <string_view>

namespace ArchiveBench {

using namespace KivArchive;

[[nodiscard]] Buffer BufferOf(std::string_view bytes);
[[nodiscard]] std::string DigitsOf(Id const& id);

/// Splits "a/b/c" into "a/b" and "c".
[[nodiscard]] std::pair<std::string, std::string> SplitPath(std::string const& path);

/// One line of development: keeps what trees hold and publishes what has changed since the last version.
class Publisher {
public:
    Publisher(IArchive& archive, unsigned workers) : archive_(archive), workers_(workers) {}

    void Set(std::string const& path, std::string bytes);
    /// Stores everything under a directory of the file system.
    void SetDirectory(std::string const& directory);
    /// Publishes a version on "master".
    void Commit(std::string const& description);

private:
    struct Entry {
        bool isTree = false;
        Id id;
    };
    struct Directory {
        std::map<std::string, Entry> entries;
        Id stored;
        bool isChanged = true;
    };

    void StoreWindow();
    Id StoreTree(std::string const& path, Directory& directory);
    Directory& At(std::string const& path);

    IArchive& archive_;
    unsigned workers_;
    Id head_;
    Change change_;
    std::uint64_t windowSize_ = 0;
    std::map<std::string, Directory> directories_;
};

} // namespace ArchiveBench
