#include "filter/mkv_context.h"
#include "filter/output_channels.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"

namespace {

constexpr uint32_t kOutputMraCapacity = 600;
// Output buffers beyond the ring: one being filled and one being consumed.
constexpr int32_t kBuffersBeyondRing = 2;

}  // namespace

int IterateOutputFormats(MkvChannel* channel, MmfMediaFormat* format, int32_t* iterator) {
  if (!channel || !format || !iterator || !channel->Filter) return kMmfInvalidArgument;
  const MkvContext* context = channel->Filter->Context;
  // Each channel has one format, yet the walk is as long as the channel list.
  if (*iterator < 0 || *iterator >= context->OutputChannelCount) return 0;
  ++*iterator;
  *format = channel->Format;
  format->buffer_count += static_cast<uint32_t>(context->RingSize + kBuffersBeyondRing + context->ExtraBufferCount);
  return kMmfFormatMatch;
}

int VerifyOutputFormat(const MkvChannel* channel, const MmfMediaFormat* a, const MmfMediaFormat* b) {
  if (!channel || !a || !b) return 0;
  return a->buffer_size == b->buffer_size ? kMmfFormatMatch : 0;
}

int SetOutputFormat(MkvChannel* channel, const MmfMediaFormat* format) {
  if (!channel || !format) return kMmfInvalidArgument;
  if (!(channel->Flags & kChannelAcquired)) return kMmfOutputNotAcquired;
  if (channel->Flags & kChannelFormatSet) return kMmfFormatAlreadySet;
  channel->Format = *format;
  channel->Flags |= kChannelFormatSet;
  return kMmfOk;
}

int SetOutputChannelMemoryPool(MkvChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param) {
  if (!channel || !pool || !param || !channel->Filter || !channel->State) return kMmfInvalidArgument;
  if (!(channel->Flags & kChannelAcquired)) return kMmfOutputNotAcquired;
  if (!(channel->Flags & kChannelFormatSet)) return kMmfFormatNotSet;
  MkvChannelState* state = channel->State;
  state->OutPool = pool;
  state->OutPoolParam = param;
  return MmfAllocateMraPool(&state->MraPool, AsFrameworkChannel(channel), kOutputMraCapacity);
}
