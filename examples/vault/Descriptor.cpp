#include "Descriptor.h"

#include "Problem.h"
#include "Text.h"

#include <cerrno>
#include <system_error>

namespace vault {

void ThrowSystemProblem(std::string const& what, std::string const& path) {
    const auto reason = std::generic_category().message(errno);
    throw Problem(what + " " + Printable(path) + ": " + reason);
}

} // namespace vault
