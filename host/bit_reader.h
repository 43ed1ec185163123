#pragma once
// Most-significant-bit-first reading of codec headers, with the bounds check in
// one place: a read past the end yields zero bits and marks the reader failed,
// so a parser reads on without checking and looks at failed() where a wrong
// value could do harm.

#include <cstddef>
#include <cstdint>

namespace host {

class BitReader {
 public:
  BitReader(const uint8_t* data, size_t size) : data_(data), size_bits_(static_cast<uint64_t>(size) * 8) {}

  // 0 to 32 bits as an unsigned number.
  uint32_t Bits(unsigned count) {
    uint32_t value = 0;
    for (unsigned i = 0; i < count; ++i) value = value << 1 | NextBit();
    return value;
  }
  bool Flag() { return NextBit() != 0; }
  void Skip(unsigned count) {
    for (unsigned i = 0; i < count; ++i) NextBit();
  }

  // ue(v): unsigned Exp-Golomb. Codes of more than 32 bits' worth of value fail.
  uint32_t Golomb() {
    unsigned zeros = 0;
    while (!failed_ && NextBit() == 0) {
      if (++zeros > 31) {
        failed_ = true;
        return 0;
      }
    }
    if (failed_) return 0;
    uint64_t value = (uint64_t{1} << zeros) - 1 + Bits(zeros);
    return failed_ ? 0 : static_cast<uint32_t>(value);
  }
  // se(v): 1, -1, 2, -2, ... for codes 1, 2, 3, 4, ...
  int32_t SignedGolomb() {
    uint32_t code = Golomb();
    auto magnitude = static_cast<int64_t>((static_cast<uint64_t>(code) + 1) / 2);
    return static_cast<int32_t>(code % 2 ? magnitude : -magnitude);
  }

  bool failed() const { return failed_; }
  uint64_t bit_position() const { return position_; }

 private:
  uint32_t NextBit() {
    if (position_ >= size_bits_) {
      failed_ = true;
      return 0;
    }
    uint32_t bit = data_[position_ / 8] >> (7 - position_ % 8) & 1;
    ++position_;
    return bit;
  }

  const uint8_t* data_;
  uint64_t size_bits_;
  uint64_t position_ = 0;
  bool failed_ = false;
};

}  // namespace host
