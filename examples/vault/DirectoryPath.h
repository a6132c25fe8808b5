#pragma once

#include "Descriptor.h"

#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace vault {

/// The way from a top directory down to the one that is being worked on, of any depth: only the innermost one is open.
///
/// Links are followed at the top only. A directory that is moved meanwhile is noticed; the way never leads out of the
/// top.
/// @throws Problem from every operation that cannot be carried out
class DirectoryPath {
public:
    explicit DirectoryPath(std::string const& top);

    /// Goes down into a directory of the innermost one.
    void Enter(std::string const& name);
    /// Goes back to the directory above. @pre not at the top
    void Leave();

    /// The innermost directory.
    [[nodiscard]] int Get() const noexcept { return innermost_.Get(); }
    /// The names in it, sorted, without "." and "..".
    [[nodiscard]] std::vector<std::string> ReadNames() const;
    /// The path of an entry of the innermost directory, for people.
    [[nodiscard]] std::string PathOf(std::string_view name) const;

private:
    struct Level {
        std::string name;
        dev_t device;
        ino_t inode;
    };

    [[nodiscard]] bool IsAt(Level const& level) const;
    void Arrive(std::string const& name);

    Descriptor innermost_;
    std::vector<Level> levels_;
};

} // namespace vault
