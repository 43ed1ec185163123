#include "core/header/ebml_read.h"

#include <bit>
#include <cstring>

#include "core/memory.h"
#include "core/status.h"

namespace {

int read_byte(mkvvstream* stream, uint8_t* byte) {
  return mkvvstream_read(stream, byte, 1) == 1 ? kStatusOk : kStatusReadFailed;
}

}  // namespace

int ebml_read_exact(mkvvstream* stream, void* destination, uint32_t count) {
  if (count > INT32_MAX) return kStatusReadFailed;
  return mkvvstream_read(stream, destination, static_cast<int32_t>(count)) == count ? kStatusOk
                                                                                      : kStatusReadFailed;
}

int ebml_read_id(mkvvstream* stream, uint32_t* id) {
  uint8_t first;
  if (read_byte(stream, &first) != kStatusOk) return kStatusReadFailed;
  if ((first & 0xF0) == 0) return kStatusMalformed;
  uint32_t value = first;
  int extra = first & 0x80 ? 0 : first & 0x40 ? 1 : first & 0x20 ? 2 : 3;
  for (int i = 0; i < extra; ++i) {
    uint8_t next;
    if (read_byte(stream, &next) != kStatusOk) return kStatusReadFailed;
    value = value << 8 | next;
  }
  *id = value;
  return kStatusOk;
}

int ebml_read_size(mkvvstream* stream, uint64_t* size) {
  uint8_t first;
  if (read_byte(stream, &first) != kStatusOk) return kStatusReadFailed;
  if (first == 0) return kStatusMalformed;
  int extra = std::countl_zero(first);
  uint64_t value = first & (0xFF >> (extra + 1));
  for (int i = 0; i < extra; ++i) {
    uint8_t next;
    if (read_byte(stream, &next) != kStatusOk) return kStatusReadFailed;
    value = value << 8 | next;
  }
  *size = value;
  return kStatusOk;
}

int ebml_read_uint(mkvvstream* stream, uint64_t size, uint64_t* value) {
  *value = 0;
  if (size > 8) return kStatusMalformed;
  uint64_t result = 0;
  for (uint64_t i = 0; i < size; ++i) {
    uint8_t byte;
    if (read_byte(stream, &byte) != kStatusOk) return kStatusReadFailed;
    result = result << 8 | byte;
  }
  *value = result;
  return kStatusOk;
}

int ebml_read_signed(mkvvstream* stream, uint64_t size, int64_t* value) {
  *value = 0;
  uint64_t raw;
  int status = ebml_read_uint(stream, size, &raw);
  if (status != kStatusOk) return status;
  if (size > 0 && size < 8) {
    unsigned shift = static_cast<unsigned>(64 - 8 * size);
    *value = static_cast<int64_t>(raw << shift) >> shift;
  } else {
    *value = static_cast<int64_t>(raw);
  }
  return kStatusOk;
}

int ebml_read_float(mkvvstream* stream, uint64_t size, double* value) {
  if (size != 4 && size != 8) return kStatusMalformed;
  uint64_t raw = 0;
  bool complete = true;
  for (uint64_t i = 0; i < size; ++i) {
    uint8_t byte = 0;
    if (read_byte(stream, &byte) != kStatusOk) complete = false;
    raw = raw << 8 | byte;
  }
  *value = size == 4 ? static_cast<double>(std::bit_cast<float>(static_cast<uint32_t>(raw)))
                     : std::bit_cast<double>(raw);
  return complete ? kStatusOk : kStatusReadFailed;
}

bool ebml_payload_fits(const mkvvstream* stream, uint64_t size) {
  // In peek mode nothing beyond the one buffer can ever be read.
  uint64_t end = stream->fill_mode == kFillWithPeek ? stream->buffer_end : mkvvstream_length(stream);
  uint64_t position = mkvvstream_tell(stream);
  return end == 0 || (position <= end && size <= end - position);
}

int ebml_read_string(mkvvstream* stream, uint64_t size, uint64_t limit, char** text) {
  *text = nullptr;
  if (size > UINT32_MAX - 1 || size > limit) return kStatusNoMemory;
  if (!ebml_payload_fits(stream, size)) return kStatusReadFailed;
  auto* block = static_cast<char*>(mem_alloc_zeroed(static_cast<size_t>(size) + 1));
  if (!block) return kStatusNoMemory;
  *text = block;
  return ebml_read_exact(stream, block, static_cast<uint32_t>(size));
}

int ebml_skip(mkvvstream* stream, uint64_t size) {
  uint64_t position = mkvvstream_tell(stream);
  if (size > UINT64_MAX - position) return kStatusReadFailed;
  return mkvvstream_seek(stream, position + size) == 0 ? kStatusOk : kStatusReadFailed;
}
