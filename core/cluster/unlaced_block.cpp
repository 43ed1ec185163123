#include "core/cluster/unlaced_block.h"

#include <bit>

#include "core/cluster/cluster_ids.h"
#include "core/cluster/element_header.h"
#include "core/memory.h"

namespace {

constexpr uint8_t kLacingBits = 0x06;
// Sizes up to here keep the parser's 32-bit block arithmetic exact.
constexpr uint64_t kLargestExactSize = 0x7FFFFFFF;
// The longest header taken here: BlockGroup ID and size, Block ID and size,
// track number, timecode and flags. Closer to the end of inbuff1 the parser reads it.
constexpr uint32_t kLongestHeader = 1 + 8 + 1 + 8 + 8 + 3;

// A size or track number at `at` (marker removed): its length, or 0 when invalid.
inline uint32_t read_vint(const uint8_t* at, uint64_t* value) {
  const uint8_t first = *at;
  if (first == 0) return 0;
  const auto length = static_cast<uint32_t>(std::countl_zero(first) + 1);
  uint64_t v = first & (0xFFu >> length);
  for (uint32_t i = 1; i < length; ++i) v = v << 8 | at[i];
  *value = v;
  return length;
}

// BlockDuration, ReferencePriority and ReferenceBlock after a BlockGroup's
// Block, read in place as the parser reads them (ReferenceBlock sign-extended
// from its width). True once the read position is past the group; false at a
// child of another kind or one that does not lie whole in inbuff1, after the
// values before it: the parser goes on from there.
bool finish_group_values(mkvinbuff* inbuff1, mkvcluster* cluster) {
  constexpr uint32_t kLongestValue = 1 + 1 + 8;
  for (;;) {
    const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
    if (position >= cluster->blockgroup_end || position >= cluster->cluster_end) return true;
    if (inbuff1->buff_left < kLongestValue) return false;
    const uint8_t* at = inbuff1->buff + inbuff1->buff_pos;
    const uint8_t id = at[0];
    if (id != cluster_id::kBlockDuration && id != cluster_id::kReferencePriority && id != cluster_id::kReferenceBlock) {
      return false;
    }
    if ((at[1] & 0x80) == 0 || (at[1] & 0x7F) > 8) return false;
    const uint32_t width = at[1] & 0x7Fu;
    uint64_t value = 0;
    for (uint32_t i = 0; i < width; ++i) value = value << 8 | at[2 + i];
    if (id == cluster_id::kBlockDuration) {
      cluster->block_duration = value;
    } else if (id == cluster_id::kReferencePriority) {
      cluster->reference_priority = value;
    } else {
      const unsigned shift = width > 0 && width < 8 ? 64u - 8u * width : 0u;
      cluster->reference_block = static_cast<int64_t>(value << shift) >> shift;
    }
    cluster->resume.id = id;
    inbuff1->buff_pos += 2 + width;
    inbuff1->buff_left -= 2 + width;
  }
}

// One header at inbuff1's read position, or false with nothing consumed.
// Other tracks' headers are taken whatever the allocator says; the own
// track's needs its one-entry table.
bool take_one(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track, bool* own, int32_t* data_left) {
  mkv_cluster_resume& resume = cluster->resume;
  if (resume.step != mkv_resume_step::none) return false;
  if (cluster->in_blockgroup && !finish_group_values(inbuff1, cluster)) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const uint8_t* const start = inbuff1->buff + inbuff1->buff_pos;
  const uint8_t id = start[0];
  if (id != cluster_id::kSimpleBlock && id != cluster_id::kBlockGroup) return false;
  const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (position >= cluster->cluster_end) return false;
  const uint8_t* at = start + 1;
  uint64_t size = 0, group_size = 0, track = 0;
  uint32_t length = read_vint(at, &size);
  if (!length) return false;
  at += length;
  if (id == cluster_id::kBlockGroup) {
    // The group's first child must be its Block.
    group_size = size;
    if (group_size == 0 || *at != cluster_id::kBlock || !(length = read_vint(at + 1, &size))) return false;
    at += 1 + length;
  }
  const uint32_t track_length = read_vint(at, &track);
  if (!track_length) return false;
  const uint8_t* const fields = at + track_length;
  const uint8_t flags = fields[2];
  if ((flags & kLacingBits) != 0 || size > kLargestExactSize || size < 3 + uint64_t{track_length}) return false;

  const uint64_t block_start = position + static_cast<uint64_t>(at - start);
  const auto data = static_cast<int32_t>(size - 3 - track_length);
  int64_t* sizes = nullptr;
  if (track == own_track) {
    // The parser's table of one frame; without it the parser tries again and reports the failure.
    sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
    if (!sizes) return false;
    sizes[0] = data;
  }
  if (id == cluster_id::kBlockGroup) {
    const uint64_t group_start = position + 1 + static_cast<uint64_t>(std::countl_zero(start[1]) + 1);
    cluster->in_blockgroup = 1;
    cluster->blockgroup_size = group_size;
    cluster->blockgroup_start = group_start;
    cluster->blockgroup_end = element_end(group_start, group_size);
    cluster->block_duration = 0;
    cluster->reference_priority = 0;
    cluster->reference_block = 0;
    resume.id = cluster_id::kBlock;
  } else {
    cluster->in_blockgroup = 0;
    resume.id = cluster_id::kSimpleBlock;
  }
  cluster->frame_sizes = sizes;
  cluster->frame_count = 1;
  cluster->block_start = block_start;
  cluster->block_end = element_end(block_start, size);
  cluster->track_number = track;
  cluster->block_timecode = static_cast<int16_t>(static_cast<uint16_t>(fields[0] << 8 | fields[1]));
  cluster->block_flags = flags;
  cluster->block_data_left = data;
  resume.header_part = 0;
  resume.number = {};
  resume.data_left = data;
  resume.lace_count = 1;
  resume.lace_sizes[0] = data;

  const auto consumed = static_cast<uint32_t>(fields + 3 - start);
  inbuff1->buff_pos += consumed;
  inbuff1->buff_left -= consumed;
  *own = sizes != nullptr;
  *data_left = data;
  return true;
}

}  // namespace

// Other tracks' blocks whose data lies whole in inbuff1 are passed over here
// one after another, as the caller would skip each; the run ends with the
// first block that is the channel's own, is cut by the end of inbuff1, or
// needs the parser.
unlaced_block_result take_unlaced_block(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track,
                                        uint64_t* data_left) {
  auto result = unlaced_block_result::parse;
  *data_left = 0;
  bool own = false;
  int32_t data = 0;
  while (take_one(inbuff1, cluster, own_track, &own, &data)) {
    if (own) return unlaced_block_result::own_track;
    result = unlaced_block_result::other_track;
    if (static_cast<uint32_t>(data) > inbuff1->buff_left) {
      *data_left = static_cast<uint64_t>(data);
      break;
    }
    inbuff1->buff_pos += static_cast<uint32_t>(data);
    inbuff1->buff_left -= static_cast<uint32_t>(data);
  }
  return result;
}
