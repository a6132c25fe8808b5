#pragma once

/// @file
/// One connection to the server, and round trips on it.

#include "Compression.h"
#include "postgres/Parameters.h"
#include "postgres/Statements.h"

#include <atomic>
#include <bitset>
#include <chrono>
#include <exception>
#include <optional>
#include <string>

namespace KivArchive::Postgres {

/// The connection is gone, or the server too busy for one; trying again may help. What was under way is not known.
struct ConnectionLost final : std::exception {
    explicit ConnectionLost(std::string why) : sentence(std::move(why)) {}
    [[nodiscard]] const char* what() const noexcept override { return sentence.c_str(); }

    std::string sentence;
};

/// The server has refused a statement, and nothing of its transaction has happened.
struct Refused final : std::exception {
    Refused(std::size_t where, std::string what, std::string why)
        : position(where), code(std::move(what)), sentence(std::move(why)) {}
    [[nodiscard]] const char* what() const noexcept override { return sentence.c_str(); }

    /// Which one of its round trip it was, counted from 0.
    std::size_t position;
    /// The five characters that SQL has for it.
    std::string code;
    std::string sentence;
};

/// Where the archive is, and what no sentence about it may show.
class Address {
public:
    /// @throws ArchiveError if @p text is no connection string
    explicit Address(std::string const& text);

    [[nodiscard]] std::string const& Text() const noexcept { return text_; }
    /// For failures: without a password.
    [[nodiscard]] std::string const& Shown() const noexcept { return shown_; }
    /// @p sentence with every secret blotted out, on one line.
    [[nodiscard]] std::string Clean(std::string sentence) const;

private:
    std::string text_;
    std::string shown_;
    std::vector<std::string> secrets_;
};

/// Used by one thread at a time.
class Connection {
public:
    /// @param schema quoted
    /// @param roundTrips counts, and must outlive the connection
    Connection(Address const& address, std::string const& schema, std::chrono::milliseconds wait,
               std::atomic<std::uint64_t>& roundTrips);

    /// Whether it can be used by another call: everything is answered, and no transaction is open.
    [[nodiscard]] bool IsSound() const noexcept {
        return isSound_ && PQtransactionStatus(handle_.get()) == PQTRANS_IDLE;
    }

    Compressor compressor;

private:
    friend class RoundTrip;

    void Connect();
    void Prepare(Statement statement);
    void Execute(Statement statement, Parameters const& parameters);
    void Set(const char* sql);
    void Flush();
    /// The next result; null at the end of a statement's.
    [[nodiscard]] PGresult* NextResult();
    void WaitFor(bool isWriting);
    void Require(int sent);
    [[noreturn]] void Lose();

    struct Close {
        void operator()(PGconn* handle) const noexcept { PQfinish(handle); }
    };

    Address const& address_;
    std::string const& schema_;
    std::chrono::milliseconds wait_;
    std::atomic<std::uint64_t>& roundTrips_;
    std::unique_ptr<PGconn, Close> handle_;
    std::bitset<statementCount> prepared_;
    bool isSound_ = false;
};

/// Statements that go to the server together, and are answered together.
class RoundTrip {
public:
    explicit RoundTrip(Connection& connection) noexcept : connection_(connection) {}

    /// @return the position of the statement
    std::size_t Add(Statement statement, Parameters const& parameters = {});
    [[nodiscard]] std::size_t Count() const noexcept { return count_; }

    /// What the statements gave, by their positions. One failure leaves out all that come after it.
    /// @throws Refused, ConnectionLost
    std::vector<Rows> Run();

private:
    struct Sent {
        Statement statement;
        bool isPreparation;
    };

    void Prepare(Statement statement);
    /// Sends what was added, and takes what it gives. @return the failure, if there was one
    [[nodiscard]] std::optional<Refused> Exchange(std::vector<Rows>& results);
    /// Takes the results of one that was sent. @return a failure; none as well if an earlier one has left it out
    [[nodiscard]] std::optional<Refused> Take(Sent const& sent, std::vector<Rows>& results);

    Connection& connection_;
    std::vector<Sent> sent_;
    std::bitset<statementCount> preparing_;
    std::size_t count_ = 0;
};

} // namespace KivArchive::Postgres
