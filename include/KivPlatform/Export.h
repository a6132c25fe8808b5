#pragma once

/// @file
/// Symbol visibility of the shared library. `KIVVCS_STATIC` is defined by the build when the library is linked
/// statically, `KIVVCS_BUILDING` only while the library itself is compiled.

#if defined(KIVVCS_STATIC)
#define KIVVCS_EXPORT
#elif defined(_WIN32)
#if defined(KIVVCS_BUILDING)
#define KIVVCS_EXPORT __declspec(dllexport)
#else
#define KIVVCS_EXPORT __declspec(dllimport)
#endif
#else
#define KIVVCS_EXPORT __attribute__((visibility("default")))
#endif
