#pragma once
// Element headers (ID, then size) read across calls: a header cut by the end
// of the buffers is finished by the next call.

#include <cstdint>

#include "core/cluster/buff_cursor.h"
#include "core/cluster/mkv_cluster.h"

struct element_header {
  uint32_t id;    // with its length-marker bits
  uint64_t size;  // marker removed; the all-ones value is just a large number
};

enum class header_result : uint8_t { done, short_read, invalid_id, invalid_size };

// Reads a header, or goes on with the one that `step` names when the last
// call stopped inside it. short_read leaves resume->step at `step`; every
// other result leaves it at none. An invalid byte is consumed and dropped
// (with an ID read before it, for an invalid size).
[[nodiscard]] header_result read_element_header(buff_cursor* cursor, mkv_cluster_resume* resume,
                                                mkv_resume_step step, element_header* header);

// Saturating end of `size` bytes from `start`: hostile sizes must not wrap.
inline uint64_t element_end(uint64_t start, uint64_t size) {
  return size > UINT64_MAX - start ? UINT64_MAX : start + size;
}

// Bytes from `position` to `end`, at most `size`, and 0 when past the end.
inline uint64_t bytes_within(uint64_t position, uint64_t end, uint64_t size) {
  if (position >= end) return 0;
  return size < end - position ? size : end - position;
}
