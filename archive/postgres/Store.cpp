#include "postgres/Store.h"

#include <algorithm>
#include <cstring>
#include <random>
#include <thread>

namespace KivArchive::Postgres {

namespace {

/// Connections kept for the next call.
constexpr std::size_t maximumIdle = 8;

constexpr std::string_view uniqueViolation = "23505";

std::string Quoted(std::string const& name) {
    std::string quoted = "\"";
    for (char const character : name)
        quoted.append(character == '"' ? 2 : 1, character);
    return quoted + "\"";
}

Failure KindOf(std::string const& code) {
    struct Kind {
        std::string_view beginning;
        Failure kind;
    };
    static constexpr std::array<Kind, 11> kinds{{
        {"42501", Failure::ReadOnly},
        {"25006", Failure::ReadOnly},
        {"53100", Failure::DiskFull},
        {"40", Failure::Locked},
        {"55P03", Failure::Locked},
        {"57014", Failure::Locked},
        {"XX001", Failure::Damaged},
        {"XX002", Failure::Damaged},
        {"42", Failure::Foreign},
        {"3F", Failure::Foreign},
        {"22", Failure::Foreign},
    }};
    auto const* const found = std::find_if(kinds.begin(), kinds.end(),
                                           [&code](Kind const& kind) { return code.starts_with(kind.beginning); });
    return found == kinds.end() ? Failure::Unavailable : found->kind;
}

const char* SentenceOf(Failure kind) {
    switch (kind) {
    case Failure::ReadOnly:
        return "The role may read this archive, not write to it";
    case Failure::DiskFull:
        return "The database has no room left";
    case Failure::Locked:
        return "Others have kept this archive busy for too long";
    case Failure::Damaged:
        return "The database is damaged";
    case Failure::Foreign:
        return "Somebody has changed the tables of this archive";
    default:
        return "The database cannot do it";
    }
}

/// What a store's tokens begin with, which no other store's do.
std::uint64_t MakeBeginningOfTokens() {
    std::random_device random;
    return std::uniform_int_distribution<std::uint64_t>()(random);
}

} // namespace

bool Attempts::WaitAfterLoss() {
    if (isFirstConnection_)
        return false;
    return Wait(options_.reconnect);
}

bool Attempts::WaitAfterConflict() {
    return Wait(options_.wait);
}

bool Attempts::Wait(std::chrono::milliseconds atMost) {
    constexpr unsigned maximumDoublings = 8;
    if (Clock::now() - begin_ > atMost)
        return false;
    // Twice as long each time, and never as long as others: those who got into each other's way must not meet again.
    thread_local std::minstd_rand random(std::random_device{}());
    int const longest = 4 << std::min(count_++, maximumDoublings);
    std::this_thread::sleep_for(std::chrono::milliseconds(std::uniform_int_distribution(longest / 4, longest)(random)));
    return true;
}

Store::Store(std::string const& address, PostgresOptions const& options)
    : address_(address), options_(options), schema_(Quoted(options.schema)), tokens_(MakeBeginningOfTokens()) {
    idle_.reserve(maximumIdle);
    if (!options.connectsLater)
        Open();
}

void Store::Open() {
    std::scoped_lock const lock(opening_);
    if (!isFirstConnection_)
        return;
    RunOpened([this](Connection& connection) { EnsureSchema(connection, *this); });
    isFirstConnection_ = false;
}

std::unique_ptr<Connection> Store::Take() {
    {
        std::scoped_lock const lock(mutex_);
        if (!idle_.empty()) {
            auto taken = std::move(idle_.back());
            idle_.pop_back();
            return taken;
        }
    }
    return std::make_unique<Connection>(address_, schema_, options_.wait, roundTrips_);
}

void Store::GiveBack(std::unique_ptr<Connection> connection) noexcept {
    if (!connection->IsSound())
        return;
    std::scoped_lock const lock(mutex_);
    if (idle_.size() < maximumIdle)
        idle_.push_back(std::move(connection));
}

void Store::DropConnections() noexcept {
    // What ended one has most likely ended all.
    std::scoped_lock const lock(mutex_);
    idle_.clear();
}

bool Store::IsConflict(Refused const& refused) noexcept {
    return refused.code.starts_with("40");
}

Token Store::MakeToken() noexcept {
    std::array const words{tokens_, ++tokenCount_};
    Token token{};
    std::memcpy(token.data(), words.data(), token.size());
    return token;
}

void Store::ThrowUnreachable(ConnectionLost const& lost) const {
    throw ArchiveError(Failure::Unavailable, Shown(),
                       "The database " + Shown() + " cannot be reached: " + lost.sentence + ".");
}

void Store::ThrowRefused(Refused const& refused) const {
    Failure const kind = KindOf(refused.code);
    throw ArchiveError(kind, Shown(), std::string(SentenceOf(kind)) + " (" + Shown() + "): " + refused.sentence + ".");
}

void Store::ThrowDamaged(std::string const& what) const {
    throw ArchiveError(Failure::Damaged, Shown(), what + " is damaged in " + Shown() + ".");
}

bool IsRepeated(Refused const& refused, std::size_t positionOfToken) noexcept {
    return refused.code == uniqueViolation && refused.position == positionOfToken;
}

} // namespace KivArchive::Postgres
