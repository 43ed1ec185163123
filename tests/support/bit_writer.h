#pragma once
// Builds codec headers bit by bit (most significant bit first), for tests of
// the H.264 and MPEG-4 configuration parsers.

#include <cstdint>
#include <vector>

namespace testing_support {

class BitWriter {
 public:
  BitWriter& Bits(unsigned count, uint64_t value) {
    for (unsigned i = count; i-- > 0;) Bit((value >> i) & 1);
    return *this;
  }
  BitWriter& Flag(bool set) { return Bit(set ? 1 : 0); }
  // ue(v): value + 1 in binary, preceded by one zero per bit after the first.
  BitWriter& Golomb(uint64_t value) {
    uint64_t code = value + 1;
    unsigned length = 0;
    while ((code >> length) > 1) ++length;
    Bits(length, 0);
    return Bits(length + 1, code);
  }
  BitWriter& SignedGolomb(int64_t value) {
    return Golomb(value > 0 ? 2 * static_cast<uint64_t>(value) - 1 : 2 * static_cast<uint64_t>(-value));
  }

  // The bits so far, the last byte padded with zeros.
  std::vector<uint8_t> bytes() const { return bytes_; }
  // With the stop bit and zero padding that end an H.264 RBSP.
  std::vector<uint8_t> rbsp() const {
    BitWriter copy = *this;
    copy.Bit(1);
    while (copy.bit_count_ % 8) copy.Bit(0);
    return copy.bytes_;
  }

 private:
  BitWriter& Bit(unsigned bit) {
    if (bit_count_ % 8 == 0) bytes_.push_back(0);
    if (bit) bytes_.back() |= static_cast<uint8_t>(0x80 >> (bit_count_ % 8));
    ++bit_count_;
    return *this;
  }

  std::vector<uint8_t> bytes_;
  uint64_t bit_count_ = 0;
};

// An RBSP as a NAL unit payload: 03 after every 00 00 that precedes 00..03.
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
