#include "tree/PackedEntries.h"

#include "objects/PackedForm.h"

#include <string_view>

namespace KivVcs::detail {

namespace {

constexpr std::string_view blobPrefix = "100644 blob ";
constexpr std::string_view treePrefix = "40000 tree ";
constexpr std::size_t identifierLength = 64;

/// Hands the code units of a name to @p take as a packed form shows them, up to the first U+0000.
/// @return false, at the first code unit that is not ASCII
template <class Take>
bool ForEachAsciiUnit(KivStringViewT<char16_t> name, Take take) noexcept {
    for (const char16_t unit : name) {
        if (unit == 0)
            break;
        if (unit >= 0x80)
            return false;
        take(static_cast<char>(unit));
    }
    return true;
}

KivStringViewT<char16_t> UntilZero(KivStringViewT<char16_t> name) noexcept {
    const char16_t* const end = std::find(name.begin(), name.end(), u'\0');
    return name.Left(static_cast<int>(end - name.begin()));
}

std::size_t PackedNameSize(KivStringViewT<char16_t> name) noexcept {
    std::size_t size = 0;
    return ForEachAsciiUnit(name, [&size](char) { ++size; }) ? size : DataEncoding::Utf8Length(UntilZero(name));
}

char* PackName(KivStringViewT<char16_t> name, char* out) noexcept {
    char* const begin = out;
    return ForEachAsciiUnit(name, [&out](char unit) { *out++ = unit; })
               ? out
               : DataEncoding::Utf8Write(UntilZero(name), begin);
}

} // namespace

std::uint64_t PackedSize(Entry const& entry) noexcept {
    if (entry.Child() == nullptr)
        return 0;
    const std::size_t prefix = entry.IsTree() ? treePrefix.size() : blobPrefix.size();
    return prefix + PackedNameSize(entry.Name()) + 1 + identifierLength;
}

std::uint64_t MostPackedSize(Entry const& entry) noexcept {
    constexpr std::uint64_t mostBytesOfUnit = 3;
    return blobPrefix.size() + mostBytesOfUnit * static_cast<std::uint64_t>(entry.Name().GetLength()) + 1 +
           identifierLength;
}

char* PackEntry(Entry const& entry, char* out) {
    if (entry.Child() == nullptr)
        return out;
    const std::string_view prefix = entry.IsTree() ? treePrefix : blobPrefix;
    out = std::copy(prefix.begin(), prefix.end(), out);
    out = PackName(entry.Name(), out);
    *out++ = '\0';
    Id::Digest const* const known = entry.Child()->GetKnownDigest();
    // NOLINTNEXTLINE(clang-analyzer-core.NonNullParamChecker): an identifier that is computed tells a digest
    return WriteDigits(known == nullptr ? *entry.Child()->Object::GetId().GetDigest() : *known, out);
}

} // namespace KivVcs::detail
