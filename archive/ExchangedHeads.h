#pragma once

/// @file
/// The records that hold the heads exchanged last.

#include "KivArchive/Upkeep.h"

namespace KivArchive {

[[nodiscard]] Record RecordOf(ExchangedHead const& head);

} // namespace KivArchive
