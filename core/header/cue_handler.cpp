#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/memory.h"
#include "core/status.h"

namespace {

constexpr uint32_t kCuePointId = 0xBB;
constexpr uint32_t kCueTimeId = 0xB3;
constexpr uint32_t kCueTrackPositionsId = 0xB7;
constexpr uint32_t kCueTrackId = 0xF7;
constexpr uint32_t kCueClusterPositionId = 0xF1;
constexpr uint32_t kCueBlockNumberId = 0x5378;
constexpr uint32_t kCueCodecStateId = 0xEA;
constexpr uint32_t kCueReferenceId = 0xDB;
constexpr uint32_t kCueRefTimeId = 0x96;

// The records created last. A new CuePoint leaves the current track position
// and reference as they were: the file's nesting is not checked.
struct cue_cursor {
  mkv_cue_point* point;
  mkv_cue_track_position* position;
  mkv_cue_reference* reference;
};

// A zeroed record appended to `list`; null (nothing appended) when the heap is exhausted.
template <typename Record>
Record* append_record(mkv_queue* list) {
  auto* record = mem_new_zeroed<Record>();
  if (record && !mkv_queue_append(list, record)) {
    mem_free(record);
    return nullptr;
  }
  return record;
}

// One child of the Cues element whose header has been read. Master children
// open a record and return, so that their own children arrive next.
int read_cue_child(mkv_file_info* info, mkvvstream* stream, cue_cursor* cursor, uint32_t id, uint64_t size) {
  switch (id) {
    case kCuePointId:
      cursor->point = append_record<mkv_cue_point>(&info->cue_points);
      return cursor->point ? kStatusOk : kStatusNoMemory;
    case kCueTimeId:
      if (!cursor->point) break;
      return ebml_read_uint(stream, size, &cursor->point->cue_time);
    case kCueTrackPositionsId:
      if (!cursor->point) return kStatusOk;
      cursor->position = append_record<mkv_cue_track_position>(&cursor->point->track_positions);
      if (!cursor->position) return kStatusNoMemory;
      cursor->position->cue_block_number = 1;
      return kStatusOk;
    case kCueTrackId:
    case kCueClusterPositionId:
    case kCueBlockNumberId:
    case kCueCodecStateId: {
      if (!cursor->position) break;
      mkv_cue_track_position* position = cursor->position;
      uint64_t* field = id == kCueTrackId            ? &position->cue_track
                        : id == kCueClusterPositionId ? &position->cue_cluster_position
                        : id == kCueBlockNumberId     ? &position->cue_block_number
                                                      : &position->cue_codec_state;
      return ebml_read_uint(stream, size, field);
    }
    case kCueReferenceId:
      if (!cursor->position) return kStatusOk;
      cursor->reference = append_record<mkv_cue_reference>(&cursor->position->references);
      return cursor->reference ? kStatusOk : kStatusNoMemory;
    case kCueRefTimeId:
      if (!cursor->reference) break;
      return ebml_read_uint(stream, size, &cursor->reference->cue_ref_time);
    default:
      break;
  }
  return ebml_skip(stream, size);
}

}  // namespace

int mkv_cue_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  // A later Cues element replaces the list; the earlier one is freed here
  // rather than left unreferenced.
  free_cue_points(&info->cue_points);
  info->parse_flags |= kMetCues;

  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  cue_cursor cursor{};
  int status = kStatusOk;
  while (status == kStatusOk && mkvvstream_tell(stream) < end) {
    uint32_t child = 0;
    uint64_t child_size = 0;
    status = ebml_read_id(stream, &child);
    if (status == kStatusOk) status = ebml_read_size(stream, &child_size);
    if (status == kStatusOk) status = read_cue_child(info, stream, &cursor, child, child_size);
  }
  // The flag promises cueing data to the seeking code: never set over an empty list.
  if (info->cue_points.count == 0) info->parse_flags &= ~kMetCues;
  return status;
}
