#pragma once

#include <string>
#include <unistd.h>
#include <utility>

namespace vault {

/// Owns a file descriptor.
class Descriptor {
public:
    explicit Descriptor(int descriptor = -1) noexcept : descriptor_(descriptor) {}
    Descriptor(Descriptor&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    Descriptor& operator=(Descriptor&& other) noexcept {
        std::swap(descriptor_, other.descriptor_);
        return *this;
    }
    ~Descriptor() {
        if (IsOpen())
            close(descriptor_);
    }

    [[nodiscard]] bool IsOpen() const noexcept { return descriptor_ >= 0; }
    [[nodiscard]] int Get() const noexcept { return descriptor_; }
    /// Somebody else closes it from now on.
    void Release() noexcept { descriptor_ = -1; }
    /// Closes it now. @return whether everything written arrived
    [[nodiscard]] bool Close() noexcept { return close(std::exchange(descriptor_, -1)) == 0; }

private:
    int descriptor_;
};

/// @throws Problem with the reason why the last system call failed
[[noreturn]] void ThrowSystemProblem(std::string const& what, std::string const& path);

} // namespace vault
