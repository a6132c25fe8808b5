#pragma once

/// @file
/// What the program holds, counted by its own operator new and delete, which the library uses too.

#include <cstdint>

namespace KivVcs::Bench {

/// The usable bytes of all blocks held now.
[[nodiscard]] std::int64_t LiveBytes() noexcept;

/// The most that `LiveBytes` has been since `ForgetPeak`.
[[nodiscard]] std::int64_t PeakBytes() noexcept;
void ForgetPeak() noexcept;

/// The most memory that the process has occupied since `ForgetResidentPeak`, in bytes; 0 where the system does not tell.
[[nodiscard]] std::int64_t PeakResidentBytes();
void ForgetResidentPeak();

} // namespace KivVcs::Bench
