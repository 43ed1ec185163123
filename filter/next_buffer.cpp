// "MediaOutput" NextBuffer: one output media buffer per call, filled from the
// input-buffer ring until it is nearly full or the input runs dry.

#include "core/cluster/cluster_status.h"
#include "core/cluster/unlaced_block.h"
#include "filter/events.h"
#include "filter/output_assembly.h"
#include "filter/output_elements.h"
#include "filter/ring_buffer.h"
#include "filter/time_converter.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"

namespace {

constexpr uint32_t kControlInputShort = 4;
constexpr uint32_t kControlFirstRunning = 64;
constexpr uint32_t kControlFirstHalted = 32;

// How a step of the walk ends the call.
enum class Walk { kGoOn, kDeliver, kEnd };

struct Call {
  MkvFilter* filter;
  MkvContext* context;
  MkvChannelState* state;
  MkvChannel* input;
  int r = kMmfBufferDelivered;  // the result the call ends with after a full walk
  int end = 0;                  // Walk::kEnd: the result
  bool fresh = false;           // the first buffer element of this pass is already in inbuff1
};

// ControlState is one word that every writer stores atomically: a load sees a
// whole, recent value without taking StateLock, once per call and per input buffer.
uint32_t ReadControlState(const MkvContext* context) { return LoadControlState(context); }

// Step 14. End of stream is not stored: the other channels still deliver what
// they have in the ring, and the upstream answers it again to each of them.
int EndWith(Call& call, int result) {
  MkvContext* context = call.context;
  if (result != kMmfEndOfStream) {
    pthread_mutex_lock(&context->StateLock);
    if (context->ControlState != kControlStopped) StoreControlState(context, static_cast<uint32_t>(result));
    pthread_mutex_unlock(&context->StateLock);
  }
  if (call.state->OutMra) (void)MmfReleaseMra(call.state->OutMra);
  call.state->OutMra = nullptr;
  return result;
}

Walk Ending(Call& call, int result) {
  pthread_mutex_unlock(&call.context->RingLock);
  call.end = result;
  return Walk::kEnd;
}

// Once posted, the flag stays set: only a call that may still have to post
// takes StateLock to decide.
void PostMetadataEvent(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  mkv_metadata_list* metadata = context->Metadata;
  if (!metadata || __atomic_load_n(&metadata->event_posted, __ATOMIC_ACQUIRE) != 0) return;
  pthread_mutex_lock(&context->StateLock);
  if (metadata->event_posted == 0) {
    __atomic_store_n(&metadata->event_posted, 1, __ATOMIC_RELEASE);
    MmfEventPost post = context->EventPost;
    pthread_mutex_unlock(&context->StateLock);
    if (post) post(AsFrameworkHandle(filter), kMetadataEvent, metadata->event_data, sizeof metadata->event_data);
    pthread_mutex_lock(&context->StateLock);
  }
  pthread_mutex_unlock(&context->StateLock);
}

// An answer of the upstream filter passed on, rather than one of NextBuffer's own.
bool IsUpstreamAnswer(int result) {
  return result != kNextBufferError && result != kNextBufferInputShort && result != kNextBufferStopped;
}

bool InputJumped(const MkvChannelState* state) {
  return state->inbuff2.buff_fileoff != state->inbuff1.buff_fileoff + state->inbuff1.buff_size;
}

// The upstream had nothing after inbuff1: inbuff1 is still parsed, with an
// empty next view, and the next call asks the upstream again.
void NoNextView(MkvChannelState* state) {
  const mkvinbuff& in = state->inbuff1;
  state->inbuff2 = mkvinbuff{nullptr, 0, 0, 0, in.buff_fileoff + in.buff_size};
  state->AheadHandle = nullptr;
}

// Step 9: both cursors onto the oldest buffer this channel has not read.
Walk FreshStart(Call& call) {
  MkvContext* context = call.context;
  MkvChannelState* state = call.state;
  if (RingEmpty(context)) {
    int wait = WaitForPool(context);
    if (wait == kWaitGaveUp) return Ending(call, kNextBufferStopped);
    if (wait == kWaitRoom) {
      int result = AddToPool(call.input, context);
      if (result != kMmfBufferDelivered) {
        state->ReadBuffer = nullptr;
        state->AheadBuffer = nullptr;
        return Ending(call, result);
      }
    }
  }
  state->AheadBuffer = context->Ring[state->AheadSlot].buffer;
  state->AheadElement = -1;
  int result = UpdateNextIOV(call.input, state, context);
  if (result != kMmfBufferDelivered) {
    state->ReadBuffer = nullptr;
    return Ending(call, result);
  }
  state->ReadSlot = state->AheadSlot;
  state->ReadBuffer = state->AheadBuffer;
  state->ReadHandle = state->AheadHandle;
  state->inbuff1 = state->inbuff2;
  state->ReadElement = 0;
  result = UpdateNextIOV(call.input, state, context);
  if (result == kNextBufferStopped) {
    state->ReadBuffer = nullptr;
    return Ending(call, result);
  }
  if (result != kMmfBufferDelivered) NoNextView(state);
  call.fresh = true;
  return Walk::kGoOn;
}

// The current block in inbuff1: delivered when it is the channel's track, else skipped.
int DeliverOrSkip(Call& call, uint32_t* count) {
  MkvChannelState* state = call.state;
  if (state->Cluster.track_number == state->Track->track_number) return ProcessBlock(state, call.context, count);
  DropBlock(state);
  return 0;
}

// Step 11: parse inbuff1. kDeliver when the output filled up before inbuff1 was used up.
Walk ParseBuffer(Call& call) {
  MkvChannelState* state = call.state;
  mkvinbuff& in = state->inbuff1;
  uint32_t count = 0;
  int error = 0;
  ApplySkip(state);
  while (error == 0 && in.buff_left != 0) {
    if (OutputNearlyFull(state)) {
      state->ParsePending = 1;
      pthread_mutex_unlock(&call.context->RingLock);
      return Walk::kDeliver;
    }
    if (state->BlockActive) {
      error = DeliverOrSkip(call, &count);
      if (error == 0 && state->BlockActive && in.buff_left != 0) {  // stopped for room
        state->ParsePending = 1;
        pthread_mutex_unlock(&call.context->RingLock);
        return Walk::kDeliver;
      }
      continue;
    }
    destroy_mkvcluster(&state->Cluster);
    // Most blocks are unlaced with their header whole in inbuff1, and most
    // belong to other channels: those are passed over by the header alone.
    uint64_t data_left = 0;
    switch (take_unlaced_block(&in, &state->Cluster, state->Track->track_number, &data_left)) {
      case unlaced_block_result::other_track:
        state->FrameIndex = 0;
        state->SkipBytes = data_left;
        ApplySkip(state);
        continue;
      case unlaced_block_result::own_track:
        state->BlockActive = 1;
        state->FrameIndex = 0;
        continue;
      case unlaced_block_result::parse:
        break;
    }
    const bool with_next = !(state->ScanMode && InputJumped(state));
    const uint64_t before = in.buff_fileoff + in.buff_pos;
    int parsed = parse_mkvcluster(&in, with_next ? &state->inbuff2 : nullptr, &state->Cluster, &state->SkipBytes);
    if (parsed == kClusterBlockReady) {
      state->BlockActive = 1;
      state->FrameIndex = 0;
      continue;
    }
    if (!with_next) {
      state->SkipBytes = in.buff_left;
      ApplySkip(state);
      continue;
    }
    // The parser waits for the bytes after inbuff1: the read goes on with the
    // next buffer. (One that waits while inbuff1 still holds bytes, a CodecState
    // longer than both views, cannot go on: -1 below.)
    if (mkvcluster_answer(&state->Cluster, parsed) == cluster_answer::need_more_data && in.buff_left == 0) break;
    if (parsed == kClusterChildShort) {
      MoveOnAndFreeBuffer(state, call.filter);
      state->ReadBuffer = nullptr;
      state->AheadBuffer = nullptr;
      return Ending(call, kNextBufferInputShort);
    }
    if (parsed == kClusterSkip) {
      state->SendSkipMark = 1;
      if (in.buff_left == 0) continue;
      // A zero-size element is skipped whole by its header: nothing more to pass over.
      if (state->SkipBytes == 0 && in.buff_fileoff + in.buff_pos == before) {
        AoLog(kAoLogFailure, "kelvane No cluster found, but no skip bytes.");
        call.r = kNextBufferError;
        break;
      }
      ApplySkip(state);
      continue;
    }
    AoLog(kAoLogFailure, "kelvane header parsing error %d.", parsed);
    call.r = kNextBufferError;
    break;
  }
  if (error != 0) {
    AoLog(kAoLogFailure, "kelvane error occurred during processing. err = %d", error);
    return Ending(call, kNextBufferError);
  }
  return Walk::kGoOn;
}

// Step 10, one buffer element of ReadBuffer.
Walk BufferElement(Call& call) {
  MkvChannelState* state = call.state;
  uint8_t* address = nullptr;
  uint32_t size = 0;
  MmfPoolBuffer* viewed = state->ReadHandle;
  int error = MmfGetMraBufferElement(state->ReadBuffer, static_cast<uint32_t>(state->ReadElement), &state->ReadHandle,
                                     &address, &size);
  if (error != 0) {
    AoLog(kAoLogFailure, "kelvane line %d MmfGetMraBufferElement() failed err = %d", 2053, error);
    return Ending(call, kNextBufferError);
  }
  // A fresh pass that bailed out before its first buffer element left that
  // element in inbuff1 already: it is parsed where it stands.
  if (!call.fresh && viewed == state->ReadHandle && address == state->inbuff1.buff) call.fresh = true;
  if (call.fresh) {
    call.fresh = false;  // later buffer elements of this input buffer come through inbuff2
  } else {
    if (state->ReadHandle != state->AheadHandle) {
      AoLog(kAoLogFailure, "kelvane current and next buffers are out of sync. ");
      return Ending(call, kNextBufferError);
    }
    if (state->ScanMode && InputJumped(state)) {
      destroy_mkvcluster(&state->Cluster);
      state->Cluster = mkvcluster{};
      state->FrameIndex = 0;
      state->SkipBytes = 0;
      state->BlockActive = 0;
    }
    state->inbuff1 = state->inbuff2;
    int result = UpdateNextIOV(call.input, state, call.context);
    if (result == kNextBufferStopped) {
      state->ReadBuffer = nullptr;
      return Ending(call, result);
    }
    if (result != kMmfBufferDelivered) NoNextView(state);
  }
  return ParseBuffer(call);
}

// Step 10, one property element of ReadBuffer.
Walk PropertyElement(Call& call) {
  MkvChannelState* state = call.state;
  if (state->OutIndex + 1 >= state->OutMra->Capacity) {
    AoLog(kAoLogNotice, "kelvane bailing out of MRA processing.  We don't have enough MRA elements.");
    pthread_mutex_unlock(&call.context->RingLock);
    return Walk::kDeliver;
  }
  uint32_t type = 0, low = 0;
  uint16_t high = 0;
  if (MmfGetMraPropertyElement(state->ReadBuffer, static_cast<uint32_t>(state->ReadElement), &type, &low, &high) != 0) {
    return Walk::kGoOn;
  }
  const uint64_t value = MmfPropertyValue(low, high);
  if (type == kMmfPropTimeMarker) {
    state->FrameSplit = 0;
    uint64_t position = 0, start = value;
    if (ConvertToPosition(call.filter, value, &position) == 0) (void)ConvertToTime(call.filter, position, &start);
    state->StartTime = start;
    state->SendStartTime = 1;
    state->ScanMode = LoadTrickMode(call.context) != 0;
    return Walk::kGoOn;
  }
  if (int error = SetOutProperty(state, type, value); error != 0) {
    AoLog(kAoLogFailure, "kelvane line %d MmfSetMraPropertyElement() failed err = %d ", 2039, error);
    return Ending(call, kNextBufferError);
  }
  return Walk::kGoOn;
}

// Steps 9 and 10 under RingLock; every path out releases it.
Walk WalkInput(Call& call) {
  MkvChannelState* state = call.state;
  pthread_mutex_lock(&call.context->RingLock);
  if (!state->ReadBuffer && !state->AheadBuffer) {
    if (Walk w = FreshStart(call); w != Walk::kGoOn) return w;
  }
  if (state->ParsePending) {
    state->ParsePending = 0;
    if (Walk w = ParseBuffer(call); w != Walk::kGoOn) return w;
    ++state->ReadElement;
  }
  uint32_t kind = 0;
  while (state->ReadBuffer &&
         MmfGetMraElementType(state->ReadBuffer, static_cast<uint32_t>(state->ReadElement), &kind) == 0) {
    Walk w = Walk::kGoOn;
    if (kind == kMmfElementProperty) w = PropertyElement(call);
    else if (kind == kMmfElementBuffer) w = BufferElement(call);
    if (w != Walk::kGoOn) return w;
    ++state->ReadElement;
  }
  MoveOnAndFreeBuffer(state, call.filter);
  pthread_mutex_unlock(&call.context->RingLock);
  if (call.r != kMmfBufferDelivered) {
    call.end = call.r;
    return Walk::kEnd;
  }
  return Walk::kGoOn;
}

}  // namespace

