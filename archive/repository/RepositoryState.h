#pragma once

/// @file
/// The state of a repository over an archive.

#include "KivArchive/ArchivedRepository.h"
#include "repository/ArchivedStorage.h"
#include "repository/LocalFacts.h"

#include <map>

namespace KivArchive {

/// A branch as the archive has it.
struct KnownBranch {
    /// Its head when it was last read; null for none.
    Id published;
    /// The published head that the branch here is based on, and that publishing expects to find.
    Id taken;
    /// Why the published head cannot be read. The branch here has no head then.
    std::optional<Failure> unreadable;
};

struct ArchivedRepository::State {
    State(std::shared_ptr<IArchive> archive, RepositoryOptions const& repositoryOptions)
        : source(std::make_shared<ObjectSource>(std::move(archive), repositoryOptions.contentBytes)),
          options(repositoryOptions) {
        auto ownStorage = std::make_unique<ArchivedStorage>(source);
        storage = ownStorage.get();
        made = std::move(ownStorage);
    }

    [[nodiscard]] IArchive& Archive() const noexcept { return *source->GetArchive(); }
    /// The head of the branch here; null if there is none.
    [[nodiscard]] Id OwnHead(KivStringViewT<char16_t> branch) const {
        cow_ptr<Commit> const head = storage->GetHead(branch);
        return head ? head->GetId() : Id();
    }

    std::shared_ptr<ObjectSource> source;
    RepositoryOptions options;
    /// Owns the storage until the repository does.
    std::unique_ptr<KivVcs::IObjectsStorage> made;
    ArchivedStorage* storage = nullptr;
    std::map<KivStringT<char16_t>, KnownBranch> branches;
    LocalFacts facts;
};

} // namespace KivArchive
