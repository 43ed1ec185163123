#pragma once
// Feeds a whole file through the playback parser the way the output path
// does: consecutive buffers as inbuff1 and inbuff2, the caller applying each
// skip result and consuming each block's frames by their sizes (crossing into
// the next buffer as needed), and checksumming the frame bytes it consumed.
// Header-only, so the cluster fuzzer can use it without GoogleTest.

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "tests/support/adler32.h"

namespace testing_support {

struct DrivenBlock {
  uint64_t track = 0;
  int64_t ticks = 0;  // Cluster timecode + the block's relative timecode
  bool key = false;  // SimpleBlock: flag 0x80; Block: its group has no ReferenceBlock
  uint8_t flags = 0;
  std::vector<int64_t> frame_sizes;  // as parsed
  std::vector<uint32_t> adler32;     // of the bytes consumed for each frame
  bool operator==(const DrivenBlock&) const = default;
};

struct DriveOptions {
  // Buffer sizes, used in turn and repeated; 0 gives an empty buffer.
  std::vector<size_t> buffer_sizes{4096};
  // Read the rest of a BlockGroup with parse_mkvblockgroup before the next
  // parse_mkvcluster call, as that call would, so that the group's
  // ReferenceBlock decides the Block's key flag. Off: keys of Blocks are not
  // known (false).
  bool read_group_tail = true;
  // Sees every result with the record as the call left it; `group_tail` is
  // set for parse_mkvblockgroup calls (read_group_tail), else the call was
  // parse_mkvcluster.
  std::function<void(int result, const mkvcluster&, bool group_tail)> observe = [](int, const mkvcluster&, bool) {};
};

struct DriveOutcome {
  std::vector<DrivenBlock> blocks;
  bool failed = false;    // a result that was neither a block, a skip nor "ran out" with inbuff1 used up
  bool complete = false;  // every byte was consumed and no read or frame was left half done
};

namespace cluster_driver_detail {

inline bool read_vint(const uint8_t* file, size_t size, uint64_t* pos, uint64_t* value, bool keep_marker) {
  if (*pos >= size || file[*pos] == 0) return false;
  uint8_t first = file[*pos];
  int length = 1;
  while (!(first & (0x80 >> (length - 1)))) ++length;
  if (*pos + length > size) return false;
  uint64_t v = keep_marker ? first : first & (0xFF >> length);
  for (int i = 1; i < length; ++i) v = v << 8 | file[*pos + i];
  *pos += length;
  *value = v;
  return true;
}

// The caller's side of the loop: skip bytes, frames in progress, buffers.
class Driver {
 public:
  Driver(const uint8_t* file, size_t size, uint64_t start, const DriveOptions& options)
      : file_(file), size_(size), next_offset_(start), options_(options), cluster_(std::make_unique<mkvcluster>()) {}
  ~Driver() { destroy_mkvcluster(cluster_.get()); }

  DriveOutcome run() {
    in2_ = next_view();
    do {
      in1_ = in2_;
      has_in2_ = next_offset_ < size_;
      if (has_in2_) in2_ = next_view();
      parse_buffer();
    } while (!outcome_.failed && has_in2_);
    if (group_tail_pending_) finish_group_tail();
    outcome_.complete = !outcome_.failed && in1_.buff_left == 0 && skip_left_ == 0 && !block_ &&
                        !mkvcluster_inside_element(cluster_.get());
    return std::move(outcome_);
  }

 private:
  mkvinbuff next_view() {
    const std::vector<size_t>& sizes = options_.buffer_sizes;
    size_t n = sizes.empty() ? size_ : sizes[view_count_++ % sizes.size()];
    if (n == 0 && last_view_empty_) n = 1;  // empty buffers come, but not forever
    if (n > size_ - next_offset_) n = size_ - next_offset_;
    last_view_empty_ = n == 0;
    mkvinbuff view{file_ + next_offset_, static_cast<uint32_t>(n), 0, static_cast<uint32_t>(n), next_offset_};
    next_offset_ += n;
    return view;
  }

  // The parser waits for the bytes after inbuff1, as the output path takes it; any other answer fails.
  void wait_or_fail(int result) {
    if (mkvcluster_answer(cluster_.get(), result) == cluster_answer::need_more_data && in1_.buff_left == 0) return;
    outcome_.failed = true;
  }

  void apply_skip() {
    uint64_t n = skip_left_ < in1_.buff_left ? skip_left_ : in1_.buff_left;
    in1_.buff_pos += static_cast<uint32_t>(n);
    in1_.buff_left -= static_cast<uint32_t>(n);
    skip_left_ -= n;
  }

  void parse_buffer() {
    apply_skip();
    while (in1_.buff_left && !outcome_.failed) {
      if (block_) consume_frames();
      else if (group_tail_pending_) read_group_tail();
      else call_parser();
    }
  }

  void call_parser() {
    destroy_mkvcluster(cluster_.get());
    uint64_t skip = 0;
    int result = parse_mkvcluster(&in1_, has_in2_ ? &in2_ : nullptr, cluster_.get(), &skip);
    options_.observe(result, *cluster_, false);
    if (result == kClusterBlockReady) return start_block();
    if (result == kClusterSkip) {
      skip_left_ = skip;
      return apply_skip();
    }
    wait_or_fail(result);
  }

