#pragma once
// One TrackEntry of the file, as the header parse records it.

#include <cstdint>

constexpr uint32_t kMaxContentEncodings = 5;

struct mkv_content_encoding {
  uint64_t order;
  uint64_t scope;  // 1 unless ContentEncodingScope says otherwise
  uint64_t type;
  uint64_t comp_algo;
  uint8_t* comp_settings;  // owned
  uint32_t comp_settings_size;
  uint64_t enc_algo;
  uint8_t* enc_key_id;  // owned
  uint32_t enc_key_id_size;
  uint8_t* signature;  // owned
  uint32_t signature_size;
  uint8_t* sig_key_id;  // owned
  uint32_t sig_key_id_size;
  uint64_t sig_algo;
  uint64_t sig_hash_algo;
};

struct mkv_track_info {
  uint64_t track_number;  // what blocks carry to name their track
  uint64_t track_uid;
  uint64_t track_type;  // 1 video, 2 audio; other values kept as they are
  uint8_t flag_enabled;
  uint8_t flag_default;
  uint8_t flag_forced;
  uint8_t flag_lacing;
  uint64_t min_cache;
  uint64_t max_cache;
  uint64_t default_duration;  // nanoseconds per frame; 0 = absent
  double track_timecode_scale;
  uint64_t max_block_addition_id;
  char* name;      // owned, NUL-terminated
  char* language;  // owned
  char* codec_id;  // owned, e.g. "A_VORBIS"
  uint32_t codec_private_size;
  uint8_t* codec_private;  // owned, not terminated
  char* codec_name;        // owned
  uint64_t attachment_link;
  uint8_t codec_decode_all;
  uint64_t track_overlay;
  uint8_t flag_interlaced;
  uint64_t stereo_mode;
  uint64_t pixel_width;
  uint64_t pixel_height;
  uint64_t pixel_crop_bottom;
  uint64_t pixel_crop_top;
  uint64_t pixel_crop_left;
  uint64_t pixel_crop_right;
  uint64_t display_width;
  uint64_t display_height;
  uint64_t display_unit;
  uint64_t aspect_ratio_type;
  uint64_t colour_space;
  double sampling_frequency;  // Hz
  double output_sampling_frequency;
  uint64_t channels;
  uint64_t bit_depth;
  uint32_t content_encoding_count;  // records opened, 0..5
  mkv_content_encoding content_encodings[kMaxContentEncodings];
  uint8_t encrypted;   // a ContentEncryption was met
  uint8_t compressed;  // a ContentCompression was met; cleared later when no header stripping applies
};
