// BlockGroups: the children around the Block, what is copied, what is passed
// over unread, what running out inside a group gives, and failed copies.

#include <gtest/gtest.h>

#include <tuple>

#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/cluster/cluster_harness.h"
#include "tests/support/log_recorder.h"

namespace {

using cluster_testing::Bytes;
using cluster_testing::Record;
using cluster_testing::View;
using namespace ebml;

Bytes Block1() { return block(1, 0, 0, {filler(3, 0xA1)}); }

Bytes ClusterOf(std::initializer_list<Bytes> children) {
  return master(kCluster, {uinteger(kTimecode, 10), cat(children)});
}

struct GroupCase {
  const char* name;
  Bytes children;  // before the Block
  int result;
  int64_t reference_block = 0;
  uint64_t reference_priority = 0;
  uint64_t block_duration = 0;
  Bytes codec_state = {};
  uint64_t failing_allocation = 0;  // the nth of the parse fails; nothing may leak
};

const GroupCase kGroupCases[] = {
    {"OneByteReferenceBlockIsSignExtended", Bytes{0xFB, 0x81, 0xFE}, kClusterBlockReady, -2},
    {"EightByteReferenceBlockIsTakenWhole", sinteger(kReferenceBlock, -3, 8), kClusterBlockReady, -3},
    {"ZeroSizeValuesAreZero", cat({bin(kReferenceBlock, {}), bin(kBlockDuration, {})}), kClusterBlockReady},
    {"PriorityAndDurationAreRead", cat({uinteger(kReferencePriority, 2), uinteger(kBlockDuration, 0x123456)}),
     kClusterBlockReady, 0, 2, 0x123456},
    {"NineByteDurationIsRejected", bin(kBlockDuration, filler(9, 1)), kClusterInvalid},
    {"CodecStateIsCopied", bin(kCodecState, {1, 2, 3}), kClusterBlockReady, 0, 0, 0, {1, 2, 3}},
    {"CodecStateOver32768BytesIsRefused", bin(kCodecState, filler(40000, 7)), kClusterNoMemory},
    {"UnreadPayloadsAreNeverReadAsHeaders",
     cat({bin(kVoid, block(9, 0, 0, {filler(1)})), master(kBlockAdditions, {bin(kBlockAdditional, Block1())}),
          bin(kSlices, block(9, 0, 0, {})), bin(kBlockVirtual, block(9, 0, 0, {})), uinteger(kDiscardPadding, 5),
          uinteger(kReferenceVirtual, 1), bin(kCrc32, {0xA1, 0x81, 0x81, 0x00})}),
     kClusterBlockReady},
    {"FailedCodecStateCopyIsOutOfMemory", bin(kCodecState, {1, 2}), kClusterNoMemory, 0, 0, 0, {}, 1},
    {"FailedFrameTableIsOutOfMemory", {}, kClusterNoMemory, 0, 0, 0, {}, 1},
};

TEST(GroupChildrenTest, AreReadAsTheirCaseSays) {
  for (const GroupCase& c : kGroupCases) {
    SCOPED_TRACE(c.name);
    const int64_t live = host::LiveBlockCount();
    {
      Record record;
      host::FailNthAllocation(c.failing_allocation);
      auto got = cluster_testing::ParseAfterBlocks(record, ClusterOf({master(kBlockGroup, {c.children, Block1()})}));
      host::FailNthAllocation(0);
      const mkvcluster& r = record.c;
      EXPECT_EQ(std::make_tuple(got.result, got.track), std::make_tuple(c.result, c.result == kClusterBlockReady ? 1u : 0u));
      EXPECT_EQ(r.frame_sizes == nullptr, c.result != kClusterBlockReady);
      EXPECT_EQ(std::tie(r.reference_block, r.reference_priority, r.block_duration),
                std::tie(c.reference_block, c.reference_priority, c.block_duration));
      EXPECT_EQ(r.codec_state == nullptr, c.codec_state.empty());
      EXPECT_EQ(Bytes(r.codec_state, r.codec_state + r.codec_state_size), c.codec_state);
    }
    EXPECT_EQ(host::LiveBlockCount(), live);
  }
}

// Inside a group, running out is reported with three notices.
TEST(ParseMkvBlockGroupTest, RunningOutInsideAChildLogsThePartialHeader) {
  Bytes bytes = ClusterOf({master(kBlockGroup, {uinteger(kReferencePriority, 0x1234), Block1()})});
  size_t cut = bytes.size() - 10;  // between the two bytes of the ReferencePriority value
  testing_support::LogRecorder log;
  Record record;
  mkvinbuff in1 = View(bytes, 0, cut - 1), in2 = View(bytes, cut - 1, cut);
  EXPECT_EQ(cluster_testing::Call(record, &in1, &in2).result, kClusterChildShort);
  EXPECT_EQ(record.c.reference_priority, 0x12u);  // what was read is there
  std::vector<std::pair<int, std::string>> want = {
      {kAoLogNotice, "Partial header!  Not supposed to happen!"},
      {kAoLogNotice, "                 inbuff1->buff_left = 0, inbuff2->buff_left = 0"},
      {kAoLogNotice, "                 inbuff1->buff_fileoff = 0, inbuff2->buff_fileoff = " + std::to_string(cut - 1)},
  };
  EXPECT_EQ(log.messages(), want);
}

}  // namespace
