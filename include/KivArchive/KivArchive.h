#pragma once

/// @file
/// The whole archive.

#include "KivArchive/ArchiveError.h"
#include "KivArchive/ArchivedBlob.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/CachingArchive.h"
#include "KivArchive/IArchive.h"
#include "KivArchive/Listings.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Merging.h"
#include "KivArchive/Progress.h"
#include "KivArchive/SqliteArchive.h"
#include "KivArchive/TextLines.h"
#include "KivArchive/Upkeep.h"
