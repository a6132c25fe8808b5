#pragma once

#include "Author.h"
#include "Vault.h"

namespace vault {

/// A commit made now, as an object with its facts.
struct NewCommit {
    NewObject object;
    KivArchive::Ancestry facts;

    /// Puts it after the objects of @p change.
    void AddTo(KivArchive::Change& change) const;
};

/// @param parent null for none
/// @param merged null for none
/// @throws Problem if the clock shows a time that a commit cannot hold
[[nodiscard]] NewCommit MakeCommit(Id const& tree, Id const& parent, Id const& merged, Author const& author,
                                   Text const& message);

} // namespace vault
