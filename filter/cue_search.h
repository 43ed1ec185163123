#pragma once
// The cue table as the filter reads it: which cue positions count, and the
// search from a media time to a cue point and its cluster. Times are
// microseconds; positions are absolute file offsets.

#include <cstdint>

#include "core/file_model.h"
#include "filter/mkv_filter.h"

// CueTableFlags bits.
constexpr uint32_t kCueTableValidated = 1u << 0;
constexpr uint32_t kCueTableAllTracksCount = 1u << 1;  // no cue names an acquired track

// The out position when no counting cue position was found.
constexpr uint64_t kNoCuePosition = 0x7FFFFFFFFFFFFFFF;

// Decides once per instance whether only acquired channels' cue positions count.
void ValidateCueingTable(MkvFilter* filter);

// A cue point's time: ticks × (timecode scale / 1000), the division first.
uint64_t CueTimeMicroseconds(const mkv_file_info& info, const mkv_cue_point& cue);

// A position counts when its track is an output channel's (the first match
// decides) that is acquired, or when every output track counts.
bool CuePositionCounts(const MkvFilter* filter, const mkv_cue_track_position& position);

// Absolute file offset of a cue position's cluster.
inline uint64_t CueBytePosition(const mkv_file_info& info, const mkv_cue_track_position& position) {
  return position.cue_cluster_position + info.segment_data_position;
}

// Forward: the first cue point after *time (or the last); backward: the last
// at or before it (or the first), except that a time equal to the last cue
// point's gives the one before. Writes that cue point's time to *time and the
// earliest counting cluster among its positions to *position (kNoCuePosition
// when none counts). 0, or 48 when the file has no cue points.
[[nodiscard]] int GetCueingPosition(MkvFilter* filter, uint64_t* time, uint32_t forward, uint64_t* position);
