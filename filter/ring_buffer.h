#pragma once
// The input-buffer ring: input media buffers pulled from the upstream filter
// wait here in arrival order until every acquired output channel has moved
// past them. The ring holds at most RingSize - 1 buffers (one slot stays
// empty so that RingTail == RingHead means empty).

#include <cstdint>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"

constexpr int kWaitRoom = 0;       // WaitForPool: there is room for one more buffer
constexpr int kWaitAdded = 1;      // another thread added a buffer meanwhile
constexpr int kWaitGaveUp = -1;    // stopped, or the condition wait failed

inline int32_t RingNext(const MkvContext* context, int32_t slot) { return (slot + 1) % context->RingSize; }
inline bool RingEmpty(const MkvContext* context) { return context->RingTail == context->RingHead; }
inline bool RingFull(const MkvContext* context) { return RingNext(context, context->RingHead) == context->RingTail; }

// Caller holds RingLock. Pulls one buffer from the upstream filter into the
// head slot: the upstream answer, 256 when a buffer arrived. Does not check
// for room (WaitForPool first).
[[nodiscard]] int AddToPool(MkvChannel* input, MkvContext* context);
// Caller holds RingLock, which the wait releases meanwhile: kWait... above.
[[nodiscard]] int WaitForPool(MkvContext* context);
// Caller holds RingLock: the channel has used up its current input buffer.
void MoveOnAndFreeBuffer(MkvChannelState* state, MkvFilter* filter);
// Gives back, from the tail, the buffers no channel needs any more; with
// flush, every buffer, and every output channel's cursors and parse state are
// reset to the head. Takes RingLock. 0.
int ReleaseInputBuffer(MkvFilter* filter, uint32_t flush);
// "MediaFlush": StateLock, then ReleaseInputBuffer(filter, 1). 0.
int Flush(MkvFilter* filter);
