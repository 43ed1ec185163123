#pragma once
// The header shared by SimpleBlock and Block: track number, relative
// timecode, flags and, with lacing, the frame count and lace table.

#include "core/cluster/buff_cursor.h"
#include "core/cluster/mkv_cluster.h"

// Starts a block whose payload of `size` bytes begins at the read position
// and reads its header: 0 (frame_count, frame_sizes and block_data_left set),
// -1 when the buffers run out (the next call goes on), -4 or -5.
[[nodiscard]] int begin_block(buff_cursor* cursor, mkvcluster* cluster, uint64_t size);

// Goes on with a block header or lace table that ran out of data.
[[nodiscard]] int continue_block_header(buff_cursor* cursor, mkvcluster* cluster);

[[nodiscard]] inline bool is_block_header_step(mkv_resume_step step) {
  return step >= mkv_resume_step::track_number && step <= mkv_resume_step::lace_table;
}
