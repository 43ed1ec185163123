#pragma once
// What the TrackEntry handler does with each child element it meets: how the
// payload is read and which field of the track record (or of its open
// content-encoding record) receives it. IDs not in the table are skipped.

#include <cstdint>

#include "core/track_info.h"

enum class track_rule : uint8_t {
  integer,           // unsigned, 0..8 bytes, into field.integer
  flag,              // lowest bit of an unsigned, into field.flag
  real,              // 4- or 8-byte float, into field.real
  text,              // string bounded by max_string_size, into field.text
  codec_id,          // string whose bound also counts its terminator
  codec_private,     // binary of at most 32768 bytes
  track_type,        // integer that also counts video and audio tracks
  colour_space,      // 4-byte integer; any other size is skipped
  descend,           // master whose children are read as the entry's own
  open_encoding,     // descend, opening a content-encoding record
  compression,       // descend, marking the track compressed
  encryption,        // descend, marking the track encrypted
  encoding_integer,  // unsigned into the open record; skipped when none is open
  encoding_binary,   // binary into the open record; skipped when none is open
};

struct encoding_payload_field {
  uint8_t* mkv_content_encoding::*data;
  uint32_t mkv_content_encoding::*size;
};

// The member named by the row's rule; the other members are not meaningful.
union track_field {
  uint64_t mkv_track_info::*integer;
  uint8_t mkv_track_info::*flag;
  double mkv_track_info::*real;
  char* mkv_track_info::*text;
  uint64_t mkv_content_encoding::*encoding_integer;
  encoding_payload_field encoding_binary;
};

struct track_element_rule {
  uint32_t id;  // with its length-marker bits
  track_rule rule;
  track_field field;
};

// The row for `id`, or null for an element the handler skips.
[[nodiscard]] const track_element_rule* find_track_element_rule(uint32_t id);
