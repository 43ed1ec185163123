#include "core/cluster/unlaced_block.h"

#include <algorithm>
#include <bit>
#include <cstring>

#include "core/cluster/cluster_ids.h"
#include "core/cluster/element_header.h"
#include "core/memory.h"

namespace {

constexpr uint8_t kLacingBits = 0x06;
constexpr uint8_t kXiphLacingBits = 0x02;
constexpr uint8_t kFixedLacingBits = 0x04;
// Sizes up to here keep the parser's 32-bit block arithmetic exact.
constexpr uint64_t kLargestExactSize = 0x7FFFFFFF;
// The longest header taken here: BlockGroup ID and size, Block ID and size,
// track number, timecode and flags. Closer to the end of inbuff1 the parser reads it.
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
void store_group_value(const uint8_t* at, mkvcluster* cluster) {
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

// BlockDuration, ReferencePriority and ReferenceBlock after a BlockGroup's
// Block, read in place as the parser reads them. True once the read position
// is past the group; false at a child of another kind or one that does not
// lie whole in inbuff1, after the values before it: the parser goes on from there.
bool finish_group_values(mkvinbuff* inbuff1, mkvcluster* cluster) {
  // Most often the group ends with one ReferenceBlock of one byte (FB 81 xx).
  const uint64_t start = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (start + 3 == cluster->blockgroup_end && start + 3 <= cluster->cluster_end && inbuff1->buff_left >= kLongestValue) {
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
    if (position >= cluster->blockgroup_end || position >= cluster->cluster_end) return true;
    if (inbuff1->buff_left < kLongestValue) return false;
    const uint8_t* at = inbuff1->buff + inbuff1->buff_pos;
    const uint32_t length = group_value_length(at);
    if (!length) return false;
    store_group_value(at, cluster);
    inbuff1->buff_pos += length;
    inbuff1->buff_left -= length;
  }
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

// One header at inbuff1's read position, or false with nothing consumed.
// Other tracks' headers are taken whatever the allocator says; the own
// track's needs its one-entry table.
bool take_one(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track, bool* own, int32_t* data_left) {
  if (cluster->resume.step != mkv_resume_step::none) return false;
  if (cluster->in_blockgroup && !finish_group_values(inbuff1, cluster)) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const uint8_t* const start = inbuff1->buff + inbuff1->buff_pos;
  const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (position >= cluster->cluster_end) return false;
  block_header_view h;
  if (!decode_header(start, &h)) return false;
  const int32_t data = data_size(h);
  int64_t* sizes = nullptr;
  if (h.track == own_track) {
    // The parser's table of one frame; without it the parser tries again and reports the failure.
    sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
    if (!sizes) return false;
    sizes[0] = data;
  }
  store_header(cluster, h, position, sizes);
  inbuff1->buff_pos += h.header_length;
  inbuff1->buff_left -= h.header_length;
  *own = sizes != nullptr;
  *data_left = data;
  return true;
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

// Other tracks' blocks of the common kind from `pos`, each whole before
// `total`, starting before `stop`: returns where the run ends; *last_pos is
// the start of the last block passed (unchanged when none was). Kept apart
// from its caller so that its few values stay in registers.
inline uint32_t pass_common_run(const uint8_t* buff, uint32_t pos, uint32_t stop, uint32_t total,
                                           uint32_t own_field, uint32_t* last_pos) {
  uint32_t last = *last_pos;
  while (pos < stop) {
    const uint8_t* const at = buff + pos;
    const uint32_t word = header_word(at);
    const uint32_t size = word >> 8 & 0x3FFFu;
    if (!is_common_block(at, word) || (word & 0xFFu) == own_field || size + 3 > total - pos) break;
    last = pos;
    pos += size + 3;
  }
  *last_pos = last;
  return pos;
}

constexpr uint32_t kNoGroup = UINT32_MAX;

// The end (from inbuff1's start) of the BlockGroup at `at`, `pos` bytes into
// inbuff1, when it can be passed over whole as take_one and
// finish_group_values would take it: another track's unlaced Block first,
// then only BlockDuration, ReferencePriority and ReferenceBlock, each with
// kLongestValue bytes readable, ending exactly at the group's end, all before
// `total` and the Cluster's end. Else 0.
uint32_t passable_group_end(const uint8_t* at, uint32_t pos, uint32_t total, uint64_t fileoff, uint64_t cluster_end,
                            uint64_t own_track) {
  block_header_view h;
  if (!decode_header(at, &h) || h.track == own_track) return 0;
  const uint64_t group_end = uint64_t{pos} + h.group_offset + h.group_size;
  const uint64_t block_end = uint64_t{pos} + h.block_offset + h.size;
  if (group_end > total || fileoff + group_end > cluster_end || block_end > group_end) return 0;
  auto child = static_cast<uint32_t>(block_end);
  const auto end = static_cast<uint32_t>(group_end);
  // Most groups hold one ReferenceBlock of one byte (FB 81 xx), or nothing.
  if (end - child == 3 && total - child >= kLongestValue && at[child - pos] == cluster_id::kReferenceBlock &&
      at[child - pos + 1] == 0x81) {
    return end;
  }
  while (child < end) {
    if (total - child < kLongestValue) return 0;
    const uint32_t length = group_value_length(at - pos + child);
    if (!length || length > end - child) return 0;
    child += length;
  }
  return end;
}

constexpr uint32_t kOwnGroup = UINT32_MAX;

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
  // Most groups hold one ReferenceBlock of one byte (FB 81 xx), or nothing.
  if (end - child == 3 && total - child >= kLongestValue && at[child - pos] == cluster_id::kReferenceBlock &&
      at[child - pos + 1] == 0x81) {
    return end;
  }
  while (child < end) {
    if (total - child < kLongestValue) return 0;
    const uint32_t length = group_value_length(at - pos + child);
    if (!length || length > end - child) return 0;
    child += length;
  }
  return end;
}

// The record as take_one, skipping the Block's data, and finish_group_values
// leave it after the group at `at` (file offset `position`) that
// passable_group_end took.
void store_passed_group(const uint8_t* at, uint64_t position, mkvcluster* cluster) {
  block_header_view h{};
  if (!common_group_view(at, &h) && !decode_header(at, &h)) return;  // it did decode when the group was passed
  store_header(cluster, h, position, nullptr);
  const uint8_t* child = at + h.block_offset + h.size;
  const uint8_t* const end = at + h.group_offset + h.group_size;
  while (child < end) {
    store_group_value(child, cluster);
    child += group_value_length(child);
  }
}

// Other tracks' blocks lying whole in inbuff1 (SimpleBlocks with a one-byte
// track number, as good as all of them, and BlockGroups that
// passable_group_end takes), passed over by their headers alone. Each would
// leave the record as the next overwrites it, except that a BlockGroup's
// values stay under the SimpleBlocks after it: the last group's record is
// written here, and the last SimpleBlock after it, if any, is left in
// *last_simple for the record (simple_view). True when any was passed over. A run
// that ends at one of the channel's own blocks of the common kind leaves it in
// *own_block, at the new read position (a BlockGroup whose first bytes are of
// the common kind counts too). The checks are decode_header's; a block's
// header and data together are its ID, size field and size.
bool pass_other_blocks(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track, const uint8_t** last_simple,
                       const uint8_t** own_block) {
  if (cluster->resume.step != mkv_resume_step::none) return false;
  // Not before the current BlockGroup's values are read (finish_group_values).
  const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (cluster->in_blockgroup && position < cluster->blockgroup_end && position < cluster->cluster_end) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const uint8_t* const buff = inbuff1->buff;
  const uint32_t first_pos = inbuff1->buff_pos;
  const uint32_t total = first_pos + inbuff1->buff_left;
  const uint64_t fileoff = inbuff1->buff_fileoff;
  // Headers start before both the last kLongestHeader bytes and the Cluster's end.
  const uint64_t cluster_left = cluster->cluster_end > fileoff ? cluster->cluster_end - fileoff : 0;
  const auto stop = static_cast<uint32_t>(std::min<uint64_t>(total - kLongestHeader + 1, cluster_left));
  const auto limit = static_cast<uint32_t>(std::min<uint64_t>(total, cluster_left));  // where passed groups end
  // The own track's number as a one-byte field, or 0, which no such field is.
  const uint8_t own_field = own_track < 0x80 ? static_cast<uint8_t>(0x80 | own_track) : 0;
  uint32_t pos = first_pos, last_pos = 0, last_group_pos = kNoGroup;
  while (pos < stop) {
    pos = pass_common_run(buff, pos, stop, total, own_field, &last_pos);
    if (pos >= stop) break;
    const uint8_t* const at = buff + pos;
    const uint32_t word = header_word(at);
    if (is_common_block(at, word)) {
      if ((word & 0xFFu) == own_field) *own_block = at;
      break;  // the channel's own, or cut by the end of inbuff1
    }
    if (at[0] == cluster_id::kBlockGroup) {
      // Groups come in runs of their own (a muxer writes all blocks alike).
      bool run_ends = false;
      do {
        const uint8_t* const group = buff + pos;
        uint32_t end = common_group_end(group, pos, total, limit, own_field);
        if (end == kOwnGroup) {
          *own_block = group;
          run_ends = true;
          break;
        }
        if (!end) end = passable_group_end(group, pos, total, fileoff, cluster->cluster_end, own_track);
        if (!end) {
          run_ends = true;
          break;
        }
        last_pos = last_group_pos = pos;
        pos = end;
      } while (pos < stop && buff[pos] == cluster_id::kBlockGroup);
      if (run_ends) break;
      continue;
    }
    // Any other unlaced SimpleBlock of another track, one at a time.
    if (at[0] != cluster_id::kSimpleBlock) break;
    uint64_t size = 0;
    const uint32_t length = read_vint(at + 1, &size);
    const uint8_t track = at[1 + length];
    // A size from 4 (track, timecode, flags) to kLargestExactSize, in one comparison.
    if (!length || track < 0x80 || track == own_field || (at[1 + length + 3] & kLacingBits) != 0 ||
        size - 4 > kLargestExactSize - 4) {
      break;
    }
    const uint64_t whole = 1 + length + size;
    if (whole > total - pos) break;
    last_pos = pos;
    pos += static_cast<uint32_t>(whole);
  }
  if (pos == first_pos) return false;
  inbuff1->buff_pos = pos;
  inbuff1->buff_left = total - pos;
  // The group's values stay in the record under the SimpleBlocks after it.
  if (last_group_pos != kNoGroup) store_passed_group(buff + last_group_pos, fileoff + last_group_pos, cluster);
  if (last_pos != last_group_pos) *last_simple = buff + last_pos;
  return true;
}

// The header of a SimpleBlock that pass_other_blocks passed over.
block_header_view simple_view(const uint8_t* at) {
  uint64_t size = 0;
  const uint32_t length = read_vint(at + 1, &size);
  return block_header_view{cluster_id::kSimpleBlock, size, 0, at[1 + length] & 0x7Fu, 1, 0,
                           1 + length, 1 + length + 1 + 3, at + 1 + length + 1};
}

// The channel's own block at inbuff1's read position, as the pass over other
// blocks found it: a SimpleBlock of the common kind, or a BlockGroup that
// common_group_end found to be the channel's own. The record as take_one
// leaves it.
bool take_own_common_block(mkvinbuff* inbuff1, mkvcluster* cluster, const uint8_t* at) {
  auto* sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
  if (!sizes) return false;
  const block_header_view h =
      at[0] == cluster_id::kBlockGroup
          ? block_header_view{cluster_id::kBlockGroup, (at[4] & 0x3Fu) << 8 | at[5], (at[1] & 0x3Fu) << 8 | at[2],
                              at[6] & 0x7Fu, 1, 3, 6, 10, at + 7}
          : block_header_view{cluster_id::kSimpleBlock, (at[1] & 0x3Fu) << 8 | at[2], 0, at[3] & 0x7Fu, 1, 0, 3, 7,
                              at + 4};
  sizes[0] = data_size(h);
  store_header(cluster, h, inbuff1->buff_fileoff + inbuff1->buff_pos, sizes);
  inbuff1->buff_pos += h.header_length;
  inbuff1->buff_left -= h.header_length;
  return true;
}

// Whether the lace table of the laced SimpleBlock of the common kind at `at`
// (`size` bytes after its size field, whole in inbuff1) lies within the block,
// as the parser reads it: then, passed over, the block ends where its size
// says, as after the parser's read and skip. A table the parser would refuse,
// or that runs past the block, is left to the parser.
[[gnu::noinline]] bool lace_table_fits(const uint8_t* at, uint32_t size, uint8_t lacing) {
  if (size < 5) return false;  // track, timecode, flags and the frame count
  const uint8_t* entry = at + 8;
  const uint8_t* const end = at + 3 + size;
  const uint32_t sizes = at[7];  // every frame but the last has one
  if (lacing == kFixedLacingBits) return true;
  for (uint32_t i = 0; i < sizes; ++i) {
    if (lacing == kXiphLacingBits) {
      uint8_t byte;
      do {
        if (entry >= end) return false;
        byte = *entry++;
      } while (byte == 255);
    } else {
      if (entry >= end || *entry == 0) return false;
      entry += std::countl_zero(static_cast<uint32_t>(*entry)) - 23;  // the vint's length
      if (entry > end) return false;
    }
  }
  return true;
}

// The most common step of all, on its own so that it stays short: from
// between SimpleBlocks outside any group, other tracks' blocks of the common
// kind lying whole in inbuff1 (laced ones too, when lace_table_fits), then
// the channel's own unlaced block of that kind, taken as
// take_own_common_block takes it. Its header overwrites every field the
// passed ones would have written, except the parser's lace-table working
// values (lace index, sum and entries past the count), which nothing reads
// before the next laced block sets them afresh. False, with nothing changed,
// when the blocks ahead are of another kind: the general steps take them.
enum class common_run_result : uint8_t {
  none,    // nothing taken
  own,     // the channel's own unlaced block taken, ready as after kClusterBlockReady
  passed,  // other tracks' blocks passed, up to the channel's own laced block
};

[[gnu::always_inline]] inline common_run_result take_common_run(mkvinbuff* inbuff1, mkvcluster* cluster,
                                                               uint64_t own_track) {
  if (cluster->resume.step != mkv_resume_step::none || cluster->in_blockgroup || own_track >= 0x80 ||
      inbuff1->buff_left < kLongestHeader) {
    return common_run_result::none;
  }
  const uint8_t* const buff = inbuff1->buff;
  const uint32_t first_pos = inbuff1->buff_pos;
  const uint32_t total = first_pos + inbuff1->buff_left;
  const uint64_t fileoff = inbuff1->buff_fileoff;
  const uint64_t cluster_left = cluster->cluster_end > fileoff ? cluster->cluster_end - fileoff : 0;
  const auto stop = static_cast<uint32_t>(std::min<uint64_t>(total - kLongestHeader + 1, cluster_left));
  const uint32_t own_field = 0x80u | static_cast<uint32_t>(own_track);
  uint32_t pos = first_pos;
  for (;;) {
    if (pos >= stop) return common_run_result::none;
    const uint8_t* const at = buff + pos;
    const uint32_t word = header_word(at);
    const uint32_t size = word >> 8 & 0x3FFFu;
    if (is_common_block(at, word)) {
      if ((word & 0xFFu) == own_field) break;
      if (size + 3 > total - pos) return common_run_result::none;
      pos += size + 3;
      continue;
    }
    if ((word & kCommonMask) != kCommonHeader || size < 4) return common_run_result::none;
    if ((word & 0xFFu) == own_field) {
      // The channel's own laced block: the parser reads its lace table from
      // here (it rewrites every field the passed blocks would have left).
      if (pos == first_pos) return common_run_result::none;
      inbuff1->buff_pos = pos;
      inbuff1->buff_left = total - pos;
      return common_run_result::passed;
    }
    if (size + 3 > total - pos || !lace_table_fits(at, size, at[6] & kLacingBits)) return common_run_result::none;
    pos += size + 3;
  }
  auto* sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
  if (!sizes) return common_run_result::none;
  const uint8_t* const at = buff + pos;
  const block_header_view h{cluster_id::kSimpleBlock, (at[1] & 0x3Fu) << 8 | at[2], 0, at[3] & 0x7Fu, 1, 0, 3, 7,
                            at + 4};
  sizes[0] = data_size(h);
  store_header(cluster, h, fileoff + pos, sizes);
  inbuff1->buff_pos = pos + 7;
  inbuff1->buff_left = total - pos - 7;
  return common_run_result::own;
}

// take_common_run for BlockGroups: after the current group's values, other
// tracks' groups of the common kind lying whole in inbuff1, then the
// channel's own group of that kind. The own group's header overwrites every
// field the passed groups would have written.
[[gnu::always_inline]] inline bool take_common_group_run(mkvinbuff* inbuff1, mkvcluster* cluster,
                                                         uint64_t own_track) {
  if (cluster->resume.step != mkv_resume_step::none || own_track >= 0x80) return false;
  if (cluster->in_blockgroup && !finish_group_values(inbuff1, cluster)) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const uint8_t* const buff = inbuff1->buff;
  const uint32_t first_pos = inbuff1->buff_pos;
  const uint32_t total = first_pos + inbuff1->buff_left;
  const uint64_t fileoff = inbuff1->buff_fileoff;
  const uint64_t cluster_left = cluster->cluster_end > fileoff ? cluster->cluster_end - fileoff : 0;
  const auto stop = static_cast<uint32_t>(std::min<uint64_t>(total - kLongestHeader + 1, cluster_left));
  const auto limit = static_cast<uint32_t>(std::min<uint64_t>(total, cluster_left));
  const uint32_t own_field = 0x80u | static_cast<uint32_t>(own_track);
  uint32_t pos = first_pos;
  for (;;) {
    if (pos >= stop || buff[pos] != cluster_id::kBlockGroup) return false;
    const uint32_t end = common_group_end(buff + pos, pos, total, limit, own_field);
    if (end == kOwnGroup) break;
    if (!end) return false;
    pos = end;
  }
  block_header_view h;
  if (!common_group_view(buff + pos, &h)) return false;
  auto* sizes = static_cast<int64_t*>(mem_alloc_zeroed(sizeof(int64_t)));
  if (!sizes) return false;
  sizes[0] = data_size(h);
  store_header(cluster, h, fileoff + pos, sizes);
  inbuff1->buff_pos = pos + h.header_length;
  inbuff1->buff_left = total - pos - h.header_length;
  return true;
}

}  // namespace

// Other tracks' blocks whose data lies whole in inbuff1 are passed over here
// one after another, as the caller would skip each; the run ends with the
// first block that is the channel's own, is cut by the end of inbuff1, or
// needs the parser. The record is written for the last block taken only: a
// header taken after a run of passed SimpleBlocks writes every field their
// record would (and take_one reads none that it would change).
unlaced_block_result take_unlaced_block(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track,
                                        uint64_t* data_left) {
  *data_left = 0;
  switch (take_common_run(inbuff1, cluster, own_track)) {
    case common_run_result::own:
      return unlaced_block_result::own_track;
    case common_run_result::passed:
      return unlaced_block_result::parse;
    case common_run_result::none:
      break;
  }
  if (take_common_group_run(inbuff1, cluster, own_track)) return unlaced_block_result::own_track;
  auto result = unlaced_block_result::parse;
  bool own = false;
  int32_t data = 0;
  for (;;) {
    if (cluster->resume.step == mkv_resume_step::none && cluster->in_blockgroup &&
        !finish_group_values(inbuff1, cluster)) {
      break;
    }
    const uint8_t* own_block = nullptr;
    const uint8_t* passed_simple = nullptr;
    const bool any = pass_other_blocks(inbuff1, cluster, own_track, &passed_simple, &own_block);
    if (any) result = unlaced_block_result::other_track;
    if (own_block && take_own_common_block(inbuff1, cluster, own_block)) return unlaced_block_result::own_track;
    if (!take_one(inbuff1, cluster, own_track, &own, &data)) {
      if (passed_simple) {
        const uint64_t position = inbuff1->buff_fileoff + static_cast<uint64_t>(passed_simple - inbuff1->buff);
        store_header(cluster, simple_view(passed_simple), position, nullptr);
      }
      break;
    }
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
