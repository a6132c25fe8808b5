#pragma once

#include "Progress.h"
#include "VaultFile.h"

#include <deque>
#include <functional>
#include <string>

namespace vault {

/// Reads histories from a vault file into a repository: commits through `Commit::Deserialize`, which brings their trees
/// and blobs along, linked to their real parents.
///
/// The repository's current branch must not have a head while this works: commits that are read back start from it.
class HistoryLoader {
public:
    /// Called with the identifier of each object that is read.
    using Visit = std::function<void(KivVcs::Id const&)>;

    HistoryLoader(VaultFile& file, KivVcs::Repository& repository, Progress& progress, Visit visit);

    /// The commit of that identifier with its whole history. Commits that the repository holds already are not read.
    /// @return null if the history cannot be read back to the very same identifiers.
    [[nodiscard]] KivVcs::cow_ptr<KivVcs::Commit> Load(KivVcs::Id const& head);

private:
    [[nodiscard]] KivVcs::StreamIO OpenObject(KivVcs::Id const& id);

    VaultFile& file_;
    KivVcs::Repository& repository_;
    Progress& progress_;
    Visit visit_;
    std::deque<KivVcs::Buffer> opened_;
};

} // namespace vault
