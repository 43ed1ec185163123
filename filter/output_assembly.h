#pragma once
// Output buffer assembly ("MediaOutput" NextBuffer): each output channel walks
// the input buffers of the ring with two views, runs the cluster parser over
// them and fills one output media buffer with properties and buffer elements
// that point into the input buffers. No frame byte is copied.

#include <cstdint>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"

constexpr int kNextBufferError = 1;
constexpr int kNextBufferInputShort = 4;  // the parser ran out inside a Cluster child with both views in use
constexpr int kNextBufferStopped = 16;

// 256 and a media buffer; the ControlState when it forbids delivery; 1 after
// an error; 4; 16; or the upstream's answer (end of stream, for example).
[[nodiscard]] int NextBuffer(MkvChannel* channel, MmfMra** out);

// Caller holds RingLock. Appends the current block's elements to OutMra from
// inbuff1: 0, or the framework error of a failed set. `count` grows by one
// per buffer element appended. Stops between frames when OutMra is nearly
// full (FrameIndex names the next frame; the block stays active).
[[nodiscard]] int ProcessBlock(MkvChannelState* state, MkvContext* context, uint32_t* count);

// Caller holds RingLock. Moves the Ahead cursor (inbuff2) to the next buffer
// element of the input, pulling a buffer from upstream when it is at the
// head: 256, 16 when stopped, or the upstream's answer.
[[nodiscard]] int UpdateNextIOV(MkvChannel* input, MkvChannelState* state, MkvContext* context);

// Frame prefix and the decoder-configuration buffer (NextBuffer steps before
// the input is walked). PrepareFramePrefix: 0, or 1 when the prefix buffer
// could not be made. DeliverDecoderConfig: 256 with OutMra filled, or 1 with
// OutMra released.
[[nodiscard]] int PrepareFramePrefix(MkvChannelState* state, MkvContext* context);
[[nodiscard]] int DeliverDecoderConfig(MkvChannelState* state);
