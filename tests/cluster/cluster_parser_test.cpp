// parse_mkvcluster at Cluster and Segment level (what is skipped, what is
// passed over, where Clusters begin and end, what running out gives) and on
// block headers and lace tables at the edges of lacing and with sizes that
// overflow 32-bit arithmetic. Ordinary Xiph, EBML and fixed lacing are
// compared with mkvinfo in the fixture test.

#include <gtest/gtest.h>

#include <tuple>

#include "tests/cluster/cluster_harness.h"
#include "platform/ao_log.h"
#include "tests/support/log_recorder.h"

namespace {

using cluster_testing::Bytes;
using cluster_testing::Record;
using cluster_testing::View;
using namespace ebml;

struct ClusterCase {
  const char* name;
  Bytes bytes;
  int blocks_before;  // blocks consumed before the call that is checked
  int result;
  uint64_t skip = 0xDEAD;  // as set by -3; untouched otherwise
  uint64_t cluster_timecode = 0;
  uint64_t track = 0;
  const char* message = nullptr;  // a level-5 message the calls must log
  int16_t timecode = 0;           // with sizes and data_left, compared when sizes are given
  std::vector<int64_t> sizes = {};
  int64_t data_left = 0;
};

Bytes Block(uint64_t track) { return simple_block(track, 0, kKeyFrame, {filler(3, 0xA3)}); }

// A Cluster of unknown size (so that any block size fits) holding a SimpleBlock of
// this header and lace table, `frame_bytes` of data and an element size (0: its own).
Bytes Laced(const Bytes& header, size_t frame_bytes, uint64_t element_size = 0) {
  Bytes body = cat({header, filler(frame_bytes, 0x5A)});
  return unknown_size(kCluster, {uinteger(kTimecode, 7), id_bytes(kSimpleBlock),
                                 size_bytes(element_size ? element_size : body.size(), 8), body});
}

const Bytes kCuesElement = master(kCues, {master(kCuePoint, {uinteger(kCueTime, 0)})});

const ClusterCase kCases[] = {
    {"CuesBetweenClustersAreSkippedWhole", kCuesElement, 0, kClusterSkip, kCuesElement.size() - 5},
    {"VoidAfterABlockIsSkippedWithAMessage",
     master(kCluster, {uinteger(kTimecode, 3), Block(1), bin(kVoid, filler(5))}), 1, kClusterSkip, 5, 3, 0,
     "Expected BlockGroup or SimpleBlock, got 0xec instead, skipping 5"},
    {"VoidReachingPastTheClusterEndIsCutToIt",
     cat({master_sized(kCluster, 3 + 9 + 2 + 2, {uinteger(kTimecode, 3), Block(1)}), bin(kVoid, filler(5))}), 1,
     kClusterSkip, 2, 3},
    {"ZeroSizeVoidBetweenBlocksSkipsNothing",
     master(kCluster, {uinteger(kTimecode, 3), Block(1), bin(kVoid, {}), Block(2)}), 1, kClusterSkip, 0, 3},
    {"TimecodeOfNineBytesIsRejected", master(kCluster, {bin(kTimecode, filler(9, 1)), Block(1)}), 0,
     kClusterInvalid},
    {"ZeroSizeClusterIsPassed", cat({master(kCluster, {}), master(kCluster, {uinteger(kTimecode, 5), Block(1)})}),
     0, kClusterBlockReady, 0xDEAD, 5, 1},
    {"LeadingCrcAndVoidPayloadsAreNotReadAsHeaders",
     master(kCluster, {bin(kCrc32, {0xA3, 0x84, 0x81, 0x00}), bin(kVoid, Block(7)), uinteger(kTimecode, 4), Block(1)}),
     0, kClusterBlockReady, 0xDEAD, 4, 1},
    {"SilentTracksAndUnknownSizeVoidArePassedToTheClusterEnd",
     cat({master(kCluster, {master(kSilentTracks, {uinteger(kSilentTrackNumber, 2)}), uinteger(kTimecode, 6),
                            id_bytes(kVoid), size_bytes(kUnknownSize, 8), Block(7)}),
          master(kCluster, {uinteger(kTimecode, 8), Block(2)})}),
     0, kClusterBlockReady, 0xDEAD, 8, 2},
    {"ZeroSizeBlockGroupIsPassed", master(kCluster, {uinteger(kTimecode, 1), master(kBlockGroup, {}), Block(2)}), 0,
     kClusterBlockReady, 0xDEAD, 1, 2},
    {"ClusterHeaderInsideAnUnknownSizeClusterStartsANewOne",
     cat({unknown_size(kCluster, {uinteger(kTimecode, 1), Block(1)}),
          master(kCluster, {uinteger(kTimecode, 9), Block(2)})}),
     1, kClusterBlockReady, 0xDEAD, 9, 2},
    {"InvalidIdByteAmongChildrenIsDropped", master(kCluster, {uinteger(kTimecode, 4), Bytes{0x05}, Block(1)}), 0,
     kClusterBlockReady, 0xDEAD, 4, 1, "Sub-element of cluster is invalid, skipping."},
    {"InvalidByteBetweenClustersFails", Bytes{0x05, 0x81}, 0, kClusterHeaderFailed},
    {"InvalidByteBetweenBlocksFails", master(kCluster, {uinteger(kTimecode, 4), Block(1), Bytes{0x05}}), 1,
     kClusterHeaderFailed, 0xDEAD, 4},
    // Lacing: track 1, timecode -2, three frames of 10 / 3; 256 frames each way; sizes past the data.
    {"FixedRemainderStaysInTheBlock", Laced({0x81, 0xFF, 0xFE, 0x04, 0x02}, 10), 0, kClusterBlockReady, 0xDEAD, 7, 1,
     nullptr, -2, {3, 3, 3}, 10},
    {"Xiph256Frames", Laced(cat({{0x81, 0x00, 0x01, 0x82, 0xFF}, Bytes(255, 0x01)}), 256), 0, kClusterBlockReady,
     0xDEAD, 7, 1, nullptr, 1, std::vector<int64_t>(256, 1), 256},
    {"Ebml256Frames", Laced(cat({{0x81, 0x00, 0x01, 0x86, 0xFF, 0x81}, Bytes(254, 0xBF)}), 256), 0,
     kClusterBlockReady, 0xDEAD, 7, 1, nullptr, 1, std::vector<int64_t>(256, 1), 256},
    {"EbmlOneFrameCodesNoSize", Laced({0x81, 0x00, 0x00, 0x86, 0x00}, 7), 0, kClusterBlockReady, 0xDEAD, 7, 1,
     nullptr, 0, {7}, 7},
    {"TwoByteTrackNumber", Laced({0x40, 0x05, 0x00, 0x10, 0x00}, 5), 0, kClusterBlockReady, 0xDEAD, 7, 5, nullptr,
     16, {5}, 5},
    {"XiphSizeBeyondTheDataGivesNegativeLast", Laced({0x81, 0x00, 0x00, 0x02, 0x01, 0xFF, 0xFF, 0x05}, 10), 0,
     kClusterBlockReady, 0xDEAD, 7, 1, nullptr, 0, {515, -505}, 10},
    {"EbmlSizeOver32BitsCountsByItsLowBits",  // first size 0x100000005
     Laced({0x81, 0x00, 0x00, 0x06, 0x01, 0x09, 0x00, 0x00, 0x00, 0x05}, 10), 0, kClusterBlockReady, 0xDEAD, 7, 1,
     nullptr, 0, {0x100000005, 5}, 10},
    {"ElementSizeFFFFFFFFWrapsNegative", Laced({0x81, 0x00, 0x00, 0x80}, 4, 0xFFFFFFFF), 0, kClusterBlockReady,
     0xDEAD, 7, 1, nullptr, 0, {-5}, -5},
    {"ElementSizeOver32BitsUsesItsLowBits", Laced({0x81, 0x00, 0x00, 0x80}, 10, (uint64_t{1} << 32) + 14), 0,
     kClusterBlockReady, 0xDEAD, 7, 1, nullptr, 0, {10}, 10},
    {"TrackNumberFirstByteZeroIsInvalid", Laced({0x00, 0x81, 0x00, 0x00, 0x80}, 4), 0, kClusterInvalid, 0xDEAD, 7},
    {"EbmlFirstSizeZeroIsInvalid", Laced({0x81, 0x00, 0x00, 0x06, 0x01, 0x00}, 4), 0, kClusterInvalid, 0xDEAD, 7},
    {"EbmlDifferenceZeroIsShort", Laced({0x81, 0x00, 0x00, 0x06, 0x02, 0x82, 0x00}, 4), 0, kClusterChildShort,
     0xDEAD, 7},
};

TEST(ParseMkvClusterTest, GivesTheResultOfEachCase) {
  for (const ClusterCase& c : kCases) {
    SCOPED_TRACE(c.name);
    testing_support::LogRecorder log;
    Record record;
    auto got = cluster_testing::ParseAfterBlocks(record, c.bytes, c.blocks_before);
    EXPECT_EQ(std::tie(got.result, got.skip, got.cluster_timecode, got.track),
              std::tie(c.result, c.skip, c.cluster_timecode, c.track));
    EXPECT_TRUE(!c.message || log.Contains(kAoLogNotice, c.message));
    if (!c.sizes.empty()) {
      EXPECT_EQ(std::tie(got.timecode, got.sizes, got.data_left), std::tie(c.timecode, c.sizes, c.data_left));
    }
  }
}

// Without inbuff2 the call ends where inbuff1 does; what it read stays read.
TEST(ParseMkvClusterRanOutTest, EndOfInbuff1GivesTheResultOfTheLevelItEndsIn) {
  Bytes bytes = master(kCluster, {uinteger(kTimecode, 2), Block(1), Block(2)});
  const struct { size_t end; bool after_first_block; int result; } rows[] = {
      {2, false, kClusterHeaderFailed},  // inside the Cluster's ID
      {6, false, kClusterChildShort},    // inside the Timecode's header
      {12, false, kClusterChildShort},   // inside the first SimpleBlock's header
      {18, true, kClusterHeaderFailed},  // between the second SimpleBlock's ID and size
      {21, true, kClusterChildShort},    // inside the second SimpleBlock's header
  };
  for (const auto& row : rows) {
    Record record;
    const Bytes cut(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(row.end));
    const auto got = cluster_testing::ParseAfterBlocks(record, cut, row.after_first_block);
    EXPECT_EQ(got.result, row.result) << "end " << row.end;
    EXPECT_EQ(got.left, 0u);
    EXPECT_TRUE(mkvcluster_inside_element(&record.c));
  }
}

}  // namespace
