#pragma once
// What the fuzz targets share: reading an input as a sequence of choices,
// checks that abort with what failed, and the heap's balance around a run.
// Exhausted input reads as zeros, so every input decodes to something.
// Numbers come in a few shapes picked by a tag byte, so that values next to
// the 32- and 64-bit limits turn up as often as small ones.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <initializer_list>

#include "host/heap_control.h"
#include "host/log_control.h"

namespace fuzz_input {

inline void Check(bool condition, const char* what, long value = 0) {
  if (condition) return;
  std::fprintf(stderr, "fuzz check failed: %s (%ld)\n", what, value);
  std::abort();
}

inline bool OneOf(int value, std::initializer_list<int> allowed) {
  return std::find(allowed.begin(), allowed.end(), value) != allowed.end();
}

// Runs `run` and checks that it freed every block it allocated.
template <typename Run>
void ExpectNoBlockLeft(Run run) {
  const int64_t live = host::LiveBlockCount();
  run();
  Check(host::LiveBlockCount() == live, "blocks left allocated", static_cast<long>(host::LiveBlockCount() - live));
}

class Reader {
 public:
  Reader(const uint8_t* data, size_t size) : data_(data), size_(size) {}

  bool empty() const { return pos_ >= size_; }

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
