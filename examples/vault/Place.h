#pragma once

#include "Descriptor.h"

#include <string>
#include <string_view>

namespace vault {

/// What the names of unfinished files and directories begin with.
inline constexpr std::string_view temporaryPrefix = ".vault-restoring-";

/// Removes a directory with all that is in it, or anything else, without following links. @return success
[[nodiscard]] bool RemoveAll(int parent, std::string const& name);

/// Where something is to appear: its directory, and its name there.
struct Place {
    Descriptor parent;
    std::string name;
};

/// Makes the directories on the way that are missing. @throws Problem
[[nodiscard]] Place FindPlace(std::string path);

/// A directory beside a place that goes with all that is in it, unless it is renamed.
class Sibling {
public:
    explicit Sibling(Place const& place);
    Sibling(Sibling const&) = delete;
    Sibling& operator=(Sibling const&) = delete;
    ~Sibling();

    [[nodiscard]] int Get() const noexcept { return directory_.Get(); }
    /// Makes @p inner of it, or itself if that is empty, the place. @throws Problem
    void Rename(std::string const& inner);

private:
    Place const& place_;
    std::string name_;
    Descriptor directory_;
};

} // namespace vault
