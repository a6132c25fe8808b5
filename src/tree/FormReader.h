#pragma once

#include "tree/EntryPacker.h"

#include <cstring>
#include <string_view>

namespace KivVcs::detail {

/// An entry as a packed form shows it.
struct PackedEntry {
    std::string_view type{};
    std::string_view name{};
    Id id{};
    /// Whether mode and type are written as our own objects show them.
    bool isOurs = false;
};

/// Takes entries off the text of a packed form. What is cut off ends where the text does.
class FormReader {
public:
    explicit FormReader(std::string_view text) noexcept : at_(text.data()), end_(text.data() + text.size()) {}

    [[nodiscard]] bool AtEnd() const noexcept { return at_ == end_; }

    /// Takes mode and type, which come first; or leaves them, and says false, if the type is not @p type.
    [[nodiscard]] bool TakeType(std::string_view type, PackedEntry& entry) noexcept {
        const char* const before = at_;
        TakeType(entry);
        if (entry.type == type)
            return true;
        at_ = before;
        return false;
    }
    void TakeType(PackedEntry& entry) noexcept {
        entry.isOurs = true;
        if (TakeIfNext(blobWords)) {
            entry.type = "blob";
        } else if (TakeIfNext(treeWords)) {
            entry.type = "tree";
        } else {
            entry.isOurs = false;
            TakeUntil(' ');
            entry.type = TakeUntil(' ');
        }
    }

    void TakeNameAndId(PackedEntry& entry) {
        entry.name = TakeUntil('\0');
        const char* const id = at_;
        at_ += std::min(idLength, Size());
        entry.id = ReadId({id, static_cast<int>(at_ - id)});
    }

private:
    [[nodiscard]] std::size_t Size() const noexcept { return static_cast<std::size_t>(end_ - at_); }

    bool TakeIfNext(std::string_view words) noexcept {
        const bool isNext = Size() >= words.size() && std::memcmp(at_, words.data(), words.size()) == 0;
        at_ += isNext ? words.size() : 0;
        return isNext;
    }

    /// Takes the text up to the next @p last, and that with it; all that is left if there is none.
    std::string_view TakeUntil(char last) noexcept {
        const char* const begin = at_;
        const void* const found = AtEnd() ? nullptr : std::memchr(at_, last, Size());
        if (found == nullptr) {
            at_ = end_;
            return {begin, static_cast<std::size_t>(end_ - begin)};
        }
        at_ = static_cast<const char*>(found) + 1;
        return {begin, static_cast<std::size_t>(at_ - begin) - 1};
    }

    // Apart, since the two together would be copied by one move, which waits for what was written by two.
    const char* at_;
    const char* end_;
};

} // namespace KivVcs::detail
