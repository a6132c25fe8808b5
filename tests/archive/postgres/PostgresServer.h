#pragma once

#include "ArchiveFiles.h"
#include "KivArchive/PostgresArchive.h"

#include <array>
#include <cstdio>
#include <gtest/gtest.h>
#include <iostream>
#include <memory>

namespace KivArchive {

/// A cluster of the test's own, as long as this object lives.
class PostgresServer {
public:
    /// @param settings as scripts/postgres.sh takes them
    explicit PostgresServer(std::string const& settings) : directory_(parent_.Path("server")) {
        // The server runs as somebody else where root runs the tests.
        std::filesystem::permissions(parent_.Path(""), std::filesystem::perms::others_exec,
                                     std::filesystem::perm_options::add);
        address_ = Call("start", settings);
        if (!address_.empty())
            address_.pop_back();
    }
    PostgresServer(PostgresServer const&) = delete;
    PostgresServer& operator=(PostgresServer const&) = delete;
    ~PostgresServer() { Call("stop"); }

    [[nodiscard]] static bool IsInstalled() {
        return std::system((std::string(KIVVCS_POSTGRES_SCRIPT) + " installed 2>/dev/null").c_str()) == 0;
    }

    /// Empty if it could not be started.
    [[nodiscard]] std::string const& Address() const noexcept { return address_; }
    [[nodiscard]] std::string const& Directory() const noexcept { return directory_; }
    void Crash() const { Call("crash"); }
    void Restart() const { Call("restart"); }

    /// A new, empty archive.
    [[nodiscard]] std::unique_ptr<PostgresArchive> MakeArchive(PostgresOptions options = {}) {
        options.schema = "archive" + std::to_string(++count_);
        return std::make_unique<PostgresArchive>(address_, options);
    }
    /// The schema of the archive made last.
    [[nodiscard]] std::string LastSchema() const { return "archive" + std::to_string(count_); }

private:
    std::string Call(std::string const& command, std::string const& settings = {}) const {
        std::string const line =
            std::string(KIVVCS_POSTGRES_SCRIPT) + " " + command + " " + directory_ + " " + settings;
        std::string output;
        struct Close {
            void operator()(std::FILE* pipe) const noexcept { pclose(pipe); }
        };
        std::unique_ptr<std::FILE, Close> const pipe(popen(line.c_str(), "r"));
        std::array<char, 256> buffer{};
        while (pipe != nullptr && std::fgets(buffer.data(), static_cast<int>(buffer.size()), pipe.get()) != nullptr)
            output += buffer.data();
        return output;
    }

    TemporaryDirectory parent_;
    std::string directory_;
    std::string address_;
    int count_ = 0;
};

/// The cluster of this program.
inline PostgresServer* theServer = nullptr;

/// For `main`: runs all tests against one cluster, which crashes may be tried on.
inline int RunTestsWithServer(int argc, char** argv, std::string const& settings) {
    testing::InitGoogleTest(&argc, argv);
    if (!PostgresServer::IsInstalled()) {
        constexpr int skipped = 77;
        std::cout << "Skipped: these tests need a PostgreSQL server, which is not installed here.\n";
        return skipped;
    }
    PostgresServer server(settings);
    if (server.Address().empty())
        return 1;
    theServer = &server;
    return RUN_ALL_TESTS();
}

} // namespace KivArchive
