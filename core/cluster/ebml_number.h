#pragma once
// EBML numbers read across calls: a number may stop at any byte when the
// buffers run out, and the next call goes on from where it stopped.

#include <cstdint>

#include "core/cluster/buff_cursor.h"

enum class ebml_number_form : uint8_t {
  id,    // element ID: 1 to 4 bytes, the length marker stays in the value
  vint,  // size or variable-size integer: 1 to 8 bytes, the marker removed
  raw,   // big-endian value of a given width, 0 to 8 bytes
};

enum class ebml_number_result : uint8_t { done, short_read, invalid };

struct ebml_partial_number {
  uint64_t value;  // the bits read so far
  uint8_t left;    // bytes still to read; 0 when no number is in progress
  uint8_t length;  // full length of the number in progress (or just read)
};

// Starts a number when number->left is 0, else continues it. `raw_width` is
// the width of a raw value (at most 8). done: value and length hold the
// number, left is 0. short_read: the buffers ran out, what was read is kept in
// *number. invalid: the first byte is 0 (vint) or has no marker bit in its
// high nibble (id); that byte is consumed and *number cleared.
[[nodiscard]] ebml_number_result ebml_continue_number(buff_cursor* cursor, ebml_number_form form,
                                                      uint8_t raw_width, ebml_partial_number* number);
