#pragma once

/// @file
/// Everything that is made of what is to be stored before the transaction that stores it.

#include "Changes.h"
#include "postgres/RecentRows.h"
#include "postgres/Store.h"

#include <algorithm>
#include <unordered_map>
#include <unordered_set>

namespace KivArchive::Postgres {

/// An item on its way into a row.
struct Prepared : ItemForm {
    /// What it is a difference to, while and if it is one.
    Id base;
    Form baseForm;
    Bytes difference;
    std::uint64_t generation = 0;
    /// What the row holds.
    Bytes stored;
};

/// The order of the lists of identifiers that a change is compared with.
inline bool IsBefore(Id const& left, Id const& right) {
    return DigestOf(left) < DigestOf(right);
}

/// Whether a list in that order has an identifier.
inline bool Contains(std::vector<Id> const& sorted, Id const& id) {
    return std::binary_search(sorted.begin(), sorted.end(), id, IsBefore);
}

/// Puts a list into that order, each identifier once.
inline void SortUnique(std::vector<Id>& ids) {
    std::sort(ids.begin(), ids.end(), IsBefore);
    ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
}

class Preparation {
public:
    /// @param recent where earlier versions are looked for, and kept
    /// @param looksForPresent whether to ask the server which items it has; it is asked as well if there are earlier
    /// versions that are not recent
    Preparation(std::vector<Item> const& items, Connection& connection, RecentRows& recent, unsigned workers,
                bool looksForPresent);
    Preparation(Preparation const&) = delete;
    Preparation& operator=(Preparation const&) = delete;
    ~Preparation() = default;

    /// What is to be stored, in ascending order of the identifiers.
    [[nodiscard]] std::vector<Prepared> const& Items() const noexcept { return prepared_; }
    /// One of `Items`; null if it is none.
    [[nodiscard]] Prepared const* Find(Id const& id) const;
    /// Whether the server has none of `Items`: it was asked, or they are taken for new unasked.
    [[nodiscard]] bool AreNew() const noexcept { return areNew_; }
    /// The items that the server has, and those of them that are no objects there.
    [[nodiscard]] std::vector<Id> const& Present() const noexcept { return present_; }
    [[nodiscard]] std::vector<Id> const& Removed() const noexcept { return removed_; }
    /// Those of which the server has facts only.
    [[nodiscard]] std::vector<Prepared> const& ForFacts() const noexcept { return forFacts_; }
    /// The rows that items are differences to and that are not among them, each once.
    /// @param inherited sorted; earlier versions whose bases need not be named
    [[nodiscard]] std::vector<Id> Bases(std::vector<Id> const& inherited) const;
    /// Rows that items are differences to but that are not their earlier versions, and what these rows are differences to
    /// themselves, as they were when they were read or stored.
    [[nodiscard]] std::unordered_map<Id, Id> const& FarBases() const noexcept { return farBases_; }
    /// Keeps what has been stored, if it was new.
    void KeepStored() const;

private:
    void Select(std::vector<Item> const& items);
    /// The earlier versions of the items, but for those that are items themselves.
    [[nodiscard]] std::vector<Id> EarlierRows() const;
    /// Keeps what was read, with its forms.
    void KeepRead(Compressor& compressor);
    /// Asks which items the server has, and for the earlier versions.
    void Ask(Connection& connection);
    void MakeDifferencesToRows(Connection& connection, unsigned workers);
    void MakeDifferences(std::span<const std::size_t> window, unsigned workers, Compressor& compressor);
    /// The version before, if it is among those prepared and comes before @p one.
    [[nodiscard]] Prepared const* EarlierPrepared(Prepared const& one) const;
    void FindBase(Prepared& one, Compressor& compressor);
    /// Of an item or of a row that was read. @throws Malformed
    [[nodiscard]] Version VersionOf(Id const& id);
    [[nodiscard]] static Version VersionOf(Prepared const& one);

    RecentRows& recent_;
    std::vector<Prepared> prepared_;
    SmallTable<Id, std::size_t> numbers_;
    std::vector<Id> present_;
    std::vector<Id> removed_;
    std::unordered_set<Id> factsOnly_;
    std::vector<Prepared> forFacts_;
    std::unordered_map<Id, Id> farBases_;
    /// The rows that were passed on the way to the bases of the items.
    std::vector<Id> passed_;
    bool areNew_ = false;
    /// The earlier versions looked at.
    Forms forms_;
};

} // namespace KivArchive::Postgres
