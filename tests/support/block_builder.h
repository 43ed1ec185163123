#pragma once
// Blocks for crafted Cluster bytes, reading like the data:
//   simple_block(1, 0, 0x80, {frame_a})
//   xiph_laced_block(2, -5, 0x80, {frame_a, frame_b, frame_c})
// The lacing bits of `flags` (0x06) choose how a SimpleBlock or Block codes
// its frames; the laced helpers set them.

#include <cstdint>
#include <vector>

#include "tests/support/ebml_builder.h"

namespace ebml {

// Cluster and BlockGroup children that the base builder does not name.
enum : uint32_t {
  kSilentTracks = 0x5854,
  kSilentTrackNumber = 0x58D7,
  kBlockVirtual = 0xA2,
  kReferencePriority = 0xFA,
  kReferenceVirtual = 0xFD,
  kCodecState = 0xA4,
  kDiscardPadding = 0x75A2,
  kBlockAdditions = 0x75A1,
  kBlockAdditional = 0xA5,
  kSlices = 0x8E,
};

enum : uint8_t {
  kKeyFrame = 0x80,
  kXiphLacing = 0x02,
  kFixedLacing = 0x04,
  kEbmlLacing = 0x06,
};

using Frames = std::vector<Bytes>;

Bytes simple_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames);
Bytes xiph_laced_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames);
Bytes ebml_laced_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames);
// The Block (0xA1) of a BlockGroup.
Bytes block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames);

// `count` frames of `size` bytes, each filled with its own index + `seed`.
Frames numbered_frames(size_t count, size_t size, uint8_t seed = 0);

}  // namespace ebml
