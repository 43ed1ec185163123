#pragma once
// Reading a fuzz input as a sequence of choices. Exhausted input reads as
// zeros, so every input decodes to something. Numbers come in a few shapes
// picked by a tag byte, so that values next to the 32- and 64-bit limits
// turn up as often as small ones.

#include <cstddef>
#include <cstdint>

namespace fuzz_input {

class Reader {
 public:
  Reader(const uint8_t* data, size_t size) : data_(data), size_(size) {}

  bool empty() const { return pos_ >= size_; }
  size_t left() const { return size_ - pos_; }
  const uint8_t* rest() const { return data_ + pos_; }

  uint8_t Byte() { return pos_ < size_ ? data_[pos_++] : 0; }

  uint64_t Bytes(int n) {
    uint64_t v = 0;
    for (int i = 0; i < n; ++i) v = v << 8 | Byte();
    return v;
  }

  // Small, 16-bit, 32-bit, full 64-bit, or a small distance from 2^32,
  // INT64_MAX or UINT64_MAX (either side).
  uint64_t Number() {
    const uint8_t tag = Byte();
    switch (tag & 7) {
      case 0:
      case 1:
        return Byte();
      case 2:
        return Bytes(2);
      case 3:
        return Bytes(4);
      case 4:
        return Bytes(8);
      case 5:
        return (uint64_t{1} << 32) + static_cast<int8_t>(Byte());
      case 6:
        return uint64_t{INT64_MAX} + static_cast<int8_t>(Byte());
      default:
        return UINT64_MAX - Byte();
    }
  }

 private:
  const uint8_t* data_;
  size_t size_;
  size_t pos_ = 0;
};

}  // namespace fuzz_input
