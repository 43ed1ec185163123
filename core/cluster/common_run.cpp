#include "core/cluster/common_run.h"

namespace cluster_shortcut {

bool lace_table_fits(const uint8_t* at, uint32_t size, uint8_t lacing) {
  if (size < 5) return false;  // track, timecode, flags and the frame count
  const uint8_t* entry = at + 8;
  const uint8_t* const end = at + 3 + size;
  const uint32_t sizes = at[7];  // every frame but the last has one
  if (lacing == block_flags::kFixedLacing) return true;
  for (uint32_t i = 0; i < sizes; ++i) {
    if (lacing == block_flags::kXiphLacing) {
      uint8_t byte;
      do {
        if (entry >= end) return false;
        byte = *entry++;
      } while (byte == 255);
    } else {
      if (entry >= end || *entry == 0) return false;
      entry += std::countl_zero(static_cast<uint32_t>(*entry)) - 23;  // the vint's length
      if (entry > end) return false;
    }
  }
  return true;
}

}  // namespace cluster_shortcut
