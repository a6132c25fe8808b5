#include "KivArchive/ArchiveError.h"

#include "KivArchive/Progress.h"

#include <utility>

namespace KivArchive {

ArchiveError::ArchiveError(Failure kind, std::string file, std::string const& sentence)
    : std::runtime_error(sentence), kind_(kind), file_(std::move(file)) {}

ArchiveError::~ArchiveError() = default;

IProgress::~IProgress() = default;

} // namespace KivArchive
