#include "stream/mkvvstream.h"

#include <cstring>

#include "core/memory.h"

namespace {

constexpr uint32_t kDiscardChunk = 4096;
// The discard buffer plus the frames of the calls below it.
constexpr size_t kDiscardStackNeed = 4224;

int64_t input_read(const MmfInputStream* input, void* destination, uint64_t count) {
  return input->Ops->Read(input->Handle, destination, count);
}

// Refills the buffer with the input's bytes at `offset`. Returns the bytes now
// buffered, or kVstreamFailed (stream unchanged) when the input cannot seek there.
uint64_t mkvvstream_autoshift_read(mkvvstream* stream, uint64_t offset) {
  if (stream->position != offset &&
      stream->input->Ops->Seek(stream->input->Handle, offset, 0) == -1) {
    return kVstreamFailed;
  }
  int64_t got = input_read(stream->input, stream->buffer, static_cast<uint64_t>(stream->buffer_size));
  if (got < 0) got = 0;
  stream->position = stream->buffer_start = offset;
  stream->buffer_end = offset + static_cast<uint64_t>(got);
  return static_cast<uint64_t>(got);
}

int unbuffered_forward_seek(mkvvstream* stream, uint64_t offset) {
  if (SysStackAvail() <= kDiscardStackNeed) return -1;
  uint8_t scratch[kDiscardChunk];
  while (stream->position < offset) {
    uint64_t remaining = offset - stream->position;
    uint32_t chunk = remaining < kDiscardChunk ? static_cast<uint32_t>(remaining) : kDiscardChunk;
    int64_t got = input_read(stream->input, scratch, chunk);
    if (got < 0) return -1;
    if (got == 0) {
      // The input has ended: nothing more can be discarded, and the next read
      // reports the end. Stepping there at once keeps a skip over an element
      // of unknown size from turning into billions of empty reads.
      stream->position = stream->buffer_start = stream->buffer_end = offset;
      return 0;
    }
    stream->position += chunk;
    stream->buffer_start += chunk;
    stream->buffer_end += chunk;
  }
  return 0;
}

}  // namespace

int mkvvstream_init(mkvvstream* stream, const MmfInputStream* input, int64_t buffer_size,
                    uint8_t read_through, uint8_t fill_mode, uint32_t buffered) {
  if (!stream || !input || buffer_size % 2 != 0) return -1;
  std::memset(stream, 0, sizeof *stream);
  stream->input = input;
  stream->read_through = read_through;
  stream->fill_mode = fill_mode;
  stream->buffered = buffered;
  stream->stream_length = input->Ops->Length(input->Handle);
  if (!buffered) return 0;

  if (buffer_size < 0) return -1;
  int64_t size = buffer_size;
  if (stream->stream_length != 0 && stream->stream_length <= static_cast<uint64_t>(buffer_size)) {
    size = static_cast<int64_t>(stream->stream_length);
  }
  stream->buffer = static_cast<uint8_t*>(mem_alloc(static_cast<size_t>(size)));
  if (!stream->buffer) return -1;
  stream->buffer_size = size;
  stream->buffer_end = static_cast<uint64_t>(size);

  int64_t got = fill_mode == kFillWithPeek
                    ? input->Ops->Peek(input->Handle, stream->buffer, static_cast<uint64_t>(size))
                    : input_read(input, stream->buffer, static_cast<uint64_t>(size));
  if (got == size) return 0;
  // The first buffer must be complete: an input shorter than the buffer whose
  // length is unknown cannot be parsed this way.
  mem_free(stream->buffer);
  stream->buffer = nullptr;
  stream->buffer_size = 0;
  stream->buffer_end = 0;
  return -1;
}

void mkvvstream_destroy(mkvvstream* stream) {
  if (!stream || !stream->buffer) return;
  mem_free(stream->buffer);
  stream->buffer = nullptr;
}

uint64_t mkvvstream_read(mkvvstream* stream, void* destination, int32_t count) {
  if (!stream || count < 0) return 0;
  auto* out = static_cast<uint8_t*>(destination);

  if (!stream->buffered) {
    int64_t got = input_read(stream->input, out, static_cast<uint64_t>(count));
    if (got < 0) got = 0;
    stream->position += static_cast<uint64_t>(got);
    stream->buffer_start += static_cast<uint64_t>(got);
    stream->buffer_end += static_cast<uint64_t>(got);
    return static_cast<uint64_t>(got);
  }

  auto offset_in_buffer = static_cast<uint32_t>(stream->position - stream->buffer_start);
  auto left_in_buffer = static_cast<uint32_t>(stream->buffer_end - stream->position);
  if (static_cast<uint64_t>(count) <= left_in_buffer) {
    std::memcpy(out, stream->buffer + offset_in_buffer, static_cast<size_t>(count));
    stream->position += static_cast<uint64_t>(count);
    return static_cast<uint64_t>(count);
  }

  if (!stream->read_through) {
    std::memcpy(out, stream->buffer + offset_in_buffer, left_in_buffer);
    stream->position += left_in_buffer;
    return left_in_buffer;
  }
  if (stream->fill_mode == kFillWithPeek) return kVstreamFailed;

  // The input stands at buffer_end: take the rest of the buffer, read the
  // remainder straight into the caller's memory, then refill behind it.
  std::memcpy(out, stream->buffer + offset_in_buffer, left_in_buffer);
  stream->position += left_in_buffer;
  int64_t got = input_read(stream->input, out + left_in_buffer,
                           static_cast<uint64_t>(count) - left_in_buffer);
  if (got <= 0) return left_in_buffer;
  stream->position += static_cast<uint64_t>(got);
  mkvvstream_autoshift_read(stream, stream->position);
  return left_in_buffer + static_cast<uint64_t>(got);
}

int mkvvstream_seek(mkvvstream* stream, uint64_t offset) {
  if (!stream) return -1;
  if (stream->fill_mode == kFillWithPeek && offset >= static_cast<uint64_t>(stream->buffer_size)) return -1;
  if (stream->buffered) {
    if (offset >= stream->buffer_start && offset <= stream->buffer_end) {
      stream->position = offset;
      return 0;
    }
    return mkvvstream_autoshift_read(stream, offset) == kVstreamFailed ? -1 : 0;
  }
  if (offset == stream->position) return 0;
  if (offset < stream->position) return -1;
  return unbuffered_forward_seek(stream, offset);
}

uint64_t mkvvstream_tell(const mkvvstream* stream) { return stream ? stream->position : kVstreamFailed; }

uint64_t mkvvstream_length(const mkvvstream* stream) { return stream ? stream->stream_length : 0; }

uint64_t mkvvstream_bytes_available(const mkvvstream* stream) {
  return stream ? stream->buffer_end - stream->position : 0;
}
