#include "postgres/Connection.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <poll.h>

namespace KivArchive::Postgres {

namespace {

std::string NameOf(Statement statement) {
    return "kivarchive" + std::to_string(static_cast<unsigned>(statement));
}

std::string FieldOf(PGresult const* result, int field) {
    const char* const value = PQresultErrorField(result, field);
    return value == nullptr ? std::string() : value;
}

/// Whether the server ends the connection with a failure of this code.
bool EndsConnection(std::string const& code) {
    return code.starts_with("57P") || code.starts_with("08");
}

} // namespace

Connection::Connection(Address const& address, std::string const& schema, std::chrono::milliseconds wait,
                       std::atomic<std::uint64_t>& roundTrips)
    : address_(address), schema_(schema), wait_(wait), roundTrips_(roundTrips) {
    Connect();
    // What others have put into schemas of the database must not be taken for what the statements mean.
    Set("SET search_path = pg_catalog");
    Set(("SET lock_timeout = " + std::to_string(wait.count())).c_str());
    // Every statement looks rows up by their keys. Plans that are made while tables are small would read them whole for as
    // long as the connection lasts, and planning anew takes longer than what is planned.
    Set("SET enable_seqscan = off");
    Set("SET plan_cache_mode = force_generic_plan");
    Set("SET jit = off");
    PQenterPipelineMode(handle_.get());
}

void Connection::Connect() {
    constexpr int expandAddress = 1;
    std::array<const char*, 4> const keywords{"fallback_application_name", "client_encoding", "dbname", nullptr};
    std::array<const char*, 4> const values{"KivArchive", "UTF8", address_.Text().c_str(), nullptr};
    handle_.reset(PQconnectStartParams(keywords.data(), values.data(), expandAddress));
    if (handle_ == nullptr)
        throw std::bad_alloc();
    // Otherwise the library prints what the server remarks.
    PQsetNoticeReceiver(
        handle_.get(), [](void* /*context*/, PGresult const* /*notice*/) {}, nullptr);
    auto state = PQstatus(handle_.get()) == CONNECTION_BAD ? PGRES_POLLING_FAILED : PGRES_POLLING_WRITING;
    for (; state != PGRES_POLLING_OK; state = PQconnectPoll(handle_.get())) {
        if (state == PGRES_POLLING_FAILED)
            Lose();
        WaitFor(state == PGRES_POLLING_WRITING);
    }
    isSound_ = true;
    PQsetnonblocking(handle_.get(), 1);
}

void Connection::Set(const char* sql) {
    // An engine that does not have the setting does without.
    Require(PQsendQuery(handle_.get(), sql));
    Flush();
    while (PGresult* const result = NextResult())
        PQclear(result);
}

void Connection::Prepare(Statement statement) {
    Require(PQsendPrepare(handle_.get(), NameOf(statement).c_str(), TextOf(statement, schema_).c_str(), 0, nullptr));
}

void Connection::Execute(Statement statement, Parameters const& parameters) {
    std::vector<const char*> values;
    std::vector<int> sizes;
    values.reserve(parameters.Count());
    sizes.reserve(parameters.Count());
    for (std::size_t i = 0; i < parameters.Count(); ++i) {
        ByteView const value = parameters.At(i);
        // Without an address it would stand for NULL.
        values.push_back(value.empty() ? "" : reinterpret_cast<const char*>(value.data()));
        sizes.push_back(static_cast<int>(value.size()));
    }
    constexpr int binary = 1;
    std::vector<int> const formats(values.size(), binary);
    Require(PQsendQueryPrepared(handle_.get(), NameOf(statement).c_str(), static_cast<int>(values.size()),
                                values.data(), sizes.data(), formats.data(), binary));
}

void Connection::Require(int sent) {
    if (sent == 0)
        Lose();
}

void Connection::Lose() {
    isSound_ = false;
    std::string const why = PQerrorMessage(handle_.get());
    throw ConnectionLost(address_.Clean(why.empty() ? "the connection was closed" : why));
}

void Connection::WaitFor(bool isWriting) {
    pollfd descriptor{PQsocket(handle_.get()), static_cast<short>(isWriting ? POLLIN | POLLOUT : POLLIN), 0};
    // A server that waits for a lock gives up before.
    auto const answerTime = static_cast<int>(std::min<std::int64_t>(2 * wait_.count(), INT_MAX));
    int const ready = poll(&descriptor, 1, answerTime);
    if (ready < 0 && errno == EINTR)
        return;
    if (ready <= 0) {
        isSound_ = false;
        throw ArchiveError(Failure::Unavailable, address_.Shown(),
                           "The database " + address_.Shown() + " does not answer.");
    }
}

void Connection::Flush() {
    for (;;) {
        int const state = PQflush(handle_.get());
        if (state == 0)
            return;
        if (state < 0)
            Lose();
        WaitFor(true);
        if (PQconsumeInput(handle_.get()) == 0)
            Lose();
    }
}

PGresult* Connection::NextResult() {
    while (PQisBusy(handle_.get()) != 0) {
        WaitFor(false);
        if (PQconsumeInput(handle_.get()) == 0)
            Lose();
    }
    PGresult* const result = PQgetResult(handle_.get());
    if (result == nullptr && PQstatus(handle_.get()) == CONNECTION_BAD)
        Lose();
    return result;
}

void RoundTrip::Prepare(Statement statement) {
    auto const number = static_cast<std::size_t>(statement);
    if (connection_.prepared_[number] || preparing_[number])
        return;
    connection_.Prepare(statement);
    sent_.push_back({statement, true});
    preparing_[number] = true;
}

std::size_t RoundTrip::Add(Statement statement, Parameters const& parameters) {
    // Until all is answered: whoever is interrupted leaves the connection where nobody can go on.
    connection_.isSound_ = false;
    Prepare(statement);
    connection_.Execute(statement, parameters);
    sent_.push_back({statement, false});
    return count_++;
}

std::optional<Refused> RoundTrip::Take(Sent const& sent, std::vector<Rows>& results) {
    PGresult* const result = connection_.NextResult();
    if (result == nullptr)
        connection_.Lose();
    Rows rows(result);
    std::optional<Refused> refused;
    ExecStatusType const status = PQresultStatus(result);
    if (status == PGRES_COMMAND_OK || status == PGRES_TUPLES_OK) {
        if (sent.isPreparation)
            connection_.prepared_[static_cast<std::size_t>(sent.statement)] = true;
        else
            results.push_back(std::move(rows));
    } else if (status != PGRES_PIPELINE_ABORTED) {
        std::string const code = FieldOf(result, PG_DIAG_SQLSTATE);
        if (code.empty() || EndsConnection(code))
            connection_.Lose();
        refused.emplace(results.size(), code, connection_.address_.Clean(FieldOf(result, PG_DIAG_MESSAGE_PRIMARY)));
    }
    if (PGresult* const further = connection_.NextResult()) {
        PQclear(further);
        connection_.Lose();
    }
    return refused;
}

std::optional<Refused> RoundTrip::Exchange(std::vector<Rows>& results) {
    connection_.Require(PQpipelineSync(connection_.handle_.get()));
    ++connection_.roundTrips_;
    connection_.Flush();
    std::optional<Refused> failure;
    for (Sent const& sent : sent_)
        if (auto refused = Take(sent, results))
            failure = std::move(refused);
    PGresult* const end = connection_.NextResult();
    bool const isEnd = PQresultStatus(end) == PGRES_PIPELINE_SYNC;
    PQclear(end);
    if (!isEnd)
        connection_.Lose();
    sent_.clear();
    preparing_.reset();
    count_ = 0;
    connection_.isSound_ = true;
    return failure;
}

std::vector<Rows> RoundTrip::Run() {
    std::vector<Rows> results;
    auto const failure = Exchange(results);
    if (!failure)
        return results;
    if (PQtransactionStatus(connection_.handle_.get()) == PQTRANS_INERROR) {
        Add(Statement::Rollback);
        static_cast<void>(Exchange(results));
    }
    throw Refused(*failure);
}

} // namespace KivArchive::Postgres
