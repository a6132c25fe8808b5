#pragma once

/// @file
/// How long-running operations report how far they are, and how a host stops them.

#include "KivArchive/Export.h"

#include <cstdint>

namespace KivArchive {

/// How far a long-running operation is.
struct Progress {
    /// A few words for a person, such as "storing objects"; valid during the call only.
    const char* step = "";
    std::uint64_t done = 0;
    /// 0 while it is not known.
    std::uint64_t total = 0;
};

/// Receives the progress of long-running operations. Called on the thread that called the operation, one call at a
/// time, with no lock held: for large work at most a few times a second, for small work once for each batch.
class KIVARCHIVE_EXPORT IProgress {
public:
    virtual ~IProgress();

    /// What this throws passes through the operation, which leaves everything as after a failure.
    /// @return false to stop: the operation then throws `ArchiveError` of kind `Failure::Cancelled`
    virtual bool Report(Progress const& progress) = 0;

protected:
    IProgress() = default;
    IProgress(IProgress const&) = default;
    IProgress& operator=(IProgress const&) = default;
};

} // namespace KivArchive
