#include "core/cluster/block_header.h"

#include <cstring>

#include "core/cluster/block_flags.h"
#include "core/cluster/cluster_status.h"
#include "core/cluster/element_header.h"
#include "core/memory.h"

namespace {

using block_flags::kFixedLacing;
using block_flags::kLacingBits;
using block_flags::kNoLacing;
using block_flags::kXiphLacing;

// Block sizes are 32-bit signed arithmetic that wraps, as real muxers' sizes
// never come near it and hostile ones must not be undefined behaviour.
int32_t wrapping_sub(int32_t a, uint64_t b) {
  return static_cast<int32_t>(static_cast<uint32_t>(a) - static_cast<uint32_t>(b));
}
int32_t wrapping_add(int32_t a, uint64_t b) {
  return static_cast<int32_t>(static_cast<uint32_t>(a) + static_cast<uint32_t>(b));
}

// Bias of a signed EBML lace difference coded in `length` bytes: 2^(7L-1) - 1.
uint64_t lace_bias(uint8_t length) { return (uint64_t{1} << (7 * length - 1)) - 1; }

// Hands the finished table over to frame_sizes.
int finish_block(mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  resume.step = mkv_resume_step::none;
  auto* table = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t) * resume.lace_count));
  if (!table) return kClusterNoMemory;
  std::memcpy(table, resume.lace_sizes, sizeof(int64_t) * resume.lace_count);
  cluster->frame_sizes = table;
  cluster->frame_count = resume.lace_count;
  cluster->block_data_left = resume.data_left;
  return kClusterBlockReady;
}

// Every entry but the last is coded as a run of bytes ending below 255.
int continue_xiph_lacing(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  while (resume.lace_index + 1 < resume.lace_count) {
    uint8_t byte;
    if (!cursor->next(&byte)) return kClusterChildShort;
    resume.data_left = wrapping_sub(resume.data_left, 1);
    resume.lace_sizes[resume.lace_index] += byte;
    if (byte != 255) {
      resume.lace_sum = wrapping_add(resume.lace_sum, static_cast<uint64_t>(resume.lace_sizes[resume.lace_index]));
      resume.lace_sizes[++resume.lace_index] = 0;
    }
  }
  return kClusterBlockReady;
}

// The first entry is a vint, each further one but the last a biased signed
// difference from the one before. A one-frame lace codes no size at all.
int continue_ebml_lacing(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  while (resume.lace_index + 1 < resume.lace_count) {
    ebml_number_result read = ebml_continue_number(cursor, ebml_number_form::vint, 0, &resume.number);
    if (read == ebml_number_result::short_read) return kClusterChildShort;
    uint16_t i = resume.lace_index;
    if (read == ebml_number_result::invalid) {
      resume.step = mkv_resume_step::none;
      return i == 0 ? kClusterInvalid : kClusterChildShort;
    }
    uint64_t entry = resume.number.value;
    if (i > 0) entry += static_cast<uint64_t>(resume.lace_sizes[i - 1]) - lace_bias(resume.number.length);
    resume.lace_sizes[i] = static_cast<int64_t>(entry);
    resume.data_left = wrapping_sub(resume.data_left, resume.number.length);
    resume.lace_sum = wrapping_add(resume.lace_sum, entry);
    resume.lace_index = static_cast<uint16_t>(i + 1);
    resume.number = {};
  }
  return kClusterBlockReady;
}

// Called once the frame-count byte is read: fills or starts the lace table.
int start_lacing(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  resume.lace_index = 0;
  resume.lace_sum = 0;
  resume.lace_sizes[0] = 0;
  resume.number = {};
  if ((cluster->block_flags & kLacingBits) == kFixedLacing) {
    // A remainder of the division belongs to no frame; it stays in block_data_left.
    int32_t each = resume.data_left / static_cast<int32_t>(resume.lace_count);
    for (uint16_t i = 0; i < resume.lace_count; ++i) resume.lace_sizes[i] = each;
    return finish_block(cluster);
  }
  resume.step = mkv_resume_step::lace_table;
  return continue_block_header(cursor, cluster);
}

}  // namespace

int begin_block(buff_cursor* cursor, mkvcluster* cluster, uint64_t size) {
  mem_free(cluster->frame_sizes);
  cluster->frame_sizes = nullptr;
  cluster->frame_count = 0;
  cluster->block_start = cursor->position();
  cluster->block_end = element_end(cluster->block_start, size);
  cluster->block_data_left = static_cast<int64_t>(size);
  mkv_cluster_resume& resume = cluster->resume;
  resume.data_left = wrapping_sub(static_cast<int32_t>(static_cast<uint32_t>(size)), 3);
  resume.number = {};
  resume.step = mkv_resume_step::track_number;
  return continue_block_header(cursor, cluster);
}

int continue_block_header(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  switch (resume.step) {
    case mkv_resume_step::track_number: {
      ebml_number_result read = ebml_continue_number(cursor, ebml_number_form::vint, 0, &resume.number);
      if (read == ebml_number_result::short_read) return kClusterChildShort;
      if (read == ebml_number_result::invalid) {
        resume.step = mkv_resume_step::none;
        return kClusterInvalid;
      }
      cluster->track_number = resume.number.value;
      resume.data_left = wrapping_sub(resume.data_left, resume.number.length);
      resume.number = {};
      cluster->block_timecode = 0;
      resume.step = mkv_resume_step::block_timecode;
      [[fallthrough]];
    }
    case mkv_resume_step::block_timecode: {
      ebml_number_result read = ebml_continue_number(cursor, ebml_number_form::raw, 2, &resume.number);
      cluster->block_timecode = static_cast<int16_t>(static_cast<uint16_t>(resume.number.value));
      if (read == ebml_number_result::short_read) return kClusterChildShort;
      resume.number = {};
      resume.step = mkv_resume_step::block_flags;
      [[fallthrough]];
    }
    case mkv_resume_step::block_flags: {
      if (!cursor->next(&cluster->block_flags)) return kClusterChildShort;
      if ((cluster->block_flags & kLacingBits) == kNoLacing) {
        resume.lace_count = 1;
        resume.lace_sizes[0] = resume.data_left;
        return finish_block(cluster);
      }
      resume.step = mkv_resume_step::frame_count;
      [[fallthrough]];
    }
    case mkv_resume_step::frame_count: {
      uint8_t count_minus_one;
      if (!cursor->next(&count_minus_one)) return kClusterChildShort;
      resume.lace_count = static_cast<uint16_t>(count_minus_one + 1);
      resume.data_left = wrapping_sub(resume.data_left, 1);
      return start_lacing(cursor, cluster);
    }
    case mkv_resume_step::lace_table: {
      int result = (cluster->block_flags & kLacingBits) == kXiphLacing ? continue_xiph_lacing(cursor, cluster)
                                                                       : continue_ebml_lacing(cursor, cluster);
      if (result != kClusterBlockReady) return result;
      uint16_t last = static_cast<uint16_t>(resume.lace_count - 1);
      resume.lace_sizes[last] = wrapping_sub(resume.data_left, static_cast<uint32_t>(resume.lace_sum));
      return finish_block(cluster);
    }
    default:
      return kClusterInvalid;
  }
}
