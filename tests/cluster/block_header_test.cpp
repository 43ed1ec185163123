// Block headers and lace tables at the edges of lacing and with sizes that
// overflow 32-bit arithmetic, each also cut and split at every byte. Ordinary
// Xiph, EBML and fixed lacing are compared with mkvinfo in the fixture test.

#include <gtest/gtest.h>

#include "tests/cluster/cluster_harness.h"

namespace {

using cluster_testing::Bytes;
using cluster_testing::Outcome;
using cluster_testing::Record;
using namespace ebml;

constexpr uint64_t kBodySize = UINT64_MAX;  // the element size is the body's own

struct BlockCase {
  const char* name;
  Bytes header;          // block header and lace table
  size_t frame_bytes;    // data bytes that follow it
  uint64_t element_size;
  int result;
  uint64_t track = 0;
  int16_t timecode = 0;
  std::vector<int64_t> sizes = {};
  int64_t data_left = 0;
};

void PrintTo(const BlockCase& c, std::ostream* os) { *os << c.name; }

Bytes Repeat(size_t n, uint8_t byte) { return Bytes(n, byte); }

const BlockCase kCases[] = {
    {"FixedRemainderStaysInTheBlock", {0x81, 0xFF, 0xFE, 0x04, 0x02}, 10, kBodySize, kClusterBlockReady, 1, -2,
     {3, 3, 3}, 10},  // track 1, timecode -2, three frames of 10 / 3
    {"Xiph256Frames", cat({{0x81, 0x00, 0x01, 0x82, 0xFF}, Repeat(255, 0x01)}), 256, kBodySize, kClusterBlockReady,
     1, 1, std::vector<int64_t>(256, 1), 256},
    {"Ebml256Frames", cat({{0x81, 0x00, 0x01, 0x86, 0xFF, 0x81}, Repeat(254, 0xBF)}), 256, kBodySize,
     kClusterBlockReady, 1, 1, std::vector<int64_t>(256, 1), 256},
    {"EbmlOneFrameCodesNoSize", {0x81, 0x00, 0x00, 0x86, 0x00}, 7, kBodySize, kClusterBlockReady, 1, 0, {7}, 7},
    {"TwoByteTrackNumber", {0x40, 0x05, 0x00, 0x10, 0x00}, 5, kBodySize, kClusterBlockReady, 5, 16, {5}, 5},
    {"XiphSizeBeyondTheDataGivesNegativeLast", {0x81, 0x00, 0x00, 0x02, 0x01, 0xFF, 0xFF, 0x05}, 10, kBodySize,
     kClusterBlockReady, 1, 0, {515, -505}, 10},
    {"EbmlSizeOver32BitsCountsByItsLowBits",
     {0x81, 0x00, 0x00, 0x06, 0x01, 0x09, 0x00, 0x00, 0x00, 0x05},  // first size 0x100000005
     10, kBodySize, kClusterBlockReady, 1, 0, {0x100000005, 5}, 10},
    {"ElementSizeFFFFFFFFWrapsNegative", {0x81, 0x00, 0x00, 0x80}, 4, 0xFFFFFFFF, kClusterBlockReady, 1, 0, {-5}, -5},
    {"ElementSizeOver32BitsUsesItsLowBits", {0x81, 0x00, 0x00, 0x80}, 10, (uint64_t{1} << 32) + 14,
     kClusterBlockReady, 1, 0, {10}, 10},
    {"TrackNumberFirstByteZeroIsInvalid", {0x00, 0x81, 0x00, 0x00, 0x80}, 4, kBodySize, kClusterInvalid},
    {"EbmlFirstSizeZeroIsInvalid", {0x81, 0x00, 0x00, 0x06, 0x01, 0x00}, 4, kBodySize, kClusterInvalid},
    {"EbmlDifferenceZeroIsShort", {0x81, 0x00, 0x00, 0x06, 0x02, 0x82, 0x00}, 4, kBodySize, kClusterChildShort},
};

// A Cluster of unknown size (so that any block size fits) holding the block.
Bytes ClusterWith(const BlockCase& c, size_t* first_frame) {
  Bytes body = cat({c.header, filler(c.frame_bytes, 0x5A)});
  uint64_t size = c.element_size == kBodySize ? body.size() : c.element_size;
  Bytes bytes = unknown_size(kCluster, {uinteger(kTimecode, 7), id_bytes(kSimpleBlock), size_bytes(size, 8), body});
  *first_frame = bytes.size() - c.frame_bytes;
  return bytes;
}

class BlockHeaderTest : public testing::TestWithParam<BlockCase> {};

TEST_P(BlockHeaderTest, WholeBufferGivesTheTable) {
  const BlockCase& c = GetParam();
  size_t first_frame;
  Bytes bytes = ClusterWith(c, &first_frame);
  Record record;
  Outcome got = cluster_testing::ParseWhole(record, bytes);
  ASSERT_EQ(got.result, c.result);
  if (c.result != kClusterBlockReady) return;
  EXPECT_EQ(got.track, c.track);
  EXPECT_EQ(got.timecode, c.timecode);
  EXPECT_EQ(got.sizes, c.sizes);
  EXPECT_EQ(got.data_left, c.data_left);
  EXPECT_EQ(got.position, first_frame);
  EXPECT_EQ(got.cluster_timecode, 7u);
}

TEST_P(BlockHeaderTest, CutOrSplitAtEveryByteGivesTheSame) {
  size_t first_frame;
  Bytes bytes = ClusterWith(GetParam(), &first_frame);
  Record whole_record;
  Outcome whole = cluster_testing::ParseWhole(whole_record, bytes);
  for (size_t at = 0; at <= first_frame; ++at) {
    Record cut, split;
    EXPECT_EQ(cluster_testing::ParseCut(cut, bytes, at), whole) << "cut at " << at;
    EXPECT_EQ(cluster_testing::ParseSplit(split, bytes, at), whole) << "split at " << at;
  }
}

INSTANTIATE_TEST_SUITE_P(Blocks, BlockHeaderTest, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
