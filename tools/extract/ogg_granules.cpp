#include "tools/extract/ogg_granules.h"

#include <cstring>

namespace {

constexpr size_t kTheoraIdentificationSize = 42;
constexpr uint8_t kTheoraInterFrame = 0x40;  // in a data packet's first byte; clear for a key frame

}  // namespace

bool TheoraGranules::Init(const std::vector<Bytes>& headers) {
  const Bytes& id = headers[0];
  if (id.size() < kTheoraIdentificationSize || id[0] != 0x80 || std::memcmp(id.data() + 1, "theora", 6)) return false;
  // From version 3.2.1 on, granule positions count frames from 1; before, from 0.
  first_frame_ = id[7] > 3 || (id[7] == 3 && (id[8] > 2 || (id[8] == 2 && id[9] >= 1))) ? 1 : 0;
  shift_ = (id[40] & 0x03) << 3 | id[41] >> 5;  // KFGSHIFT: 5 bits after the 6-bit quality
  return true;
}

int64_t TheoraGranules::After(uint8_t first_byte, size_t size) {
  // An empty packet repeats the frame before: an inter frame.
  if (size > 0 && !(first_byte & kTheoraInterFrame)) key_frame_ = frames_;
  ++frames_;
  return (key_frame_ + first_frame_) << shift_ | (frames_ - 1 - key_frame_);
}

std::vector<Bytes> SplitXiphLacing(const Bytes& laced) {
  if (laced.size() < 3 || laced[0] != 2) return {};
  size_t pos = 1;
  size_t sizes[2] = {0, 0};
  for (size_t& size : sizes) {
    for (;;) {
      if (pos >= laced.size()) return {};
      uint8_t byte = laced[pos++];
      size += byte;
      if (byte != 255) break;
    }
  }
  if (sizes[0] + sizes[1] >= laced.size() - pos) return {};
  auto at = laced.begin() + static_cast<ptrdiff_t>(pos);
  auto second = at + static_cast<ptrdiff_t>(sizes[0]);
  auto third = second + static_cast<ptrdiff_t>(sizes[1]);
  return {Bytes(at, second), Bytes(second, third), Bytes(third, laced.end())};
}
