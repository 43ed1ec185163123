#pragma once
// Pools of media buffers (MRAs) for an output channel.

#include <stdint.h>

#include "platform/channel.h"
#include "platform/media_buffer.h"

#ifdef __cplusplus
extern "C" {
#endif

// Makes a pool for the channel: as many media buffers as the buffer count of
// the channel's format (at least one), each with room for `capacity` elements.
// 0, 22 for a null argument or a capacity of 0, 12 when out of memory.
int MmfAllocateMraPool(MmfMraPool** pool, MmfChannel* channel, uint32_t capacity);
// Frees the pool. Media buffers still acquired stay valid until released;
// the pool goes away with the last of them. 0, or 22.
int MmfFreeMraPool(MmfMraPool* pool);

#ifdef __cplusplus
}
#endif
