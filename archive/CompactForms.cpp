#include "CompactForms.h"

#include "Digits.h"

#include <algorithm>
#include <cstring>
#include <string_view>

namespace KivArchive {

namespace {

constexpr std::string_view filePrefix = "100644 blob ";
constexpr std::string_view directoryPrefix = "40000 tree ";
constexpr std::string_view treeLine = "tree ";
constexpr std::string_view parentLine = "parent ";
constexpr std::string_view authorLine = "author ";
constexpr std::string_view committerLine = "committer ";

constexpr auto digitPairs = [] {
    std::array<std::array<char, 2>, 256> pairs{};
    constexpr std::string_view digits = "0123456789abcdef";
    for (std::size_t byte = 0; byte < pairs.size(); ++byte)
        pairs[byte] = {digits[byte >> 4U], digits[byte & 15U]};
    return pairs;
}();

char* WriteDigits(ByteView digest, char* to) noexcept {
    for (std::byte const byte : digest) {
        std::memcpy(to, digitPairs[static_cast<std::size_t>(byte)].data(), 2);
        to += 2;
    }
    return to;
}

std::string_view TextOf(ByteView bytes) noexcept {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

char* Write(std::string_view text, char* to) noexcept {
    return std::copy(text.begin(), text.end(), to);
}

/// Takes @p line, 64 digits and a line feed from the front of @p text.
bool TakeIdentifier(std::string_view& text, std::string_view line, Bytes& digests) {
    if (text.substr(0, line.size()) != line || text.size() < line.size() + digitCount + 1 ||
        text[line.size() + digitCount] != '\n')
        return false;
    digests.resize(digests.size() + digestSize);
    if (!ReadDigits(text.data() + line.size(), digests.data() + digests.size() - digestSize))
        return false;
    text.remove_prefix(line.size() + digitCount + 1);
    return true;
}

} // namespace

std::optional<Bytes> CompactTree(ByteView data) {
    // Every entry shrinks: the form is never larger than the data. It is mostly smaller by a third, which need not be cleared.
    constexpr std::size_t step = 4096;
    Bytes form;
    form.reserve(data.size());
    std::size_t used = 0;
    std::string_view rest = TextOf(data);
    while (!rest.empty()) {
        bool const isDirectory = rest.front() == '4';
        std::string_view const prefix = isDirectory ? directoryPrefix : filePrefix;
        if (rest.substr(0, prefix.size()) != prefix)
            return std::nullopt;
        rest.remove_prefix(prefix.size());
        const void* const zero = std::memchr(rest.data(), 0, rest.size());
        if (zero == nullptr)
            return std::nullopt;
        std::size_t const nameSize = static_cast<std::size_t>(static_cast<const char*>(zero) - rest.data()) + 1;
        if (rest.size() < nameSize + digitCount)
            return std::nullopt;
        std::size_t const size = 1 + nameSize + digestSize;
        if (form.size() - used < size)
            form.resize(std::min(data.size(), used + std::max(size, step)));
        std::byte* const to = form.data() + used;
        *to = static_cast<std::byte>(isDirectory);
        std::memcpy(to + 1, rest.data(), nameSize);
        if (!ReadDigits(rest.data() + nameSize, to + 1 + nameSize))
            return std::nullopt;
        used += size;
        rest.remove_prefix(nameSize + digitCount);
    }
    form.resize(used);
    return form;
}

Bytes ExpandTree(ByteView form, std::uint64_t size) {
    // No entry grows to more than three times its size.
    if (size > 3 * static_cast<std::uint64_t>(form.size()))
        throw Malformed();
    Bytes data(static_cast<std::size_t>(size));
    char* to = reinterpret_cast<char*>(data.data());
    const char* const end = to + data.size();
    for (ByteReader reader(form); !reader.Rest().empty();) {
        std::uint8_t const kind = reader.TakeByte();
        const void* const zero =
            reader.Rest().empty() ? nullptr : std::memchr(reader.Rest().data(), 0, reader.Rest().size());
        if (kind > 1 || zero == nullptr)
            throw Malformed();
        auto const nameSize = static_cast<std::size_t>(static_cast<const std::byte*>(zero) - reader.Rest().data()) + 1;
        ByteView const name = reader.Take(nameSize);
        ByteView const digest = reader.Take(digestSize);
        std::string_view const prefix = kind == 1 ? directoryPrefix : filePrefix;
        if (static_cast<std::size_t>(end - to) < prefix.size() + nameSize + digitCount)
            throw Malformed();
        to = WriteDigits(digest, Write(TextOf(name), Write(prefix, to)));
    }
    if (to != end)
        throw Malformed();
    return data;
}

std::optional<Bytes> CompactCommit(ByteView data) {
    std::string_view rest = TextOf(data);
    Bytes form;
    form.reserve(data.size());
    form.resize(1);
    if (!TakeIdentifier(rest, treeLine, form))
        return std::nullopt;
    if (TakeIdentifier(rest, parentLine, form))
        form.front() = std::byte{1};
    if (rest.substr(0, authorLine.size()) != authorLine)
        return std::nullopt;
    rest.remove_prefix(authorLine.size());
    std::size_t const lineSize = rest.find('\n') + 1;
    std::string_view const author = rest.substr(0, lineSize);
    rest.remove_prefix(author.size());
    if (lineSize == 0 || rest.substr(0, committerLine.size()) != committerLine ||
        rest.substr(committerLine.size(), lineSize) != author)
        return std::nullopt;
    rest.remove_prefix(committerLine.size() + lineSize);
    Append(form, std::as_bytes(std::span(author)));
    Append(form, std::as_bytes(std::span(rest)));
    return form;
}

Bytes ExpandCommit(ByteView form, std::uint64_t size) {
    ByteReader reader(form);
    bool const hasParent = reader.TakeByte() != 0;
    ByteView const tree = reader.Take(digestSize);
    ByteView const parent = hasParent ? reader.Take(digestSize) : ByteView();
    std::string_view const rest = TextOf(reader.Rest());
    std::string_view const author = rest.substr(0, rest.find('\n') + 1);
    std::size_t const expanded = treeLine.size() + digitCount + 1 +
                                 (hasParent ? parentLine.size() + digitCount + 1 : 0) + authorLine.size() +
                                 committerLine.size() + author.size() + rest.size();
    if (author.empty() || size != expanded)
        throw Malformed();
    Bytes data(expanded);
    char* to = WriteDigits(tree, Write(treeLine, reinterpret_cast<char*>(data.data())));
    *to++ = '\n';
    if (hasParent) {
        to = WriteDigits(parent, Write(parentLine, to));
        *to++ = '\n';
    }
    to = Write(author, Write(authorLine, to));
    to = Write(author, Write(committerLine, to));
    Write(rest.substr(author.size()), to);
    return data;
}

} // namespace KivArchive
