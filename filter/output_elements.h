#pragma once
// Element writes into a channel's OutMra at OutIndex (which moves on only on
// success), the skip rule, and the room test of the output.

#include <cstdint>

#include "filter/mkv_channel_state.h"
#include "platform/media_buffer.h"

// Room kept free for one frame (prefix part, prefix, end part, frame) and the
// properties that may head a block (two time markers, skip mark, preroll
// time, timestamp): a block is begun only with this much room, and its first
// frame then always fits.
constexpr uint32_t kBlockElementReserve = 10;

[[nodiscard]] inline int SetOutProperty(MkvChannelState* state, uint32_t type, uint64_t value) {
  int result = MmfSetMraPropertyElement(state->OutMra, state->OutIndex, type, static_cast<uint32_t>(value),
                                        static_cast<uint16_t>(value >> 32));
  if (result == 0) ++state->OutIndex;
  return result;
}

[[nodiscard]] inline int SetOutBuffer(MkvChannelState* state, MmfPoolBuffer* handle, const uint8_t* address,
                                      uint32_t size) {
  int result = MmfSetMraBufferElement(state->OutMra, state->OutIndex, handle, const_cast<uint8_t*>(address), size);
  if (result == 0) ++state->OutIndex;
  return result;
}

inline bool OutputNearlyFull(const MkvChannelState* state) {
  return state->OutIndex + kBlockElementReserve > state->OutMra->Capacity;
}

// SkipBytes against inbuff1; what inbuff1 cannot hold is carried to the next buffer.
inline void ApplySkip(MkvChannelState* state) {
  mkvinbuff& in = state->inbuff1;
  if (state->SkipBytes <= in.buff_left) {
    in.buff_pos += static_cast<uint32_t>(state->SkipBytes);
    in.buff_left -= static_cast<uint32_t>(state->SkipBytes);
    state->SkipBytes = 0;
  } else {
    state->SkipBytes -= in.buff_left;
    in.buff_pos += in.buff_left;
    in.buff_left = 0;
  }
}

// The rest of the current block is not delivered.
inline void DropBlock(MkvChannelState* state) {
  int64_t left = state->Cluster.block_data_left;
  state->SkipBytes = left > 0 ? static_cast<uint64_t>(left) : 0;
  state->FrameIndex = 0;
  state->BlockActive = 0;
  ApplySkip(state);
}
