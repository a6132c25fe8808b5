#pragma once

/// @file
/// Short forms of identifiers, for people.

#include "KivVcs/Storage.h"

#include <string>
#include <string_view>
#include <vector>

namespace KivVcs {

/// The identifiers of everything that a storage holds, told apart by how they begin.
///
/// Made from the storage's tables as they are then. Identifiers of objects that are stored later may begin the same.
///
/// Threads: a value; any number of threads may ask one at the same time.
class KIVVCS_EXPORT ShortIds {
public:
    /// @complexity O(n log n) for n objects, without looking at any of them
    /// @throws std::bad_alloc, and what the storage throws
    explicit ShortIds(IObjectsStorage const& storage);

    /// The shortest beginning of @p id, at least @p digits long, that no other identifier of the storage has; all of it
    /// if another one begins with all of it. @p id itself need not be stored. O(log n).
    [[nodiscard]] std::string ShortFormOf(Id const& id, int digits = 7) const;

    /// Every identifier that begins with @p digits, hexadecimal digits of either case, in their order: one if the short
    /// form is unique, none if it is unknown or empty. O(log n) and the identifiers found.
    [[nodiscard]] std::vector<Id> Find(std::string_view digits) const;

private:
    std::vector<Id> ids_;
};

} // namespace KivVcs
