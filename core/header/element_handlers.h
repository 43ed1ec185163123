#pragma once
// The handlers of the element walker's table. Each is called with the stream
// at the element's data and answers a core status (0 taken, 5, 12, 48).

#include "core/file_model.h"
#include "stream/mkvvstream.h"

int ebml_document_header_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);
int mkv_info_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);
// One TrackEntry into the next track record; 12 once the file has 100 tracks.
int mkv_track_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);
// A SeekHead becomes the next seek list, sorted by position; a damaged one is
// dropped (0) and the walk goes on.
int mkv_meta_seek_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);
// Cues replace the cue list; bit 3 of parse_flags stays set only over cue points.
int mkv_cue_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);
// Each SimpleTag fills the next of the 50 tag entries.
int mkv_tag_handler(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);

// The bound of string elements: the creator's limit, or none.
inline uint64_t string_limit(const mkv_file_info* info) {
  return info->parse_limits ? info->parse_limits->max_string_size : UINT64_MAX;
}
