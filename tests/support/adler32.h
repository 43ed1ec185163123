#pragma once
// Adler-32 (RFC 1950), the frame checksum that mkvinfo -c prints and the
// .blocks files record. Running, so that a frame consumed in pieces across
// buffers sums as one.

#include <cstddef>
#include <cstdint>

namespace testing_support {

struct Adler32Sum {
  uint32_t a = 1, b = 0;
  Adler32Sum& update(const uint8_t* data, size_t size) {
    for (size_t i = 0; i < size; ++i) {
      a = (a + data[i]) % 65521;
      b = (b + a) % 65521;
    }
    return *this;
  }
  uint32_t value() const { return b << 16 | a; }
};

inline uint32_t Adler32(const uint8_t* data, size_t size) { return Adler32Sum{}.update(data, size).value(); }

}  // namespace testing_support
