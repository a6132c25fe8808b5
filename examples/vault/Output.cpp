#include "Output.h"

#include "Names.h"
#include "Problem.h"

#include <array>
#include <cstdlib>
#include <ctime>
#include <iostream>
#include <unistd.h>

namespace vault {

namespace {

constexpr std::size_t shortLength = 12;

} // namespace

std::string DescribeAuthor(CommitRecord const& commit) {
    return Printable(commit.authorName) + " <" + Printable(commit.authorEmail) + '>';
}

std::string DescribeTime(CommitRecord const& commit) {
    const auto time = static_cast<std::time_t>(commit.time.ToTimeT(KivVcs::TimeZone::Utc));
    std::tm parts{};
    localtime_r(&time, &parts);
    std::array<char, 64> text{};
    std::string described(text.data(), std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%S%z", &parts));
    return described.insert(described.size() - 2, ":");
}

std::string Shortened(Id const& id) {
    return DigitsOf(id).substr(0, shortLength);
}

std::string DescribeMessage(CommitRecord const& commit) {
    switch (commit.state) {
    case KivArchive::CommitState::Sound:
        break;
    case KivArchive::CommitState::Missing:
        return "(forgotten)";
    case KivArchive::CommitState::Damaged:
    case KivArchive::CommitState::Unrepresentable:
        return "(damaged)";
    }
    return Printable(commit.description);
}

std::string JsonCommit(CommitRecord const& commit) {
    std::string merged;
    for (auto const& id : commit.merged)
        merged += (merged.empty() ? R"(")" : R"(,")") + DigitsOf(id) + '"';
    return R"({"id":")" + DigitsOf(commit.id) + R"(","parent":")" + DigitsOf(commit.parent) + R"(","merged":[)" +
           merged + R"(],"tree":")" + DigitsOf(commit.tree) + R"(","readable":)" +
           (commit.state == KivArchive::CommitState::Sound ? "true" : "false") + R"(,"author":)" +
           JsonText(ToUtf8(commit.authorName)) + R"(,"email":)" + JsonText(ToUtf8(commit.authorEmail)) +
           R"(,"time":")" + DescribeTime(commit) + R"(","message":)" + JsonText(ToUtf8(commit.description)) + '}';
}

bool IsTerminal() noexcept {
    static const bool isTerminal = isatty(STDOUT_FILENO) == 1;
    return isTerminal;
}

std::string Coloured(std::string_view text, Colour colour) {
    if (!IsTerminal())
        return std::string(text);
    // NOLINTNEXTLINE(concurrency-mt-unsafe): nobody changes the environment
    auto const* const noColour = std::getenv("NO_COLOR");
    if (noColour != nullptr && *noColour != '\0')
        return std::string(text);
    return "\x1b[" + std::to_string(static_cast<int>(colour)) + 'm' + std::string(text) + "\x1b[0m";
}

std::string Counted(std::uint64_t count, std::string_view noun) {
    return std::to_string(count) + ' ' + std::string(noun) + (count == 1 ? "" : "s");
}

void Warn(std::string_view line) {
    std::cerr << "vault: " << line << '\n';
}

bool Confirm(std::string const& question, bool yes) {
    if (yes)
        return true;
    if (isatty(STDIN_FILENO) != 1)
        throw Problem(question + " Nobody is here to ask: say --yes if so");
    std::cerr << question << " [y/N] " << std::flush;
    std::string answer;
    std::getline(std::cin, answer);
    return answer == "y" || answer == "yes";
}

} // namespace vault
