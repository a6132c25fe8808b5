#include "tree/PackedEntries.h"

#include "objects/PackedForm.h"

#include <string_view>

namespace KivVcs::detail {

namespace {

constexpr std::string_view blobPrefix = "100644 blob ";
constexpr std::string_view treePrefix = "40000 tree ";
constexpr std::size_t identifierLength = 64;

/// A name as a packed form shows it: a text ends at its first U+0000 there.
KivStringViewT<char16_t> PackedName(Entry const& entry) noexcept {
    const KivStringViewT<char16_t> name = entry.Name();
    const char16_t* const end = std::find(name.begin(), name.end(), u'\0');
    return name.Left(static_cast<int>(end - name.begin()));
}

} // namespace

std::uint64_t PackedSize(Entry const& entry) noexcept {
    if (entry.Child() == nullptr)
        return 0;
    const std::size_t prefix = entry.IsTree() ? treePrefix.size() : blobPrefix.size();
    return prefix + DataEncoding::Utf8Length(PackedName(entry)) + 1 + identifierLength;
}

char* PackEntry(Entry const& entry, char* out) {
    if (entry.Child() == nullptr)
        return out;
    const Id id = entry.Child()->GetId();
    const std::string_view prefix = entry.IsTree() ? treePrefix : blobPrefix;
    out = std::copy(prefix.begin(), prefix.end(), out);
    out = DataEncoding::Utf8Write(PackedName(entry), out);
    *out++ = '\0';
    return WriteDigits(id, out);
}

} // namespace KivVcs::detail
