#pragma once

/// @file
/// The one exception of the archive.

#include "KivArchive/Export.h"

#include <cstdint>
#include <stdexcept>
#include <string>

namespace KivArchive {

/// What went wrong, for a host that acts on it.
enum class Failure : std::uint8_t {
    DiskFull,        ///< No room on the disk, or a quota.
    ReadOnly,        ///< The archive can be read, but not written.
    Locked,          ///< Somebody else held a lock longer than the host is willing to wait.
    Unavailable,     ///< The archive cannot be opened, or reading or writing it fails.
    Foreign,         ///< Not an archive, or one whose schema somebody has changed.
    NewerFormat,     ///< An archive written by a later release.
    Damaged,         ///< Stored bytes have changed since they were stored, or are gone.
    Unrepresentable, ///< Sound, but nothing that this archive can store, or this library can show.
    Collected,       ///< An object that the call relies on has been collected; the host begins again.
    Cancelled,       ///< The host's progress callback asked to stop.
};

/// Thrown by every operation of an archive that cannot do what it promises. Nothing of the operation is visible then:
/// no branch has moved, no record has changed.
class KIVARCHIVE_EXPORT ArchiveError : public std::runtime_error {
public:
    /// @param file the archive's file or address; empty for one in memory
    /// @param sentence what happened, as one sentence for a person
    ArchiveError(Failure kind, std::string file, std::string const& sentence);
    ArchiveError(ArchiveError const&) = default;
    ArchiveError& operator=(ArchiveError const&) = default;
    ~ArchiveError() override;

    [[nodiscard]] Failure GetKind() const noexcept { return kind_; }
    [[nodiscard]] std::string const& GetFile() const noexcept { return file_; }

private:
    Failure kind_;
    std::string file_;
};

} // namespace KivArchive
