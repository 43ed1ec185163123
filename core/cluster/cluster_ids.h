#pragma once
// IDs of the elements the playback parser meets, with their length-marker bits.

#include <cstdint>

namespace cluster_id {

constexpr uint32_t kCluster = 0x1F43B675;
constexpr uint32_t kTimecode = 0xE7;
constexpr uint32_t kPosition = 0xA7;
constexpr uint32_t kPrevSize = 0xAB;
constexpr uint32_t kSilentTracks = 0x5854;
constexpr uint32_t kSimpleBlock = 0xA3;
constexpr uint32_t kBlockGroup = 0xA0;
constexpr uint32_t kBlock = 0xA1;
constexpr uint32_t kBlockDuration = 0x9B;
constexpr uint32_t kReferencePriority = 0xFA;
constexpr uint32_t kReferenceBlock = 0xFB;
constexpr uint32_t kCodecState = 0xA4;
constexpr uint32_t kBlockAdditions = 0x75A1;
constexpr uint32_t kSlices = 0x8E;

}  // namespace cluster_id
