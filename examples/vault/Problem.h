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

/// The command was carried out as far as that was possible: damage, conflicts, files that were not saved or restored.
inline constexpr int findingsExitStatus = 1;
/// A listing was cut off.
inline constexpr int cutOffExitStatus = 3;

} // namespace vault
