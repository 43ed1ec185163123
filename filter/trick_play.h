#pragma once
// "MediaTrickPlay": fast forward and rewind by steering the upstream
// streamer. A scan puts the first read-list request (one cue point's cluster
// near the graph clock's time) and switches the streamer to list mode; the
// streamer then asks GetNextReadList for each further request. ScanEnd puts a
// last, normal-length request and returns the streamer to normal streaming.

#include <cstdint>

#include "filter/mkv_filter.h"

constexpr int kTrickCapabilities = 8;

// 0 and the graph clock's media time of the frames consumed (microseconds),
// or the error of MmfGetGraphClock (out not written).
[[nodiscard]] int GetCurrentTime(MkvFilter* filter, uint64_t* time);

int TrickQuery();

// 0, or the error of the clock, of MmfAcquireReadList, of the cue search (the
// no-skip path of an audio-only scan below TrickPlaySkipStartSpeed) or of
// MmfStreamerSetListMode. A scan that finds no cue point still succeeds: its
// request carries length -1, which ends the stream.
[[nodiscard]] int ScanForward(MkvFilter* filter, uint32_t speed);
[[nodiscard]] int ScanBackward(MkvFilter* filter, uint32_t speed);
[[nodiscard]] int ScanEnd(MkvFilter* filter);
