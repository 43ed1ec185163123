#pragma once
// One output channel's parsing and delivery state, made zero-filled when a
// stream is rated. Field order is the delivery path's; the ring cursors
// (Read..., Ahead...) and every field here are guarded by the context's RingLock.

#include <cstdint>

#include "core/cluster/mkv_cluster.h"
#include "core/cluster/mkv_inbuff.h"
#include "core/track_info.h"
#include "platform/media_buffer.h"
#include "platform/memory_pool.h"

constexpr uint32_t kMaxDecoderConfigPackets = 3;

struct MkvChannelState {
  uint32_t Acquired;                 // 1 while the channel is acquired
  MmfMraPool* MraPool;               // output media buffers; null until the pool is set
  MmfMra* OutMra;                    // the media buffer being filled by the current NextBuffer
  const MmfMemoryPoolOps* OutPool;
  MmfMemoryPool* OutPoolParam;
  uint32_t OutIndex;                 // next element of OutMra to set
  uint32_t FrameSplit;               // 1 while a frame has gone out only in part
  uint64_t StartTime;                // microseconds: blocks before it are dropped or marked
  uint32_t SendStartTime;            // 1: the next block gets a time marker first
  uint8_t ScanMode;                  // 1: input buffers need not follow one another in the file

  int32_t ReadSlot;                  // ring slot of ReadBuffer
  MmfMra* ReadBuffer;                // input media buffer that inbuff1 lies in; null = none
  MmfPoolBuffer* ReadHandle;
  int32_t ReadElement;
  mkvinbuff inbuff1;

  int32_t AheadSlot;
  MmfMra* AheadBuffer;
  MmfPoolBuffer* AheadHandle;
  int32_t AheadElement;              // -1 before the first buffer element of AheadBuffer
  mkvinbuff inbuff2;

  mkvcluster Cluster;
  uint64_t SkipBytes;                // bytes still to skip, carried from buffer to buffer
  uint64_t PrerollTime;
  uint8_t PrerollPending;
  const mkv_track_info* Track;       // the track this channel delivers; points into the file model
  int32_t FrameIndex;                // next frame of the current block; 0 between blocks
  uint32_t DecoderConfigCount;       // 0, 1 or 3 packets
  const uint8_t* DecoderConfigData[kMaxDecoderConfigPackets];  // into the track's codec_private
  uint32_t DecoderConfigSize[kMaxDecoderConfigPackets];
  uint32_t DecoderConfigSent;
  MmfPoolBuffer* ConfigBuffer;       // the frame prefix; null when none is held
  uint32_t ConfigBufferSize;
  uint32_t SendSkipMark;             // 1: the next block gets a skip mark first
  // 1 from the parser's block result until the block's last frame went out or
  // the block was skipped; bytes of the block after its last frame are skipped.
  uint8_t BlockActive;
  // 1 when the output filled up in the middle of inbuff1: the next call goes on
  // parsing inbuff1 before it walks on to the element after ReadElement.
  uint8_t ParsePending;
  // A record counted for a track that was then left out (an encrypted one)
  // keeps no Track: the index of that track plus one; 0 when none is known.
  uint32_t LeftOutTrack;
};