  void read_group_tail() {
    const mkvcluster& c = *cluster_;
    uint64_t position = mkvinbuff_position(&in1_, has_in2_ ? &in2_ : nullptr);
    bool inside = c.resume.step != mkv_resume_step::none ||
                  (c.in_blockgroup && position < c.blockgroup_end && position < c.cluster_end);
    if (!inside) return finish_group_tail();
    destroy_mkvcluster(cluster_.get());
    int result = parse_mkvblockgroup(&in1_, has_in2_ ? &in2_ : nullptr, cluster_.get());
    options_.observe(result, *cluster_, true);
    if (result == kClusterGroupEnded) return finish_group_tail();
    if (result == kClusterBlockReady) {  // a further Block in the same group
      finish_group_tail();
      return start_block();
    }
    wait_or_fail(result);
  }

  void finish_group_tail() {
    group_tail_pending_ = false;
    outcome_.blocks.back().key = cluster_->reference_block == 0;  // no block comes before the tail is read
  }

  void start_block() {
    const mkvcluster& c = *cluster_;
    const bool simple = c.in_blockgroup == 0;
    outcome_.blocks.push_back({c.track_number, static_cast<int64_t>(c.cluster_timecode) + c.block_timecode,
                               simple && (c.block_flags & 0x80), c.block_flags,
                               std::vector<int64_t>(c.frame_sizes, c.frame_sizes + c.frame_count), {}});
    group_tail_pending_ = !simple && options_.read_group_tail;
    block_ = true;
    frame_index_ = 0;  // frame_left_ is 0: the block before was consumed whole
    data_left_ = c.block_data_left;
  }

  // Frames of the current block from inbuff1; a frame cut by the buffer's end
  // goes on in the next one. A size below 1 is refused and consumes nothing.
  // Bytes of the block after its last frame (the remainder of a fixed-size
  // lace that does not divide) are skipped.
  void consume_frames() {
    DrivenBlock& block = outcome_.blocks.back();
    while (frame_index_ < block.frame_sizes.size()) {
      auto size = static_cast<int32_t>(static_cast<uint32_t>(block.frame_sizes[frame_index_]));
      if (frame_left_ == 0) {
        if (size < 1) {
          block.adler32.push_back(Adler32Sum{}.value());
          ++frame_index_;
          continue;
        }
        frame_left_ = static_cast<uint32_t>(size);
        adler_ = Adler32Sum{};
      }
      if (in1_.buff_left == 0) return;
      uint32_t n = frame_left_ < in1_.buff_left ? frame_left_ : in1_.buff_left;
      adler_.update(in1_.buff + in1_.buff_pos, n);
      in1_.buff_pos += n;
      in1_.buff_left -= n;
      frame_left_ -= n;
      data_left_ -= n;
      if (frame_left_) return;
      block.adler32.push_back(adler_.value());
      ++frame_index_;
    }
    block_ = false;
    if (data_left_ > 0) {
      skip_left_ = static_cast<uint64_t>(data_left_);
      apply_skip();
    }
  }

  const uint8_t* file_;
  size_t size_;
  uint64_t next_offset_;
  const DriveOptions& options_;
  std::unique_ptr<mkvcluster> cluster_;
  size_t view_count_ = 0;
  bool last_view_empty_ = false;
  mkvinbuff in1_{}, in2_{};
  bool has_in2_ = false;
  uint64_t skip_left_ = 0;     // bytes still to skip from the read position
  bool block_ = false;         // frames of the last parsed block are being consumed
  size_t frame_index_ = 0;
  uint32_t frame_left_ = 0;    // bytes of frame frame_index_ still to consume; 0 between frames
  int64_t data_left_ = 0;      // the block's block_data_left less the frame bytes consumed so far
  Adler32Sum adler_;
  bool group_tail_pending_ = false;  // the last Block's group has children still to read
  DriveOutcome outcome_;
};

}  // namespace cluster_driver_detail

// File offset of the first Cluster (the EBML header and the Segment's other
// children before it are stepped over), or `size` when there is none.
inline uint64_t FirstClusterOffset(const uint8_t* file, size_t size) {
  using cluster_driver_detail::read_vint;
  constexpr uint64_t kSegment = 0x18538067, kCluster = 0x1F43B675;
  uint64_t pos = 0;
  while (pos < size) {
    uint64_t start = pos, id, element_size;
    if (!read_vint(file, size, &pos, &id, true) || !read_vint(file, size, &pos, &element_size, false)) break;
    if (id == kCluster) return start;
    if (id == kSegment) continue;  // its children follow
    if (element_size >= size - pos) break;
    pos += element_size;
  }
  return size;
}

inline DriveOutcome DriveClusters(const uint8_t* file, size_t size, uint64_t start, const DriveOptions& options) {
  return cluster_driver_detail::Driver(file, size, start, options).run();
}

}  // namespace testing_support
