#pragma once
// The framework's filter handle: eight words that the plug-in makes in Create
// and the framework passes back to every operation. The framework fills Graph
// and the two reserved words; the plug-in owns the rest.

#include <stdint.h>

#include "platform/channel.h"

#ifdef __cplusplus
extern "C" {
#endif

enum { kMmfFilterKind = 2 };

typedef struct MmfGraph MmfGraph;

typedef struct MmfFilterHandle {
  uint32_t Kind;  // kMmfFilterKind
  char* Name;
  MmfChannel* InputChannel;
  MmfChannel* OutputChannels;  // an array
  void* Context;               // the plug-in's
  void* Reserved5;             // framework
  MmfGraph* Graph;             // framework: the graph the instance belongs to
  void* Reserved7;             // framework
} MmfFilterHandle;

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfFilterHandle> && std::is_trivially_copyable_v<MmfFilterHandle>);
static_assert(sizeof(MmfFilterHandle) == 8 * sizeof(void*), "eight words");
static_assert(__builtin_offsetof(MmfFilterHandle, Graph) == 6 * sizeof(void*));
#endif
