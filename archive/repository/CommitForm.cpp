#include "repository/CommitForm.h"

#include <charconv>
#include <string_view>

namespace KivArchive {

namespace {

using KivVcs::Commit;
using KivVcs::cow_ptr;

constexpr std::size_t digitCount = 64;
constexpr std::string_view committerLine = "\ncommitter ";
/// An author's name may have line breaks, so that more than one place may look like the end of the author's line.
constexpr int mostLineEnds = 100;

bool Take(std::string_view& text, std::string_view expected) {
    if (!text.starts_with(expected))
        return false;
    text.remove_prefix(expected.size());
    return true;
}

/// Takes 64 digits and a line break. @return whether they were there
bool TakeIdentifier(std::string_view& text, Id& id) {
    auto const parsed = Id::Parse(text.substr(0, digitCount));
    if (!parsed)
        return false;
    id = *parsed;
    text.remove_prefix(digitCount);
    return Take(text, "\n");
}

template <class Number>
bool ReadNumber(std::string_view digits, Number& number) {
    auto const [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    return error == std::errc() && end == digits.data() + digits.size();
}

/// The hours in a time-zone bias that ticks can hold have fewer digits.
constexpr std::size_t mostHourDigits = 8;

bool ReadBias(std::string_view offset, KivVcs::TimeDelta& bias) {
    constexpr std::int64_t ticksPerMinute = 600'000'000;
    std::int64_t hours = 0;
    std::int64_t minutes = 0;
    if (offset.size() < 5 || offset.size() > mostHourDigits + 3 ||
        !ReadNumber(offset.substr(1, offset.size() - 3), hours) ||
        !ReadNumber(offset.substr(offset.size() - 2), minutes))
        return false;
    std::int64_t const ticks = (hours * 60 + minutes) * ticksPerMinute;
    bias = KivVcs::TimeDelta(offset.front() == '-' ? -ticks : ticks);
    return true;
}

/// Takes the word behind the last blank off @p text, and the blank with it.
std::string_view TakeLastWord(std::string_view& text) {
    std::size_t const blank = text.rfind(' ');
    if (blank == std::string_view::npos)
        return {};
    std::string_view const word = text.substr(blank + 1);
    text = text.substr(0, blank);
    return word;
}

bool ReadSignature(std::string_view line, Commit& commit) {
    KivVcs::TimeDelta bias;
    std::int64_t seconds = 0;
    if (!ReadBias(TakeLastWord(line), bias) || !ReadNumber(TakeLastWord(line), seconds))
        return false;
    std::size_t const email = line.rfind(" <");
    if (email == std::string_view::npos || !line.ends_with('>'))
        return false;
    commit.SetAuthorName(KivVcs::FromUtf8(line.substr(0, email)));
    commit.SetAuthorEmail(KivVcs::FromUtf8(line.substr(email + 2, line.size() - email - 3)));
    commit.SetCommitTime(KivVcs::Time::FromTimeT(seconds, KivVcs::TimeZone::Utc));
    commit.SetCommitTimezoneBias(bias);
    return true;
}

/// Reads what follows the word "author ": the line, the same again as the committer's, and the description.
bool ReadAuthorAndDescription(std::string_view text, Commit& commit) {
    std::size_t end = text.find(committerLine);
    for (int tried = 0; end != std::string_view::npos && tried < mostLineEnds; ++tried) {
        std::string_view const author = text.substr(0, end);
        std::string_view rest = text.substr(end + committerLine.size());
        if (Take(rest, author) && Take(rest, "\n\n") && rest.ends_with('\n') && ReadSignature(author, commit)) {
            commit.SetDescription(KivVcs::FromUtf8(rest.substr(0, rest.size() - 1)));
            return true;
        }
        end = text.find(committerLine, end + 1);
    }
    return false;
}

} // namespace

cow_ptr<Commit> ReadCommit(Id const& id, std::span<const std::byte> data, Commit::FetchCommit fetchParent,
                           Commit::FetchTree fetchRoot) {
    std::string_view text(reinterpret_cast<const char*>(data.data()), data.size());
    Id root;
    Id parent;
    if (!Take(text, "tree ") || !(Take(text, "\n") || TakeIdentifier(text, root)) ||
        (Take(text, "parent ") && !TakeIdentifier(text, parent)) || !Take(text, "author "))
        return nullptr;
    auto commit = KivVcs::immu::make<Commit>();
    Commit& read = *commit.write();
    if (!ReadAuthorAndDescription(text, read))
        return nullptr;
    read.DeferRoot(root, std::move(fetchRoot));
    read.DeferParent(parent, std::move(fetchParent));
    // The last word on whether everything has been understood.
    return read.GetId() == id ? commit : nullptr;
}

} // namespace KivArchive
