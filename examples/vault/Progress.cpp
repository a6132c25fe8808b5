#include "Progress.h"

#include <iostream>
#include <unistd.h>

namespace vault {

namespace {

constexpr auto patience = std::chrono::milliseconds(200);
constexpr std::uint64_t mebibyte = std::uint64_t{1024} * 1024;

} // namespace

Progress::Progress(std::string label)
    : label_(std::move(label)), isTerminal_(isatty(STDERR_FILENO) == 1), nextShow_(Clock::now() + patience) {}

Progress::~Progress() {
    Erase();
}

void Progress::Step(std::uint64_t bytes) {
    ++steps_;
    bytes_ += bytes;
    if (!isTerminal_ || Clock::now() < nextShow_)
        return;
    Erase();
    std::cerr << label_ << ": " << steps_ << ", " << bytes_ / mebibyte << " MiB" << std::flush;
    isShown_ = true;
    nextShow_ = Clock::now() + patience;
}

void Progress::Say(std::string_view line) {
    Erase();
    isShown_ = false;
    std::cerr << "vault: " << line << '\n';
}

void Progress::Erase() const {
    if (isShown_)
        std::cerr << "\r\x1b[K" << std::flush;
}

} // namespace vault
