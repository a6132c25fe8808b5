#include "Author.h"

#include "Problem.h"

#include <algorithm>
#include <array>
#include <pwd.h>
#include <unistd.h>

namespace vault {

Author ParseAuthor(std::string const& text) {
    const auto open = text.find('<');
    if (open == std::string::npos && text.find('>') == std::string::npos)
        return {RequireLine(text, "the author"), {}};
    if (open == std::string::npos || text.find('>') != text.size() - 1 || text.find('<', open + 1) != std::string::npos)
        throw Problem("the author must be given as 'Name <mail>': " + Printable(text));
    const auto nameEnd = text.find_last_not_of(' ', open == 0 ? 0 : open - 1);
    const auto name = open == 0 || nameEnd == std::string::npos ? std::string() : text.substr(0, nameEnd + 1);
    return {RequireLine(name, "the author"), RequireLine(text.substr(open + 1, text.size() - open - 2), "the author")};
}

std::string DefaultAuthor() {
    passwd entry{};
    passwd* user = nullptr;
    std::array<char, 4096> texts{};
    getpwuid_r(geteuid(), &entry, texts.data(), texts.size(), &user);
    const std::string login = user == nullptr ? "unknown" : user->pw_name;
    std::string name = user == nullptr ? "" : user->pw_gecos;
    name.resize(std::min(name.find_first_of(",<>\r\n"), name.size()));
    std::array<char, 256> host{};
    if (gethostname(host.data(), host.size() - 1) != 0)
        host = {"localhost"};
    return (name.empty() ? login : name) + " <" + login + '@' + host.data() + '>';
}

} // namespace vault
