#pragma once

namespace KivUtils {

/// Has the processor fetch the line of memory at @p address, which is read soon and need not be readable.
inline void Prefetch([[maybe_unused]] const void* address) noexcept {
#if defined(__GNUC__)
    __builtin_prefetch(address);
#endif
}

/// The same for a line that is written soon, which takes as long to come.
inline void PrefetchToWrite([[maybe_unused]] const void* address) noexcept {
#if defined(__GNUC__)
    __builtin_prefetch(address, 1);
#endif
}

} // namespace KivUtils
