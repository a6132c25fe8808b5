#pragma once

/// @file
/// Independent work on several threads.

#include "Compression.h"

#include <atomic>
#include <exception>
#include <mutex>
#include <thread>
#include <vector>

namespace KivArchive {

/// Calls `work(index, compressor)` for every index below @p count, on up to @p workers threads, this one among them; 0
/// stands for as many as there are processors.
/// @throws what a call throws; calls that have not begun by then are left out
template <class Work>
void ForEachInParallel(std::size_t count, unsigned workers, Compressor& own, Work const& work) {
    std::atomic<std::size_t> next{0};
    std::exception_ptr failure;
    std::mutex failureMutex;
    auto const run = [&](Compressor& compressor) {
        try {
            for (std::size_t index = next++; index < count; index = next++)
                work(index, compressor);
        } catch (...) {
            next = count;
            std::scoped_lock const lock(failureMutex);
            failure = std::current_exception();
        }
    };
    std::vector<std::thread> helpers;
    std::size_t const useful =
        std::min<std::size_t>(workers == 0 ? std::thread::hardware_concurrency() : workers, count);
    try {
        for (std::size_t i = 1; i < useful; ++i)
            helpers.emplace_back([&run, &next, count, &failure, &failureMutex] {
                try {
                    Compressor compressor;
                    run(compressor);
                } catch (...) {
                    next = count;
                    std::scoped_lock const lock(failureMutex);
                    failure = std::current_exception();
                }
            });
    } catch (...) {
        // Without some of the helpers it only takes longer.
    }
    run(own);
    for (std::thread& helper : helpers)
        helper.join();
    if (failure)
        std::rethrow_exception(failure);
}

} // namespace KivArchive
