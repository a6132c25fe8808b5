#pragma once

/// @file
/// The data of trees, read in batches for the listings.

#include "KivArchive/Listings.h"
#include "PackedForms.h"

#include <string>
#include <unordered_map>

namespace KivArchive {

/// How many objects listings read at once.
inline constexpr std::size_t listedAtOnce = 500;

/// The data of trees by identifier; the null one has none.
class TreeData {
public:
    /// Reads those of @p ids that are not null; some may be equal.
    /// @throws ArchiveError of kind `Collected` if one is not there, of kind `Damaged` if one is not a sound tree
    TreeData(IArchive& archive, std::vector<Id> ids);

    [[nodiscard]] std::span<const std::byte> At(Id const& id) const {
        return id.IsEmpty() ? std::span<const std::byte>() : std::as_bytes(std::span(data_.at(id)));
    }

private:
    std::unordered_map<Id, std::string> data_;
};

/// Throws because a tree cannot be shown. @throws ArchiveError of kind `Unrepresentable`
[[noreturn]] void ThrowUnrepresentableTree(Id const& id);

} // namespace KivArchive
