#include "Publishing.h"

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <thread>
#include <vector>

namespace ArchiveBench {

namespace {

constexpr std::uint64_t window = 16 * largestWholeContent;

std::string ReadFile(std::string const& path, std::uint64_t size) {
    std::ifstream file(path, std::ios::binary);
    std::string bytes(size, '\0');
    file.read(bytes.data(), static_cast<std::streamsize>(size));
    bytes.resize(static_cast<std::size_t>(file.gcount()));
    return bytes;
}

} // namespace

Buffer BufferOf(std::string_view bytes) {
    Buffer buffer;
    buffer.Append(bytes.data(), bytes.size());
    return buffer;
}

std::string DigitsOf(Id const& id) {
    static constexpr std::string_view digits = "0123456789abcdef";
    std::string text(2 * std::tuple_size_v<Id::Digest>, ' ');
    char* to = text.data();
    for (std::uint8_t const byte : *id.GetDigest()) {
        *to++ = digits[byte >> 4U];
        *to++ = digits[byte & 15U];
    }
    return text;
}

std::pair<std::string, std::string> SplitPath(std::string const& path) {
    std::size_t const slash = path.rfind('/');
    if (slash == std::string::npos)
        return {"", path};
    return {path.substr(0, slash), path.substr(slash + 1)};
}

Publisher::Directory& Publisher::At(std::string const& path) {
    auto const [entry, isNew] = directories_.try_emplace(path);
    if (isNew && !path.empty()) {
        auto const [parent, name] = SplitPath(path);
        At(parent).entries[name].isTree = true;
    }
    for (std::string changed = path; !changed.empty(); changed = SplitPath(changed).first)
        directories_[changed].isChanged = true;
    directories_[""].isChanged = true;
    return entry->second;
}

void Publisher::Set(std::string const& path, std::string bytes) {
    auto const [directory, name] = SplitPath(path);
    Entry& entry = At(directory).entries[name];
    Buffer const data = BufferOf(bytes);
    Id id = Identify(ObjectType::Blob, data);
    if (bytes.size() > largestWholeContent) {
        Buffer content = data;
        StreamIO stream(KivVcs::MemStream::CreateOnRef(content));
        archive_.StoreContent(id, stream, entry.id, nullptr);
    } else {
        change_.objects.push_back({id, ObjectType::Blob, data, entry.id});
        windowSize_ += bytes.size();
        if (windowSize_ > window)
            StoreWindow();
    }
    entry = {false, std::move(id)};
}

void Publisher::SetDirectory(std::string const& directory) {
    namespace fs = std::filesystem;
    struct File {
        std::string path;
        std::uint64_t size = 0;
        std::string bytes;
        Id id;
    };
    std::vector<File> files;
    for (auto const& entry : fs::recursive_directory_iterator(directory))
        if (entry.is_regular_file() && !entry.is_symlink())
            files.push_back({entry.path().string(), entry.file_size(), {}, {}});
    std::sort(files.begin(), files.end(), [](File const& left, File const& right) { return left.path < right.path; });
    for (std::size_t begin = 0, end = 0; begin < files.size(); begin = end) {
        for (std::uint64_t size = 0; end < files.size() && size < window; ++end)
            size += files[end].size;
        std::atomic<std::size_t> next{begin};
        auto const read = [&] {
            for (std::size_t i = next++; i < end; i = next++) {
                files[i].bytes = ReadFile(files[i].path, files[i].size);
                files[i].id = Identify(ObjectType::Blob, std::as_bytes(std::span(files[i].bytes)));
            }
        };
        std::vector<std::thread> threads;
        for (unsigned i = 1; i < workers_; ++i)
            threads.emplace_back(read);
        read();
        for (std::thread& thread : threads)
            thread.join();
        for (std::size_t i = begin; i < end; ++i) {
            auto const [parent, name] = SplitPath(files[i].path.substr(directory.size() + 1));
            At(parent).entries[name] = {false, files[i].id};
            if (files[i].bytes.size() > largestWholeContent)
                Set(files[i].path.substr(directory.size() + 1), files[i].bytes);
            else
                change_.objects.push_back({files[i].id, ObjectType::Blob, BufferOf(files[i].bytes), {}});
            files[i].bytes = {};
        }
        StoreWindow();
    }
}

void Publisher::StoreWindow() {
    archive_.Apply(change_);
    change_ = {};
    windowSize_ = 0;
}

Id Publisher::StoreTree(std::string const& path, Directory& directory) {
    if (!directory.isChanged)
        return directory.stored;
    std::string data;
    for (auto& [name, entry] : directory.entries) {
        if (entry.isTree) {
            std::string const below = path.empty() ? name : path + "/" + name;
            entry.id = StoreTree(below, directories_[below]);
        }
        data += (entry.isTree ? "40000 tree " : "100644 blob ") + name + '\0' + DigitsOf(entry.id);
    }
    Buffer const buffer = BufferOf(data);
    Id id = Identify(ObjectType::Tree, buffer);
    change_.objects.push_back({id, ObjectType::Tree, buffer, directory.stored});
    directory.stored = id;
    directory.isChanged = false;
    return id;
}

void Publisher::Commit(std::string const& description) {
    Id const root = StoreTree("", directories_[""]);
    std::string const author = "Ada <ada@example.org> 1700000000 +0100\n";
    std::string const parent = head_.IsEmpty() ? "" : "parent " + DigitsOf(head_) + "\n";
    Buffer const data = BufferOf("tree " + DigitsOf(root) + "\n" + parent + "author " + author + "committer " + author +
                                 "\n" + description + "\n");
    Id id = Identify(ObjectType::Commit, data);
    change_.objects.push_back({id, ObjectType::Commit, data, {}});
    change_.ancestry.push_back({id, head_, root, {}});
    change_.branches.push_back({u"master", head_, id});
    StoreWindow();
    head_ = std::move(id);
}

} // namespace ArchiveBench
