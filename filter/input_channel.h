#pragma once
// The input channel's set-up ("MediaInput"), in the framework's order:
// acquired, SetInputFormat, SetMediaOutput, SetInputChannelMemoryPool.

#include "filter/mkv_filter.h"
#include "platform/interfaces.h"

// 0; 22 a null argument; 4009 not acquired; 4011 the media output is already set.
[[nodiscard]] int SetInputFormat(MkvChannel* channel, const MmfMediaFormat* format);
// 0; 22 a null argument.
[[nodiscard]] int SetMediaOutput(MkvChannel* channel, const MmfMediaOutputOps* upstream);
// 0; 22 a null argument or a channel without filter; 4009 not acquired; 4012 no media output yet.
[[nodiscard]] int SetInputChannelMemoryPool(MkvChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param);
