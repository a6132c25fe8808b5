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
    if (isShown_)
        std::cerr << "\r\x1b[K" << std::flush;
}

void Progress::Step(std::uint64_t bytes) {
    ++steps_;
    bytes_ += bytes;
    if (IsDue())
        Show(label_ + ": " + std::to_string(steps_) + ", " + std::to_string(bytes_ / mebibyte) + " MiB");
}

bool Progress::Report(KivArchive::Progress const& progress) {
    if (IsDue())
        Show(label_ + ": " + progress.step + ' ' + std::to_string(progress.done) +
             (progress.total == 0 ? "" : " of " + std::to_string(progress.total)));
    return true;
}

bool Progress::IsDue() const {
    return isTerminal_ && Clock::now() >= nextShow_;
}

void Progress::Show(std::string const& line) {
    std::cerr << "\r\x1b[K" << line << std::flush;
    isShown_ = true;
    nextShow_ = Clock::now() + patience;
}

} // namespace vault
