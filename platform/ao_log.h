#pragma once
// Logging of the add-on interface library.

#ifdef __cplusplus
extern "C" {
#endif

// Levels the plug-in uses.
enum {
  kAoLogFailure = 2,   // a failure that stops an operation
  kAoLogDegraded = 3,  // a degraded result
  kAoLogNotice = 5,    // notices and per-element read errors
};

// printf-style message at the given level; the framework decides what to show.
void AoLog(int level, const char* format, ...) __attribute__((format(printf, 2, 3)));

#ifdef __cplusplus
}
#endif
