#include "KivUtils/Time.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <limits>

namespace KivUtils {

namespace {

constexpr std::int64_t ticksPerSecond = 10'000'000;

bool LocalCalendarTime(std::int64_t seconds, std::tm& calendar) noexcept {
    const auto time = static_cast<std::time_t>(seconds);
    if (time != seconds)
        return false;
#if defined(_WIN32)
    return localtime_s(&calendar, &time) == 0;
#else
    // Unlike localtime, localtime_r need not notice that the process has changed its time zone. Where it has none of its
    // own, looking for a change of the system's would ask the file system for every commit; that is done once after the
    // process has given up its own, of which the C library keeps no memory that could be asked.
    static constinit std::atomic<bool> hadZone{true};
    // NOLINTNEXTLINE(concurrency-mt-unsafe): reads the environment as the functions of the C library below do
    const bool hasZone = std::getenv("TZ") != nullptr;
    if (hasZone || hadZone.load(std::memory_order_acquire)) {
        tzset();
        hadZone.store(hasZone, std::memory_order_release);
    }
    return localtime_r(&time, &calendar) != nullptr;
#endif
}

/// The seconds since 1970 of a calendar time taken as UTC.
std::int64_t SecondsOfCalendarTime(std::tm const& calendar) noexcept {
    using namespace std::chrono;
    const auto date = year(calendar.tm_year + 1900) / month(static_cast<unsigned>(calendar.tm_mon + 1)) /
                      day(static_cast<unsigned>(calendar.tm_mday));
    const std::int64_t days = sys_days(date).time_since_epoch().count();
    return ((days * 24 + calendar.tm_hour) * 60 + calendar.tm_min) * 60 + calendar.tm_sec;
}

} // namespace

Time Time::Now() noexcept {
    using ticks = std::chrono::duration<std::int64_t, std::ratio<1, ticksPerSecond>>;
    const auto sinceEpoch = std::chrono::system_clock::now().time_since_epoch();
    return Time(static_cast<std::uint64_t>(std::chrono::floor<ticks>(sinceEpoch).count()));
}

Time Time::FromTimeT(std::int64_t seconds, TimeZone) noexcept {
    constexpr std::int64_t latest = std::numeric_limits<std::int64_t>::max() / ticksPerSecond;
    return Time(static_cast<std::uint64_t>(std::clamp(seconds, -latest, latest) * ticksPerSecond));
}

std::int64_t Time::ToTimeT(TimeZone) const noexcept {
    const auto ticks = static_cast<std::int64_t>(ticks_);
    return ticks / ticksPerSecond - (ticks % ticksPerSecond < 0 ? 1 : 0);
}

TimeDelta DateTime::GetCurrentTimezoneBias(Time time) noexcept {
    const std::int64_t seconds = time.ToTimeT(TimeZone::Utc);
    std::tm calendar{};
    if (!LocalCalendarTime(seconds, calendar))
        return {};
    return TimeDelta((SecondsOfCalendarTime(calendar) - seconds) * ticksPerSecond);
}

} // namespace KivUtils
