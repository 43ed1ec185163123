#include "tools/extract/track_facts.h"

#include <cstring>

#include "core/codec_table.h"
#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/input_streams.h"
#include "stream/mkvvstream.h"

namespace {

constexpr int64_t kHeaderBufferSize = 480;

}  // namespace

bool ReadOfferedTracks(const char* path, std::vector<TrackFacts>* tracks) {
  auto input = host::OpenFileStream(path, true);
  mkvvstream stream;
  if (!input || mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, 1) != 0) return false;
  auto* info = mem_new_zeroed<mkv_file_info>();  // large: keep it off the stack
  mkv_parse_limits limits{kDefaultMaxStringSize, 1};
  bool parsed = false;
  if (info) {
    info->parse_limits = &limits;
    info->metadata = mem_new_zeroed<mkv_metadata_list>();
    parsed = info->metadata && parse_mkvfile(info, &stream) == kParseSucceeded;
    for (uint32_t i = 0; parsed && i < info->track_count && i < kMaxTracks; ++i) {
      const mkv_track_info& track = info->tracks[i];
      // The plug-in sets up no channel for an encrypted track or a codec it does not know.
      if (track.encrypted || lookup_codec_fourcc(track.codec_id) == 0) continue;
      tracks->push_back(TrackFacts{track.track_number, track.codec_id, static_cast<uint32_t>(track.bit_depth)});
    }
    if (info->metadata) FreeMetadata(info->metadata);
    destroy_mkv_file_info(info);
    mem_free(info);
  }
  mkvvstream_destroy(&stream);
  return parsed;
}
