#include "core/header/element_walker.h"

#include <cstring>

#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "platform/ao_log.h"

namespace {

constexpr uint32_t kEbmlHeaderId = 0x1A45DFA3;
constexpr uint32_t kSegmentId = 0x18538067;

const mkv_element_row element_list[] = {
    {kEbmlHeaderId, "EBML Document", ebml_document_header_handler},
    {kSegmentId, "Matroska Segment", nullptr},
    {0xEC, "Void", nullptr},
    {0xBF, "CRC-32", nullptr},
    {0x114D9B74, "SeekHead", mkv_meta_seek_handler},
    {0x1549A966, "Info", mkv_info_handler},
    {kClusterId, "Cluster", nullptr},
    {0x1654AE6B, "Tracks", nullptr},
    {0xAE, "TrackEntry", mkv_track_handler},
    {0x1C53BB6B, "Cues", mkv_cue_handler},
    {0x1941A469, "Attachments", nullptr},
    {0x1043A770, "Chapters", nullptr},
    {0x1254C367, "Tags", mkv_tag_handler},
    {0, nullptr, nullptr},
};

const uint32_t ebml_container_elements[] = {
    kSegmentId, 0x114D9B74, 0x1549A966, 0x1654AE6B, 0x1C53BB6B, 0x1941A469, 0x1043A770, 0x1254C367,
};

const mkv_element_row* find_row(uint32_t id) {
  for (const mkv_element_row* row = element_list; row->id != 0; ++row) {
    if (row->id == id) return row;
  }
  return nullptr;
}

bool is_container(uint32_t id) {
  for (uint32_t container : ebml_container_elements) {
    if (container == id) return true;
  }
  return false;
}

// After the first Cluster, a top-level or Segment-level element is read at the
// first SeekHead target at or after `element_start` that is not a Cluster, so
// the clusters in between are never touched. 0 or 5.
int jump_over_clusters(mkv_file_info* info, mkvvstream* stream, int level, uint64_t element_start) {
  if (!(info->parse_flags & kMetSeekHead) || (level != 1 && level != 2) || info->first_cluster_position == 0 ||
      info->seek_head_count < 1 || info->seek_lists[0].count == 0) {
    return kStatusOk;
  }
  mkv_queue_node* node = info->seek_lists[0].head;
  for (uint32_t i = 0; i < info->seek_lists[0].count && node; ++i, node = node->next) {
    const auto* entry = static_cast<const mkv_seek_entry*>(node->data);
    uint64_t target = entry->seek_position + info->segment_data_position;
    if (target < element_start || entry->seek_id == kClusterId) continue;
    if (target != 0 && mkvvstream_seek(stream, target) != 0) return kStatusReadFailed;
    break;
  }
  return kStatusOk;
}

}  // namespace

int parse_element(mkv_file_info* info, mkvvstream* stream, uint64_t parent_start, uint64_t parent_size,
                  int32_t depth) {
  int level = depth + 1;
  if (level > kMaxNestingLevels) return kStatusMalformed;
  uint64_t element_start = mkvvstream_tell(stream);
  if (jump_over_clusters(info, stream, level, element_start) != kStatusOk) return kStatusReadFailed;

  uint32_t id = 0;
  uint64_t size = 0;
  int status = ebml_read_id(stream, &id);
  if (status == kStatusOk) status = ebml_read_size(stream, &size);
  if (status == kStatusReadFailed) return status;
  if (status == kStatusMalformed) {
    // A damaged header inside an element costs the rest of that element only.
    if (parent_size == 0) return kStatusMalformed;
    return mkvvstream_seek(stream, ebml_end_of(parent_start, parent_size)) == 0 ? kStatusOk : kStatusReadFailed;
  }

  uint64_t data_start = mkvvstream_tell(stream);
  uint64_t data_end = ebml_end_of(data_start, size);
  if (const mkv_element_row* row = find_row(id)) {
    if (id == kClusterId && info->first_cluster_position == 0) info->first_cluster_position = element_start;
    if (row->handler) {
      status = row->handler(info, stream, &id, &size);
      if (status != kStatusOk) AoLog(kAoLogFailure, "Error parsing %s Element.", row->name);
    }
    if (id == kSegmentId) info->segment_data_position = mkvvstream_tell(stream);
  }

  if (status == kStatusOk && is_container(id)) {
    while (mkvvstream_tell(stream) < data_end) {
      status = parse_element(info, stream, data_start, size, level);
      if (status != kStatusOk) break;
    }
  }
  if (mkvvstream_tell(stream) < data_end) (void)mkvvstream_seek(stream, data_end);
  return status;
}

int valid_mkv(mkvvstream* stream, mkv_file_info* info) {
  int status = parse_element(info, stream, 0, 0, 0);
  if (status != kStatusOk) return status;
  return std::strcmp(info->doc_type, "matroska") == 0 ? kStatusOk : kStatusMalformed;
}

int parse_mkvfile(mkv_file_info* info, mkvvstream* stream) {
  info->seek_head_count = 0;
  info->track_count = 0;
  info->video_track_count = 0;
  info->audio_track_count = 0;
  info->parse_flags = 0;
  info->first_cluster_position = 0;
  info->tag_count = 0;

  int status;
  do {
    status = parse_element(info, stream, 0, 0, 0);
  } while (status == kStatusOk);

  if (status == kStatusNoMemory) return kParseNoMemory;
  if ((info->parse_flags & kRequiredParseFlags) == kRequiredParseFlags) {
    // A list that could not be completed still leaves a usable file.
    (void)FinalizeMetadata(info);
    return kParseSucceeded;
  }
  return status == kStatusMalformed ? kParseMalformed : kParseIncomplete;
}
