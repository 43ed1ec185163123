#include "filter/ring_buffer.h"

#include <cstring>

#include "platform/ao_log.h"
#include "platform/media_buffer.h"
#include "platform/mmf_status.h"

namespace {

// Caller holds RingLock.
void ReleaseFromTail(MkvContext* context, uint32_t flush) {
  while (context->RingTail != context->RingHead) {
    RingSlot& slot = context->Ring[context->RingTail];
    if (slot.use_count != 0 && !flush) break;
    if (slot.buffer) (void)MmfReleaseMra(slot.buffer);
    slot.buffer = nullptr;
    slot.use_count = 0;
    context->RingTail = RingNext(context, context->RingTail);
    pthread_cond_broadcast(&context->RingCond);
  }
}

void ResetChannel(MkvChannelState* state, int32_t head) {
  state->ReadSlot = head;
  state->ReadBuffer = nullptr;
  state->ReadHandle = nullptr;
  state->ReadElement = 0;
  std::memset(&state->inbuff1, 0, sizeof state->inbuff1);
  state->AheadSlot = head;
  state->AheadBuffer = nullptr;
  state->AheadHandle = nullptr;
  state->AheadElement = 0;
  std::memset(&state->inbuff2, 0, sizeof state->inbuff2);
  state->FrameSplit = 0;
  state->SkipBytes = 0;
  state->FrameIndex = 0;
  state->BlockActive = 0;
  state->ParsePending = 0;
  destroy_mkvcluster(&state->Cluster);
  std::memset(&state->Cluster, 0, sizeof state->Cluster);
}

// Caller holds RingLock.
void ReleaseLocked(MkvFilter* filter, uint32_t flush) {
  MkvContext* context = filter->Context;
  if (!context->Ring) return;
  ReleaseFromTail(context, flush);
  if (!flush || !filter->OutputChannels) return;
  for (int32_t i = 0; i < context->OutputChannelCount; ++i) {
    if (filter->OutputChannels[i].State) ResetChannel(filter->OutputChannels[i].State, context->RingHead);
  }
}

}  // namespace

int AddToPool(MkvChannel* input, MkvContext* context) {
  if (!context->MediaOutput || !context->MediaOutput->NextBuffer) return kMmfNotAvailable;
  RingSlot& slot = context->Ring[context->RingHead];
  int result = context->MediaOutput->NextBuffer(input->Peer, &slot.buffer);
  if (result != kMmfBufferDelivered) return result;
  slot.use_count = static_cast<uint8_t>(context->AcquiredChannelCount);
  context->RingHead = RingNext(context, context->RingHead);
  return kMmfBufferDelivered;
}

int WaitForPool(MkvContext* context) {
  for (;;) {
    const int32_t head = context->RingHead;
    if (!RingFull(context)) return kWaitRoom;
    if (LoadControlState(context) == kControlStopped) return kWaitGaveUp;
    if (pthread_cond_wait(&context->RingCond, &context->RingLock) != 0) return kWaitGaveUp;
    if (context->RingHead != head) return kWaitAdded;
  }
}

namespace {

// Whether a buffer is still held by a slot between the tail and the head.
bool InRing(const MkvContext* context, const MmfMra* buffer) {
  if (!buffer) return false;
  for (int32_t slot = context->RingTail; slot != context->RingHead; slot = RingNext(context, slot)) {
    if (context->Ring[slot].buffer == buffer) return true;
  }
  return false;
}

}  // namespace

void MoveOnAndFreeBuffer(MkvChannelState* state, MkvFilter* filter) {
  MkvContext* context = filter->Context;
  state->ReadElement = 0;
  RingSlot& slot = context->Ring[state->ReadSlot];
  if (slot.use_count != 0) --slot.use_count;
  if (state->ReadSlot == context->RingHead) {
    AoLog(kAoLogFailure, "kelvane butting up against the head.");
    state->ReadBuffer = state->AheadBuffer;
    // The ahead view may still name a buffer the other channels have since
    // given back: reading it again would parse recycled memory and, as its
    // slot stays at the head, go round this step for ever. With no live
    // buffer left the channel starts afresh from the ring once it refills.
    if (!InRing(context, state->AheadBuffer)) {
      state->ReadBuffer = nullptr;
      state->AheadBuffer = nullptr;
      state->ReadHandle = nullptr;
      state->AheadHandle = nullptr;
    }
  } else {
    state->ReadSlot = RingNext(context, state->ReadSlot);
    state->ReadBuffer = context->Ring[state->ReadSlot].buffer;
  }
  ReleaseLocked(filter, 0);
}

int ReleaseInputBuffer(MkvFilter* filter, uint32_t flush) {
  MkvContext* context = filter->Context;
  pthread_mutex_lock(&context->RingLock);
  ReleaseLocked(filter, flush);
  pthread_mutex_unlock(&context->RingLock);
  return kMmfOk;
}

int Flush(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  pthread_mutex_lock(&context->StateLock);
  (void)ReleaseInputBuffer(filter, 1);
  pthread_mutex_unlock(&context->StateLock);
  return kMmfOk;
}
