#pragma once
// "MediaOutput": listing, acquiring and releasing the output channels, and
// fixing their formats and buffer pools. Per channel: acquire, then set the
// format (once per channel lifetime), then the pool.

#include <cstdint>

#include "filter/mkv_filter.h"
#include "platform/interfaces.h"

// A record counted for a track that was left out at the rating (an
// encrypted one) has no track and cannot play: every operation on it answers
// 4044, "not available", logged, and touches nothing. True, after logging,
// when `channel` (which may be null) is such a record.
bool LogWithoutTrack(const MkvChannel* channel, const char* operation);
[[nodiscard]] inline bool RefusedWithoutTrack(const MkvChannel* channel, const char* operation) {
  if (!channel || channel->Direction != kMmfDirectionOutput || !channel->State || channel->State->Track) return false;
  return LogWithoutTrack(channel, operation);
}

// The channel at *iterator, advancing it; null for a null argument or past the end.
MkvChannel* IterateOutputChannels(MkvFilter* filter, int32_t* iterator);

// 0 or the read-list allocation's error; 22 null; 4013 already acquired.
// A failed read-list allocation leaves the channel acquired.
[[nodiscard]] int AcquireOutputChannel(MkvChannel* channel);

// Frees the channel's pool, frame-prefix buffer and the instance's read list.
// 0; 22 null; 4015 not acquired. The format stays set.
[[nodiscard]] int ReleaseOutputChannel(MkvChannel* channel);

// 100 and a copy of the channel's format with the buffer count raised by the
// ring and the extra buffers; 0 past the last channel; 22 for a null argument.
[[nodiscard]] int IterateOutputFormats(MkvChannel* channel, MmfMediaFormat* format, int32_t* iterator);

// 100 when the two formats' buffer sizes are equal, else 0.
[[nodiscard]] int VerifyOutputFormat(const MkvChannel* channel, const MmfMediaFormat* a, const MmfMediaFormat* b);

// 0; 22 null; 4014 not acquired; 4016 already set.
[[nodiscard]] int SetOutputFormat(MkvChannel* channel, const MmfMediaFormat* format);

// The result of the MRA pool allocation; 22 null; 4014 not acquired; 4017 no format set.
[[nodiscard]] int SetOutputChannelMemoryPool(MkvChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param);
