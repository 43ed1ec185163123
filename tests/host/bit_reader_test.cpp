#include "host/bit_reader.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

TEST(BitReaderTest, GolombCodesDecodeUpToTheLargestAndNoFurther) {
  const struct {
    std::vector<uint8_t> bytes;
    uint32_t ue;
    int32_t se;  // the same code read as se(v)
    bool failed;
  } cases[] = {
      {{0x80}, 0, 0, false},
      {{0x60}, 2, -1, false},
      {{0x00, 0x80, 0x00}, 255, 128, false},
      // 31 zeros, a one and 31 ones: the largest code.
      {{0x00, 0x00, 0x00, 0x01, 0xFF, 0xFF, 0xFF, 0xFE}, 0xFFFFFFFE, -2147483647, false},
      {{0x00, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, 0, 0, true},  // 32 zeros
      {{0x00, 0x80}, 0, 0, true},                                            // value bits missing
      {{}, 0, 0, true},
  };
  for (const auto& c : cases) {
    host::BitReader unsigned_bits(c.bytes.data(), c.bytes.size());
    EXPECT_EQ(unsigned_bits.Golomb(), c.ue) << testing::PrintToString(c.bytes);
    EXPECT_EQ(unsigned_bits.failed(), c.failed) << testing::PrintToString(c.bytes);
    host::BitReader signed_bits(c.bytes.data(), c.bytes.size());
    EXPECT_EQ(signed_bits.SignedGolomb(), c.se) << testing::PrintToString(c.bytes);
  }
}

}  // namespace
