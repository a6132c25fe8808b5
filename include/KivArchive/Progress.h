#pragma once

/// @file
/// How long operations report how far they are, and how a host stops them.

#include "KivArchive/Export.h"

#include <cstdint>

namespace KivArchive {

/// How far a long operation is.
struct Progress {
    /// A few words for a person, such as "storing objects"; valid during the call only.
    const char* step = "";
    std::uint64_t done = 0;
    /// 0 while it is not known.
    std::uint64_t total = 0;
};

/// A host's view of long operations. Called on the thread that called the operation, one call at a time, with no lock
/// held, some times a second at most for large work and once for each batch of small work.
class KIVARCHIVE_EXPORT IProgress {
public:
    virtual ~IProgress();

    /// @return false to stop: the operation then throws `ArchiveError` of kind `Failure::Cancelled`.
    /// What it throws passes through the operation, which leaves everything as a failure does.
    virtual bool Report(Progress const& progress) = 0;

protected:
    IProgress() = default;
    IProgress(IProgress const&) = default;
    IProgress& operator=(IProgress const&) = default;
};

} // namespace KivArchive
