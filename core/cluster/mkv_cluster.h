#pragma once
// The playback parser: Clusters, SimpleBlocks and BlockGroups read straight
// out of the input buffers, one call at a time, with all state in one record
// per output channel. Frame bytes are never read here; the caller cuts them
// out of the buffers by the sizes a parsed block header gives.

#include <cstdint>
#include <type_traits>

#include "core/cluster/ebml_number.h"
#include "core/cluster/mkv_inbuff.h"
#include "core/memory.h"

constexpr uint32_t kMaxLaceFrames = 256;  // a frame-count byte of 255
constexpr uint32_t kMaxCodecStateSize = 32768;

// The read that a call was in when the buffers ran out; the next call goes on
// with it before anything else.
enum class mkv_resume_step : uint8_t {
  none = 0,        // at an element boundary: the read position decides what comes next
  segment_header,  // element header between Clusters
  cluster_header,  // element header between blocks of a Cluster
  child_header,    // header of a Cluster child before the first block
  child_value,     // Timecode, Position or PrevSize (`id` says which)
  child_payload,   // payload of a Cluster child that is passed over
  group_header,    // header of a BlockGroup child
  group_value,     // BlockDuration, ReferencePriority or ReferenceBlock
  group_payload,   // payload of a BlockGroup child that is passed over
  codec_state,     // CodecState whose payload is not yet all in the buffers
  track_number,    // block header fields, then the lace table
  block_timecode,
  block_flags,
  frame_count,
  lace_table,
};

struct mkv_cluster_resume {
  mkv_resume_step step;
  uint8_t header_part;         // element header: 0 while the ID is read, 1 while the size is (ID in `id`)
  uint32_t id;                 // element whose size, value or payload is in progress
  ebml_partial_number number;  // the number in progress
  uint64_t payload_left;       // payload bytes still to pass over; for CodecState, its size
  uint16_t lace_count;         // frames of the block being read; frame_count is set only when it is complete
  uint16_t lace_index;         // lace entry being read
  int32_t data_left;           // D: the block's bytes after what has been read of its header (32-bit wrapping)
  int32_t lace_sum;            // sum of the finished entries (32-bit wrapping)
  int64_t lace_sizes[kMaxLaceFrames];  // the table being read; copied to frame_sizes when complete
};

struct mkvcluster {
  uint64_t cluster_timecode;    // Timecode (0xE7), in TimecodeScale units
  uint64_t cluster_position;    // Position (0xA7); stored only
  uint64_t cluster_prevsize;    // PrevSize (0xAB); stored only
  uint8_t in_blockgroup;        // 1 while inside a BlockGroup; its children after the Block are read next
  uint64_t block_duration;      // BlockDuration of the current BlockGroup (0 when it has none)
  uint64_t reference_priority;  // ReferencePriority of the current BlockGroup
  int64_t reference_block;      // ReferenceBlock of the current BlockGroup, sign-extended (0 when none)
  uint8_t* codec_state;         // owned: null, or codec_state_size bytes copied from CodecState
  uint32_t codec_state_size;
  uint64_t blockgroup_size;
  uint64_t blockgroup_start;    // file offset of the BlockGroup payload
  uint64_t blockgroup_end;      // blockgroup_start + blockgroup_size (saturating)
  uint64_t track_number;
  int16_t block_timecode;       // relative to the Cluster's Timecode
  uint8_t block_flags;          // 0x80 key, 0x08 invisible, 0x06 lacing, 0x01 discardable
  uint16_t frame_count;         // 1 to 256 after a parsed block header; 0 while one is being read
  int64_t* frame_sizes;         // owned: null, or frame_count sizes (only the low 32 bits count, signed)
  int64_t block_data_left;      // frame bytes after the header and lace table: what skips a whole block
  uint64_t block_start;         // file offset of the block payload
  uint64_t block_end;           // block_start + the block's size (saturating)
  uint64_t cluster_size;
  uint64_t cluster_start;       // file offset of the Cluster payload
  uint64_t cluster_end;         // cluster_start + cluster_size (saturating); 0: between Clusters
  mkv_cluster_resume resume;    // all zero unless a call ran out of data inside a read
};

// An all-zero record is the start state: it expects a Cluster header.
static_assert(std::is_standard_layout_v<mkvcluster> && std::is_trivially_copyable_v<mkvcluster>);

// Parses up to and including the next SimpleBlock or Block header (results in
// core/cluster/cluster_status.h). `inbuff2` may be null. `skip` is set only
// with -3. Bytes read stay consumed whatever the result. Call
// destroy_mkvcluster before each call: it frees the previous block's table.
[[nodiscard]] int parse_mkvcluster(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster, uint64_t* skip);

// What an answer of parse_mkvcluster means to its caller. -1 and -2 each stand
// for two things, told apart by the record: the buffers ran out (the record
// waits inside a read, and the next call with the bytes that follow goes on
// from there) or bytes that cannot be read (the record waits for nothing).
enum class cluster_answer : uint8_t {
  done,            // 0, a block header; -3, a skip
  need_more_data,  // -1 or -2 with a read left open
  error,           // -1 or -2 on bytes that cannot be read, -4, -5
};
[[nodiscard]] cluster_answer mkvcluster_answer(const mkvcluster* cluster, int result);

// Called with the ID and size of a SimpleBlock (0xA3) or BlockGroup (0xA0)
// whose header was just read: 0, -6 for a BlockGroup without a (further)
// Block, or a failure. `skip` is not used. Any other ID gives -4.
[[nodiscard]] int start_newmkvblock(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster, uint64_t* skip,
                                    uint32_t id, uint64_t size);

// Reads BlockGroup children from the read position: 0 after a Block header,
// -6 at the BlockGroup's end, else a failure.
[[nodiscard]] int parse_mkvblockgroup(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster);

// True when the last call stopped part-way through an element: bytes of a
// header, value, payload or block header were consumed and the rest is
// awaited. A record waiting for the next header with none of it read is not.
[[nodiscard]] bool mkvcluster_inside_element(const mkvcluster* cluster);

// Frees codec_state and frame_sizes and nulls them; other fields stay. Every
// channel calls it before every block, most often with only a one-entry
// table to free, so it is inline.
inline void destroy_mkvcluster(mkvcluster* cluster) {
  if (cluster->codec_state) {
    mem_free(cluster->codec_state);
    cluster->codec_state = nullptr;
  }
  if (cluster->frame_sizes) {
    mem_free(cluster->frame_sizes);
    cluster->frame_sizes = nullptr;
  }
}
