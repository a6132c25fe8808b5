#include "postgres/Connection.h"

#include <algorithm>
#include <array>
#include <string_view>

namespace KivArchive::Postgres {

namespace {

constexpr std::array<std::string_view, 3> secretOptions{"password", "sslpassword", "oauth_client_secret"};

void Replace(std::string& text, std::string_view what, std::string_view by) {
    for (std::size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + by.size()))
        text.replace(at, what.size(), by);
}

} // namespace

Address::Address(std::string const& text) : text_(text) {
    // What the library says about a text that it does not understand quotes it.
    struct Free {
        void operator()(PQconninfoOption* options) const noexcept { PQconninfoFree(options); }
    };
    using Options = std::unique_ptr<PQconninfoOption, Free>;
    Options const options(PQconninfoParse(text.c_str(), nullptr));
    if (options == nullptr)
        throw ArchiveError(Failure::Unavailable, "postgresql://", "This is no connection string of PostgreSQL.");
    std::string host;
    std::string database;
    Options const defaults(PQconndefaults());
    for (auto const* const given : {options.get(), defaults.get()})
        for (PQconninfoOption const* option = given; option != nullptr && option->keyword != nullptr; ++option) {
            std::string_view const keyword = option->keyword;
            std::string_view const value = option->val == nullptr ? "" : option->val;
            if (std::find(secretOptions.begin(), secretOptions.end(), keyword) != secretOptions.end() && !value.empty())
                secrets_.emplace_back(value);
            else if (keyword == "host" && host.empty())
                host = value;
            else if (keyword == "dbname" && database.empty())
                database = value;
        }
    shown_ = Clean("postgresql://" + host + "/" + database);
}

std::string Address::Clean(std::string sentence) const {
    for (std::string const& secret : secrets_)
        Replace(sentence, secret, "...");
    while (!sentence.empty() && (sentence.back() == '\n' || sentence.back() == '.'))
        sentence.pop_back();
    // What the library advises stands on a line of its own.
    for (auto at = sentence.find("\n\t"); at != std::string::npos; at = sentence.find("\n\t", at)) {
        sentence.insert(std::min(sentence.find('\n', at + 1), sentence.size()), ")");
        sentence.replace(at, 2, " (");
    }
    Replace(sentence, "\n", "; ");
    return sentence;
}

} // namespace KivArchive::Postgres
