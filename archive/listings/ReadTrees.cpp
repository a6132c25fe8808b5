#include "listings/ReadTrees.h"

#include "Changes.h"

#include <KivUtils/Utf8.h>

#include <algorithm>

namespace KivArchive {

namespace {

std::string DigitsOf(Id const& id) {
    return KivUtils::ToUtf8(id.GetText());
}

/// The names of a path; empty ones are left out.
std::vector<std::string> ComponentsOf(KivStringT<char16_t> const& path) {
    std::string const text = KivUtils::ToUtf8(path);
    std::vector<std::string> components;
    for (std::size_t begin = 0; begin < text.size();) {
        std::size_t const end = std::min(text.find('/', begin), text.size());
        if (end > begin)
            components.push_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    return components;
}

/// The entry with that name; nothing if there is none.
std::optional<PackedEntry> Find(std::span<const std::byte> tree, std::string_view name) {
    for (PackedEntries entries(tree); entries.Next();)
        if (entries.Get().name == name)
            return entries.Get();
    return std::nullopt;
}

} // namespace

TreeData::TreeData(IArchive& archive, std::vector<Id> ids) {
    std::erase_if(ids, [](Id const& id) { return id.IsEmpty(); });
    std::sort(ids.begin(), ids.end(), [](Id const& one, Id const& other) { return DigestOf(one) < DigestOf(other); });
    ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
    data_.reserve(ids.size());
    ReadOutcome const outcome = archive.Read(ids, [this](ArchivedObject const& object) {
        if (object.type != ObjectType::Tree)
            throw ArchiveError(Failure::Damaged, {},
                               "What is named as a directory is none: " + DigitsOf(object.id) + ".");
        data_[object.id].assign(reinterpret_cast<const char*>(object.data.data()), object.data.size());
    });
    if (!outcome.missing.empty())
        ThrowCollected(outcome.missing.front(), {});
    if (!outcome.damaged.empty())
        throw ArchiveError(Failure::Damaged, {}, "A directory is damaged: " + DigitsOf(outcome.damaged.front()) + ".");
}

void ThrowUnrepresentableTree(Id const& id) {
    throw ArchiveError(Failure::Unrepresentable, {}, "This directory is not as trees are: " + DigitsOf(id) + ".");
}

std::vector<EntryRecord> ListDirectory(IArchive& archive, Id const& tree) {
    TreeData const data(archive, {tree});
    std::vector<EntryRecord> listed;
    PackedEntries entries(data.At(tree));
    while (entries.Next())
        listed.push_back({KivUtils::FromUtf8(entries.Get().name), entries.Get().GetId(), entries.Get().isTree});
    if (!entries.AreSound())
        ThrowUnrepresentableTree(tree);
    return listed;
}

std::vector<FoundEntry> FindEntries(IArchive& archive, std::span<const Id> trees, KivStringT<char16_t> const& path) {
    std::vector<FoundEntry> found;
    for (Id const& tree : trees)
        if (!tree.IsEmpty())
            found.push_back({tree, {path, tree, true}});
    for (std::string const& name : ComponentsOf(path)) {
        std::erase_if(found, [](FoundEntry const& one) { return !one.entry.isDirectory; });
        std::vector<FoundEntry> next;
        for (std::span<FoundEntry> rest(found); !rest.empty();) {
            auto const batch = rest.first(std::min(listedAtOnce, rest.size()));
            rest = rest.subspan(batch.size());
            std::vector<Id> ids;
            for (FoundEntry const& one : batch)
                ids.push_back(one.entry.id);
            TreeData const data(archive, ids);
            // Successive versions share most of their directories.
            std::unordered_map<Id, std::optional<PackedEntry>> known;
            for (FoundEntry& one : batch) {
                auto const [entry, isNew] = known.try_emplace(one.entry.id);
                if (isNew)
                    entry->second = Find(data.At(one.entry.id), name);
                if (entry->second)
                    next.push_back({one.tree, {path, entry->second->GetId(), entry->second->isTree}});
            }
        }
        found = std::move(next);
    }
    return found;
}

} // namespace KivArchive
