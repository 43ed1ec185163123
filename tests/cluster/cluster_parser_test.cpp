// The playback parser over crafted bytes. parse_mkvcluster at Cluster and
// Segment level (what is skipped, what is passed over, where Clusters begin
// and end, what running out gives) and on block headers and lace tables at the
// edges of lacing and with sizes that overflow 32-bit arithmetic (ordinary
// Xiph, EBML and fixed lacing are compared with mkvinfo in the fixture test);
// BlockGroups: the children around the Block, what is copied, what is passed
// over unread, what running out inside a group gives, and failed copies; and
// the byte rule over inbuff1 and inbuff2 where it is a contract of its own:
// what a failed read or skip leaves consumed. (Reads across the two views are
// exercised at every split point by the block and fixture tests.)

#include <gtest/gtest.h>

#include <cstdint>
#include <tuple>
#include <vector>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/support/block_builder.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;

// bytes[from, to) as the file bytes at offset `from`.
mkvinbuff View(const Bytes& bytes, size_t from, size_t to) {
  return mkvinbuff{bytes.data() + from, static_cast<uint32_t>(to - from), 0, static_cast<uint32_t>(to - from), from};
}

// A zero record (the start state) that frees its tables when it goes; not to be copied.
struct Record {
  mkvcluster c{};
  ~Record() { destroy_mkvcluster(&c); }
};

// What one parse gave besides the record: its result, the skip it found
// (0xDEAD: none) and the bytes left in inbuff1.
struct Outcome {
  int result;
  uint64_t skip;
  uint32_t left;
};

Outcome Call(Record& record, mkvinbuff* in1, mkvinbuff* in2) {
  destroy_mkvcluster(&record.c);
  Outcome out{0, 0xDEAD, 0};
  out.result = parse_mkvcluster(in1, in2, &record.c, &out.skip);
  out.left = in1->buff_left;
  return out;
}

// Runs parse_mkvcluster over one buffer `blocks_before` + 1 times, consuming
// each block's data and applying each skip between calls as the caller does.
Outcome ParseAfterBlocks(Record& record, const Bytes& bytes, int blocks_before = 0) {
  mkvinbuff in1 = View(bytes, 0, bytes.size());
  for (int blocks = 0;;) {
    const Outcome out = Call(record, &in1, nullptr);
    const bool block = out.result == kClusterBlockReady && blocks++ < blocks_before;
    if (!block && (out.result != kClusterSkip || blocks >= blocks_before)) return out;
    const auto consumed = static_cast<uint32_t>(block ? uint64_t(record.c.block_data_left) : out.skip);
    in1.buff_pos += consumed;
    in1.buff_left -= consumed;
  }
}

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
  bool ran_out = false;  // the bytes end inside an element: all of inbuff1 is read, and the record says so
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
const Bytes kTwoBlocks = master(kCluster, {uinteger(kTimecode, 2), Block(1), Block(2)});

Bytes Cut(size_t end) { return Bytes(kTwoBlocks.begin(), kTwoBlocks.begin() + static_cast<std::ptrdiff_t>(end)); }

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
    // Without inbuff2 the call ends where inbuff1 does, inside the Cluster's ID, the Timecode's header, the first
    // SimpleBlock's header, between the second one's ID and size, and inside its header.
    {"RanOutInTheClusterId", Cut(2), 0, kClusterHeaderFailed, 0xDEAD, 0, 0, nullptr, 0, {}, 0, true},
    {"RanOutInTheTimecodeHeader", Cut(6), 0, kClusterChildShort, 0xDEAD, 0, 0, nullptr, 0, {}, 0, true},
    {"RanOutInTheFirstBlockHeader", Cut(12), 0, kClusterChildShort, 0xDEAD, 2, 0, nullptr, 0, {}, 0, true},
    {"RanOutBetweenTheSecondBlockIdAndSize", Cut(18), 1, kClusterHeaderFailed, 0xDEAD, 2, 0, nullptr, 0, {}, 0, true},
    {"RanOutInTheSecondBlockHeader", Cut(21), 1, kClusterChildShort, 0xDEAD, 2, 0, nullptr, 0, {}, 0, true},
};

