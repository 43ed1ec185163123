// Crafted files for the faults that recur in Matroska parsers: element and
// lace sizes at the 32-bit edge, lace sums past 2^32, a CodecPrivate of
// 2^32 - 1 bytes declared, times and scales near the 64-bit limits, nesting
// thousands of levels deep, and zero-size and unknown-size elements at every
// level. Each file goes through the header parse and through a real graph
// (streamer, kelvane, sinks) and must end with a declared answer and deliver
// the frames its row names (or, for damage whose effect spreads, frames of the
// undamaged file in their order), leaving no block behind.

#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/status.h"
#include "host/graph_runner.h"
#include "host/heap_control.h"
#include "host/log_control.h"
#include "tests/support/block_builder.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/plugin_under_test.h"

namespace {

using namespace ebml;

constexpr uint64_t k2To32 = uint64_t{1} << 32;
constexpr uint64_t kBias5 = (uint64_t{1} << 34) - 1;  // of a 5-byte signed EBML lace difference
constexpr uint32_t kSomeUnknownId = 0x4FAB;  // a two-byte ID Matroska does not define

// ---- The undamaged file: one MP3 track, two Clusters, three frames, Cues, Tags.

// A SimpleBlock of track 1 with a lace header written out: `sizes` are the
// lace bytes after the frame-count byte, then `data` bytes of frame data.
Bytes LacedBlock(uint8_t lacing, uint8_t frame_count_minus_1, const Bytes& sizes, size_t data) {
  const Bytes head = {0x81, 0x00, 0x00, static_cast<uint8_t>(kKeyFrame | lacing), frame_count_minus_1};
  return element(kSimpleBlock, cat({head, sizes, Bytes(data, 0x33)}));
}

// Where a crafted child goes: first child of the master with this ID (0: none).
struct Insert { uint32_t into = 0; Bytes child = {}; };

// A master that takes the insert as its first child when it is the target.
Bytes In(const Insert& insert, uint32_t id, std::initializer_list<Bytes> children) {
  Bytes payload = insert.into == id ? insert.child : Bytes{};
  return element(id, cat({payload, cat(children)}));
}

struct Shape {
  uint64_t timecode_scale = 1000000;
  uint64_t cluster_time[2] = {0, 100};
  Bytes codec_private = {};
  Insert insert = {};
};

Bytes File(const Shape& s) {
  const Insert& x = s.insert;
  const Bytes header = In(x, kEbmlHeader, {uinteger(kEbmlVersion, 1), str(kDocType, "matroska")});
  const Bytes info = In(x, kInfo, {uinteger(kTimecodeScale, s.timecode_scale), str(kTitle, "crafted")});
  const Bytes tracks = In(x, kTracks, {In(x, kTrackEntry, {
      uinteger(kTrackNumber, 1), uinteger(kTrackUid, 1), uinteger(kTrackType, 2), str(kCodecId, "A_MPEG/L3"),
      s.codec_private, In(x, kAudio, {f64(kSamplingFrequency, 44100), uinteger(kChannels, 1)})})});
  const Bytes tags = In(x, kTags, {In(x, kTag, {In(x, kSimpleTag, {str(kTagName, "TITLE"),
                                                                   str(kTagString, "crafted")})})});
  const Bytes cluster1 = In(x, kCluster, {uinteger(kTimecode, s.cluster_time[0]),
                                          simple_block(1, 0, kKeyFrame, {filler(100, 1)}),
                                          In(x, kBlockGroup, {block(1, 20, 0, {filler(101, 2)})})});
  const Bytes cluster2 = In(x, kCluster, {uinteger(kTimecode, s.cluster_time[1]),
                                          simple_block(1, 0, kKeyFrame, {filler(102, 3)})});
  const Bytes cues = In(x, kCues, {In(x, kCuePoint, {uinteger(kCueTime, 0), In(x, kCueTrackPositions, {
      uinteger(kCueTrack, 1), uinteger(kCueClusterPosition, 0)})})});
  return cat({header, In(x, kSegment, {info, tracks, tags, cluster1, cluster2, cues})});
}

// The undamaged file's three frames, by size.
const std::vector<uint32_t> kAllFrames = {100, 101, 102};

// ---- Damage that a row names.

// The undamaged file and a third Cluster of these children; an 8-byte size field claims `claimed` when given.
Bytes ThirdCluster(const Bytes& children, uint64_t claimed = 0) {
  const Bytes payload = cat({uinteger(kTimecode, 200), children});
  return cat({File({}), id_bytes(kCluster), size_bytes(claimed ? claimed : payload.size(), claimed ? 8 : 0), payload});
}

// A SimpleBlock that claims `size` bytes and carries 50.
Bytes BlockClaiming(uint64_t size) {
  return ThirdCluster(
      cat({id_bytes(kSimpleBlock), size_bytes(size, 8), Bytes{0x81, 0x00, 0x00, kKeyFrame}, filler(50, 5)}));
}

// A crafted laced block, then a good block of 60 bytes.
Bytes LacedCluster(const Bytes& laced) {
  return ThirdCluster(cat({laced, simple_block(1, 10, kKeyFrame, {filler(60, 6)})}));
}

// `depth` masters of `id` inside each other around one TagName, inside a Tag
// that sits before the Clusters.
Bytes Nested(uint32_t outer, uint32_t id, int depth) {
  Bytes inside = str(kTagName, "deep");
  for (int i = 0; i < depth; ++i) inside = element(id, inside);
  return File({.insert = {outer, inside}});
}

// ---- The table.

// kSome: frames of the undamaged file, in its order, none invented (damage may cost any of them).
enum class Delivered { kExactly, kSome };

struct Case {
  std::string name;
  Bytes file;
  std::vector<uint32_t> sizes = kAllFrames;  // the frames delivered, or those that may be
  int parse = kParseSucceeded;               // parse_mkvfile's answer
  int rating = 80;
  Delivered frames = Delivered::kExactly;
  bool pinned = true;  // the parse answer, the rating and the frames are the row's; else only declared ones
};

void PrintTo(const Case& c, std::ostream* out) { *out << c.name; }

std::vector<Case> NamedCases() {
  const std::vector<uint32_t> kPlus90 = {100, 101, 102, 90};
  return {
      {"Undamaged", File({})},
      // Sizes at the 32-bit edge.
      {"ClusterSizeFFFFFFFF", ThirdCluster(simple_block(1, 0, kKeyFrame, {filler(90, 4)}), 0xFFFFFFFF), kPlus90},
      {"ClusterSize2To32Plus1", ThirdCluster(simple_block(1, 0, kKeyFrame, {filler(90, 4)}), k2To32 + 1), kPlus90},
      // A block that claims more than the file holds is never complete: its frame is not delivered.
      {"SimpleBlockSizeFFFFFFFF", BlockClaiming(0xFFFFFFFF)},
      {"SimpleBlockSize2To32Plus1", BlockClaiming(k2To32 + 1)},
      // Lace sizes are taken by their low 32 bits as signed, sums wrap in 32 bits, and a
      // frame below 1 byte is passed over. 0xFFFFFFFF is -1: the last frame gets 41 of the
      // block's 40 bytes, the next block is read one byte late, and the channel's error
      // drops the media buffer it was filling, which may hold any of the frames before.
      {"EbmlLaceSizeFFFFFFFF", LacedCluster(LacedBlock(kEbmlLacing, 1, size_bytes(0xFFFFFFFF, 5), 40)),
       {100, 101, 102, 41}, kParseSucceeded, 80, Delivered::kSome},
      // 2^32 + 1 is a 1-byte frame, and the last one gets the other 39.
      {"EbmlLaceSize2To32Plus1", LacedCluster(LacedBlock(kEbmlLacing, 1, size_bytes(k2To32 + 1, 5), 40)),
       {100, 101, 102, 1, 39, 60}},
      // 2^31 and 2^31 + 4 are negative in 32 bits and passed over; their sum wraps to 4,
      // which leaves 36 bytes to the last frame.
      {"EbmlLaceSumAbove2To32",
       LacedCluster(LacedBlock(kEbmlLacing, 2, cat({size_bytes(k2To32 / 2, 5), size_bytes(kBias5 + 4, 5)}), 40)),
       {100, 101, 102, 36, 60}},
      {"XiphLaceLongerThanTheBlock", LacedCluster(LacedBlock(kXiphLacing, 1, Bytes(40, 0xFF), 10))},
      {"FixedLaceOf256FramesInFiveBytes", LacedCluster(LacedBlock(kFixedLacing, 255, {}, 5)), {100, 101, 102, 60}},
      // A binary above the size limit ends the parse as a limit exceeded.
      {"CodecPrivateOf2To32Minus1Declared",
       File({.codec_private = cat({id_bytes(kCodecPrivate), size_bytes(0xFFFFFFFF, 8), Bytes(16, 0x77)})}), {},
       kParseNoMemory, 0},
      // Times and scales near the 64-bit limits.
      {"TimecodeScaleMax", File({.timecode_scale = UINT64_MAX})},
      {"TimecodeScale2To63", File({.timecode_scale = uint64_t{1} << 63})},
      // Times wrap in 64 bits; a block whose time comes out below the start (0) is dropped:
      // ticks of 2^64 - 1 and 2^64 - 2 are -1 and -2 ms, the Block 20 ticks later is at 19 ms.
      {"ClusterTimesMax", File({.cluster_time = {UINT64_MAX, UINT64_MAX - 1}}), {101}},
      // INT64_MAX ms is -1 ms in 64 bits, 2^63 ms is 0.
      {"ClusterTimesAroundInt64Max", File({.cluster_time = {uint64_t{INT64_MAX}, uint64_t{INT64_MAX} + 1}}),
       {101, 102}},
      {"CueTimeAndPositionMax", File({.insert = {kCues, master(kCuePoint, {uinteger(kCueTime, UINT64_MAX),
          master(kCueTrackPositions, {uinteger(kCueTrack, 1), uinteger(kCueClusterPosition, UINT64_MAX)})})}})},
      // Nesting thousands of levels deep.
      {"SimpleTagsNested5000Deep", Nested(kTag, kSimpleTag, 5000)},
      {"ClustersNested3000Deep", Nested(kSegment, kCluster, 3000)},
      {"BlockGroupsNested3000Deep", Nested(kCluster, kBlockGroup, 3000)},
      {"UnknownMastersNested3000Deep", Nested(kSegment, kSomeUnknownId, 3000)},
  };
}

// Zero-size and unknown-size elements as the first child at every level:
// each master of the file, and each kind of child it may hold.
std::vector<Case> EveryLevelCases() {
  const std::vector<std::pair<uint32_t, std::vector<uint32_t>>> levels = {
      {kEbmlHeader, {kDocType, kEbmlVersion}},
      {kSegment, {kInfo, kTracks, kCluster, kCues, kTags, kSeekHead, kVoid, kSomeUnknownId}},
      {kInfo, {kTimecodeScale, kDuration, kTitle}},
      {kTracks, {kTrackEntry}},
      {kTrackEntry, {kTrackNumber, kCodecId, kCodecPrivate, kAudio, kVideo, kContentEncodings}},
      {kAudio, {kSamplingFrequency, kChannels}},
      {kCluster, {kTimecode, kSimpleBlock, kBlockGroup, kSomeUnknownId}},
      {kBlockGroup, {kBlock, kBlockDuration, kReferenceBlock}},
      {kCues, {kCuePoint}}, {kCuePoint, {kCueTime, kCueTrackPositions}},
      {kCueTrackPositions, {kCueTrack, kCueClusterPosition}},
      {kTags, {kTag}}, {kTag, {kSimpleTag}}, {kSimpleTag, {kTagName, kTagString}},
  };
  std::vector<Case> cases;
  for (const auto& [into, ids] : levels) {
    for (uint32_t id : ids) {
      for (bool unknown : {false, true}) {
        char name[40];  // as "UnknownSize4282In1A45DFA3": the child's ID, then its master's
        std::snprintf(name, sizeof name, "%sSize%XIn%X", unknown ? "Unknown" : "Zero", id, into);
        const Bytes child = unknown ? unknown_size(id, {}) : element(id, {});
        cases.push_back({name, File({.insert = {into, child}}), kAllFrames, 0, 0, Delivered::kSome, false});
      }
    }
  }
  return cases;
}

// ---- Running a case.

class CraftedFileTest : public testing::TestWithParam<Case> {};

// Header parse and playback.
TEST_P(CraftedFileTest, EndsAsDeclared) {
  const Case& c = GetParam();
  host::SetLogThreshold(0);  // the damaged files' complaints are expected
  const host::Plugin& plugin = plugin_test::HostPlugin();
  const int64_t live = host::LiveBlockCount();
  const int result = testing_support::HeaderParse(c.file).Parse();
  const std::set<int> declared = {kParseSucceeded, kParseMalformed, kParseIncomplete, kParseNoMemory};
  EXPECT_TRUE(c.pinned ? result == c.parse : declared.count(result) == 1) << result;
  const std::string path = testing::TempDir() + "kelvane_crafted_" + std::to_string(getpid()) + "_" + c.name + ".mkv";
  std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(c.file.data()), std::ssize(c.file));
  for (uint32_t buffer_size : {7u, 4096u}) {
    SCOPED_TRACE(testing::Message() << "input buffers of " << buffer_size << " bytes");
    host::RunnerOptions options;
    options.input_buffer_size = buffer_size;
    const host::RunResult run = host::RunGraph(plugin, path, options);
    EXPECT_TRUE(c.pinned ? run.rating == c.rating : run.rating == 0 || run.rating == 80) << run.rating;
    std::vector<uint32_t> sizes;
    for (const host::ChannelRun& channel : run.channels) {
      EXPECT_TRUE(channel.end_result == 2 || channel.end_result == 1) << channel.end_result;
      EXPECT_EQ(channel.foreign_elements, 0u);
      for (const host::RunFrame& frame : channel.frames) sizes.push_back(frame.size);
    }
    size_t matched = 0;  // of the frames delivered, those that are in order the row's (all: a subsequence)
    for (size_t i = 0; i < c.sizes.size() && matched < sizes.size(); ++i) matched += c.sizes[i] == sizes[matched];
    EXPECT_TRUE(matched == sizes.size() && (c.frames == Delivered::kSome || sizes.size() == c.sizes.size()))
        << testing::PrintToString(sizes);
  }
  std::remove(path.c_str());
  EXPECT_EQ(host::LiveBlockCount(), live);
}

std::string NameOf(const testing::TestParamInfo<Case>& info) { return info.param.name; }
INSTANTIATE_TEST_SUITE_P(Named, CraftedFileTest, testing::ValuesIn(NamedCases()), NameOf);
INSTANTIATE_TEST_SUITE_P(ZeroAndUnknownSize, CraftedFileTest, testing::ValuesIn(EveryLevelCases()), NameOf);

}  // namespace
