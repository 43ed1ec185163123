#pragma once
// The parsed file model: everything the header parse learns about a file
// before playback. One fixed-size record; only strings, payloads and the seek
// and cue lists live on the heap, so a whole record fits on a caller's stack.

#include <cstdint>

#include "core/queue.h"
#include "core/track_info.h"

constexpr int kMaxSeekLists = 50;
constexpr uint32_t kMaxTags = 50;
constexpr uint32_t kMaxTracks = 100;
constexpr uint32_t kMaxDocTypeLength = 31;
constexpr uint32_t kClusterId = 0x1F43B675;

// Bits of mkv_file_info::parse_flags.
constexpr uint32_t kMetEbmlHeader = 1u << 0;
constexpr uint32_t kMetSeekHead = 1u << 1;     // switches on the jump over clusters
constexpr uint32_t kMetInfo = 1u << 2;
constexpr uint32_t kMetCues = 1u << 3;         // cueing data is available
constexpr uint32_t kMetTrackEntry = 1u << 4;
constexpr uint32_t kMetSecondEbmlHeader = 1u << 5;
constexpr uint32_t kRequiredParseFlags = kMetEbmlHeader | kMetInfo | kMetTrackEntry;

struct mkv_seek_entry {
  uint32_t seek_id;        // element ID with its length-marker bits; 0 until read
  uint64_t seek_position;  // relative to segment_data_position
};

struct mkv_cue_reference {
  uint64_t cue_ref_time;
};

struct mkv_cue_track_position {
  uint64_t cue_track;
  uint64_t cue_cluster_position;  // relative to segment_data_position
  uint64_t cue_block_number;      // 1 when absent
  uint64_t cue_codec_state;
  mkv_queue references;  // of mkv_cue_reference
};

struct mkv_cue_point {
  uint64_t cue_time;  // timecode ticks
  mkv_queue track_positions;  // of mkv_cue_track_position
};

struct mkv_tag_entry {
  char* name;      // TagName, owned, NUL-terminated
  char* string;    // TagString, owned, NUL-terminated
  uint8_t* binary; // TagBinary payload, owned
  uint32_t length; // bytes of the TagString or TagBinary read last
};

struct mkv_parse_limits {
  uint32_t max_string_size;  // largest string element the parse allocates
  uint32_t input_seekable;
};
constexpr uint32_t kDefaultMaxStringSize = 8192;

struct mkv_metadata_list;

struct mkv_file_info {
  uint64_t ebml_version;
  uint64_t ebml_read_version;
  uint64_t ebml_max_id_length;
  uint64_t ebml_max_size_length;
  char doc_type[kMaxDocTypeLength + 1];
  uint64_t doc_type_version;
  uint64_t doc_type_read_version;
  int32_t seek_head_count;  // seek lists 0 .. seek_head_count - 1 are valid
  mkv_queue seek_lists[kMaxSeekLists];  // of mkv_seek_entry, each sorted by position

  // The Info block, zeroed as a unit when an Info element starts.
  uint8_t segment_uid[16];
  char* segment_filename;
  uint8_t prev_uid[16];
  char* prev_filename;
  uint8_t next_uid[16];
  char* next_filename;
  uint8_t segment_family[16];
  uint64_t timecode_scale;  // nanoseconds per tick
  double duration;          // ticks
  int64_t date_utc;
  char* title;
  char* muxing_app;
  char* writing_app;

  mkv_queue cue_points;  // of mkv_cue_point, in file order
  uint32_t parse_flags;
  uint32_t tag_count;
  mkv_tag_entry tags[kMaxTags];
  uint32_t track_count;
  uint32_t video_track_count;
  uint32_t audio_track_count;
  mkv_track_info tracks[kMaxTracks];
  uint64_t first_cluster_position;  // offset of the first Cluster's ID; 0 = none met yet
  uint64_t segment_data_position;   // offset of the Segment's data; seek and cue positions count from here
  mkv_metadata_list* metadata;      // filled by FinalizeMetadata; not owned
  mkv_parse_limits* parse_limits;   // not owned; null = no limits
};

// Frees everything the record owns; not the record, `metadata` or
// `parse_limits`. Afterwards the record is dead: a new parse needs a zeroed one.
void destroy_mkv_file_info(mkv_file_info* info);

// Frees every cue point of the list with its track positions and references,
// and leaves the list empty.
void free_cue_points(mkv_queue* cue_points);

// Frees the strings and payloads one track record owns (not the record).
void free_mkv_track_info(mkv_track_info* track);

// Offsets of the Info block, for handlers that zero it as a unit.
constexpr auto kInfoBlockBegin = __builtin_offsetof(mkv_file_info, segment_uid);
constexpr auto kInfoBlockEnd = __builtin_offsetof(mkv_file_info, cue_points);
