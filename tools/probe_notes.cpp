#include "tools/probe_notes.h"

#include <cinttypes>
#include <cstdio>
#include <vector>

#include "tools/reading/header_reading.h"

void PrintCompressionNotes(const char* file) {
  std::vector<reading::TrackFacts> tracks;
  if (!reading::ReadOfferedTracks(file, &tracks)) return;
  for (size_t k = 0; k < tracks.size(); ++k) {
    if (tracks[k].FrameCompression() != reading::kCompressionZlib) continue;
    std::printf("note: channel %zu (track %" PRIu64 ") is stored with zlib compression: the plug-in delivers its "
                "frames as stored (kelvane extract inflates them)\n",
                k, tracks[k].number);
  }
}
