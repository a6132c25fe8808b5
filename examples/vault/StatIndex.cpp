#include "StatIndex.h"

#include "Cache.h"
#include "Descriptor.h"

#include <algorithm>
#include <array>
#include <concepts>
#include <cstdio>
#include <cstring>
#include <fcntl.h>

namespace vault {

namespace {

constexpr std::string_view beginning = "vault index 2\n";
constexpr std::size_t digestSize = std::tuple_size_v<Id::Digest>;
/// Of what every directory begins with: its size, tree and mode, and the size of its path.
constexpr std::size_t headSize = 4 + digestSize + 4 + 4;
/// Of what every file begins with: size, times, inode, mode, identifier, and the size of its name.
constexpr std::size_t fileSize = 8 + 8 + 8 + 8 + 4 + digestSize + 4;

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

/// Tells a file that a power failure has left cut off, or with gaps, from a whole one.
std::uint64_t Checksum(std::string_view bytes) noexcept {
    std::uint64_t sum = bytes.size();
    for (; bytes.size() >= sizeof(sum); bytes.remove_prefix(sizeof(sum))) {
        std::uint64_t word = 0;
        std::memcpy(&word, bytes.data(), sizeof(word));
        sum = (sum ^ word) * 0x9E3779B97F4A7C15U;
        sum ^= sum >> 32U;
    }
    for (const char byte : bytes)
        sum = (sum ^ static_cast<unsigned char>(byte)) * 0x9E3779B97F4A7C15U;
    return sum;
}

std::optional<std::string> IndexFile(std::string const& top) {
    auto directory = CacheDirectory();
    return directory ? std::optional(*directory + CacheName(top) + ".index") : std::nullopt;
}

bool WriteFile(std::string const& path, std::string_view bytes) {
    Descriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    return file.IsOpen() && WriteAll(file.Get(), std::as_bytes(std::span(bytes))) && file.Close();
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

std::string ReadIndex(std::string const& top) {
    const auto path = IndexFile(top);
    const Descriptor file(path ? open(path->c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC) : -1);
    struct stat status {};
    // What somebody else has put there is not to be trusted.
    if (!file.IsOpen() || fstat(file.Get(), &status) != 0 || status.st_uid != geteuid())
        return {};
    std::string bytes(static_cast<std::size_t>(status.st_size), '\0');
    const auto size = ReadUpTo(file.Get(), std::as_writable_bytes(std::span(bytes)));
    if (size != bytes.size() || bytes.size() < beginning.size() + sizeof(std::uint64_t))
        return {};
    auto sum = std::string_view(bytes).substr(bytes.size() - sizeof(std::uint64_t));
    const auto expected = Take<std::uint64_t>(sum);
    bytes.resize(bytes.size() - sizeof(expected));
    return Checksum(bytes) == expected ? bytes : std::string();
}

void WriteIndex(std::string const& top, std::string const& index) {
    const auto path = IndexFile(top);
    if (!path)
        return;
    const auto temporary = *path + '-' + std::to_string(getpid());
    auto bytes = index;
    Append(bytes, Checksum(index));
    if (!WriteFile(temporary, bytes) || rename(temporary.c_str(), path->c_str()) != 0)
        unlink(temporary.c_str());
}

} // namespace vault
