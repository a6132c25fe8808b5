#include "StatIndex.h"

#include "Text.h"

#include <algorithm>
#include <array>
#include <concepts>
#include <cstring>

namespace vault {

namespace {

constexpr std::string_view beginning = "vault index 2\n";
constexpr std::size_t digestSize = std::tuple_size_v<Id::Digest>;
/// Of what every directory begins with: its size, tree and mode, and the size of its path.
constexpr std::size_t headSize = 4 + digestSize + 4 + 4;
/// Of what every file begins with: size, times, inode, mode, identifier, and the size of its name.
constexpr std::size_t fileSize = 8 + 8 + 8 + 8 + 4 + digestSize + 4;
/// Records hold at most 16 MiB.
constexpr std::size_t pieceSize = std::size_t{8} * 1024 * 1024;

template <std::integral Number>
void Append(std::string& bytes, Number number) {
    std::array<char, sizeof(Number)> raw{};
    std::memcpy(raw.data(), &number, sizeof(Number));
    bytes.append(raw.data(), raw.size());
}

std::string_view BytesOf(Id::Digest const& digest) noexcept {
    return {reinterpret_cast<char const*>(digest.data()), digest.size()};
}

void Append(std::string& bytes, Id const& id) {
    const Id::Digest none{};
    bytes += BytesOf(id.GetDigest() ? *id.GetDigest() : none);
}

/// Takes a number off the front of bytes that are long enough.
template <std::integral Number>
Number Take(std::string_view& bytes) noexcept {
    Number number{};
    std::memcpy(&number, bytes.data(), sizeof(Number));
    bytes.remove_prefix(sizeof(Number));
    return number;
}

std::string_view TakeText(std::string_view& bytes, std::size_t size) noexcept {
    const auto text = bytes.substr(0, size);
    bytes.remove_prefix(text.size());
    return text;
}

Id IdOf(std::string_view bytes) {
    Id::Digest digest{};
    std::copy(bytes.begin(), bytes.end(), digest.begin());
    return digest == Id::Digest{} ? Id() : Id::FromDigest(digest);
}

Text RecordName(std::string const& top, std::size_t piece) {
    const auto digest = KivVcs::Helpers::ComputeEncodedSHA256Hash(top.data(), top.size());
    return Text(u"vault/index/") + digest + FromUtf8("/" + std::to_string(piece)).value();
}

std::int64_t Nanoseconds(timespec const& time) noexcept {
    return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

} // namespace

FileState StateOf(struct stat const& status) noexcept {
    return {static_cast<std::uint64_t>(status.st_size), Nanoseconds(status.st_mtim), Nanoseconds(status.st_ctim),
            status.st_ino, status.st_mode};
}

Id StatIndex::File::GetId() const {
    return IdOf(digest);
}

StatIndex::Listing::Listing(std::string_view block) : block_(block), rest_(block) {
    Take<std::uint32_t>(rest_);
    digest_ = TakeText(rest_, digestSize);
    mode_ = Take<std::uint32_t>(rest_);
    const auto pathSize = Take<std::uint32_t>(rest_);
    path_ = TakeText(rest_, pathSize);
}

Id StatIndex::Listing::Tree() const {
    return IdOf(digest_);
}

std::optional<StatIndex::File> StatIndex::Listing::Next() {
    if (rest_.size() < fileSize)
        return std::nullopt;
    File file;
    file.state.size = Take<std::uint64_t>(rest_);
    file.state.modified = Take<std::int64_t>(rest_);
    file.state.changed = Take<std::int64_t>(rest_);
    file.state.inode = Take<std::uint64_t>(rest_);
    file.state.mode = Take<std::uint32_t>(rest_);
    file.digest = TakeText(rest_, digestSize);
    const auto nameSize = Take<std::uint32_t>(rest_);
    file.name = TakeText(rest_, nameSize);
    return file;
}

StatIndex::StatIndex(std::string_view bytes) {
    if (!bytes.starts_with(beginning))
        return;
    bytes.remove_prefix(beginning.size());
    while (bytes.size() >= headSize) {
        auto head = bytes;
        const auto size = Take<std::uint32_t>(head);
        if (size < headSize || size > bytes.size())
            return;
        const Listing listing(TakeText(bytes, size));
        directories_.emplace(listing.Path(), listing);
    }
}

std::optional<StatIndex::Listing> StatIndex::Find(std::string_view path) const {
    const auto found = directories_.find(path);
    return found == directories_.end() ? std::nullopt : std::optional(found->second);
}

std::optional<bool> StatIndex::Has(Id const& top, std::string_view path) const {
    auto tree = top;
    for (std::size_t begin = 0; begin < path.size();) {
        auto listing = Find(path.substr(0, begin));
        if (!listing || tree.IsEmpty() || listing->Tree() != tree)
            return std::nullopt;
        const auto end = std::min(path.find('/', begin), path.size());
        auto file = listing->Next();
        while (file && file->name != path.substr(begin, end - begin))
            file = listing->Next();
        if (!file)
            return false;
        tree = file->state == FileState() ? file->GetId() : Id();
        begin = end + 1;
    }
    return true;
}

StatIndexWriter::StatIndexWriter() : bytes_(beginning) {}

void StatIndexWriter::Begin(std::string_view path, std::uint32_t mode) {
    begin_ = bytes_.size();
    bytes_.append(4 + digestSize, '\0');
    Append(bytes_, mode);
    Append(bytes_, static_cast<std::uint32_t>(path.size()));
    bytes_ += path;
}

void StatIndexWriter::AddFile(std::string_view name, FileState const& state, Id const& id) {
    Append(bytes_, state.size);
    Append(bytes_, state.modified);
    Append(bytes_, state.changed);
    Append(bytes_, state.inode);
    Append(bytes_, state.mode);
    Append(bytes_, id);
    Append(bytes_, static_cast<std::uint32_t>(name.size()));
    bytes_ += name;
}

void StatIndexWriter::End(Id const& tree) {
    std::string head;
    Append(head, static_cast<std::uint32_t>(bytes_.size() - begin_));
    Append(head, tree);
    bytes_.replace(begin_, head.size(), head);
}

void StatIndexWriter::Copy(StatIndex::Listing const& listing) {
    bytes_ += listing.Block();
}

std::string ReadIndex(IArchive& archive, std::string const& top) {
    std::string bytes;
    for (std::size_t piece = 0;; ++piece) {
        const auto name = RecordName(top, piece);
        const auto records = archive.ReadRecords(std::span(&name, 1));
        if (records.empty() || !records.front().value)
            return bytes;
        auto value = BytesOf(*records.front().value);
        bytes = bytes.empty() ? std::move(value) : bytes + value;
        if (records.front().value->GetSize() < pieceSize)
            return bytes;
    }
}

void WriteIndex(KivArchive::Change& change, std::string const& top, std::string const& before,
                std::string const& after) {
    const auto pieceOf = [](std::string const& bytes, std::size_t piece) {
        return std::string_view(bytes).substr(std::min(piece * pieceSize, bytes.size()), pieceSize);
    };
    for (std::size_t piece = 0; piece * pieceSize < std::max(before.size(), after.size()); ++piece) {
        const auto bytes = pieceOf(after, piece);
        if (bytes == pieceOf(before, piece))
            continue;
        KivArchive::RecordChange record{{RecordName(top, piece), {}}, false, {}};
        if (!bytes.empty())
            record.record.value = BufferOf(bytes);
        change.records.push_back(std::move(record));
    }
}

} // namespace vault
