#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vault {

/// Owns a file descriptor.
class Descriptor {
public:
    explicit Descriptor(int descriptor = -1) noexcept : descriptor_(descriptor) {}
    Descriptor(Descriptor&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    Descriptor& operator=(Descriptor&& other) noexcept {
        std::swap(descriptor_, other.descriptor_);
        return *this;
    }
    ~Descriptor() {
        if (IsOpen())
            close(descriptor_);
    }

    [[nodiscard]] bool IsOpen() const noexcept { return descriptor_ >= 0; }
    [[nodiscard]] int Get() const noexcept { return descriptor_; }
    /// Somebody else closes it from now on.
    void Release() noexcept { descriptor_ = -1; }
    /// Closes it now. @return whether everything written arrived
    [[nodiscard]] bool Close() noexcept { return close(std::exchange(descriptor_, -1)) == 0; }

private:
    int descriptor_;
};

/// @throws Problem with the reason why the last system call failed
[[noreturn]] void ThrowSystemProblem(std::string const& what, std::string const& path);

/// The path without links and dots; @p path itself if there is nothing.
[[nodiscard]] std::string RealPath(std::string const& path);

/// Opens the directory @p name of @p parent, if it is no link.
[[nodiscard]] Descriptor OpenDirectory(int parent, char const* name, int moreFlags = 0) noexcept;

/// Calls @p receiver with each name in a directory but "." and "..". @return false, with errno set, if it cannot be listed
[[nodiscard]] bool ForEachName(Descriptor const& directory, std::function<void(char const*)> const& receiver);
/// Adds these names to @p names.
[[nodiscard]] bool ReadNames(Descriptor const& directory, std::vector<std::string>& names);

/// Fills @p to as far as the file goes on. @return how many bytes there were; nothing, with errno set, after a failure
[[nodiscard]] std::optional<std::uint64_t> ReadUpTo(int file, std::span<std::byte> to) noexcept;
/// @return false, with errno set, after a failure
[[nodiscard]] bool WriteAll(int file, std::span<const std::byte> bytes) noexcept;

/// Opens directories below a top one by their paths, of any depth and without ever following a link.
class DirectoryOpener {
public:
    /// Links are followed at the top only.
    /// @throws Problem if it is no directory
    explicit DirectoryOpener(std::string const& top);
    explicit DirectoryOpener(Descriptor top) noexcept : top_(std::move(top)) {}

    /// A descriptor for the directory at @p path, which is empty for the top and otherwise ends with "/"; -1, with errno
    /// set, if there is none. Valid until the next call.
    [[nodiscard]] int Open(std::string_view path);
    [[nodiscard]] int Top() const noexcept { return top_.Get(); }
    /// Forgets what has been opened, which may have been replaced.
    void Forget() noexcept { opened_.clear(); }

private:
    struct Opened {
        std::string path;
        Descriptor directory;
    };

    Descriptor top_;
    /// The last ones used come first.
    std::list<Opened> opened_;
};

} // namespace vault