int NextBuffer(MkvChannel* channel, MmfMra** out) {
  MkvFilter* filter = channel->Filter;
  MkvContext* context = filter->Context;
  MkvChannelState* state = channel->State;
  state->OutMra = nullptr;
  state->OutIndex = 0;
  *out = nullptr;

  PostMetadataEvent(filter);
  const uint32_t control = ReadControlState(context);
  if (control != kControlInputShort && control < kControlFirstRunning) return static_cast<int>(control);

  Call call{filter, context, state, filter->InputChannel};
  if (PrepareFramePrefix(state, context) != kMmfOk) return EndWith(call, kNextBufferError);
  if (MmfAcquireMra(state->MraPool, &state->OutMra, 0) != 0) {
    AoLog(kAoLogFailure, "kelvane->MmfAcquireMra() failed");
    state->OutMra = nullptr;
    (void)ReleaseInputBuffer(filter, 0);
    return kNextBufferError;
  }
  if (state->DecoderConfigSent == 0 && state->DecoderConfigCount != 0) {
    int result = DeliverDecoderConfig(state);
    if (result == kMmfBufferDelivered) *out = state->OutMra;
    return result;
  }
  for (;;) {
    const uint32_t now = ReadControlState(context);
    if (now < kControlFirstHalted && now != kControlInputShort) break;
    Walk w = WalkInput(call);
    if (w == Walk::kDeliver) break;
    if (w == Walk::kEnd) {
      // What is filled goes out first; the upstream gives its answer again to the next call.
      if (IsUpstreamAnswer(call.end) && state->OutIndex > 0) break;
      return EndWith(call, call.end);
    }
  }
  *out = state->OutMra;
  return kMmfBufferDelivered;
}
