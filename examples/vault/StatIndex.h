#pragma once

#include "Trees.h"

#include <sys/stat.h>

namespace vault {

/// What says whether a file has changed since it was read.
struct FileState {
    std::uint64_t size = 0;
    /// In nanoseconds since 1970.
    std::int64_t modified = 0;
    std::int64_t changed = 0;
    std::uint64_t inode = 0;
    std::uint32_t mode = 0;

    friend bool operator==(FileState const&, FileState const&) noexcept = default;
};

[[nodiscard]] FileState StateOf(struct stat const& status) noexcept;

/// What the last save of a directory found: the states of its files, and the identifiers that they had, so that a save reads
/// only what has changed. It is read where it lies: of most directories nothing is wanted but that they are as they were.
class StatIndex {
public:
    struct File {
        std::string_view name;
        /// All zero for a directory.
        FileState state;
        std::string_view digest;

        /// Of its content, or the tree that the directory had; null if that is not known.
        [[nodiscard]] Id GetId() const;
    };

    /// A directory of the index, and what is left of it to be read.
    class Listing {
    public:
        /// @param block as `StatIndexWriter` writes it
        explicit Listing(std::string_view block);

        /// Ends with "/" unless it is empty.
        [[nodiscard]] std::string_view Path() const noexcept { return path_; }
        /// The tree that the directory had; null if one of its files is left out here.
        [[nodiscard]] Id Tree() const;
        [[nodiscard]] std::uint32_t Mode() const noexcept { return mode_; }
        [[nodiscard]] std::string_view Block() const noexcept { return block_; }
        /// The next file in the order of the tree, without those that may have changed since unnoticed.
        [[nodiscard]] std::optional<File> Next();

    private:
        std::string_view block_;
        std::string_view path_;
        std::string_view digest_;
        std::uint32_t mode_ = 0;
        std::string_view rest_;
    };

    StatIndex() = default;
    /// @param bytes which outlive the index; what is not one is an empty one
    explicit StatIndex(std::string_view bytes);

    /// The directory at @p path; nothing if there is none.
    [[nodiscard]] std::optional<Listing> Find(std::string_view path) const;
    /// Whether the version with the tree @p top has a path; nothing if the index does not know.
    [[nodiscard]] std::optional<bool> Has(Id const& top, std::string_view path) const;

private:
    std::unordered_map<std::string_view, Listing> directories_;
};

/// Makes the bytes of an index.
class StatIndexWriter {
public:
    StatIndexWriter();

    /// Begins a directory. @param path ends with "/" unless it is empty
    void Begin(std::string_view path, std::uint32_t mode);
    void AddFile(std::string_view name, FileState const& state, Id const& id);
    /// Ends it. @param tree null if one of its files was left out
    void End(Id const& tree);
    /// Takes over a directory of another index.
    void Copy(StatIndex::Listing const& listing);

    [[nodiscard]] std::string const& Bytes() const noexcept { return bytes_; }

private:
    std::string bytes_;
    std::size_t begin_ = 0;
};

/// The index of the directory at @p top, from the user's caches: whichever vault it was saved to, files that look as they
/// did are what they were. Empty if there is none.
[[nodiscard]] std::string ReadIndex(std::string const& top);
/// Replaces it; where that fails, the next save only takes longer.
void WriteIndex(std::string const& top, std::string const& index);

} // namespace vault
