#include "host/bit_reader.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

using host::BitReader;

TEST(BitReaderTest, ExpGolombCodesDecode) {
  const struct {
    std::vector<uint8_t> bytes;
    uint32_t ue;
    int32_t se;  // the same code read as se(v)
  } cases[] = {
      {{0x80}, 0, 0},                       // 1
      {{0x40}, 1, 1},                       // 010
      {{0x60}, 2, -1},                      // 011
      {{0x20}, 3, 2},                       // 00100
      {{0x38}, 6, -3},                      // 00111
      {{0x00, 0x80, 0x00}, 255, 128},        // 8 zeros, 1, 8 zeros
      {{0x00, 0x00, 0x80, 0x00, 0x00}, 65535, 32768},
      // 31 zeros, a one and 31 ones: the largest code.
      {{0x00, 0x00, 0x00, 0x01, 0xFF, 0xFF, 0xFF, 0xFE}, 0xFFFFFFFE, -2147483647},
  };
  for (const auto& c : cases) {
    BitReader unsigned_reader(c.bytes.data(), c.bytes.size());
    EXPECT_EQ(unsigned_reader.Golomb(), c.ue) << testing::PrintToString(c.bytes);
    EXPECT_FALSE(unsigned_reader.failed());
    BitReader signed_reader(c.bytes.data(), c.bytes.size());
    EXPECT_EQ(signed_reader.SignedGolomb(), c.se) << testing::PrintToString(c.bytes);
  }
}

TEST(BitReaderTest, ReadsPastTheEndFailAndYieldZeros) {
  const struct {
    const char* name;
    std::vector<uint8_t> bytes;
    unsigned skip;
    unsigned count;
    uint32_t value;
    bool failed;
  } cases[] = {
      {"exactly the last bits", {0xAB, 0xCD}, 4, 12, 0xBCD, false},
      {"one bit too many", {0xAB, 0xCD}, 4, 13, 0x179A, true},
      {"nothing left", {0xFF}, 8, 1, 0, true},
      {"empty input", {}, 0, 8, 0, true},
      {"thirty-two bits", {0x12, 0x34, 0x56, 0x78}, 0, 32, 0x12345678, false},
  };
  for (const auto& c : cases) {
    BitReader bits(c.bytes.data(), c.bytes.size());
    bits.Skip(c.skip);
    EXPECT_EQ(bits.Bits(c.count), c.value) << c.name;
    EXPECT_EQ(bits.failed(), c.failed) << c.name;
  }
}

TEST(BitReaderTest, OverlongOrUnfinishedGolombCodeFails) {
  const std::vector<uint8_t> cases[] = {
      {0x00, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF},  // 32 zeros
      {0x00, 0x00},                                            // no one bit at all
      {0x00, 0x80},                                            // eight zeros, a one, no value bits
  };
  for (const auto& bytes : cases) {
    BitReader bits(bytes.data(), bytes.size());
    EXPECT_EQ(bits.Golomb(), 0u) << testing::PrintToString(bytes);
    EXPECT_TRUE(bits.failed()) << testing::PrintToString(bytes);
  }
}

}  // namespace
