#include "KivArchive/PostgresArchive.h"

#include "postgres/Store.h"

namespace KivArchive {

PostgresArchive::PostgresArchive(std::string const& address, PostgresOptions const& options)
    : store_(std::make_unique<Postgres::Store>(address, options)) {}

PostgresArchive::~PostgresArchive() = default;

std::uint64_t PostgresArchive::GetRoundTrips() const noexcept {
    return store_->RoundTrips();
}

} // namespace KivArchive
