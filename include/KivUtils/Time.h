#pragma once

/// @file
/// Points in time, differences of time and the local time zone.

#include "KivPlatform/Export.h"

#include <compare>
#include <cstdint>

namespace KivUtils {

/// How a `Time` is related to seconds since 1970: there is only UTC.
enum class TimeZone : std::int32_t { Utc = 0 };

/// A signed count of 100-nanosecond ticks.
class TimeDelta {
public:
    constexpr TimeDelta() noexcept = default;
    constexpr explicit TimeDelta(std::int64_t ticks) noexcept : ticks_(ticks) {}

    [[nodiscard]] constexpr std::int64_t GetTicks() const noexcept { return ticks_; }

    friend constexpr auto operator<=>(TimeDelta, TimeDelta) noexcept = default;

private:
    std::int64_t ticks_ = 0;
};

/// A point in time: 100-nanosecond ticks since 1970-01-01T00:00:00Z, earlier times as their two's complement.
///
/// Times compare by the unsigned value of their ticks, so that times before 1970 come after all others.
class KIVVCS_EXPORT Time {
public:
    constexpr Time() noexcept = default;
    constexpr explicit Time(std::uint64_t ticks) noexcept : ticks_(ticks) {}

    /// The current time.
    [[nodiscard]] static Time Now() noexcept;

    /// The time @p seconds after (before, if negative) 1970; seconds that ticks cannot hold (beyond the year 31197)
    /// give the nearest time that they can.
    [[nodiscard]] static Time FromTimeT(std::int64_t seconds, TimeZone) noexcept;

    /// Whole seconds since 1970, rounded down.
    [[nodiscard]] std::int64_t ToTimeT(TimeZone) const noexcept;

    [[nodiscard]] constexpr std::uint64_t GetTicks() const noexcept { return ticks_; }

    friend constexpr auto operator<=>(Time, Time) noexcept = default;

private:
    std::uint64_t ticks_ = 0;
};

namespace DateTime {

/// The offset from UTC that the local time zone has at @p time (positive east of Greenwich), to the second; zero where
/// the platform does not know it. Reads the environment, which no other thread may change meanwhile.
[[nodiscard]] KIVVCS_EXPORT TimeDelta GetCurrentTimezoneBias(Time time) noexcept;

} // namespace DateTime

} // namespace KivUtils
