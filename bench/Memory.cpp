#include "Memory.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <limits>
#include <malloc.h>
#include <new>
#include <string>

namespace {

// Plain integers: the benchmarks run on one thread, and an atomic would be paid for in every time measured.
bool counting = false;
std::int64_t live = 0;
std::int64_t peak = 0;

} // namespace

void* operator new(std::size_t size) {
    void* const block = std::malloc(size);
    if (block == nullptr)
        throw std::bad_alloc();
    if (counting) {
        live += static_cast<std::int64_t>(malloc_usable_size(block));
        peak = std::max(peak, live);
    }
    return block;
}

void operator delete(void* block) noexcept {
    if (counting)
        live -= static_cast<std::int64_t>(malloc_usable_size(block));
    std::free(block);
}

void operator delete(void* block, std::size_t) noexcept {
    operator delete(block);
}

namespace KivVcs::Bench {

void CountMemory(bool counted) noexcept {
    counting = counted;
}

bool CountsMemory() noexcept {
    return counting;
}

std::int64_t LiveBytes() noexcept {
    return live;
}

std::int64_t PeakBytes() noexcept {
    return peak;
}

void ForgetPeak() noexcept {
    peak = live;
}

void KeepFreedMemory() {
    mallopt(M_MMAP_MAX, 0);
    mallopt(M_TRIM_THRESHOLD, std::numeric_limits<int>::max());
}

void SettleFreedMemory() {
    // A block that is no small one makes it join those that are free.
    constexpr std::size_t large = 1 << 20;
    ::operator delete(::operator new(large));
}

std::int64_t PeakResidentBytes() {
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with("VmHWM:"))
            return std::stoll(line.substr(6)) * 1024;
    }
    return 0;
}

void ForgetResidentPeak() {
    malloc_trim(0);
    std::ofstream("/proc/self/clear_refs") << "5";
}

} // namespace KivVcs::Bench
