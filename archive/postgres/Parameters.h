#pragma once

/// @file
/// Values in the binary form of the protocol.

#include "Bytes.h"
#include "KivArchive/IArchive.h"

#include <libpq-fe.h>
#include <memory>
#include <optional>

namespace KivArchive::Postgres {

/// The parameters of one statement, in their order, one behind the other.
class Parameters {
public:
    Parameters& With(ByteView bytes);
    Parameters& With(Id::Digest const& digest) { return With(std::as_bytes(std::span(digest))); }
    /// Null becomes no bytes.
    Parameters& With(Id const& id);
    Parameters& With(std::int64_t number);
    Parameters& With(std::uint64_t number) { return With(static_cast<std::int64_t>(number)); }
    Parameters& With(std::string const& text);

    /// Arrays. Null identifiers become no bytes.
    Parameters& With(std::span<const Id> ids);
    Parameters& With(std::span<const ByteView> values);
    Parameters& With(std::span<const Bytes> values);
    /// Nothing becomes NULL.
    Parameters& With(std::span<const std::optional<ByteView>> values);
    Parameters& With(std::span<const std::int16_t> numbers);
    Parameters& With(std::span<const std::int64_t> numbers);

    [[nodiscard]] std::size_t Count() const noexcept { return ends_.size(); }
    [[nodiscard]] ByteView At(std::size_t number) const noexcept {
        std::size_t const begin = number == 0 ? 0 : ends_[number - 1];
        return ByteView(bytes_).subspan(begin, ends_[number] - begin);
    }

private:
    Parameters& EndOne();

    Bytes bytes_;
    std::vector<std::size_t> ends_;
};

/// What one statement gave.
class Rows {
public:
    Rows() = default;
    explicit Rows(PGresult* result) noexcept : result_(result, &PQclear) {}

    [[nodiscard]] int Count() const noexcept { return result_ == nullptr ? 0 : PQntuples(result_.get()); }
    /// Whether the statement has stored or changed a row.
    [[nodiscard]] bool HasChanged() const noexcept;
    [[nodiscard]] bool IsNull(int row, int column) const noexcept {
        return PQgetisnull(result_.get(), row, column) != 0;
    }
    /// Valid as long as this object or a copy of it lives.
    [[nodiscard]] ByteView Value(int row, int column) const noexcept;
    /// @throws Malformed, as below, if the value has another size
    [[nodiscard]] std::int64_t Number(int row, int column) const;
    /// Null for no bytes.
    [[nodiscard]] Id Identifier(int row, int column) const;

private:
    std::shared_ptr<PGresult> result_;
};

} // namespace KivArchive::Postgres
