#include "StatIndex.h"

#include "Text.h"

#include <concepts>
#include <cstring>

namespace vault {

namespace {

constexpr std::string_view beginning = "vault index 1\n";
/// Records hold at most 16 MiB.
constexpr std::size_t pieceSize = std::size_t{8} * 1024 * 1024;

template <std::integral Number>
void Append(std::string& bytes, Number number) {
    std::array<char, sizeof(Number)> raw{};
    std::memcpy(raw.data(), &number, sizeof(Number));
    bytes.append(raw.data(), raw.size());
}

void AppendText(std::string& bytes, std::string_view text) {
    Append(bytes, static_cast<std::uint32_t>(text.size()));
    bytes += text;
}

void Append(std::string& bytes, Id const& id) {
    const Id::Digest none{};
    auto const& digest = id.GetDigest() ? *id.GetDigest() : none;
    bytes.append(reinterpret_cast<char const*>(digest.data()), digest.size());
}

/// Takes values off the front of bytes; whatever does not fit ends it for good.
class Reader {
public:
    explicit Reader(std::string_view bytes) noexcept : rest_(bytes) {}

    [[nodiscard]] bool IsAtEnd() const noexcept { return rest_.empty(); }

    template <class Number>
    Number Take() noexcept {
        Number number{};
        const auto bytes = Take(sizeof(Number));
        if (bytes.size() == sizeof(Number))
            std::memcpy(&number, bytes.data(), sizeof(Number));
        return number;
    }
    std::string_view TakeText() noexcept { return Take(Take<std::uint32_t>()); }
    Id TakeId() noexcept {
        const auto digest = Take<Id::Digest>();
        return digest == Id::Digest{} ? Id() : Id::FromDigest(digest);
    }

private:
    std::string_view Take(std::size_t size) noexcept {
        if (size > rest_.size()) {
            rest_ = {};
            return {};
        }
        const auto taken = rest_.substr(0, size);
        rest_.remove_prefix(size);
        return taken;
    }

    std::string_view rest_;
};

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

StatIndex StatIndex::Read(std::string_view bytes) {
    StatIndex index;
    if (!bytes.starts_with(beginning))
        return index;
    Reader reader(bytes.substr(beginning.size()));
    while (!reader.IsAtEnd()) {
        std::string path(reader.TakeText());
        IndexedDirectory directory{reader.TakeId(), {}};
        for (auto count = reader.Take<std::uint32_t>(); count > 0 && !reader.IsAtEnd(); --count) {
            auto& file = directory.files.emplace_back();
            file.name = reader.TakeText();
            file.state = {reader.Take<std::uint64_t>(), reader.Take<std::int64_t>(), reader.Take<std::int64_t>(),
                          reader.Take<std::uint64_t>(), reader.Take<std::uint32_t>()};
            file.id = reader.TakeId();
        }
        index.positions_.emplace(path, index.directories_.size());
        index.Add(std::move(path), std::move(directory));
    }
    return index;
}

std::string StatIndex::Write() const {
    std::string bytes(beginning);
    for (auto const& [path, directory] : directories_) {
        AppendText(bytes, path);
        Append(bytes, directory.tree);
        Append(bytes, static_cast<std::uint32_t>(directory.files.size()));
        for (auto const& [name, state, id] : directory.files) {
            AppendText(bytes, name);
            Append(bytes, state.size);
            Append(bytes, state.modified);
            Append(bytes, state.changed);
            Append(bytes, state.inode);
            Append(bytes, state.mode);
            Append(bytes, id);
        }
    }
    return bytes;
}

StatIndex::IndexedDirectory const* StatIndex::Find(std::string const& path) const {
    const auto found = positions_.find(path);
    return found == positions_.end() ? nullptr : &directories_[found->second].second;
}

std::string ReadIndex(IArchive& archive, std::string const& top) {
    std::string bytes;
    for (std::size_t piece = 0;; ++piece) {
        const auto name = RecordName(top, piece);
        const auto records = archive.ReadRecords(std::span(&name, 1));
        if (records.empty() || !records.front().value)
            return bytes;
        bytes += BytesOf(*records.front().value);
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
