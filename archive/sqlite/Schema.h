#pragma once

/// @file
/// The tables of an archive's file.

#include "sqlite/Database.h"

namespace KivArchive {

/// Makes the tables if the file is empty and @p make is true. Refuses a file that does not have exactly these.
/// @throws ArchiveError
void EnsureSchema(Database& database, bool make);

} // namespace KivArchive
