#pragma once
// Sample counting for Vorbis packets, which Ogg granule positions need: the
// identification header gives the two block sizes, the setup header's modes
// tell which size each audio packet uses, and a packet decodes to a quarter
// of the previous block plus a quarter of its own.

#include <cstdint>
#include <vector>

#include "tools/extract/frame_writer.h"

class VorbisBlocks {
 public:
  // False when the headers cannot be read.
  bool Init(const Bytes& identification, const Bytes& setup);
  // Samples that the audio packet starting with `first_byte` adds.
  uint32_t Samples(uint8_t first_byte);

 private:
  uint32_t block_size_[2] = {0, 0};
  std::vector<bool> mode_long_;  // per mode: uses the long block
  int mode_bits_ = 0;
  uint32_t previous_ = 0;  // block size of the packet before; 0 before the first
};
