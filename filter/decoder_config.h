#pragma once
// A channel's decoder configuration: the packets that go to the decoder ahead
// of the first frame. They point into the track's codec_private; nothing is copied.

#include <cstdint>

#include "filter/mkv_channel_state.h"

// Empties the configuration: no packets, null pointers. The sizes stay as they were.
void ClearDecoderConfig(MkvChannelState* state);

// Splits a Vorbis CodecPrivate (three headers in Xiph lacing) into its
// identification, comment and setup packets. Malformed data leaves the
// configuration empty, with a level-3 message where the packet layout is wrong.
void SplitVorbisHeaders(MkvChannelState* state, const uint8_t* codec_private, uint32_t size);
