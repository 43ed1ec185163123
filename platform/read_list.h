#pragma once
// Read lists: how a list maker (the parser during trick play) tells the
// upstream streamer which byte ranges to read. A list holds a ring of entries;
// each entry carries its requests. In list mode the streamer reads only the
// ranges of requests and asks the list maker for the next entry; a request
// length of -1 ends the stream.

#include <stdint.h>

#include "platform/channel.h"

#ifdef __cplusplus
extern "C" {
#endif

typedef struct MmfReadRequest {
  uint32_t Flags;     // 0
  uint32_t Reserved;
  uint64_t Position;  // byte offset in the file
  uint64_t Time;      // media time, microseconds
  int32_t Length;     // bytes to read; kMmfReadEndOfStream ends the stream
  uint32_t Reserved2;
} MmfReadRequest;

enum { kMmfReadEndOfStream = -1 };

typedef struct MmfReadListEntry {
  uint32_t Index;         // place in the list's ring
  uint32_t RequestCount;  // requests at Request
  uint32_t Ready;         // 1 once the list maker has filled the entry
  uint32_t Reserved;
  MmfReadRequest* Request;
} MmfReadListEntry;

typedef struct MmfReadList MmfReadList;

// Makes a list of `entry_count` entries with `request_count` requests each for
// the input channel of the list maker (whose Peer is the streamer's output).
// 0, 22 for a null argument or a count of 0, 12 when out of memory.
int MmfAllocateReadlist(MmfReadList** list, MmfChannel* channel, uint32_t entry_count, uint32_t request_count);
// 0, or 22. Switches the streamer back to normal streaming if the list drove it.
int MmfFreeReadlist(MmfReadList* list);
// Takes the next entry of the ring, cleared (Ready 0, requests zero). 0, or 22.
int MmfAcquireReadList(MmfReadList* list, MmfReadListEntry** entry);
// mode 1: the streamer reads only the requests of the list; 0: normal
// streaming. The streamer starts with the entry last acquired. 0, 22 for a
// null list, 4044 when the list's channel is connected to no streamer.
int MmfStreamerSetListMode(MmfReadList* list, uint32_t mode);

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfReadRequest> && std::is_trivially_copyable_v<MmfReadRequest>);
static_assert(__builtin_offsetof(MmfReadRequest, Position) == 8 && __builtin_offsetof(MmfReadRequest, Time) == 16 &&
              __builtin_offsetof(MmfReadRequest, Length) == 24 && sizeof(MmfReadRequest) == 32);
static_assert(std::is_standard_layout_v<MmfReadListEntry> && std::is_trivially_copyable_v<MmfReadListEntry>);
static_assert(__builtin_offsetof(MmfReadListEntry, Ready) == 8, "ready mark is the third word");
static_assert(__builtin_offsetof(MmfReadListEntry, Request) == 16, "request pointer is the fifth word");
#endif
