#pragma once
// The lacing bits of a block header's flags byte.

#include <cstdint>

namespace block_flags {

constexpr uint8_t kLacingBits = 0x06;
constexpr uint8_t kNoLacing = 0x00;
constexpr uint8_t kXiphLacing = 0x02;
constexpr uint8_t kFixedLacing = 0x04;

}  // namespace block_flags
