#pragma once
// "MediaTimeConverter" and "MediaSeeker": media time (microseconds) to file
// position and back through the cue table, and the bookkeeping of a seek.

#include <cstdint>

#include "filter/mkv_filter.h"

// 0 and the cluster of the last cue point at or before the time (kNoCuePosition
// when none of its positions counts); without cues time 0 gives the first
// Cluster and any other time 4002.
[[nodiscard]] int ConvertToPosition(MkvFilter* filter, uint64_t time, uint64_t* position);

// 0 and the time of the cue point whose cluster is at the position, or of the
// one before the first cluster past it; 0 when there is none. With preroll on,
// the time last given to ConvertToPosition is answered once instead. Without
// cues 4002 unless the position is the first Cluster's.
[[nodiscard]] int ConvertToTime(MkvFilter* filter, uint64_t position, uint64_t* time);

// 2 when the input can seek, else 1.
int SeekQuery(const MkvFilter* filter);

// Marks the acquired channels for preroll (when enabled) and notes a cue
// position with a codec state. Moves nothing; always 0.
int Seek(MkvFilter* filter, uint64_t time, uint64_t position);
