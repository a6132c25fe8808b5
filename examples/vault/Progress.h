#pragma once

#include <KivArchive/Progress.h>
#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace vault {

/// Shows on standard error how far long work has come, on one line that disappears at the end; silent unless that is a
/// terminal.
class Progress final : public KivArchive::IProgress {
public:
    explicit Progress(std::string label);
    Progress(Progress const&) = delete;
    Progress& operator=(Progress const&) = delete;
    ~Progress() override;

    /// One more thing done, of @p bytes bytes.
    void Step(std::uint64_t bytes = 0);
    bool Report(KivArchive::Progress const& progress) override;

private:
    using Clock = std::chrono::steady_clock;

    [[nodiscard]] bool IsDue() const;
    void Show(std::string const& line);

    std::string label_;
    bool isTerminal_;
    bool isShown_ = false;
    std::uint64_t steps_ = 0;
    std::uint64_t bytes_ = 0;
    Clock::time_point nextShow_;
};

} // namespace vault
