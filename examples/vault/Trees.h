#pragma once

#include <KivArchive/IArchive.h>

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace vault {

using KivArchive::IArchive;
using KivArchive::NewObject;
using KivVcs::Buffer;
using KivVcs::Id;

enum class EntryKind : std::uint8_t { File, Link, Directory };

/// What a directory remembers of an entry, or of itself, beside the content.
struct Attributes {
    /// A symbolic link; its content is where it points to.
    bool isLink = false;
    /// Permission bits, the special ones included.
    std::uint32_t mode = 0;
    /// When it was changed last, in nanoseconds since 1970.
    std::int64_t time = 0;

    /// Whether only the times differ, which is no change.
    [[nodiscard]] bool IsLike(Attributes const& other) const noexcept {
        return isLink == other.isLink && mode == other.mode;
    }
    friend bool operator==(Attributes const&, Attributes const&) noexcept = default;
};

struct Entry {
    /// As the tree has it.
    std::string name;
    bool isDirectory = false;
    Id id;
    /// Of a file or link; nothing where a version was saved without. A directory has its own.
    std::optional<Attributes> attributes;

    [[nodiscard]] EntryKind Kind() const noexcept {
        return isDirectory                        ? EntryKind::Directory
               : attributes && attributes->isLink ? EntryKind::Link
                                                  : EntryKind::File;
    }
    friend bool operator==(Entry const&, Entry const&) noexcept = default;
};

/// A directory of a version. Its tree holds its entries under their names, and its attributes, and those of its files, in
/// entries of the vault's own, whose contents are lines of
///
///     MODE TIME NAME\0        MODE in octal, with an "l" after it for a link; the directory itself has no NAME
///
/// There is one of these entries, or, in large directories, 256 among which names are spread by a hash, so that one change
/// rewrites little.
struct Directory {
    /// In the order of the tree.
    std::vector<Entry> entries;
    std::optional<Attributes> own;
    /// The contents that the attributes were read from.
    std::vector<Id> attributeContents;

    [[nodiscard]] Entry const* Find(std::string_view name) const noexcept;
};

/// The attributes in such a content by name; whatever else it has is left out.
using AttributeMap = std::map<std::string, Attributes, std::less<>>;
[[nodiscard]] AttributeMap ReadAttributes(std::string_view content);

/// Where the attributes of the file at @p path may be in a version: in a small directory, and in a large one.
[[nodiscard]] std::array<std::string, 2> AttributePaths(std::string_view path);

/// A directory as objects: the contents of its attributes, and then its tree.
struct PackedDirectory {
    std::vector<NewObject> attributes;
    NewObject tree;
};

[[nodiscard]] PackedDirectory Pack(Directory const& directory);

/// Reads trees and contents of an archive.
class TreeReader {
public:
    explicit TreeReader(IArchive& archive) noexcept : archive_(archive) {}

    [[nodiscard]] IArchive& Archive() const noexcept { return archive_; }

    /// The directories of these trees, by few calls; the null identifier is an empty one. What is missing or damaged, or
    /// no tree, is left out.
    [[nodiscard]] std::unordered_map<Id, Directory> Read(std::span<const Id> trees);
    /// @throws Problem if it cannot be read
    [[nodiscard]] Directory Read(Id const& tree);
    /// The content of a blob; nothing if it is missing, damaged or larger than @p largest.
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t largest);

    /// The entry at a path, of which a tree has the components; nothing if there is none. The empty path is the tree.
    [[nodiscard]] std::optional<Entry> Find(Id const& tree, std::string_view path);

private:
    IArchive& archive_;
};

/// The bytes of a buffer.
[[nodiscard]] std::string BytesOf(Buffer const& buffer);
[[nodiscard]] Buffer BufferOf(std::string_view bytes);
/// The digits of an identifier; none for the null one.
[[nodiscard]] std::string DigitsOf(Id const& id);

} // namespace vault
