#pragma once
// Element headers and values read from the header parse's stream. Every
// function answers a core status: 0, 5 (the stream ended or failed), 12 (a
// limit or the heap) or 48 (malformed).

#include <cstdint>

#include "stream/mkvvstream.h"

// An ID with its length-marker bits (0x1A45DFA3); at most four bytes.
// 48 for a first byte with no marker in its high nibble.
[[nodiscard]] int ebml_read_id(mkvvstream* stream, uint32_t* id);
// A size of 1 to 8 bytes with the marker removed. The all-ones value is not
// special: it reads as a very large number. 48 for a first byte of 0.
[[nodiscard]] int ebml_read_size(mkvvstream* stream, uint64_t* size);

// Values of `size` bytes at the stream's position.
[[nodiscard]] int ebml_read_uint(mkvvstream* stream, uint64_t size, uint64_t* value);     // 0..8 bytes, big-endian
[[nodiscard]] int ebml_read_signed(mkvvstream* stream, uint64_t size, int64_t* value);    // sign-extended
// 4 bytes (single, widened) or 8 (double). Every byte is attempted even after a
// short read; the value is stored, and then 5 reports the missing bytes.
[[nodiscard]] int ebml_read_float(mkvvstream* stream, uint64_t size, double* value);
constexpr uint64_t kNoStringLimit = UINT64_MAX;

// False when the input's length is known and fewer than `size` bytes are left
// after the stream's position: such a payload can only end in a short read, so
// it is not worth allocating (a hostile size would otherwise ask for gigabytes).
[[nodiscard]] bool ebml_payload_fits(const mkvvstream* stream, uint64_t size);

// A new zero-filled block of size + 1 bytes holding the text and a NUL. A size
// above `limit` (or of 2^32 or more) is 12 with *text null. A short read is 5
// and leaves the partly filled block in *text.
[[nodiscard]] int ebml_read_string(mkvvstream* stream, uint64_t size, uint64_t limit, char** text);

// End of an element's data. Sizes carry at most 56 bits, but a hostile
// position must not wrap around.
inline uint64_t ebml_end_of(uint64_t data_start, uint64_t size) {
  return size > UINT64_MAX - data_start ? UINT64_MAX : data_start + size;
}

// Moves the stream forward by `size` bytes from its position (0 or 5).
[[nodiscard]] int ebml_skip(mkvvstream* stream, uint64_t size);

// Reads exactly `count` bytes (a single call). 0 or 5.
[[nodiscard]] int ebml_read_exact(mkvvstream* stream, void* destination, uint32_t count);
