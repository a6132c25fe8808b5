#include "KivVcs/PortablePaths.h"

#include "KivVcs/Helpers.h"
#include "foundation/CaseFolding.h"
#include "tree/PathPrefix.h"

#include <algorithm>
#include <string_view>
#include <unordered_set>
#include <utility>

namespace KivVcs {

namespace {

constexpr std::size_t longestName = 255;

std::u16string_view Standard(KivStringViewT<char16_t> text) noexcept {
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

/// What comes before the first dot, without blanks at its end, names a device whatever follows.
bool IsDeviceName(std::u16string_view name) {
    name = name.substr(0, name.find(u'.'));
    while (!name.empty() && name.back() == u' ')
        name.remove_suffix(1);
    if (name.size() < 3 || name.size() > 7)
        return false;
    const auto folded = KivUtils::FoldCase({name.data(), static_cast<int>(name.size())});
    const std::u16string_view lower = Standard(folded);
    for (const std::u16string_view device : {u"con", u"prn", u"aux", u"nul", u"conin$", u"conout$"}) {
        if (lower == device)
            return true;
    }
    const bool isPort = lower.starts_with(u"com") || lower.starts_with(u"lpt");
    return isPort && lower.size() == 4 &&
           std::u16string_view(u"0123456789\u00B9\u00B2\u00B3").find(lower[3]) != lower.npos;
}

bool HasLoneSurrogate(std::u16string_view name) noexcept {
    for (std::size_t index = 0; index < name.size(); ++index) {
        if ((name[index] & 0xF800) != 0xD800)
            continue;
        const bool isPair = name[index] < 0xDC00 && index + 1 < name.size() && (name[index + 1] & 0xFC00) == 0xDC00;
        if (!isPair)
            return true;
        ++index;
    }
    return false;
}

optional<PathProblemKind> ProblemOf(KivStringViewT<char16_t> component) {
    const std::u16string_view name = Standard(component);
    if (name == u"." || name == u"..")
        return PathProblemKind::RelativeName;
    const auto isReserved = [](char16_t unit) {
        return unit < 0x20 || unit == 0x7F ||
               std::u16string_view(u"<>:\"|?*\\").find(unit) != std::u16string_view::npos;
    };
    if (std::any_of(name.begin(), name.end(), isReserved))
        return PathProblemKind::ReservedCharacter;
    if (IsDeviceName(name))
        return PathProblemKind::ReservedName;
    if (name.back() == u'.' || name.back() == u' ')
        return PathProblemKind::TrailingDotOrBlank;
    if (HasLoneSurrogate(name))
        return PathProblemKind::NotUnicode;
    if (DataEncoding::Utf8Length(component) > longestName)
        return PathProblemKind::LongName;
    return {};
}

/// A directory to be searched, and how much of the prefix of the directory entered last is its parent's too.
struct OpenDirectory {
    cow_ptr<Tree> tree;
    KivStringT<char16_t> name;
    std::size_t prefixLength;
};

/// The names of one directory that are equal without case, in groups of at least two.
std::vector<PathList> CollidingNames(Tree const& directory) {
    PathList names = directory.GetLocalObjectPaths();
    std::sort(names.begin(), names.end());
    names.erase(std::unique(names.begin(), names.end()), names.end());
    std::vector<std::pair<KivStringT<char16_t>, KivStringT<char16_t>>> folded;
    folded.reserve(names.size());
    for (auto& name : names)
        folded.emplace_back(KivUtils::FoldCase(name), std::move(name));
    std::sort(folded.begin(), folded.end());
    std::vector<PathList> groups;
    for (auto first = folded.begin(); first != folded.end();) {
        const auto behind =
            std::find_if(first, folded.end(), [&](auto const& each) { return each.first != first->first; });
        if (behind - first > 1) {
            auto& group = groups.emplace_back();
            std::for_each(first, behind, [&](auto& each) { group.push_back(std::move(each.second)); });
        }
        first = behind;
    }
    return groups;
}

} // namespace

optional<PathProblem> PortablePathProblem(KivStringViewT<char16_t> path) {
    const auto components = Helpers::SplitVcsPath(path);
    if (components.empty())
        return PathProblem{};
    for (auto const& component : components) {
        if (const auto kind = ProblemOf(component))
            return PathProblem{*kind, component.ToString()};
    }
    return {};
}

std::vector<PathList> FindCaseCollisions(cow_ptr<Tree> const& tree) {
    std::vector<PathList> collisions;
    std::unordered_set<Id> seen;
    std::vector<OpenDirectory> open;
    PathPrefix prefix;
    const auto search = [&](cow_ptr<Tree> const& directory) {
        for (auto& group : CollidingNames(*directory)) {
            for (auto& name : group)
                name = prefix.PathOf(name);
            collisions.push_back(std::move(group));
        }
        const PathList names = directory->GetLocalSubtreePaths();
        std::for_each(names.rbegin(), names.rend(), [&](KivStringT<char16_t> const& name) {
            open.push_back({directory->GetLocalTree(name), name, prefix.GetLength()});
        });
    };
    if (tree)
        search(tree);
    while (!open.empty()) {
        const OpenDirectory directory = std::move(open.back());
        open.pop_back();
        prefix.Enter(directory.prefixLength, directory.name);
        if (seen.insert(directory.tree->GetId()).second)
            search(directory.tree);
    }
    std::sort(collisions.begin(), collisions.end());
    return collisions;
}

} // namespace KivVcs
