#pragma once

#include <stdexcept>
#include <string>

namespace vault {

/// What ends a command: one line for the user and the exit status.
class Problem : public std::runtime_error {
public:
    explicit Problem(std::string const& line, int exitStatus = 2) : std::runtime_error(line), exitStatus_(exitStatus) {}

    [[nodiscard]] int ExitStatus() const noexcept { return exitStatus_; }

private:
    int exitStatus_;
};

/// The exit status of damaged vaults and of merges that were stopped by conflicts.
inline constexpr int findingsExitStatus = 1;

} // namespace vault
