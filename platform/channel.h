#pragma once
// The framework's channel record. The plug-in lays out its channels this way
// (input and output alike); the framework fills the words reserved for it and
// reads the rest. Our framework keeps the input stream of an input channel in
// StreamLink and its own connection record in ConnectionLink.

#include <stdint.h>

#include "platform/input_stream.h"
#include "platform/media_format.h"

#ifdef __cplusplus
extern "C" {
#endif

enum {
  kMmfChannelKind = 4,
  kMmfDirectionInput = 1,
  kMmfDirectionOutput = 2,
};

struct MmfFilterHandle;

typedef struct MmfChannel {
  uint32_t Kind;       // kMmfChannelKind
  char* Name;          // owned by the plug-in
  uint32_t Direction;  // kMmfDirection...
  uint32_t Flags;      // the plug-in's
  MmfMediaFormat Format;
  struct MmfFilterHandle* Filter;  // owning filter handle
  void* StreamLink;                // framework: the input stream of an input channel
  void* ConnectionLink;            // framework: its connection record
  struct MmfChannel* Peer;         // framework: the upstream output channel of an input channel
  void* Reserved;                  // framework
  void* State;                     // the plug-in's
} MmfChannel;

// 0 and the input stream that feeds an input channel; 22 for a null argument,
// 4044 when the framework has given the channel no stream.
int MmfGetInputStream(MmfChannel* channel, MmfInputStream** stream);

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfChannel> && std::is_trivially_copyable_v<MmfChannel>);
static_assert(sizeof(void*) == 4 ? __builtin_offsetof(MmfChannel, Format) == 16 && sizeof(MmfChannel) == 1168
                                 : __builtin_offsetof(MmfChannel, Format) == 24 && sizeof(MmfChannel) == 1200,
              "channel record: four header words, the format, six words");
static_assert(__builtin_offsetof(MmfChannel, State) ==
              __builtin_offsetof(MmfChannel, Format) + sizeof(MmfMediaFormat) + 5 * sizeof(void*));
#endif
