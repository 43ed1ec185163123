#include <gtest/gtest.h>

#include <cstring>
#include <utility>
#include <vector>

#include "core/flac_config.h"
#include "core/status.h"

namespace {

using Bytes = std::vector<uint8_t>;

// "fLaC" and a STREAMINFO (last block): blocks 4096..4096, frames 14..5000 bytes,
// 44100 Hz, 2 channels, 16 bits, 0x123456789 samples.
Bytes stream_header() {
  Bytes bytes = {'f', 'L', 'a', 'C', 0x80, 0x00, 0x00, 0x22,  // marker, block header
                 0x10, 0x00, 0x10, 0x00,                      // min, max block size
                 0x00, 0x00, 0x0E, 0x00, 0x13, 0x88,          // min, max frame size
                 0x0A, 0xC4, 0x42, 0xF1, 0x23, 0x45, 0x67, 0x89};
  bytes.resize(42, 0xEE);  // MD5
  return bytes;
}

struct Patch {
  size_t offset;
  uint8_t value;
};

Bytes patched(std::initializer_list<Patch> patches, size_t size = 42) {
  Bytes bytes = stream_header();
  for (const Patch& p : patches) bytes[p.offset] = p.value;
  bytes.resize(size, 0x00);
  return bytes;
}

mkv_flac_config expected_config(uint32_t rate, uint32_t channels, uint32_t bits, uint64_t samples) {
  mkv_flac_config config{};
  config.max_block_size = 4096;
  config.min_block_size = 4096;
  config.max_frame_size = 5000;
  config.min_frame_size = 14;
  config.sample_rate = rate;
  config.channels = channels;
  config.bits_per_sample = bits;
  config.total_samples = samples;
  config.filled = 1;
  return config;
}

TEST(FlacConfigTest, StreamInfoIsValidatedAndUnpacked) {
  const mkv_flac_config usual = expected_config(44100, 2, 16, 0x123456789);
  const struct {
    const char* name;
    Bytes codec_private;
    int status;
    mkv_flac_config config;
  } cases[] = {
      {"the 42 bytes of a stream header", stream_header(), kStatusOk, usual},
      {"41 bytes", patched({}, 41), kStatusInvalidArgument, {}},
      {"further metadata blocks behind STREAMINFO", patched({{4, 0x00}}, 80), kStatusOk, usual},
      {"marker other than fLaC", patched({{3, 'c'}}), kStatusInvalidArgument, {}},
      {"a comment block first", patched({{4, 0x04}}), kStatusInvalidArgument, {}},
      {"a comment block first, flagged last", patched({{4, 0x84}}), kStatusInvalidArgument, {}},
      {"block length 33", patched({{7, 0x21}}), kStatusInvalidArgument, {}},
      {"block length 34 + 65536", patched({{5, 0x01}}), kStatusInvalidArgument, {}},
      {"minimum block above maximum", patched({{8, 0x10}, {9, 0x01}}), kStatusInvalidArgument, {}},
      {"minimum frame above maximum", patched({{12, 0x00}, {13, 0x13}, {14, 0x89}}), kStatusInvalidArgument, {}},
      {"minimum frame 14, maximum unknown", patched({{15, 0}, {16, 0}, {17, 0}}), kStatusInvalidArgument, {}},
      {"sample rate 0", patched({{18, 0}, {19, 0}, {20, 0x02}}), kStatusInvalidArgument, {}},
      {"8 channels of 32 bits at 96000 Hz", patched({{18, 0x17}, {19, 0x70}, {20, 0x0F}, {21, 0xF1}}), kStatusOk,
       expected_config(96000, 8, 32, 0x123456789)},
      {"1 channel of 1 bit at 1 Hz", patched({{18, 0x00}, {19, 0x00}, {20, 0x10}, {21, 0x01}}), kStatusOk,
       expected_config(1, 1, 1, 0x123456789)},
      {"2^31 samples", patched({{21, 0xF0}, {22, 0x80}, {23, 0}, {24, 0}, {25, 0}}), kStatusOk,
       expected_config(44100, 2, 16, 2147483648u)},
      {"36-bit sample count", patched({{21, 0xFF}, {22, 0xFF}, {23, 0xFF}, {24, 0xFF}, {25, 0xFF}}), kStatusOk,
       expected_config(44100, 2, 16, 0xFFFFFFFFF)},
  };
  for (const auto& c : cases) {
    mkv_flac_config config{};
    ASSERT_EQ(parse_flac_stream_header(c.codec_private.data(), static_cast<uint32_t>(c.codec_private.size()),
                                       &config),
              c.status)
        << c.name;
    EXPECT_EQ(0, std::memcmp(&config, &c.config, sizeof config)) << c.name;
  }
}

TEST(FlacConfigTest, FrameSizesBothUnknownAreAccepted) {
  Bytes bytes = patched({{12, 0}, {13, 0}, {14, 0}, {15, 0}, {16, 0}, {17, 0}});
  mkv_flac_config config{};
  ASSERT_EQ(parse_flac_stream_header(bytes.data(), 42, &config), kStatusOk);
  EXPECT_EQ(config.min_frame_size, 0u);
  EXPECT_EQ(config.max_frame_size, 0u);
}

// A stand-in for the media format: the record goes to bytes 28..75.
struct FormatBytes {
  uint8_t bytes[1128];
  uint8_t* extra_ptr;
  uint32_t extra_size;
};

uint32_t word(const uint8_t* record, int index) {
  uint32_t value;
  std::memcpy(&value, record + 4 * index, 4);
  return value;
}

TEST(FlacConfigTest, SetupWritesTheTwelveWordsIntoTheFormat) {
  FormatBytes format;
  std::memset(format.bytes, 0xA5, sizeof format.bytes);
  Bytes header = patched({{8, 0x00}, {9, 0x10}});  // minimum block 16
  ASSERT_EQ(setup_flac_codec_config(format.bytes + kFlacConfigFormatOffset, &format.extra_ptr, &format.extra_size,
                                    header.data(), 42),
            kStatusOk);
  const uint8_t* record = format.bytes + 28;
  EXPECT_EQ(format.extra_ptr, record);
  EXPECT_EQ(format.extra_size, 48u);
  const uint32_t words[] = {4096, 16, 5000, 14, 44100, 2, 16, 0};
  for (int i = 0; i < 8; ++i) EXPECT_EQ(word(record, i), words[i]) << "word " << i;
  uint64_t samples;
  std::memcpy(&samples, record + 32, 8);
  EXPECT_EQ(samples, 0x123456789u);
  EXPECT_EQ(word(record, 10), 1u);
  EXPECT_EQ(word(record, 11), 0u);
  EXPECT_EQ(format.bytes[27], 0xA5);  // nothing outside bytes 28..75
  EXPECT_EQ(format.bytes[76], 0xA5);
}

TEST(FlacConfigTest, RejectedHeaderClearsTheExtraDataAndLeavesTheFormat) {
  const Bytes rejected[] = {patched({}, 41), patched({{4, 0x04}}), patched({{18, 0}, {19, 0}, {20, 0x02}})};
  for (const Bytes& header : rejected) {
    FormatBytes format;
    std::memset(format.bytes, 0xA5, sizeof format.bytes);
    format.extra_ptr = format.bytes;  // left from an earlier set-up
    format.extra_size = 99;
    EXPECT_EQ(setup_flac_codec_config(format.bytes + 28, &format.extra_ptr, &format.extra_size, header.data(),
                                      static_cast<uint32_t>(header.size())),
              kStatusInvalidArgument);
    EXPECT_EQ(format.extra_ptr, nullptr);
    EXPECT_EQ(format.extra_size, 0u);
    for (int i = 28; i < 76; ++i) ASSERT_EQ(format.bytes[i], 0xA5) << "byte " << i;
  }
  uint8_t* extra_ptr = nullptr;
  uint32_t extra_size = 1;
  uint8_t destination[48];
  EXPECT_EQ(setup_flac_codec_config(destination, &extra_ptr, &extra_size, nullptr, 0), kStatusInvalidArgument);
  EXPECT_EQ(extra_size, 0u);
}

}  // namespace
