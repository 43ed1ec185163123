#include "tests/support/block_builder.h"

#include <cstdlib>

namespace ebml {

namespace {

// A signed EBML lace difference: the shortest length whose biased value is
// not all ones.
Bytes signed_lace_number(int64_t difference) {
  for (int length = 1; length <= 8; ++length) {
    int64_t bias = (int64_t{1} << (7 * length - 1)) - 1;
    int64_t raw = difference + bias;
    if (raw >= 0 && raw < (int64_t{1} << (7 * length)) - 1) return size_bytes(static_cast<uint64_t>(raw), length);
  }
  std::abort();
}

// The lace table of `frames` as `lacing` codes it (no frame-count byte).
Bytes lace_table(uint8_t lacing, const Frames& frames) {
  Bytes out;
  for (size_t i = 0; i + 1 < frames.size(); ++i) {  // the last frame takes whatever remains
    size_t size = frames[i].size();
    if (lacing == kEbmlLacing) {
      const auto difference = static_cast<int64_t>(size) - static_cast<int64_t>(i ? frames[i - 1].size() : 0);
      out = cat({out, i == 0 ? size_bytes(size) : signed_lace_number(difference)});
    } else if (lacing == kXiphLacing) {
      for (; size >= 255; size -= 255) out.push_back(255);
      out.push_back(static_cast<uint8_t>(size));
    }
  }
  return out;
}

// Track number, relative timecode, flags, then (when flags lace) the
// frame-count byte and the lace table, then the frames.
Bytes block_body(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames) {
  auto tc = static_cast<uint16_t>(timecode);
  Bytes out = cat({size_bytes(track), Bytes{static_cast<uint8_t>(tc >> 8), static_cast<uint8_t>(tc), flags}});
  uint8_t lacing = flags & 0x06;
  if (lacing) out = cat({out, Bytes{static_cast<uint8_t>(frames.size() - 1)}, lace_table(lacing, frames)});
  for (const Bytes& frame : frames) out.insert(out.end(), frame.begin(), frame.end());
  return out;
}

}  // namespace

Bytes simple_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames) {
  return element(kSimpleBlock, block_body(track, timecode, flags, frames));
}

Bytes xiph_laced_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames) {
  return simple_block(track, timecode, static_cast<uint8_t>((flags & ~0x06) | kXiphLacing), frames);
}

Bytes ebml_laced_block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames) {
  return simple_block(track, timecode, static_cast<uint8_t>(flags | kEbmlLacing), frames);
}

Bytes block(uint64_t track, int16_t timecode, uint8_t flags, const Frames& frames) {
  return element(kBlock, block_body(track, timecode, flags, frames));
}

Frames numbered_frames(size_t count, size_t size, uint8_t seed) {
  Frames frames;
  for (size_t i = 0; i < count; ++i) frames.push_back(filler(size, static_cast<uint8_t>(i + seed)));
  return frames;
}

}  // namespace ebml
