#pragma once

/// @file
/// The rows of an archive's file, found page by page, for files of which the pages that lead to others are damaged.

#include "Bytes.h"
#include "KivArchive/IArchive.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

namespace KivArchive {

/// The pages of a file and its write-ahead log, numbered from 1. Nothing in them is trusted: all reading stays in
/// bounds.
class RawPages {
public:
    /// The state of the file: with its log, or without.
    enum class State : std::uint8_t { Newest, Checkpointed };

    /// @throws ArchiveError of kind `Unavailable`, as everything here, if the file cannot be read
    explicit RawPages(std::string const& path);
    RawPages(RawPages const&) = delete;
    RawPages& operator=(RawPages const&) = delete;
    ~RawPages();

    [[nodiscard]] std::uint64_t Count() const noexcept { return count_; }
    /// Whether the log has a newer form of a page.
    [[nodiscard]] bool IsLogged(std::uint64_t number) const { return logged_.count(number) != 0; }
    /// Empty if there is no such page.
    [[nodiscard]] Bytes Read(std::uint64_t number, State state) const;

private:
    void ReadLog(std::string const& path);

    std::string path_;
    int file_ = -1;
    int log_ = -1;
    std::uint64_t count_ = 0;
    /// The offset in the log of the newest form of each page in it.
    std::unordered_map<std::uint64_t, std::uint64_t> logged_;
};

/// A value of a row: a number, or bytes.
struct RawValue {
    bool isNumber = false;
    std::int64_t number = 0;
    ByteView bytes;
};

/// Where a row is.
struct RawPlace {
    std::uint64_t page = 0;
    RawPages::State state = RawPages::State::Newest;
    std::size_t cell = 0;
};

/// A row of a table, or of an index, which has no number.
struct RawRow {
    bool isOfTable = false;
    std::int64_t number = 0;
    /// The bytes that the values are parts of.
    std::shared_ptr<const Bytes> payload;
    std::vector<RawValue> values;
};

/// Passes every row that can be found in a page to @p receive, with its place.
/// @param budget how many further pages may be read for rows that take several, since hostile rows could all name the
/// same
void ForEachRow(RawPages const& pages, std::uint64_t page, RawPages::State state, std::uint64_t& budget,
                std::function<void(RawPlace const&, RawRow const&)> const& receive);

/// The row at a place; nothing if there is none.
[[nodiscard]] std::optional<RawRow> RowAt(RawPages const& pages, RawPlace const& place);

/// The rows of the table @p name, which has no row numbers, in the newest state; nothing if one of its pages is
/// damaged, or what leads to them.
[[nodiscard]] std::optional<std::vector<RawRow>> RowsOfTable(RawPages const& pages, std::string_view name);

} // namespace KivArchive
