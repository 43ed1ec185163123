#pragma once
// One output channel made from one track: its media format (four-character
// code, picture or audio parameters, durations, extra data) and its decoder
// configuration, as RateInputFormat prepares them.

#include <cstdint>

#include "filter/mkv_filter.h"

enum class TrackSetup {
  kSkipped,   // encrypted, no codec ID or an unsupported one: the channel stays free
  kSetUp,     // the channel now carries the track
  kNoMemory,  // the channel name could not be copied: the rating fails
};

// Sets up `channel` (whose State exists) from track `track_index` of the
// context's file model; `input` is the input format the rating was given.
[[nodiscard]] TrackSetup SetUpTrackChannel(MkvFilter* filter, const MmfMediaFormat& input, uint32_t track_index,
                                           MkvChannel* channel);
