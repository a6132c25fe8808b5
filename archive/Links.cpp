#include "Bytes.h"
#include "Digits.h"
#include "KivArchive/Upkeep.h"

#include <cstring>

namespace KivArchive {

namespace {

/// Takes @p expected from the front of @p text. @return false, taking nothing, if it begins with something else
bool Take(std::string_view& text, std::string_view expected) {
    if (text.substr(0, expected.size()) != expected)
        return false;
    text.remove_prefix(expected.size());
    return true;
}

bool TakeIdentifier(std::string_view& text, ObjectType type, std::vector<Link>& links) {
    Id::Digest digest{};
    if (text.size() < digitCount || !ReadDigits(text.data(), std::as_writable_bytes(std::span(digest)).data()))
        return false;
    text.remove_prefix(digitCount);
    links.push_back({type, Id::FromDigest(digest), {}});
    return true;
}

bool ReadTreeLinks(std::string_view text, std::vector<Link>& links) {
    while (!text.empty()) {
        bool const isTree = Take(text, "40000 tree ");
        if (!isTree && !Take(text, "100644 blob "))
            return false;
        std::size_t const end = text.find('\0');
        if (end == std::string_view::npos)
            return false;
        std::string_view const name = text.substr(0, end);
        text.remove_prefix(end + 1);
        if (!TakeIdentifier(text, isTree ? ObjectType::Tree : ObjectType::Blob, links))
            return false;
        links.back().name = name;
    }
    return true;
}

bool ReadCommitLinks(std::string_view text, std::vector<Link>& links) {
    if (!Take(text, "tree "))
        return false;
    // A commit may have no tree at all.
    if (!Take(text, "\n") && !(TakeIdentifier(text, ObjectType::Tree, links) && Take(text, "\n")))
        return false;
    if (Take(text, "parent ") && !(TakeIdentifier(text, ObjectType::Commit, links) && Take(text, "\n")))
        return false;
    return text.substr(0, 7) == "author ";
}

} // namespace

bool ReadLinks(ObjectType type, std::span<const std::byte> data, std::vector<Link>& links) {
    std::string_view const text(reinterpret_cast<const char*>(data.data()), data.size());
    switch (type) {
    case ObjectType::Tree:
        return ReadTreeLinks(text, links);
    case ObjectType::Commit:
        return ReadCommitLinks(text, links);
    case ObjectType::Blob:
        break;
    }
    return true;
}

} // namespace KivArchive
