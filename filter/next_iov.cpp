// The Ahead cursor: inbuff2 views the buffer element after the one in
// inbuff1, in the same input media buffer or a later slot of the ring.

#include "filter/output_assembly.h"
#include "filter/ring_buffer.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"

namespace {

// Views the next buffer element of AheadBuffer after AheadElement: true when found.
bool ViewNextElement(MkvChannelState* state) {
  if (!state->AheadBuffer) return false;
  uint64_t offset = 0;
  uint32_t kind = 0;
  for (int32_t i = state->AheadElement + 1; MmfGetMraElementType(state->AheadBuffer, static_cast<uint32_t>(i), &kind) == 0;
       ++i) {
    if (kind == kMmfElementProperty) {
      uint32_t type = 0, low = 0;
      uint16_t high = 0;
      if (MmfGetMraPropertyElement(state->AheadBuffer, static_cast<uint32_t>(i), &type, &low, &high) == 0 &&
          type == kMmfPropFileOffset) {
        offset = MmfPropertyValue(low, high);
      }
      continue;
    }
    if (kind != kMmfElementBuffer) continue;
    MmfPoolBuffer* handle = nullptr;
    uint8_t* address = nullptr;
    uint32_t size = 0;
    int error = MmfGetMraBufferElement(state->AheadBuffer, static_cast<uint32_t>(i), &handle, &address, &size);
    if (error != 0) {
      AoLog(kAoLogDegraded, "kelvane line %d MmfGetMraBufferElement() failed err = %d", 1650, error);
      return false;
    }
    state->inbuff2 = mkvinbuff{address, size, 0, size, offset};
    state->AheadHandle = handle;
    state->AheadElement = i;
    return true;
  }
  return false;
}

}  // namespace

int UpdateNextIOV(MkvChannel* input, MkvChannelState* state, MkvContext* context) {
  while (!ViewNextElement(state)) {
    if (state->AheadSlot != context->RingHead) {
      state->AheadElement = -1;
      state->AheadSlot = RingNext(context, state->AheadSlot);
    }
    if (state->AheadSlot == context->RingHead) {
      int wait = WaitForPool(context);
      if (wait == kWaitGaveUp) return kNextBufferStopped;
      if (wait == kWaitRoom) {
        int result = AddToPool(input, context);
        if (result != kMmfBufferDelivered) {
          state->AheadBuffer = nullptr;
          return result;
        }
      }
      state->AheadElement = -1;  // a buffer that just arrived is walked from its first element
    }
    state->AheadBuffer = context->Ring[state->AheadSlot].buffer;
  }
  return kMmfBufferDelivered;
}
