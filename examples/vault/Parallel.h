#pragma once

#include <algorithm>
#include <atomic>
#include <exception>
#include <mutex>
#include <thread>
#include <vector>

namespace vault {

[[nodiscard]] inline unsigned WorkerCount() noexcept {
    return std::clamp(std::thread::hardware_concurrency(), 1U, 8U);
}

/// Calls @p work once on each of several threads, this one among them, and waits for all.
/// @throws what one of the calls has thrown
template <class Work>
void InParallel(Work const& work, unsigned workers = WorkerCount()) {
    std::exception_ptr failure;
    std::mutex mutex;
    const auto run = [&] {
        try {
            work();
        } catch (...) {
            const std::scoped_lock lock(mutex);
            failure = std::current_exception();
        }
    };
    std::vector<std::thread> helpers;
    try {
        while (helpers.size() + 1 < workers)
            helpers.emplace_back(run);
    } catch (std::exception const&) {
        // With fewer helpers it only takes longer.
    }
    run();
    for (auto& helper : helpers)
        helper.join();
    if (failure)
        std::rethrow_exception(failure);
}

} // namespace vault
