#pragma once
// What a framework's format record does not say about an offered track: its
// Matroska track number (what people select tracks by), its codec ID (which
// tells PCM integer from float and names the AAC profile) and its bit depth
// (the audio format always says 16 bits). Read from the file's headers with
// the format core, as `kelvane info` reads them; the plug-in offers one
// channel per such track, in this order.

#include <cstdint>
#include <string>
#include <vector>

struct TrackFacts {
  uint64_t number = 0;
  std::string codec_id;
  uint32_t bit_depth = 0;  // 0: not stated
};

// The tracks the plug-in offers channels for, in file order; false when the
// headers cannot be parsed.
bool ReadOfferedTracks(const char* path, std::vector<TrackFacts>* tracks);
