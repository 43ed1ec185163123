#include "core/cluster/unlaced_block.h"

#include <algorithm>
#include <cstring>

#include "core/cluster/block_header_view.h"
#include "core/cluster/common_run.h"

using namespace cluster_shortcut;

namespace {

// One header at inbuff1's read position, or false with nothing consumed.
// Other tracks' headers are taken whatever the allocator says; the own
// track's needs its one-entry table.
bool take_one(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track, bool* own, int32_t* data_left) {
  if (cluster->resume.step != mkv_resume_step::none) return false;
  if (cluster->in_blockgroup && !finish_group_values(inbuff1, cluster)) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const uint8_t* const start = inbuff1->buff + inbuff1->buff_pos;
  const uint64_t position = inbuff1->buff_fileoff + inbuff1->buff_pos;
  if (position + kLongestHeader >= cluster->cluster_end) return false;
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

// Other tracks' blocks of the common kind from `pos`, each whole before
// `total`, starting before `stop`: returns where the run ends; *last_pos is
// the start of the last block passed (unchanged when none was).
inline uint32_t pass_common_run(const uint8_t* buff, uint32_t pos, uint32_t stop, uint32_t total, uint32_t own_field,
                                uint32_t* last_pos) {
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
  const auto end = static_cast<uint32_t>(group_end);
  return group_values_fit(at - pos, static_cast<uint32_t>(block_end), end, total) ? end : 0;
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
  const auto [buff, first_pos, total, fileoff, stop, limit] = window_of(inbuff1, cluster);
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
