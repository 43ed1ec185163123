#pragma once
// The graph a filter belongs to: its parameters and its clock.

#include <stdint.h>

#include "platform/filter_handle.h"

#ifdef __cplusplus
extern "C" {
#endif

// Bits of the graph's flags word.
enum { kMmfGraphMetadataFromStream = 1 };  // metadata blocks keep a link to their input stream

// 0 and the graph's flags word; 22 for a null argument.
int MmfGetGraphParams(MmfGraph* graph, uint32_t* flags);

typedef struct MmfClock MmfClock;

typedef struct MmfClockOps {
  void* Reserved0;
  void* Reserved1;
  void* Reserved2;
  void* Reserved3;
  // The clock's media time in microseconds. `which` 1 = the time of the
  // frames consumed so far; the other arguments are 0.
  uint64_t (*GetTime)(MmfClock* clock, uint32_t reserved, uint32_t which, uint32_t a, uint32_t b, uint32_t c);
} MmfClockOps;

// 0 and the graph's clock with its operations; 22 for a null argument.
int MmfGetGraphClock(MmfGraph* graph, MmfClock** clock, const MmfClockOps** ops);

#ifdef __cplusplus
}  // extern "C"
static_assert(__builtin_offsetof(MmfClockOps, GetTime) == 4 * sizeof(void*), "time is the fifth operation");
#endif
