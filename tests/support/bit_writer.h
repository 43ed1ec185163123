#pragma once
// Codec headers written bit by bit (most significant first), for tests of the
// H.264 and MPEG-4 configuration parsers.

#include <cstdint>
#include <vector>

namespace testing_support {

class BitWriter {
 public:
  BitWriter& Bits(unsigned count, uint64_t value) {
    for (unsigned i = count; i-- > 0;) {
      if (bit_count_ % 8 == 0) bytes_.push_back(0);
      if ((value >> i) & 1) bytes_.back() |= static_cast<uint8_t>(0x80 >> (bit_count_ % 8));
      ++bit_count_;
    }
    return *this;
  }
  BitWriter& Golomb(uint64_t value) {  // ue(v)
    unsigned length = 0;
    while (((value + 1) >> length) > 1) ++length;
    return Bits(length, 0).Bits(length + 1, value + 1);
  }
  BitWriter& SignedGolomb(int64_t value) {  // se(v)
    return Golomb(value > 0 ? 2 * static_cast<uint64_t>(value) - 1 : 2 * static_cast<uint64_t>(-value));
  }
  // The bits so far, the last byte padded with zeros.
  const std::vector<uint8_t>& bytes() const { return bytes_; }

 private:
  std::vector<uint8_t> bytes_;
  uint64_t bit_count_ = 0;
};

// An H.264 RBSP as a NAL unit payload: 03 after every 00 00 that precedes 00..03.
inline std::vector<uint8_t> EscapeRbsp(const std::vector<uint8_t>& rbsp) {
  std::vector<uint8_t> out;
  int zeros = 0;
  for (uint8_t byte : rbsp) {
    if (zeros >= 2 && byte <= 3) {
      out.push_back(3);
      zeros = 0;
    }
    out.push_back(byte);
    zeros = byte == 0 ? zeros + 1 : 0;
  }
  return out;
}

}  // namespace testing_support
