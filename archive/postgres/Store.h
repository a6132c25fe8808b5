#pragma once

/// @file
/// What the operations of `PostgresArchive` share.

#include "Items.h"
#include "KivArchive/PostgresArchive.h"
#include "postgres/Connection.h"
#include "postgres/RecentRows.h"

#include <mutex>

namespace KivArchive::Postgres {

/// Rows that are no objects but kept as what others are differences to have a type that is higher by this.
inline constexpr std::int64_t removedTypes = 8;

/// A number that the server keeps with a transaction, so that one whose answer is lost can be looked up.
using Token = std::array<std::byte, 16>;

/// The pauses between attempts.
class Attempts {
public:
    explicit Attempts(PostgresOptions const& options, bool isFirstConnection) noexcept
        : options_(options), isFirstConnection_(isFirstConnection) {}

    /// Waits before the next attempt. @return false if it is time to give up
    [[nodiscard]] bool WaitAfterLoss();
    [[nodiscard]] bool WaitAfterConflict();

private:
    using Clock = std::chrono::steady_clock;

    bool Wait(std::chrono::milliseconds atMost);

    PostgresOptions const& options_;
    bool isFirstConnection_;
    Clock::time_point const begin_ = Clock::now();
    unsigned count_ = 0;
};

/// What is behind one `PostgresArchive`.
class Store {
public:
    Store(std::string const& address, PostgresOptions const& options);

    /// Calls `work(connection)`, again and again while the connection is lost or the server finds no order of the
    /// transactions. So @p work may have been done before, if it changes something.
    template <class Work>
    auto Run(Work work) {
        if (isFirstConnection_)
            Open();
        return RunOpened(work);
    }

    /// Stores @p items with the rest of @p change, which has no objects of its own.
    [[nodiscard]] ChangeOutcome Apply(std::vector<Item> const& items, Change const& change);

    [[nodiscard]] std::string const& Shown() const noexcept { return address_.Shown(); }
    [[nodiscard]] PostgresOptions const& Options() const noexcept { return options_; }
    [[nodiscard]] std::uint64_t RoundTrips() const noexcept { return roundTrips_; }
    [[nodiscard]] std::string const& Schema() const noexcept { return schema_; }
    /// Another one each time, here and anywhere.
    [[nodiscard]] Token MakeToken() noexcept;

    [[noreturn]] void ThrowDamaged(std::string const& what) const;
    [[noreturn]] void ThrowRefused(Refused const& refused) const;

private:
    /// A connection for the time of a call.
    class Lease {
    public:
        explicit Lease(Store& store) : store_(store), connection_(store.Take()) {}
        Lease(Lease const&) = delete;
        Lease& operator=(Lease const&) = delete;
        ~Lease() { store_.GiveBack(std::move(connection_)); }

        Connection& operator*() const noexcept { return *connection_; }

    private:
        Store& store_;
        std::unique_ptr<Connection> connection_;
    };

    template <class Work>
    auto RunOpened(Work work) {
        Attempts attempts(options_, isFirstConnection_);
        for (;;) {
            try {
                Lease const connection(*this);
                return work(*connection);
            } catch (ConnectionLost const& lost) {
                DropConnections();
                if (!attempts.WaitAfterLoss())
                    ThrowUnreachable(lost);
            } catch (Refused const& refused) {
                if (!IsConflict(refused) || !attempts.WaitAfterConflict())
                    ThrowRefused(refused);
            } catch (Malformed const&) {
                ThrowDamaged("Something");
            }
        }
    }

    /// Makes sure of the tables.
    void Open();
    [[nodiscard]] std::unique_ptr<Connection> Take();
    void GiveBack(std::unique_ptr<Connection> connection) noexcept;
    void DropConnections() noexcept;
    [[nodiscard]] static bool IsConflict(Refused const& refused) noexcept;
    [[noreturn]] void ThrowUnreachable(ConnectionLost const& lost) const;

    Address address_;
    PostgresOptions options_;
    std::string schema_;
    std::atomic<std::uint64_t> roundTrips_{0};
    std::uint64_t tokens_;
    std::atomic<std::uint64_t> tokenCount_{0};
    /// Until the tables have been looked at.
    std::atomic<bool> isFirstConnection_{true};
    std::mutex opening_;
    std::mutex mutex_;
    std::vector<std::unique_ptr<Connection>> idle_;
    RecentRows recent_;
};

/// Makes the tables if there are none and that is wanted, and makes sure that they are ours.
void EnsureSchema(Connection& connection, Store const& store);

/// Whether a refused transaction had been committed by an earlier attempt: its token is there.
[[nodiscard]] bool IsRepeated(Refused const& refused, std::size_t positionOfToken) noexcept;

} // namespace KivArchive::Postgres
