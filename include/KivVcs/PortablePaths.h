#pragma once

/// @file
/// Paths that every file system can hold, for hosts that write versions to disks.

#include "KivVcs/Tree.h"

#include <vector>

namespace KivVcs {

/// Why a path cannot be written to every disk.
enum class PathProblemKind : std::int32_t {
    /// There is no component.
    Empty = 0,
    /// "." or "..", which lead elsewhere.
    RelativeName = 1,
    /// A control character or one of < > : " | ? * and the backslash.
    ReservedCharacter = 2,
    /// A name of a device, such as CON, NUL.txt or COM1, in any case.
    ReservedName = 3,
    /// The last character is a dot or a blank, which some systems drop.
    TrailingDotOrBlank = 4,
    /// More than 255 bytes of UTF-8.
    LongName = 5,
    /// A surrogate without its other half.
    NotUnicode = 6,
};

struct PathProblem {
    PathProblemKind kind = PathProblemKind::Empty;
    /// The component at fault; empty where there is none.
    KivStringT<char16_t> component;
};

/// The first thing that keeps @p path, split at "/" with empty components dropped, from being written to disks of
/// common systems (Linux, macOS, Windows); nothing if every component is fine. Whether the whole path is too long
/// depends on where it is written, and is not checked.
/// @throws std::bad_alloc
[[nodiscard]] KIVVCS_EXPORT optional<PathProblem> PortablePathProblem(KivStringViewT<char16_t> path);

/// The paths, of files and directories, that a disk which ignores case cannot keep apart: each group has at least two
/// names of one directory that differ in case only, by Unicode's simple case folding whatever the locale, in their
/// order. The groups are ordered by their first paths. A directory that is named more than once is searched, and
/// reported, once. Names that differ only in how an accent is composed are no collision here, although some disks take
/// them for one.
/// @complexity proportional to the entries of all distinct directories
/// @throws std::bad_alloc; std::length_error for a path that is longer than a text can be
[[nodiscard]] KIVVCS_EXPORT std::vector<PathList> FindCaseCollisions(cow_ptr<Tree> const& tree);

} // namespace KivVcs
