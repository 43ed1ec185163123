#pragma once
// The pieces the cluster parser's shortcuts share: block headers decoded in
// place from inbuff1 and the record written as parse_mkvcluster would leave
// it, for the common SimpleBlock and BlockGroup and the values that end a
// group.

#include <algorithm>
#include <bit>
#include <cstdint>
#include <cstring>

#include "core/cluster/block_flags.h"
#include "core/cluster/cluster_ids.h"
#include "core/cluster/element_header.h"
#include "core/cluster/mkv_cluster.h"
#include "core/memory.h"

namespace cluster_shortcut {

using block_flags::kLacingBits;
// Sizes up to here keep the parser's 32-bit block arithmetic exact.
constexpr uint64_t kLargestExactSize = 0x7FFFFFFF;
// The longest header taken here: BlockGroup ID and size, Block ID and size,
// track number, timecode and flags. Closer to the end of inbuff1 the parser
// reads it, and closer to the Cluster's end too: the parser does not return a
// block whose header reaches that end, but reads on from there.
constexpr uint32_t kLongestHeader = 1 + 8 + 1 + 8 + 8 + 3;

// A size or track number at `at` (marker removed): its length, or 0 when
// invalid. Reads the 8 bytes from `at` whatever the length: the callers have
// kLongestHeader bytes in front of them. Nearly every field is one or two
// bytes long, and those are read without the variable shifts of the rest.
[[gnu::always_inline]] inline uint32_t read_vint(const uint8_t* at, uint64_t* value) {
  const uint8_t first = at[0];
  if (first & 0x80) {
    *value = first & 0x7Fu;
    return 1;
  }
  if (first & 0x40) {
    *value = (first & 0x3Fu) << 8 | at[1];
    return 2;
  }
  uint64_t word;
  std::memcpy(&word, at, sizeof word);
  if constexpr (std::endian::native == std::endian::little) word = __builtin_bswap64(word);
  if ((word >> 56) == 0) return 0;
  const auto length = static_cast<uint32_t>(std::countl_zero(word) + 1);
  *value = (word << length) >> length >> (64 - 8 * length);
  return length;
}

// Where inbuff1 allows a run of block headers, from its read position:
// headers start before the last kLongestHeader bytes of both it and the
// Cluster (`stop`), and blocks passed whole end by `limit`. Offsets from inbuff1's start.
struct run_window {
  const uint8_t* buff;
  uint32_t first;  // the read position
  uint32_t total;  // the bytes of inbuff1
  uint64_t fileoff;
  uint32_t stop;
  uint32_t limit;
};

[[gnu::always_inline]] inline run_window window_of(const mkvinbuff* inbuff1, const mkvcluster* cluster) {
  const uint32_t total = inbuff1->buff_pos + inbuff1->buff_left;
  const uint64_t fileoff = inbuff1->buff_fileoff;
  const uint64_t cluster_left = cluster->cluster_end > fileoff ? cluster->cluster_end - fileoff : 0;
  return run_window{inbuff1->buff,
                    inbuff1->buff_pos,
                    total,
                    fileoff,
                    static_cast<uint32_t>(std::min<uint64_t>(
                        total - kLongestHeader + 1, cluster_left > kLongestHeader ? cluster_left - kLongestHeader : 0)),
                    static_cast<uint32_t>(std::min<uint64_t>(total, cluster_left))};
}

// The longest BlockDuration, ReferencePriority or ReferenceBlock: ID, size, 8 bytes.
constexpr uint32_t kLongestValue = 1 + 1 + 8;

// Length of the BlockDuration, ReferencePriority or ReferenceBlock at `at`
// (kLongestValue bytes readable), or 0 for a child of another kind or width.
[[gnu::always_inline]] inline uint32_t group_value_length(const uint8_t* at) {
  const uint8_t id = at[0];
  if (id != cluster_id::kBlockDuration && id != cluster_id::kReferencePriority && id != cluster_id::kReferenceBlock) {
    return 0;
  }
  if ((at[1] & 0x80) == 0 || (at[1] & 0x7F) > 8) return 0;
  return 2 + (at[1] & 0x7Fu);
}

// Stores the value at `at`, of a kind group_value_length accepts, as the parser
// does (ReferenceBlock sign-extended from its width).
inline void store_group_value(const uint8_t* at, mkvcluster* cluster) {
  const uint8_t id = at[0];
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
}

// An unlaced block header decoded in place (nothing stored yet).
struct block_header_view {
  uint8_t id;
  uint64_t size;             // the (Simple)Block's size
  uint64_t group_size;       // the BlockGroup's size, for a BlockGroup
  uint64_t track;
  uint32_t track_length;
  uint32_t group_offset;     // bytes from the element ID to the BlockGroup payload
  uint32_t block_offset;     // bytes from the element ID to the block payload
  uint32_t header_length;    // bytes from the element ID to the first frame byte
  const uint8_t* fields;     // timecode and flags
};

// Decodes the header at `start` (at least kLongestHeader bytes readable);
// false when it is not an unlaced block the shortcut may take.
[[gnu::always_inline]] inline bool decode_header(const uint8_t* start, block_header_view* h) {
  const uint8_t id = start[0];
  if (id != cluster_id::kSimpleBlock && id != cluster_id::kBlockGroup) return false;
  const uint8_t* at = start + 1;
  uint64_t size = 0, group_size = 0, track = 0;
  uint32_t length = read_vint(at, &size);
  if (!length) return false;
  at += length;
  const auto group_offset = static_cast<uint32_t>(at - start);
  if (id == cluster_id::kBlockGroup) {
    // The group's first child must be its Block.
    group_size = size;
    if (group_size == 0 || *at != cluster_id::kBlock || !(length = read_vint(at + 1, &size))) return false;
    at += 1 + length;
  }
  const uint32_t track_length = read_vint(at, &track);
  if (!track_length) return false;
  const uint8_t* const fields = at + track_length;
  if ((fields[2] & kLacingBits) != 0 || size > kLargestExactSize || size < 3 + uint64_t{track_length}) return false;
  h->id = id;
  h->size = size;
  h->group_size = group_size;
  h->track = track;
  h->track_length = track_length;
  h->group_offset = group_offset;
  h->block_offset = static_cast<uint32_t>(at - start);
  h->header_length = static_cast<uint32_t>(fields + 3 - start);
  h->fields = fields;
  return true;
}

inline int32_t data_size(const block_header_view& h) { return static_cast<int32_t>(h.size - 3 - h.track_length); }

// The record as the parser leaves it after the header `h` read at file
// offset `position`, with `sizes` as its frame table.
[[gnu::always_inline]] inline void store_header(mkvcluster* cluster, const block_header_view& h, uint64_t position,
                                                int64_t* sizes) {
  mkv_cluster_resume& resume = cluster->resume;
  const int32_t data = data_size(h);
  const uint64_t block_start = position + h.block_offset;
  if (h.id == cluster_id::kBlockGroup) {
    const uint64_t group_start = position + h.group_offset;
    cluster->in_blockgroup = 1;
    cluster->blockgroup_size = h.group_size;
    cluster->blockgroup_start = group_start;
    cluster->blockgroup_end = element_end(group_start, h.group_size);
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
  cluster->block_end = element_end(block_start, h.size);
  cluster->track_number = h.track;
  cluster->block_timecode = static_cast<int16_t>(static_cast<uint16_t>(h.fields[0] << 8 | h.fields[1]));
  cluster->block_flags = h.fields[2];
  cluster->block_data_left = data;
  resume.header_part = 0;
  resume.number = {};
  resume.data_left = data;
  resume.lace_count = 1;
  resume.lace_sizes[0] = data;
}

// ID, two-byte size and one-byte track number of the SimpleBlock at `at`,
// big-endian in one word; masked with kCommonMask it equals kCommonHeader.
// Most blocks are from 127 bytes to 16 KiB and of one of the first 127 tracks.
constexpr uint32_t kCommonMask = 0xFFC00080u;
constexpr uint32_t kCommonHeader = uint32_t{cluster_id::kSimpleBlock} << 24 | 0x00400080u;

[[gnu::always_inline]] inline uint32_t header_word(const uint8_t* at) {
  uint32_t word;
  std::memcpy(&word, at, sizeof word);
  if constexpr (std::endian::native == std::endian::little) word = __builtin_bswap32(word);
  return word;
}

// An unlaced SimpleBlock of the common kind, of at least 4 bytes (track, timecode, flags).
[[gnu::always_inline]] inline bool is_common_block(const uint8_t* at, uint32_t word) {
  return (word & kCommonMask) == kCommonHeader && (at[6] & kLacingBits) == 0 && (word >> 8 & 0x3FFFu) >= 4;
}

// Whether the children of a BlockGroup from `child` to `end` (offsets in
// `buff`, whose first `total` bytes are readable) are only BlockDuration,
// ReferencePriority and ReferenceBlock, each with kLongestValue bytes
// readable, ending exactly at `end`: then they are read as the parser reads them.
[[gnu::always_inline]] inline bool group_values_fit(const uint8_t* buff, uint32_t child, uint32_t end, uint32_t total) {
  // Most groups hold one ReferenceBlock of one byte (FB 81 xx), or nothing.
  if (end - child == 3 && total - child >= kLongestValue && buff[child] == cluster_id::kReferenceBlock &&
      buff[child + 1] == 0x81) {
    return true;
  }
  while (child < end) {
    if (total - child < kLongestValue) return false;
    const uint32_t length = group_value_length(buff + child);
    if (!length || length > end - child) return false;
    child += length;
  }
  return true;
}

constexpr uint32_t kOwnGroup = UINT32_MAX;

// The header of a SimpleBlock of the common kind at `at` (is_common_block).
[[gnu::always_inline]] inline block_header_view common_block_view(const uint8_t* at) {
  return block_header_view{cluster_id::kSimpleBlock, (at[1] & 0x3Fu) << 8 | at[2], 0, at[3] & 0x7Fu, 1, 0, 3, 7,
                           at + 4};
}

// The header of a BlockGroup of the common kind at `at`, or false.
[[gnu::always_inline]] inline bool common_group_view(const uint8_t* at, block_header_view* h) {
  const uint32_t word = header_word(at);
  const uint32_t block = header_word(at + 4);  // Block size, track number, timecode's first byte
  if ((word & 0xFFC000FFu) != (uint32_t{cluster_id::kBlockGroup} << 24 | 0x00400000u | cluster_id::kBlock) ||
      (block & 0xC0008000u) != 0x40008000u || (at[9] & kLacingBits) != 0) {
    return false;
  }
  const uint32_t group_size = word >> 8 & 0x3FFFu, block_size = block >> 16 & 0x3FFFu;
  if (block_size < 4 || group_size == 0) return false;
  *h = block_header_view{cluster_id::kBlockGroup, block_size, group_size, at[6] & 0x7Fu, 1, 3, 6, 10, at + 7};
  return true;
}

// passable_group_end for the common BlockGroup: two-byte group and Block
// sizes, a one-byte track number, then the children (most often one
// ReferenceBlock, or none), all before `limit` (the end of inbuff1 or of the
// Cluster, if sooner). 0 when the group is not of that kind or cannot be
// passed over; kOwnGroup when it is the channel's own.
[[gnu::always_inline]] inline uint32_t common_group_end(const uint8_t* at, uint32_t pos, uint32_t total,
                                                        uint32_t limit, uint32_t own_field) {
  block_header_view h;
  if (!common_group_view(at, &h)) return 0;
  if (at[6] == own_field) return kOwnGroup;
  const auto end = static_cast<uint32_t>(pos + 3 + h.group_size);
  auto child = static_cast<uint32_t>(pos + 6 + h.size);
  if (end > limit || child > end) return 0;
  return group_values_fit(at - pos, child, end, total) ? end : 0;
}

// Takes the channel's own block of the common kind at `at` in inbuff1 (a
// SimpleBlock, or a BlockGroup common_group_view reads): its one-entry frame
// table, its header in the record, the read position after the header, as
// take_one leaves them. False, with nothing changed, when the table cannot be had.
[[gnu::always_inline]] inline bool take_own_common_block(mkvinbuff* inbuff1, mkvcluster* cluster,
                                                         const uint8_t* at) {
  block_header_view h = common_block_view(at);
  if (at[0] == cluster_id::kBlockGroup && !common_group_view(at, &h)) return false;
  auto* sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
  if (!sizes) return false;
  sizes[0] = data_size(h);
  const auto pos = static_cast<uint32_t>(at - inbuff1->buff);
  const uint32_t total = inbuff1->buff_pos + inbuff1->buff_left;
  store_header(cluster, h, inbuff1->buff_fileoff + pos, sizes);
  inbuff1->buff_pos = pos + h.header_length;
  inbuff1->buff_left = total - pos - h.header_length;
  return true;
}

// BlockDuration, ReferencePriority and ReferenceBlock after a BlockGroup's
// Block, read in place as the parser reads them. True once the read position
// is past the group; false at a child of another kind or one that does not
// lie whole in inbuff1, after the values before it: the parser goes on from there.
// A group that runs past the Cluster's end is the parser's from the start: it
// reads such a group's children on past that end, in the same call.
inline bool finish_group_values(mkvinbuff* inbuff1, mkvcluster* cluster) {
  if (cluster->blockgroup_end > cluster->cluster_end) return false;
  // Most often the group ends with one ReferenceBlock of one byte (FB 81 xx).
  const uint64_t start = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (start + 3 == cluster->blockgroup_end && inbuff1->buff_left >= kLongestValue) {
    const uint8_t* at = inbuff1->buff + inbuff1->buff_pos;
    if (at[0] == cluster_id::kReferenceBlock && at[1] == 0x81) {
      cluster->reference_block = static_cast<int8_t>(at[2]);
      cluster->resume.id = cluster_id::kReferenceBlock;
      inbuff1->buff_pos += 3;
      inbuff1->buff_left -= 3;
      return true;
    }
  }
  for (;;) {
    const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
    if (position >= cluster->blockgroup_end) return true;  // within the Cluster, as checked above
    if (inbuff1->buff_left < kLongestValue) return false;
    const uint8_t* at = inbuff1->buff + inbuff1->buff_pos;
    const uint32_t length = group_value_length(at);
    if (!length) return false;
    store_group_value(at, cluster);
    inbuff1->buff_pos += length;
    inbuff1->buff_left -= length;
  }
}

}  // namespace cluster_shortcut
