#pragma once

#include <array>
#include <atomic>
#include <climits>
#include <cstring>
#include <poll.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace KivArchive {

/// Stands between clients and a server's socket, and cuts connections.
class CuttingProxy {
public:
    /// @param directory where clients find its socket @param server the directory of the server's
    CuttingProxy(std::string const& directory, std::string const& server)
        : server_(AddressIn(server)), listening_(socket(AF_UNIX, SOCK_STREAM, 0)) {
        sockaddr_un const own = AddressIn(directory);
        bind(listening_, reinterpret_cast<sockaddr const*>(&own), sizeof own);
        listen(listening_, 64);
        accepting_ = std::thread([this] { Accept(); });
    }
    CuttingProxy(CuttingProxy const&) = delete;
    CuttingProxy& operator=(CuttingProxy const&) = delete;
    ~CuttingProxy() {
        isEnding_ = true;
        accepting_.join();
        for (std::thread& passing : passing_)
            passing.join();
        close(listening_);
    }

    /// Cuts a connection when that many more bytes have gone to the server.
    void CutAfter(long bytes) noexcept { rest_ = bytes; }
    /// Lets the server do what it is told next, and cuts the connection instead of passing the answer on.
    void LoseNextAnswer() noexcept { losesAnswer_ = true; }

private:
    static sockaddr_un AddressIn(std::string const& directory) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::string const path = directory + "/.s.PGSQL.5432";
        std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
        return address;
    }

    void Accept() {
        while (!isEnding_) {
            pollfd waiting{listening_, POLLIN, 0};
            if (poll(&waiting, 1, 20) <= 0)
                continue;
            int const client = accept(listening_, nullptr, nullptr);
            int const server = socket(AF_UNIX, SOCK_STREAM, 0);
            if (connect(server, reinterpret_cast<sockaddr const*>(&server_), sizeof server_) == 0) {
                passing_.emplace_back([this, client, server] { Pass(client, server); });
                continue;
            }
            close(client);
            close(server);
        }
    }

    void Pass(int client, int server) {
        bool isOpen = true;
        while (isOpen && !isEnding_) {
            std::array<pollfd, 2> both{{{client, POLLIN, 0}, {server, POLLIN, 0}}};
            if (poll(both.data(), both.size(), 20) <= 0)
                continue;
            if (both[1].revents != 0)
                isOpen = !losesAnswer_.exchange(false) && PassSome(server, client, LONG_MAX);
            if (isOpen && both[0].revents != 0) {
                long const rest = rest_;
                isOpen = PassSome(client, server, rest);
            }
        }
        close(client);
        close(server);
    }

    /// @return whether the connection stays
    bool PassSome(int from, int to, long atMost) {
        std::array<char, 65536> bytes{};
        ssize_t const count = read(from, bytes.data(), bytes.size());
        if (count <= 0)
            return false;
        bool const isCut = count > atMost;
        ssize_t const passed = isCut ? atMost : count;
        for (ssize_t done = 0; done < passed;) {
            ssize_t const written =
                send(to, bytes.data() + done, static_cast<std::size_t>(passed - done), MSG_NOSIGNAL);
            if (written <= 0)
                return false;
            done += written;
        }
        if (atMost != LONG_MAX)
            rest_ = isCut ? LONG_MAX : atMost - count;
        return !isCut;
    }

    sockaddr_un server_;
    int listening_;
    std::atomic<bool> isEnding_{false};
    std::atomic<bool> losesAnswer_{false};
    std::atomic<long> rest_{LONG_MAX};
    std::thread accepting_;
    /// One for each connection, made by the one that accepts them.
    std::vector<std::thread> passing_;
};

} // namespace KivArchive
