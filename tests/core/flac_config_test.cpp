#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <vector>

#include "core/flac_config.h"
#include "core/status.h"

namespace {

using Bytes = std::vector<uint8_t>;

struct Patch {
  size_t offset;
  uint8_t value;
};

// "fLaC" and a STREAMINFO flagged last: blocks 4096..4096, frames 14..5000 bytes,
// 44100 Hz, 2 channels, 16 bits, 0x123456789 samples; then patched and resized.
Bytes stream_header(std::initializer_list<Patch> patches = {}, size_t size = 42) {
  Bytes bytes = {'f',  'L',  'a',  'C',  0x80, 0x00, 0x00, 0x22, 0x10, 0x00, 0x10, 0x00, 0x00,
                 0x00, 0x0E, 0x00, 0x13, 0x88, 0x0A, 0xC4, 0x42, 0xF1, 0x23, 0x45, 0x67, 0x89};
  bytes.resize(42, 0xEE);  // MD5
  for (const Patch& p : patches) bytes[p.offset] = p.value;
  bytes.resize(size, 0x00);
  return bytes;
}

TEST(FlacConfigTest, StreamInfoIsValidatedAndUnpacked) {
  // Expected words 0..6 and the total samples; all zero for a rejection.
  const struct {
    const char* name;
    Bytes codec_private;
    uint32_t words[7];
    uint64_t samples;
  } cases[] = {
      {"the 42 bytes of a stream header", stream_header(), {4096, 4096, 5000, 14, 44100, 2, 16}, 0x123456789},
      {"41 bytes", stream_header({}, 41), {}, 0},
      {"maximum of each pair first", stream_header({{8, 0x00}, {9, 0x10}, {14, 0x0F}}), {4096, 16, 5000, 15, 44100, 2, 16},
       0x123456789},
      {"marker other than fLaC", stream_header({{3, 'c'}}), {}, 0},
      {"a comment block first", stream_header({{4, 0x04}}), {}, 0},
      {"block length 33", stream_header({{7, 0x21}}), {}, 0},
      {"block length 34 + 65536", stream_header({{5, 0x01}}), {}, 0},
      {"minimum block above maximum", stream_header({{8, 0x10}, {9, 0x01}}), {}, 0},
      {"minimum frame 14, maximum unknown", stream_header({{15, 0}, {16, 0}, {17, 0}}), {}, 0},
      {"both frame sizes unknown", stream_header({{14, 0}, {15, 0}, {16, 0}, {17, 0}}),
       {4096, 4096, 0, 0, 44100, 2, 16}, 0x123456789},
      {"sample rate 0", stream_header({{18, 0}, {19, 0}, {20, 0x02}}), {}, 0},
      {"1 channel of 1 bit at 1 Hz", stream_header({{18, 0}, {19, 0}, {20, 0x10}, {21, 0x01}}),
       {4096, 4096, 5000, 14, 1, 1, 1}, 0x123456789},
      {"36-bit sample count", stream_header({{21, 0xFF}, {22, 0xFF}, {23, 0xFF}, {24, 0xFF}, {25, 0xFF}}),
       {4096, 4096, 5000, 14, 44100, 2, 16}, 0xFFFFFFFFF},
  };
  for (const auto& c : cases) {
    const bool accepted = c.words[0] != 0;
    // A 1128-byte stand-in for the media format; the record belongs at bytes
    // 28..75, in the machine-order words the decoder reads; nothing else changes.
    std::vector<uint8_t> format(1128, 0xA5), want = format;
    if (accepted) {
      uint32_t words[12] = {};
      std::copy(c.words, c.words + 7, words);
      words[10] = 1;
      std::memcpy(&want[28], words, sizeof words);
      std::memcpy(&want[28 + 32], &c.samples, sizeof c.samples);
    }
    uint8_t* extra_ptr = format.data();  // left from an earlier set-up
    uint32_t extra_size = 99;
    ASSERT_EQ(setup_flac_codec_config(format.data() + kFlacConfigFormatOffset, &extra_ptr, &extra_size,
                                      c.codec_private.data(), static_cast<uint32_t>(c.codec_private.size())),
              accepted ? kStatusOk : kStatusInvalidArgument)
        << c.name;
    EXPECT_EQ(extra_ptr, accepted ? format.data() + 28 : nullptr) << c.name;
    EXPECT_EQ(extra_size, accepted ? 48u : 0u) << c.name;
    EXPECT_EQ(format, want) << c.name;
  }
}

}  // namespace
