#pragma once
// A view of one input buffer, and the byte rule of the playback parser: bytes
// come from inbuff1 while it has any left, then from inbuff2, so a header may
// begin in one buffer and end in the next without being copied.

#include <cstdint>
#include <type_traits>

struct mkvinbuff {
  const uint8_t* buff;    // first byte of the buffer's data
  uint32_t buff_size;     // bytes in the buffer
  uint32_t buff_pos;      // bytes consumed: the next byte is buff[buff_pos]
  uint32_t buff_left;     // bytes not consumed: buff_size - buff_pos while the view is in use
  uint64_t buff_fileoff;  // file offset of buff[0]
};

// The output path copies views (inbuff1 = inbuff2) and zeroes them on a flush.
static_assert(std::is_standard_layout_v<mkvinbuff> && std::is_trivially_copyable_v<mkvinbuff>);

// Results of ebml_get_byte_from_buff and skip_buffbytes.
constexpr int kBuffGotByte = 1;
constexpr int kBuffEmpty = 0;
constexpr int kBuffSkipped = 0;
constexpr int kBuffSkipShort = -1;

// File offset of the next byte: inbuff1's while it has bytes left or inbuff2
// is absent (null), else inbuff2's.
[[nodiscard]] uint64_t mkvinbuff_position(const mkvinbuff* inbuff1, const mkvinbuff* inbuff2);

// 1 and the next byte; 0, consuming nothing, when inbuff1 is empty and inbuff2
// is absent or empty.
[[nodiscard]] int ebml_get_byte_from_buff(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint8_t* byte);

// Consumes `count` bytes, inbuff1's first: 0. All or nothing: -1, consuming
// nothing, when the two views hold fewer.
[[nodiscard]] int skip_buffbytes(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint32_t count);

// One EBML variable-size integer with its marker bit removed (the all-ones
// value is an ordinary number). 0 with the value and, when `length` is not
// null, its length 1 to 8; 48 for a first byte of 0; 5 when the buffers run
// out, the bytes read so far staying consumed.
[[nodiscard]] int ebml_get_var_uint_from_buff(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint64_t* value,
                                              uint32_t* length);
