#pragma once
// The header parse's byte source: a small buffer over the framework's input
// stream, so one-byte reads come from memory and short forward skips cost
// nothing. Three modes:
//  - buffered, fill mode 1: the buffer is refilled from the input as the
//    stream moves; a skip beyond the buffer is one input seek and one read;
//  - buffered, fill mode 2 (peek): the buffer is filled once with the input's
//    peek and is all that is reachable; the input is not consumed;
//  - unbuffered: reads pass straight to the input, forward seeks read and
//    discard, backward seeks fail (for inputs that cannot seek).

#include <cstdint>

#include "platform/input_stream.h"

struct mkvvstream {
  uint8_t* buffer;         // heap; null when not buffered
  int64_t buffer_size;     // capacity; 0 when not buffered
  uint64_t position;       // offset of the next read
  uint64_t buffer_start;   // offset of buffer[0]
  uint64_t buffer_end;     // offset just after the last valid buffered byte
  uint64_t stream_length;  // the input's length when the stream was made (0: unknown)
  uint8_t read_through;    // a read running past the buffer continues from the input
  uint8_t fill_mode;       // 1: fill with read; 2: fill once with peek
  const MmfInputStream* input;  // not owned
  uint32_t buffered;
};
// Invariant when buffered: buffer_start <= position <= buffer_end and
// buffer_end - buffer_start <= buffer_size. Unbuffered, the three move together.

constexpr uint64_t kVstreamFailed = ~uint64_t{0};
constexpr uint8_t kFillWithRead = 1;
constexpr uint8_t kFillWithPeek = 2;

// The input must stand at offset 0. Returns 0, or -1 (nothing to release).
[[nodiscard]] int mkvvstream_init(mkvvstream* stream, const MmfInputStream* input, int64_t buffer_size,
                                  uint8_t read_through, uint8_t fill_mode, uint32_t buffered);
void mkvvstream_destroy(mkvvstream* stream);

// Bytes delivered (callers test for exactly `count`); kVstreamFailed when a
// peek-mode read would leave the first buffer.
[[nodiscard]] uint64_t mkvvstream_read(mkvvstream* stream, void* destination, int32_t count);
// 0 or -1.
[[nodiscard]] int mkvvstream_seek(mkvvstream* stream, uint64_t offset);
uint64_t mkvvstream_tell(const mkvvstream* stream);    // all ones for a null stream
uint64_t mkvvstream_length(const mkvvstream* stream);  // 0 for a null stream
uint64_t mkvvstream_bytes_available(const mkvvstream* stream);
