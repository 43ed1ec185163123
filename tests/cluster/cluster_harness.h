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

// A zero record (the start state) that frees its tables when it goes; not to be copied.
struct Record {
  mkvcluster c{};
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
  uint32_t left = 0;  // of inbuff1
};

inline Outcome Call(Record& record, mkvinbuff* in1, mkvinbuff* in2) {
  destroy_mkvcluster(&record.c);
  Outcome out;
  out.skip = 0xDEAD;
  out.result = parse_mkvcluster(in1, in2, &record.c, &out.skip);
  const mkvcluster& c = record.c;
  out.cluster_timecode = c.cluster_timecode;
  out.left = in1->buff_left;
  if (out.result == kClusterBlockReady) {
    out.track = c.track_number;
    out.timecode = c.block_timecode;
    out.sizes.assign(c.frame_sizes, c.frame_sizes + c.frame_count);
    out.data_left = c.block_data_left;
  }
  return out;
}

// Runs parse_mkvcluster over one buffer `blocks_before` + 1 times, consuming
// each block's data and applying each skip between calls as the caller does.
inline Outcome ParseAfterBlocks(Record& record, const Bytes& bytes, int blocks_before = 0) {
  mkvinbuff in1 = View(bytes, 0, bytes.size());
  for (int blocks = 0;;) {
    const Outcome out = Call(record, &in1, nullptr);
    const bool block = out.result == kClusterBlockReady && blocks++ < blocks_before;
    if (!block && (out.result != kClusterSkip || blocks >= blocks_before)) return out;
    const auto consumed = static_cast<uint32_t>(block ? uint64_t(record.c.block_data_left) : out.skip);
    in1.buff_pos += consumed;
    in1.buff_left -= consumed;
  }
}

}  // namespace cluster_testing
