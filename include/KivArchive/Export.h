#pragma once

/// @file
/// Symbol visibility of the archive's library. `KIVARCHIVE_STATIC` is defined by the build when it is linked statically.

#if defined(KIVARCHIVE_STATIC)
#define KIVARCHIVE_EXPORT
#else
#define KIVARCHIVE_EXPORT __attribute__((visibility("default")))
#endif
