#include "core/file_model.h"

#include "core/memory.h"

namespace {

template <typename T>
void free_field(T*& field) {
  if (field) mem_free(field);
}

// Walks exactly `count` nodes: the count, not a null `next`, bounds every list.
template <typename Entry, typename FreeEntry>
void free_queue(mkv_queue& queue, FreeEntry free_entry) {
  mkv_queue_node* node = queue.head;
  for (uint32_t i = 0; i < queue.count && node; ++i) {
    mkv_queue_node* next = node->next;
    free_entry(static_cast<Entry*>(node->data));
    mem_free(node);
    node = next;
  }
}

void free_cue_point(mkv_cue_point* point) {
  free_queue<mkv_cue_track_position>(point->track_positions, [](mkv_cue_track_position* position) {
    free_queue<mkv_cue_reference>(position->references, [](mkv_cue_reference* ref) { mem_free(ref); });
    mem_free(position);
  });
  mem_free(point);
}


}  // namespace

void free_cue_points(mkv_queue* cue_points) {
  free_queue<mkv_cue_point>(*cue_points, free_cue_point);
  *cue_points = mkv_queue{};
}

void free_mkv_track_info(mkv_track_info* record) {
  mkv_track_info& track = *record;
  free_field(track.codec_id);
  free_field(track.codec_name);
  free_field(track.language);
  free_field(track.name);
  free_field(track.codec_private);
  uint32_t encodings = track.content_encoding_count < kMaxContentEncodings ? track.content_encoding_count
                                                                          : kMaxContentEncodings;
  for (uint32_t i = 0; i < encodings; ++i) {
    mkv_content_encoding& encoding = track.content_encodings[i];
    free_field(encoding.comp_settings);
    free_field(encoding.enc_key_id);
    free_field(encoding.sig_key_id);
    free_field(encoding.signature);
  }
}

void destroy_mkv_file_info(mkv_file_info* info) {
  if (!info) return;
  int seek_lists = info->seek_head_count < kMaxSeekLists ? info->seek_head_count : kMaxSeekLists;
  for (int i = 0; i < seek_lists; ++i) {
    free_queue<mkv_seek_entry>(info->seek_lists[i], [](mkv_seek_entry* entry) { mem_free(entry); });
  }

  uint32_t tags = info->tag_count < kMaxTags ? info->tag_count : kMaxTags;
  for (uint32_t i = 0; i < tags; ++i) {
    mkv_tag_entry& tag = info->tags[i];
    free_field(tag.binary);
    free_field(tag.name);
    free_field(tag.string);
    tag.binary = nullptr;
    tag.name = nullptr;
    tag.string = nullptr;
  }

  free_queue<mkv_cue_point>(info->cue_points, free_cue_point);

  free_field(info->muxing_app);
  free_field(info->next_filename);
  free_field(info->prev_filename);
  free_field(info->segment_filename);
  free_field(info->title);
  free_field(info->writing_app);

  uint32_t tracks = info->track_count < kMaxTracks ? info->track_count : kMaxTracks;
  for (uint32_t i = 0; i < tracks; ++i) free_mkv_track_info(&info->tracks[i]);
}
