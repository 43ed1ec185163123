#include "filter/input_channel.h"

#include "filter/mkv_context.h"
#include "platform/mmf_status.h"

int SetInputFormat(MkvChannel* channel, const MmfMediaFormat* format) {
  if (!channel || !format) return kMmfInvalidArgument;
  if (!(channel->Flags & kChannelAcquired)) return kMmfChannelNotAcquired;
  if (channel->Flags & kChannelMediaOutputSet) return kMmfMediaOutputSet;
  channel->Format = *format;
  return kMmfOk;
}

int SetMediaOutput(MkvChannel* channel, const MmfMediaOutputOps* upstream) {
  if (!channel || !upstream || !channel->Filter) return kMmfInvalidArgument;
  channel->Filter->Context->MediaOutput = upstream;
  channel->Flags |= kChannelMediaOutputSet;
  return kMmfOk;
}

int SetInputChannelMemoryPool(MkvChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param) {
  if (!channel || !pool || !param || !channel->Filter) return kMmfInvalidArgument;
  if (!(channel->Flags & kChannelAcquired)) return kMmfChannelNotAcquired;
  if (!(channel->Flags & kChannelMediaOutputSet)) return kMmfMediaOutputNotSet;
  MkvContext* context = channel->Filter->Context;
  context->InputPool = pool;
  context->InputPoolParam = param;
  return kMmfOk;
}
