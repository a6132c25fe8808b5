#include "Trees.h"

#include "Names.h"
#include "Problem.h"
#include "Text.h"

#include <KivArchive/Upkeep.h>
#include <algorithm>
#include <charconv>
#include <map>

namespace vault {

using KivArchive::ArchivedObject;
using KivArchive::Link;
using KivArchive::ObjectType;

namespace {

/// Directories with more entries than this have their attributes in many contents.
constexpr std::size_t mostInOneContent = 8192;

void AppendNumber(std::string& text, auto number, int base) {
    std::array<char, 24> digits{};
    text.append(digits.data(), std::to_chars(digits.data(), digits.data() + digits.size(), number, base).ptr);
}

void AppendLine(std::string& text, std::string_view name, Attributes const& attributes) {
    AppendNumber(text, attributes.mode, 8);
    text += attributes.isLink ? "l " : " ";
    AppendNumber(text, attributes.time, 10);
    (text += ' ').append(name) += '\0';
}

/// Takes "MODE TIME NAME\0" off @p text. @return false if it begins otherwise
bool TakeLine(std::string_view& text, AttributeMap& lines) {
    Attributes attributes;
    const auto end = text.find('\0');
    const auto line = text.substr(0, end);
    const auto* const last = line.data() + line.size();
    const auto [modeEnd, modeError] = std::from_chars(line.data(), last, attributes.mode, 8);
    if (end == std::string_view::npos || modeError != std::errc() || attributes.mode > 07777)
        return false;
    attributes.isLink = modeEnd != last && *modeEnd == 'l';
    const auto* const time = modeEnd + (attributes.isLink ? 2 : 1);
    if (time >= last || time[-1] != ' ')
        return false;
    const auto [timeEnd, timeError] = std::from_chars(time, last, attributes.time);
    if (timeError != std::errc() || timeEnd == last || *timeEnd != ' ')
        return false;
    lines.insert_or_assign(std::string(timeEnd + 1, last), attributes);
    text.remove_prefix(end + 1);
    return true;
}

std::string OwnName(std::string_view name, bool isSpread) {
    std::string own(ownPrefix);
    if (!isSpread)
        return own;
    // FNV-1a, folded to one byte.
    std::uint32_t hash = 2166136261U;
    for (const char c : name)
        hash = (hash ^ static_cast<unsigned char>(c)) * 16777619U;
    hash ^= hash >> 16U;
    return own += {hexDigits[(hash >> 12U) & 0xFU], hexDigits[(hash >> 8U) & 0xFU]};
}

NewObject MakeObject(ObjectType type, std::string_view data) {
    auto buffer = BufferOf(data);
    auto id = KivArchive::Identify(type, buffer);
    return {std::move(id), type, std::move(buffer), {}};
}

std::string_view TextOf(ArchivedObject const& object) noexcept {
    return {reinterpret_cast<char const*>(object.data.data()), object.data.size()};
}

} // namespace

Entry const* Directory::Find(std::string_view name) const noexcept {
    const auto found =
        std::lower_bound(entries.begin(), entries.end(), name,
                         [](Entry const& entry, auto const& sought) { return ComesBefore(entry.name, sought); });
    return found != entries.end() && found->name == name ? &*found : nullptr;
}

std::array<std::string, 2> AttributePaths(std::string_view path) {
    const auto nameAt = path.find_last_of('/') + 1;
    const auto below = [&](bool isSpread) {
        return std::string(path.substr(0, nameAt)) + OwnName(path.substr(nameAt), isSpread);
    };
    return {below(false), below(true)};
}

AttributeMap ReadAttributes(std::string_view content) {
    AttributeMap lines;
    while (TakeLine(content, lines)) {
    }
    return lines;
}

PackedDirectory Pack(Directory const& directory) {
    PackedDirectory packed;
    const bool isSpread = directory.entries.size() > mostInOneContent;
    std::map<std::string, std::string> contents;
    if (directory.own)
        AppendLine(contents[OwnName("", isSpread)], "", *directory.own);
    for (auto const& entry : directory.entries) {
        if (entry.attributes)
            AppendLine(contents[OwnName(entry.name, isSpread)], entry.name, *entry.attributes);
    }
    std::vector<Entry> own;
    for (auto const& [name, lines] : contents) {
        packed.attributes.push_back(MakeObject(ObjectType::Blob, lines));
        own.push_back({name, false, packed.attributes.back().id, {}});
    }

    std::string data;
    const auto append = [&data](Entry const& entry) {
        (data += entry.isDirectory ? "40000 tree " : "100644 blob ") += entry.name;
        (data += '\0') += DigitsOf(entry.id);
    };
    auto next = own.cbegin();
    for (auto const& entry : directory.entries) {
        for (; next != own.cend() && ComesBefore(next->name, entry.name); ++next)
            append(*next);
        append(entry);
    }
    std::for_each(next, own.cend(), append);
    packed.tree = MakeObject(ObjectType::Tree, data);
    return packed;
}

std::unordered_map<Id, Directory> TreeReader::Read(std::span<const Id> trees) {
    std::unordered_map<Id, Directory> directories;
    std::vector<Id> ids;
    for (auto const& id : trees) {
        if (id.IsEmpty())
            directories[id];
        else if (directories.try_emplace(id).second)
            ids.push_back(id);
    }
    std::vector<Id> contents;
    std::unordered_map<Id, bool> isRead;
    archive_.Read(ids, [&](ArchivedObject const& object) {
        std::vector<Link> links;
        if (object.type != ObjectType::Tree || !KivArchive::ReadLinks(object.type, object.data, links))
            return;
        auto& directory = directories[object.id] = {};
        isRead[object.id] = true;
        for (auto const& link : links) {
            if (IsOwn(link.name)) {
                directory.attributeContents.push_back(link.id);
                contents.push_back(link.id);
            } else {
                directory.entries.push_back({std::string(link.name), link.type == ObjectType::Tree, link.id, {}});
            }
        }
    });
    std::unordered_map<Id, AttributeMap> attributes;
    archive_.Read(contents,
                  [&](ArchivedObject const& object) { attributes[object.id] = ReadAttributes(TextOf(object)); });
    for (auto& [id, directory] : directories) {
        for (auto const& content : directory.attributeContents) {
            for (auto const& [name, line] : attributes[content]) {
                if (name.empty())
                    directory.own = line;
                else if (auto* const entry = const_cast<Entry*>(directory.Find(name)); entry && !entry->isDirectory)
                    entry->attributes = line;
            }
        }
    }
    std::erase_if(directories, [&](auto const& item) { return !item.first.IsEmpty() && !isRead.contains(item.first); });
    return directories;
}

Directory TreeReader::Read(Id const& tree) {
    auto read = Read(std::span(&tree, 1));
    if (read.empty())
        throw Problem("a directory is damaged or missing: " + DigitsOf(tree), findingsExitStatus);
    return std::move(read.begin()->second);
}

std::optional<Buffer> TreeReader::ReadContent(Id const& id, std::uint64_t largest) {
    try {
        auto content = archive_.ReadContent(id, 0, largest + 1);
        if (content && content->GetSize() <= largest)
            return content;
    } catch (KivArchive::ArchiveError const& error) {
        if (error.GetKind() != KivArchive::Failure::Damaged)
            throw;
    }
    return std::nullopt;
}

std::optional<Entry> TreeReader::Find(Id const& tree, std::string_view path) {
    Entry entry{"", true, tree, {}};
    while (!path.empty()) {
        const auto end = std::min(path.find('/'), path.size());
        const auto name = path.substr(0, end);
        path.remove_prefix(std::min(end + 1, path.size()));
        if (name.empty())
            continue;
        if (!entry.isDirectory)
            return std::nullopt;
        const auto directory = Read(entry.id);
        auto const* const found = directory.Find(name);
        if (found == nullptr)
            return std::nullopt;
        entry = *found;
    }
    return entry;
}

std::string BytesOf(Buffer const& buffer) {
    std::string bytes;
    bytes.reserve(buffer.GetSize());
    for (auto const& chunk : buffer.LockForRead())
        bytes.append(reinterpret_cast<char const*>(chunk.data()), chunk.size());
    return bytes;
}

Buffer BufferOf(std::string_view bytes) {
    Buffer buffer;
    buffer.Append(bytes.data(), bytes.size());
    return buffer;
}

std::string DigitsOf(Id const& id) {
    std::string digits;
    if (auto const* const digest = id.GetDigest()) {
        digits.reserve(2 * digest->size());
        for (const auto byte : *digest) {
            digits += hexDigits[byte >> 4U];
            digits += hexDigits[byte & 0xFU];
        }
    }
    return digits;
}

} // namespace vault
