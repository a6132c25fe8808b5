#pragma once

/// @file
/// Rows that a host is likely to store differences to.

#include "postgres/Forms.h"

#include <mutex>

namespace KivArchive::Postgres {

/// Rows that were read or stored a short time ago, so that a series of small edits need not fetch what it has just stored.
/// Any number of threads may use it.
class RecentRows {
public:
    void Keep(Id const& id, WholeRow row);
    /// Gives @p forms the rows of @p ids, and of each those on the way to what its next version is a difference to.
    /// @return false, giving some of them, if one is not here
    [[nodiscard]] bool GiveAll(std::span<const Id> ids, Forms& forms);

    /// Forgets a row: one that neither a newer version nor those after it will be differences to.
    void Drop(Id const& id);

private:
    [[nodiscard]] WholeRow const* Find(Id const& id);

    std::mutex mutex_;
    /// What was used since the others were `current_`; they go when it is full.
    std::unordered_map<Id, WholeRow> current_;
    std::unordered_map<Id, WholeRow> before_;
    std::uint64_t size_ = 0;
};

} // namespace KivArchive::Postgres
