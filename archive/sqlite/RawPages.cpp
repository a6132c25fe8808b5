#include "sqlite/RawPages.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KivArchive {

namespace {

/// The size of pages in every archive.
constexpr std::size_t pageSize = 4096;
constexpr std::size_t fileHeader = 100;
constexpr std::size_t logHeader = 32;
constexpr std::size_t frameHeader = 24;
constexpr std::uint64_t largestPayload = std::uint64_t{1} << 30U;

constexpr unsigned tableLeaf = 13;
constexpr unsigned indexLeaf = 10;
constexpr unsigned indexInterior = 2;

std::uint64_t BigEndian(ByteView bytes) noexcept {
    std::uint64_t number = 0;
    for (std::byte const byte : bytes)
        number = number << 8U | static_cast<std::uint64_t>(byte);
    return number;
}

/// A number of one to nine bytes, as SQLite writes it. @throws Malformed
std::uint64_t TakeVarint(ByteReader& reader) {
    std::uint64_t number = 0;
    for (int i = 0; i < 8; ++i) {
        unsigned const byte = reader.TakeByte();
        number = number << 7U | (byte & 0x7FU);
        if (byte < 0x80)
            return number;
    }
    return number << 8U | reader.TakeByte();
}

bool ReadAt(int file, std::uint64_t offset, std::byte* to, std::size_t size) {
    ssize_t const read = pread(file, to, size, static_cast<off_t>(offset));
    return read == static_cast<ssize_t>(size);
}

std::uint64_t SizeOf(int file) {
    struct stat status {};
    return fstat(file, &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
}

/// The bytes of a payload of @p size that begins with @p local and goes on at page @p next. @throws Malformed
Bytes PayloadOf(RawPages const& pages, RawPages::State state, ByteView local, std::uint64_t size, std::uint64_t next,
                std::uint64_t& budget) {
    Bytes payload(local.begin(), local.end());
    while (payload.size() < size) {
        if (budget == 0)
            throw Malformed();
        --budget;
        Bytes const page = pages.Read(next, state);
        if (page.size() != pageSize)
            throw Malformed();
        constexpr std::size_t link = 4;
        next = BigEndian(ByteView(page).first(link));
        std::size_t const part =
            std::min<std::size_t>(pageSize - link, static_cast<std::size_t>(size) - payload.size());
        Append(payload, ByteView(page).subspan(link, part));
    }
    return payload;
}

std::size_t SizeOfSerial(std::uint64_t serial) {
    static constexpr std::array<std::size_t, 10> numbers{0, 1, 2, 3, 4, 6, 8, 8, 0, 0};
    if (serial < numbers.size())
        return numbers[static_cast<std::size_t>(serial)];
    if (serial < 12)
        throw Malformed();
    return static_cast<std::size_t>((serial - 12) / 2);
}

RawValue ValueOf(std::uint64_t serial, ByteView bytes) {
    constexpr std::uint64_t one = 9;
    if (serial >= 12)
        return {false, 0, bytes};
    // Numbers of less than eight bytes are never negative in an archive.
    return {true, serial == one ? 1 : static_cast<std::int64_t>(BigEndian(bytes)), {}};
}

std::vector<RawValue> ValuesOf(ByteView payload) {
    ByteReader header(payload);
    std::uint64_t const headerSize = TakeVarint(header);
    if (headerSize > payload.size())
        throw Malformed();
    std::size_t const taken = payload.size() - header.Rest().size();
    if (headerSize < taken)
        throw Malformed();
    ByteReader serials(payload.subspan(taken, static_cast<std::size_t>(headerSize) - taken));
    ByteReader body(payload.subspan(static_cast<std::size_t>(headerSize)));
    std::vector<RawValue> values;
    while (!serials.Rest().empty()) {
        std::uint64_t const serial = TakeVarint(serials);
        values.push_back(ValueOf(serial, body.Take(SizeOfSerial(serial))));
    }
    return values;
}

/// A page of rows, read as far as it makes sense as one.
class RowPage {
public:
    RowPage(RawPages const& pages, std::uint64_t number, RawPages::State state)
        : pages_(pages), state_(state), page_(pages.Read(number, state)) {
        std::size_t const begin = number == 1 ? fileHeader : 0;
        if (page_.size() != pageSize)
            return;
        type_ = static_cast<unsigned>(page_[begin]);
        if (type_ != tableLeaf && type_ != indexLeaf && type_ != indexInterior)
            return;
        pointers_ = begin + (type_ == indexInterior ? 12 : 8);
        count_ = std::min<std::size_t>(static_cast<std::size_t>(BigEndian(ByteView(page_).subspan(begin + 3, 2))),
                                       (pageSize - pointers_) / 2);
    }

    [[nodiscard]] std::size_t Count() const noexcept { return count_; }
    [[nodiscard]] bool IsOfIndex() const noexcept { return type_ == indexLeaf || type_ == indexInterior; }

    /// The pages below this one, in an index.
    [[nodiscard]] std::vector<std::uint64_t> Children() const {
        std::vector<std::uint64_t> children;
        if (type_ != indexInterior)
            return children;
        children.push_back(BigEndian(ByteView(page_).subspan(pointers_ - 4, 4)));
        for (std::size_t cell = 0; cell < count_; ++cell)
            if (std::size_t const offset = OffsetOf(cell); offset + 4 <= pageSize)
                children.push_back(BigEndian(ByteView(page_).subspan(offset, 4)));
        return children;
    }

    [[nodiscard]] std::optional<RawRow> At(std::size_t cell, std::uint64_t& budget) const {
        try {
            if (cell >= count_)
                return std::nullopt;
            std::size_t const offset = OffsetOf(cell);
            if (offset >= pageSize)
                return std::nullopt;
            return Parse(ByteReader(ByteView(page_).subspan(offset)), budget);
        } catch (Malformed const&) {
            return std::nullopt;
        }
    }

private:
    [[nodiscard]] std::size_t OffsetOf(std::size_t cell) const noexcept {
        return static_cast<std::size_t>(BigEndian(ByteView(page_).subspan(pointers_ + 2 * cell, 2)));
    }

    [[nodiscard]] RawRow Parse(ByteReader reader, std::uint64_t& budget) const {
        RawRow row;
        row.isOfTable = type_ == tableLeaf;
        if (type_ == indexInterior)
            static_cast<void>(reader.Take(4));
        std::uint64_t const size = TakeVarint(reader);
        if (size > largestPayload || size > pages_.Count() * pageSize)
            throw Malformed();
        if (row.isOfTable)
            row.number = static_cast<std::int64_t>(TakeVarint(reader));
        constexpr std::uint64_t most = pageSize - 35;
        constexpr std::uint64_t maximumOfIndex = (pageSize - 12) * 64 / 255 - 23;
        constexpr std::uint64_t least = (pageSize - 12) * 32 / 255 - 23;
        std::uint64_t const whole = row.isOfTable ? most : maximumOfIndex;
        std::uint64_t local = size;
        if (size > whole) {
            local = least + (size - least) % (pageSize - 4);
            local = local > whole ? least : local;
        }
        ByteView const begin = reader.Take(local);
        std::uint64_t const next = local < size ? BigEndian(reader.Take(4)) : 0;
        row.payload = std::make_shared<const Bytes>(PayloadOf(pages_, state_, begin, size, next, budget));
        row.values = ValuesOf(*row.payload);
        return row;
    }

    RawPages const& pages_;
    RawPages::State state_;
    Bytes page_;
    unsigned type_ = 0;
    std::size_t pointers_ = 0;
    std::size_t count_ = 0;
};

} // namespace

RawPages::RawPages(std::string const& path)
    : path_(path), file_(open(path.c_str(), O_RDONLY | O_CLOEXEC)) { // NOLINT(*-vararg)
    if (file_ < 0)
        throw ArchiveError(Failure::Unavailable, path, "The file " + path + " cannot be read.");
    count_ = SizeOf(file_) / pageSize;
    ReadLog(path + "-wal");
}

RawPages::~RawPages() {
    close(file_);
    if (log_ >= 0)
        close(log_);
}

void RawPages::ReadLog(std::string const& path) {
    log_ = open(path.c_str(), O_RDONLY | O_CLOEXEC); // NOLINT(*-vararg)
    std::array<std::byte, logHeader> header{};
    if (log_ < 0 || !ReadAt(log_, 0, header.data(), header.size()))
        return;
    std::uint64_t const size = SizeOf(log_);
    // Frames count up to the end of the last transaction. Those left from before the log began anew have other salts.
    std::unordered_map<std::uint64_t, std::uint64_t> open;
    for (std::uint64_t at = logHeader; at + frameHeader + pageSize <= size; at += frameHeader + pageSize) {
        std::array<std::byte, frameHeader> frame{};
        if (!ReadAt(log_, at, frame.data(), frame.size()) || std::memcmp(frame.data() + 8, header.data() + 16, 8) != 0)
            break;
        open[BigEndian(ByteView(frame).first(4))] = at + frameHeader;
        if (BigEndian(ByteView(frame).subspan(4, 4)) == 0)
            continue;
        for (auto const& [number, offset] : open) {
            logged_[number] = offset;
            count_ = std::max(count_, number);
        }
        open.clear();
    }
}

Bytes RawPages::Read(std::uint64_t number, State state) const {
    if (number == 0 || number > count_)
        return {};
    Bytes page(pageSize);
    auto const logged = state == State::Newest ? logged_.find(number) : logged_.end();
    bool const isRead = logged == logged_.end() ? ReadAt(file_, (number - 1) * pageSize, page.data(), page.size())
                                                : ReadAt(log_, logged->second, page.data(), page.size());
    return isRead ? page : Bytes();
}

void ForEachRow(RawPages const& pages, std::uint64_t page, RawPages::State state, std::uint64_t& budget,
                std::function<void(RawPlace const&, RawRow const&)> const& receive) {
    RowPage const rows(pages, page, state);
    for (std::size_t cell = 0; cell < rows.Count(); ++cell)
        if (auto const row = rows.At(cell, budget))
            receive({page, state, cell}, *row);
}

std::optional<RawRow> RowAt(RawPages const& pages, RawPlace const& place) {
    std::uint64_t budget = pages.Count();
    return RowPage(pages, place.page, place.state).At(place.cell, budget);
}

std::optional<std::vector<RawRow>> RowsOfTable(RawPages const& pages, std::string_view name) {
    std::uint64_t budget = 2 * pages.Count();
    std::vector<std::uint64_t> open;
    ForEachRow(pages, 1, RawPages::State::Newest, budget, [&](RawPlace const&, RawRow const& row) {
        constexpr std::size_t columnsOfSchema = 5;
        auto const& values = row.values;
        if (values.size() == columnsOfSchema && values[3].isNumber &&
            std::string_view(reinterpret_cast<const char*>(values[1].bytes.data()), values[1].bytes.size()) == name)
            open.push_back(static_cast<std::uint64_t>(values[3].number));
    });
    if (open.size() != 1)
        return std::nullopt;
    std::vector<RawRow> rows;
    for (std::uint64_t entered = 0; !open.empty(); ++entered) {
        RowPage const page(pages, open.back(), RawPages::State::Newest);
        open.pop_back();
        if (!page.IsOfIndex() || entered == pages.Count())
            return std::nullopt;
        for (std::size_t cell = 0; cell < page.Count(); ++cell) {
            auto row = page.At(cell, budget);
            if (!row)
                return std::nullopt;
            rows.push_back(*std::move(row));
        }
        auto const children = page.Children();
        open.insert(open.end(), children.begin(), children.end());
    }
    return rows;
}

} // namespace KivArchive
