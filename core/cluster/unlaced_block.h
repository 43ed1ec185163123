#pragma once
// A shortcut of the output path for the common block: when the whole header
// of an unlaced SimpleBlock, or of a BlockGroup and the Block that opens it,
// lies in inbuff1, it is decoded in place (after the BlockDuration,
// ReferencePriority and ReferenceBlock that end the BlockGroup before it) and the record is left exactly as
// parse_mkvcluster would leave it after that header (for the channel's own
// track, with the one-entry frame_sizes), without the byte-by-byte read that
// must allow for a header cut by the end of a buffer.

#include <cstdint>

#include "core/cluster/mkv_cluster.h"

enum class unlaced_block_result : uint8_t {
  parse,        // not such a header, or nothing allocated: the caller parses as usual from the read
                // position (group values before it may have been read, as the parser would have)
  other_track,  // one or more blocks of other tracks consumed (with the data of all but the last);
                // frame_sizes stays null; the caller skips *data_left bytes (0 when all were whole)
  own_track,    // consumed (after any other tracks' blocks before it that lay whole in inbuff1);
                // the block is ready as after kClusterBlockReady
};

// `own_track` is the channel's track number; *data_left is block_data_left
// (never negative). Call only between blocks, after destroy_mkvcluster.
[[nodiscard]] unlaced_block_result take_unlaced_block(mkvinbuff* inbuff1, mkvcluster* cluster, uint64_t own_track,
                                                      uint64_t* data_left);
