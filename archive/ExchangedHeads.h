#pragma once

/// @file
/// The records in which archives keep the heads that were exchanged last.

#include "KivArchive/Upkeep.h"

namespace KivArchive {

[[nodiscard]] Record RecordOf(ExchangedHead const& head);

} // namespace KivArchive
