#pragma once
// The two commonest steps of the output path, each on a short path of its
// own: a run of other tracks' SimpleBlocks, or of their BlockGroups, up to the
// channel's own block. Anything else is left to the general steps of
// take_unlaced_block. Call only between blocks, after destroy_mkvcluster.

#include <algorithm>
#include <cstdint>

#include "core/cluster/block_header_view.h"
#include "core/cluster/mkv_cluster.h"

enum class common_run_result : uint8_t {
  none,    // nothing taken or changed: the blocks ahead are of another kind
  own,     // the channel's own unlaced block taken, ready as after kClusterBlockReady
  passed,  // other tracks' blocks passed, up to the channel's own laced block, for the parser
};

namespace cluster_shortcut {

// Each header's place follows from the one before, a few hundred bytes on,
// so the processor cannot fetch the next ones ahead on its own, and a channel
// often walks bytes another core has just read in. While the runs read one
// header they ask for the memory from half a kilobyte to three and a half
// ahead, a line in each kilobyte: with headers a few hundred bytes apart,
// every line is asked for a few steps before it is read. (Hints only: they
// never fault, past the buffer's end either.)
[[gnu::always_inline]] inline void prefetch_ahead(const uint8_t* at) {
  __builtin_prefetch(at + 512);
  __builtin_prefetch(at + 1536);
  __builtin_prefetch(at + 2560);
  __builtin_prefetch(at + 3584);
}

// Whether the lace table of the laced SimpleBlock of the common kind at `at`
// (`size` bytes after its size field, whole in inbuff1) lies within the block,
// as the parser reads it: then, passed over, the block ends where its size
// says, as after the parser's read and skip. A table the parser would refuse,
// or that runs past the block, is left to the parser.
bool lace_table_fits(const uint8_t* at, uint32_t size, uint8_t lacing);

// From between SimpleBlocks outside any group: other tracks' blocks with a
// two-byte size and a one-byte track number lying whole in inbuff1 (laced
// ones too, when their lace table lies within the block), then the channel's
// own block of that kind. Its header overwrites every field the passed ones
// would have written, except the parser's lace-table working values (lace
// index, sum and entries past the count), which nothing reads before the
// next laced block sets them afresh.
[[gnu::always_inline]] inline common_run_result take_common_run(mkvinbuff* inbuff1, mkvcluster* cluster,
                                                               uint64_t own_track) {
  if (cluster->resume.step != mkv_resume_step::none || cluster->in_blockgroup || own_track >= 0x80 ||
      inbuff1->buff_left < kLongestHeader) {
    return common_run_result::none;
  }
  const auto [buff, first_pos, total, fileoff, stop, limit] = window_of(inbuff1, cluster);
  const uint32_t own_field = 0x80u | static_cast<uint32_t>(own_track);
  uint32_t pos = first_pos;
  for (;;) {
    if (pos >= stop) return common_run_result::none;
    const uint8_t* const at = buff + pos;
    prefetch_ahead(at);
    const uint32_t word = header_word(at);
    const uint32_t size = word >> 8 & 0x3FFFu;
    if (is_common_block(at, word)) {
      if ((word & 0xFFu) == own_field) break;
      // No bound check: a block that ends past inbuff1 (or the cluster) leaves
      // pos at or past `stop`, which ends the run with nothing taken.
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
  return take_own_common_block(inbuff1, cluster, buff + pos) ? common_run_result::own : common_run_result::none;
}

// The same for BlockGroups: after the current group's values, other tracks'
// groups of the common kind lying whole in inbuff1, then the channel's own
// group of that kind, whose header overwrites every field the passed groups
// would have written. False, with only the current group's values read, when
// the blocks ahead are of another kind.
[[gnu::always_inline]] inline bool take_common_group_run(mkvinbuff* inbuff1, mkvcluster* cluster,
                                                         uint64_t own_track) {
  if (cluster->resume.step != mkv_resume_step::none || own_track >= 0x80) return false;
  if (cluster->in_blockgroup && !finish_group_values(inbuff1, cluster)) return false;
  if (inbuff1->buff_left < kLongestHeader) return false;
  const auto [buff, first_pos, total, fileoff, stop, limit] = window_of(inbuff1, cluster);
  const uint32_t own_field = 0x80u | static_cast<uint32_t>(own_track);
  uint32_t pos = first_pos;
  for (;;) {
    if (pos >= stop || buff[pos] != cluster_id::kBlockGroup) return false;
    prefetch_ahead(buff + pos);
    const uint32_t end = common_group_end(buff + pos, pos, total, limit, own_field);
    if (end == kOwnGroup) break;
    if (!end) return false;
    pos = end;
  }
  return take_own_common_block(inbuff1, cluster, buff + pos);
}

}  // namespace cluster_shortcut