TEST(ParseMkvClusterTest, GivesTheResultOfEachCase) {
  for (const ClusterCase& c : kCases) {
    SCOPED_TRACE(c.name);
    testing_support::LogRecorder log;
    Record record;
    const auto got = ParseAfterBlocks(record, c.bytes, c.blocks_before);
    const mkvcluster& r = record.c;
    const bool ready = got.result == kClusterBlockReady;
    EXPECT_EQ(std::make_tuple(got.result, got.skip, r.cluster_timecode, ready ? r.track_number : 0),
              std::make_tuple(c.result, c.skip, c.cluster_timecode, c.track));
    EXPECT_TRUE(!c.message || log.Contains(kAoLogNotice, c.message));
    EXPECT_TRUE(!c.ran_out || (got.left == 0 && mkvcluster_inside_element(&r)));
    if (!c.sizes.empty()) {
      EXPECT_EQ(std::make_tuple(r.block_timecode, std::vector<int64_t>(r.frame_sizes, r.frame_sizes + r.frame_count),
                                r.block_data_left),
                std::make_tuple(c.timecode, c.sizes, c.data_left));
    }
  }
}

// ---- BlockGroups.

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
      auto got = ParseAfterBlocks(record, ClusterOf({master(kBlockGroup, {c.children, Block1()})}));
      host::FailNthAllocation(0);
      const mkvcluster& r = record.c;
      EXPECT_EQ(std::make_tuple(got.result, got.result == kClusterBlockReady ? r.track_number : 0),
                std::make_tuple(c.result, c.result == kClusterBlockReady ? 1u : 0u));
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
  EXPECT_EQ(Call(record, &in1, &in2).result, kClusterChildShort);
  EXPECT_EQ(record.c.reference_priority, 0x12u);  // what was read is there
  std::vector<std::pair<int, std::string>> want = {
      {kAoLogNotice, "Partial header!  Not supposed to happen!"},
      {kAoLogNotice, "                 inbuff1->buff_left = 0, inbuff2->buff_left = 0"},
      {kAoLogNotice, "                 inbuff1->buff_fileoff = 0, inbuff2->buff_fileoff = " + std::to_string(cut - 1)},
  };
  EXPECT_EQ(log.messages(), want);
}

// ---- The byte rule.

TEST(EbmlGetVarUintFromBuffTest, ReadsAcrossTheTwoViews) {
  // inbuff1 holds bytes[0, split), inbuff2 the rest (none when split is the size)
  const struct { Bytes bytes; size_t split; int status; uint64_t value; uint32_t length; size_t consumed; } rows[] = {
      {{0x81}, 1, kStatusOk, 1, 1, 1},
      {{0x40, 0x02}, 1, kStatusOk, 2, 2, 2},
      {{0x10, 0x00, 0x00, 0x01}, 2, kStatusOk, 1, 4, 4},
      {{0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, 3, kStatusOk, 0x00FFFFFFFFFFFFFF, 8, 8},
      {{0x00, 0x81}, 2, kStatusMalformed, 0, 0, 1},
      {{0x20, 0x01}, 1, kStatusReadFailed, 0, 0, 2},  // 3 bytes wanted, the read ones stay consumed
      {{0x20, 0x01}, 2, kStatusReadFailed, 0, 0, 2},
  };
  for (const auto& c : rows) {
    mkvinbuff in1 = View(c.bytes, 0, c.split), in2 = View(c.bytes, c.split, c.bytes.size());
    uint64_t value = 0;
    uint32_t length = 0;
    EXPECT_EQ(ebml_get_var_uint_from_buff(&in1, c.split < c.bytes.size() ? &in2 : nullptr, &value, &length), c.status);
    EXPECT_TRUE(c.status != kStatusOk || (value == c.value && length == c.length)) << value << " " << length;
    EXPECT_EQ(in1.buff_pos + in2.buff_pos, c.consumed);
  }
}

TEST(SkipBuffbytesTest, IsAllOrNothing) {
  Bytes bytes(5);
  const struct { uint32_t count; bool with_inbuff2; int result; uint32_t left1, left2; } rows[] = {
      {2, true, 0, 1, 2}, {5, true, 0, 0, 0}, {6, true, -1, 3, 2}, {4, false, -1, 3, 2}, {3, false, 0, 0, 2}};
  for (const auto& row : rows) {
    mkvinbuff in1 = View(bytes, 0, 3), in2 = View(bytes, 3, 5);
    const int result = skip_buffbytes(&in1, row.with_inbuff2 ? &in2 : nullptr, row.count);
    EXPECT_EQ(std::tie(result, in1.buff_left, in2.buff_left), std::tie(row.result, row.left1, row.left2)) << row.count;
  }
}

}  // namespace
