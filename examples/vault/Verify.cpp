#include "Verify.h"

#include "Text.h"

#include <algorithm>
#include <unordered_map>
#include <unordered_set>

namespace vault {

namespace {

constexpr std::size_t idLength = 64;

std::vector<std::string_view> ReferencesOfTree(std::string_view data) {
    std::vector<std::string_view> ids;
    for (auto nameEnd = data.find('\0'); nameEnd != std::string_view::npos;
         nameEnd = data.find('\0', nameEnd + 1 + idLength))
        ids.push_back(data.substr(nameEnd + 1, idLength));
    return ids;
}

std::vector<std::string_view> ReferencesOfCommit(std::string_view data) {
    std::vector<std::string_view> ids;
    for (const std::string_view key : {"tree ", "parent "}) {
        if (!data.starts_with(key))
            continue;
        const auto lineEnd = data.find('\n');
        if (lineEnd > key.size())
            ids.push_back(data.substr(key.size(), lineEnd - key.size()));
        data = data.substr(std::min(lineEnd, data.size() - 1) + 1);
    }
    return ids;
}

std::vector<std::string_view> References(std::string_view packed) {
    const auto headerEnd = packed.find('\0');
    if (headerEnd == std::string_view::npos)
        return {};
    const auto data = packed.substr(headerEnd + 1);
    if (packed.starts_with("tree "))
        return ReferencesOfTree(data);
    return packed.starts_with("commit ") ? ReferencesOfCommit(data) : std::vector<std::string_view>();
}

} // namespace

std::vector<std::string> FindDamage(VaultFile& file, Progress& progress) {
    std::vector<std::string> findings;
    if (auto structural = file.FindStructuralDamage(); !structural.empty())
        findings.push_back("damaged file: " + Printable(structural));

    std::unordered_set<std::string> present;
    std::unordered_map<std::string, std::string> users;
    file.ForEachObject([&](std::string_view id, std::string_view packed) {
        progress.Step(packed.size());
        present.emplace(id);
        if (KivVcs::Helpers::ComputeEncodedSHA256Hash(packed.data(), packed.size()) !=
            Text(KivVcs::KivStringT<char>(id.data(), static_cast<int>(id.size())))) {
            findings.push_back("damaged object " + Printable(id));
            return;
        }
        for (auto const reference : References(packed))
            users.try_emplace(std::string(reference), "object " + std::string(id));
    });
    for (auto const& [name, head] : file.ReadBranches()) {
        if (!head.empty())
            users.try_emplace(head, "branch " + name);
    }
    for (auto const& [id, user] : users) {
        if (!present.contains(id))
            findings.push_back("missing object " + Printable(id) + ", needed by " + Printable(user));
    }
    return findings;
}

} // namespace vault
