#include "tools/extract/vorbis_blocks.h"

#include <cstring>

namespace {

constexpr size_t kIdentificationSize = 30;
constexpr size_t kBlockSizeByte = 28;
constexpr int kModeBits = 1 + 16 + 16 + 8;  // block flag, window type, transform type, mapping
constexpr int kMaxModes = 64;

// Vorbis packs bits from the least significant bit of each byte on.
bool Bit(const Bytes& bytes, long pos) { return (bytes[static_cast<size_t>(pos / 8)] >> (pos % 8)) & 1; }

uint32_t Bits(const Bytes& bytes, long pos, int count) {
  uint32_t value = 0;
  for (int i = 0; i < count; ++i) value |= static_cast<uint32_t>(Bit(bytes, pos + i)) << i;
  return value;
}

bool IsHeader(const Bytes& packet, uint8_t type) {
  return packet.size() > 7 && packet[0] == type && !std::memcmp(packet.data() + 1, "vorbis", 6);
}

int BitsFor(uint32_t value) {
  int bits = 0;
  for (; value; value >>= 1) ++bits;
  return bits;
}

}  // namespace

bool VorbisBlocks::Init(const Bytes& identification, const Bytes& setup) {
  if (!IsHeader(identification, 1) || identification.size() < kIdentificationSize || !IsHeader(setup, 5)) return false;
  block_size_[0] = 1u << (identification[kBlockSizeByte] & 0x0F);
  block_size_[1] = 1u << (identification[kBlockSizeByte] >> 4);
  // The mode list closes the setup header, followed only by the framing bit;
  // what comes before it has variable length, so it is read from the end:
  // step back over candidate modes (window and transform types are zero) and
  // keep the longest run whose count matches the 6-bit field in front of it.
  long framing = static_cast<long>(setup.size()) * 8 - 1;
  while (framing >= 0 && !Bit(setup, framing)) --framing;
  int candidates = 0;
  for (long start = framing - kModeBits; start >= 0 && candidates < kMaxModes; start -= kModeBits) {
    if (Bits(setup, start + 1, 16) || Bits(setup, start + 17, 16)) break;
    ++candidates;
  }
  for (int count = candidates; count > 0; --count) {
    long first = framing - static_cast<long>(count) * kModeBits;
    if (first < 6 || static_cast<int>(Bits(setup, first - 6, 6)) + 1 != count) continue;
    mode_long_.clear();
    for (int i = 0; i < count; ++i) mode_long_.push_back(Bit(setup, first + static_cast<long>(i) * kModeBits));
    mode_bits_ = BitsFor(static_cast<uint32_t>(count - 1));
    return true;
  }
  return false;
}

uint32_t VorbisBlocks::Samples(uint8_t first_byte) {
  uint32_t mode = (first_byte >> 1) & ((1u << mode_bits_) - 1);
  uint32_t size = block_size_[mode < mode_long_.size() && mode_long_[mode] ? 1 : 0];
  uint32_t samples = previous_ ? previous_ / 4 + size / 4 : 0;
  previous_ = size;
  return samples;
}
