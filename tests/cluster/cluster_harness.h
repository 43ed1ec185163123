#pragma once
// Crafted bytes through parse_mkvcluster, in views of one buffer.

#include <cstdint>
#include <vector>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "tests/support/block_builder.h"

namespace cluster_testing {

using ebml::Bytes;

// bytes[from, to) as the file bytes at offset `from`.
inline mkvinbuff View(const Bytes& bytes, size_t from, size_t to) {
  return mkvinbuff{bytes.data() + from, static_cast<uint32_t>(to - from), 0, static_cast<uint32_t>(to - from), from};
}

// A zero record (the start state) that frees its tables when it goes.
struct Record {
  mkvcluster c{};
  Record() = default;
  Record(const Record&) = delete;
  Record& operator=(const Record&) = delete;
  ~Record() { destroy_mkvcluster(&c); }
};

// What one parse left behind.
struct Outcome {
  int result = 1;
  uint64_t skip = 0;
  uint64_t track = 0;
  int16_t timecode = 0;
  std::vector<int64_t> sizes;  // frame_sizes, when the result is 0
  int64_t data_left = 0;
  uint64_t cluster_timecode = 0;
};

inline Outcome Call(Record& record, mkvinbuff* in1, mkvinbuff* in2) {
  destroy_mkvcluster(&record.c);
  Outcome out;
  out.skip = 0xDEAD;
  out.result = parse_mkvcluster(in1, in2, &record.c, &out.skip);
  const mkvcluster& c = record.c;
  out.cluster_timecode = c.cluster_timecode;
  if (out.result == kClusterBlockReady) {
    out.track = c.track_number;
    out.timecode = c.block_timecode;
    out.sizes.assign(c.frame_sizes, c.frame_sizes + c.frame_count);
    out.data_left = c.block_data_left;
  }
  return out;
}

inline Outcome ParseWhole(Record& record, const Bytes& bytes) {
  mkvinbuff in1 = View(bytes, 0, bytes.size());
  return Call(record, &in1, nullptr);
}

}  // namespace cluster_testing
