#pragma once

/// @file
/// What the program holds, counted by its own operator new and delete, which the library uses too.

#include <cstdint>

namespace KivVcs::Bench {

/// Counts from now on, or no longer. While it does not, taking and giving back memory costs what it always costs.
void CountMemory(bool counted) noexcept;
[[nodiscard]] bool CountsMemory() noexcept;

/// The usable bytes of all blocks taken while they were counted, less those given back.
[[nodiscard]] std::int64_t LiveBytes() noexcept;

/// The most that `LiveBytes` has been since `ForgetPeak`.
[[nodiscard]] std::int64_t PeakBytes() noexcept;
void ForgetPeak() noexcept;

/// Keeps what is given back within the process, for the next one to take, as in a host that has run for a while.
void KeepFreedMemory();

/// Lets the allocator do now what it has put off when much was given back.
void SettleFreedMemory();

/// The most memory that the process has occupied since `ForgetResidentPeak`, in bytes; 0 where the system does not
/// know.
[[nodiscard]] std::int64_t PeakResidentBytes();
/// Gives back to the system what is not used, and forgets.
void ForgetResidentPeak();

} // namespace KivVcs::Bench
