#pragma once
// One fuzz input for the playback parser, decoded and driven; shared by the
// libFuzzer target and the test that replays the inputs it found.
//
// Input: a flags byte (bit 0: read group tails, bit 1: start at byte 0 rather
// than at the first Cluster, bits 2-4: buffer-size count - 1), that many
// buffer-size bytes, one allocation-failure byte (the nth allocation fails;
// 0: none), then the file.
//
// Every result must be a declared one, no fixed capacity may be exceeded,
// every block allocated must be freed again, and when the bytes parse
// completely both in the chosen buffers and in one buffer, the block lists
// must agree. Over one buffer, the output path's shortcut for unlaced blocks
// must leave the cluster record exactly as parse_mkvcluster does, for each
// track met taken as the channel's own.

#include <cstddef>
#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "core/cluster/unlaced_block.h"
#include "host/heap_control.h"
#include "tests/support/cluster_driver.h"

namespace testing_support {

namespace cluster_fuzz_detail {

// 0..127 as they are, above that in steps of 64 up to 8192.
inline size_t BufferSize(uint8_t code) { return code < 128 ? code : static_cast<size_t>(code - 127) * 64; }

// "" when the result and the record are as declared, else what is wrong.
inline std::string BrokenInvariant(int result, const mkvcluster& c, bool group_tail) {
  bool declared = group_tail ? (result == kClusterBlockReady || result == kClusterChildShort ||
                                result == kClusterInvalid || result == kClusterNoMemory ||
                                result == kClusterGroupEnded)
                             : (result <= kClusterBlockReady && result >= kClusterNoMemory);
  if (!declared) return "undeclared result " + std::to_string(result);
  if (result == kClusterBlockReady &&
      (c.frame_count < 1 || c.frame_count > kMaxLaceFrames || !c.frame_sizes ||
       c.resume.step != mkv_resume_step::none)) {
    return "block without a frame table";
  }
  if (c.resume.lace_count > kMaxLaceFrames || c.resume.lace_index >= kMaxLaceFrames) return "lace table overrun";
  if (c.resume.number.left > 8 || c.resume.number.length > 8) return "number longer than 8 bytes";
  // destroy_mkvcluster leaves codec_state_size as it was; a copy is never empty.
  if (c.codec_state_size > kMaxCodecStateSize || (c.codec_state && c.codec_state_size == 0)) {
    return "CodecState of " + std::to_string(c.codec_state_size) + " bytes";
  }
  if (c.in_blockgroup > 1) return "in_blockgroup not 0 or 1";
  return "";
}

// The record's fields one after another, owned tables by their contents, then
// `position`. Not its padding: a copy of a whole member, such as
// `number = {}`, may fill that with whatever lay in the copied temporary. Nor
// the lace table's working values (count, index, sum, entries) unless a table
// is being read: else they are left over from whichever laced block the parser
// read last, and set afresh before any use; the shortcut, passing other
// tracks' laced blocks unread, may leave others.
inline std::string Snapshot(const mkvcluster& c, uint64_t position) {
  const mkv_cluster_resume& r = c.resume;
  std::string out;
  auto put = [&out](const auto&... field) { (out.append(reinterpret_cast<const char*>(&field), sizeof field), ...); };
  put(c.cluster_timecode, c.cluster_position, c.cluster_prevsize, c.in_blockgroup, c.block_duration,
      c.reference_priority, c.reference_block, c.codec_state_size, c.blockgroup_size, c.blockgroup_start,
      c.blockgroup_end, c.track_number, c.block_timecode, c.block_flags, c.frame_count, c.block_data_left,
      c.block_start, c.block_end, c.cluster_size, c.cluster_start, c.cluster_end, r.step, r.header_part, r.id,
      r.number.value, r.number.left, r.number.length, r.payload_left, r.data_left, position);
  if (r.step == mkv_resume_step::lace_table) {
    put(r.lace_count, r.lace_index, r.lace_sum);
    out.append(reinterpret_cast<const char*>(r.lace_sizes), (r.lace_index + 1u) * sizeof(int64_t));
  }
  put(c.codec_state != nullptr, c.frame_sizes != nullptr);
  if (c.codec_state) out.append(reinterpret_cast<const char*>(c.codec_state), c.codec_state_size);
  if (c.frame_sizes) out.append(reinterpret_cast<const char*>(c.frame_sizes), c.frame_count * sizeof(int64_t));
  return out;
}

// The own track's blocks (and the final record) of one walk over one buffer;
// skipped blocks and the own track's frames are passed over as the output path does.
inline std::vector<std::string> Walk(const uint8_t* file, size_t size, uint64_t own, bool shortcut) {
  std::vector<std::string> seen;
  mkvcluster c{};
  mkvinbuff in{file, static_cast<uint32_t>(size), 0, static_cast<uint32_t>(size), 0};
  auto skip = [&in](uint64_t count) {
    auto n = static_cast<uint32_t>(count < in.buff_left ? count : in.buff_left);
    in.buff_pos += n;
    in.buff_left -= n;
  };
  while (in.buff_left) {
    destroy_mkvcluster(&c);
    uint64_t left = 0;
    auto taken = shortcut ? take_unlaced_block(&in, &c, own, &left) : unlaced_block_result::parse;
    int result = taken == unlaced_block_result::parse ? parse_mkvcluster(&in, nullptr, &c, &left)
                 : taken == unlaced_block_result::other_track ? kClusterSkip  // *left to skip, as after a skip
                                                              : kClusterBlockReady;
    if (result == kClusterSkip) {
      skip(left);
      continue;
    }
    if (result != kClusterBlockReady) break;
    if (c.track_number == own) seen.push_back(Snapshot(c, in.buff_fileoff + in.buff_pos));
    skip(c.block_data_left > 0 ? static_cast<uint64_t>(c.block_data_left) : 0);
  }
  destroy_mkvcluster(&c);
  seen.push_back(Snapshot(c, in.buff_fileoff + in.buff_pos));
  return seen;
}

}  // namespace cluster_fuzz_detail

// "" when the input passed every check, else the first check that failed.
inline std::string RunClusterFuzzInput(const uint8_t* data, size_t size) {
  using namespace cluster_fuzz_detail;
  if (size < 3) return "";
  uint8_t flags = data[0];
  size_t size_count = 1 + (flags >> 2 & 7);
  if (size < 2 + size_count) return "";
  DriveOptions options;
  options.read_group_tail = flags & 1;
  options.buffer_sizes.clear();
  for (size_t i = 0; i < size_count; ++i) options.buffer_sizes.push_back(BufferSize(data[1 + i]));
  uint8_t fail_at = data[1 + size_count];
  const uint8_t* file = data + 2 + size_count;
  size_t file_size = size - 2 - size_count;
  uint64_t start = flags & 2 ? 0 : FirstClusterOffset(file, file_size);
  if (start >= file_size) start = 0;

  std::string broken;
  options.observe = [&broken](int result, const mkvcluster& cluster, bool group_tail) {
    if (broken.empty()) broken = BrokenInvariant(result, cluster, group_tail);
  };
  int64_t live = host::LiveBlockCount();
  host::FailNthAllocation(fail_at);
  DriveOutcome split = DriveClusters(file, file_size, start, options);
  host::FailNthAllocation(0);
  if (!broken.empty()) return broken;
  if (host::LiveBlockCount() != live) return "blocks leaked";

  options.buffer_sizes = {file_size};
  DriveOutcome whole = DriveClusters(file, file_size, start, options);
  if (!broken.empty()) return broken + " (one buffer)";
  if (host::LiveBlockCount() != live) return "blocks leaked (one buffer)";
  // Without group tails read both lists hold the same unknown (false) keys.
  if (fail_at == 0 && split.complete && whole.complete && split.blocks != whole.blocks) {
    return "blocks differ from the one-buffer parse";
  }
  std::set<uint64_t> tracks;
  for (const DrivenBlock& block : whole.blocks) tracks.insert(block.track);
  for (uint64_t own : tracks) {
    if (Walk(file + start, file_size - start, own, true) != Walk(file + start, file_size - start, own, false) ||
        host::LiveBlockCount() != live) {
      return "the unlaced-block shortcut leaves another record than the parser, or a block, for track " +
             std::to_string(own);
    }
  }
  return "";
}

}  // namespace testing_support
