// Crafted files for the faults that recur in Matroska parsers: element and
// lace sizes at the 32-bit edge, lace sums past 2^32, a CodecPrivate of
// 2^32 - 1 bytes declared, times and scales near the 64-bit limits, nesting
// thousands of levels deep, and zero-size and unknown-size elements at every
// level. Each file goes through the header parse and through a real graph
// (streamer, kelvane, sinks) and must end with a declared answer and deliver
// the frames its row names (or, for damage whose effect spreads, frames of the
// undamaged file in their order), leaving no block behind.

#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <fstream>
#include <limits>
#include <memory>
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

using ebml::Bytes;

constexpr uint64_t k2To32 = uint64_t{1} << 32;
constexpr uint32_t kSomeUnknownId = 0x4FAB;  // a two-byte ID Matroska does not define

const host::Plugin& HostPlugin() {
  host::SetLogThreshold(0);  // the damaged files' complaints are expected
  return plugin_test::HostPlugin();
}

// ---- The undamaged file: one MP3 track, two Clusters, three frames, Cues, Tags.

Bytes Frame(size_t size, uint8_t fill) { return Bytes(size, fill); }

// A SimpleBlock of track 1 with a lace header written out: `sizes` are the
// lace bytes after the frame-count byte, then `data` bytes of frame data.
Bytes LacedBlock(uint8_t lacing, uint8_t frame_count_minus_1, const Bytes& sizes, size_t data) {
  Bytes body = {0x81, 0x00, 0x00, static_cast<uint8_t>(ebml::kKeyFrame | lacing), frame_count_minus_1};
  body = ebml::cat({body, sizes, Bytes(data, 0x33)});
  return ebml::element(ebml::kSimpleBlock, body);
}

// An EBML-lace size difference: the signed value biased as a `width`-byte variable-size integer.
Bytes LaceDelta(int64_t delta, int width) {
  const int64_t bias = (int64_t{1} << (7 * width - 1)) - 1;
  return ebml::size_bytes(static_cast<uint64_t>(delta + bias), width);
}

// Where a crafted child goes: first child of the master with this ID (0: none).
struct Insert {
  uint32_t into = 0;
  Bytes child;
};

// A master that takes the insert as its first child when it is the target.
Bytes In(const Insert& insert, uint32_t id, std::initializer_list<Bytes> children) {
  Bytes payload = insert.into == id ? insert.child : Bytes{};
  return ebml::element(id, ebml::cat({payload, ebml::cat(children)}));
}

struct Shape {
  uint64_t timecode_scale = 1000000;
  uint64_t cluster_time[2] = {0, 100};
  Bytes codec_private;
  Insert insert;
};

Bytes File(const Shape& s) {
  const Insert& x = s.insert;
  const Bytes header = In(x, ebml::kEbmlHeader, {ebml::uinteger(ebml::kEbmlVersion, 1),
                                                 ebml::str(ebml::kDocType, "matroska")});
  const Bytes info = In(x, ebml::kInfo, {ebml::uinteger(ebml::kTimecodeScale, s.timecode_scale),
                                         ebml::str(ebml::kTitle, "crafted")});
  const Bytes tracks = In(x, ebml::kTracks, {In(x, ebml::kTrackEntry, {
      ebml::uinteger(ebml::kTrackNumber, 1), ebml::uinteger(ebml::kTrackUid, 1), ebml::uinteger(ebml::kTrackType, 2),
      ebml::str(ebml::kCodecId, "A_MPEG/L3"), s.codec_private,
      In(x, ebml::kAudio, {ebml::f64(ebml::kSamplingFrequency, 44100), ebml::uinteger(ebml::kChannels, 1)})})});
  const Bytes tags = In(x, ebml::kTags, {In(x, ebml::kTag, {In(x, ebml::kSimpleTag, {
      ebml::str(ebml::kTagName, "TITLE"), ebml::str(ebml::kTagString, "crafted")})})});
  const Bytes cluster1 = In(x, ebml::kCluster, {ebml::uinteger(ebml::kTimecode, s.cluster_time[0]),
                                                ebml::simple_block(1, 0, ebml::kKeyFrame, {Frame(100, 1)}),
                                                In(x, ebml::kBlockGroup, {ebml::block(1, 20, 0, {Frame(101, 2)})})});
  const Bytes cluster2 = In(x, ebml::kCluster, {ebml::uinteger(ebml::kTimecode, s.cluster_time[1]),
                                                ebml::simple_block(1, 0, ebml::kKeyFrame, {Frame(102, 3)})});
  const Bytes cues = In(x, ebml::kCues, {In(x, ebml::kCuePoint, {ebml::uinteger(ebml::kCueTime, 0),
      In(x, ebml::kCueTrackPositions, {ebml::uinteger(ebml::kCueTrack, 1),
                                       ebml::uinteger(ebml::kCueClusterPosition, 0)})})});
  Bytes segment = In(x, ebml::kSegment, {info, tracks, tags, cluster1, cluster2, cues});
  return ebml::cat({header, segment});
}

// The undamaged file's three frames, by size.
const std::vector<uint32_t> kAllFrames = {100, 101, 102};

// ---- Damage that a row names.

// One Cluster whose size field claims `size`, holding the first frame, at the end of the file.
Bytes ClusterClaiming(uint64_t size) {
  return ebml::cat({File(Shape{}), ebml::master_sized(ebml::kCluster, size, {
      ebml::uinteger(ebml::kTimecode, 200), ebml::simple_block(1, 0, ebml::kKeyFrame, {Frame(90, 4)})}, 8)});
}

// A third Cluster whose SimpleBlock claims `size` bytes and carries 50.
Bytes BlockClaiming(uint64_t size) {
  Bytes body = {0x81, 0x00, 0x00, ebml::kKeyFrame};
  body = ebml::cat({body, Frame(50, 5)});
  const Bytes block = ebml::cat({ebml::id_bytes(ebml::kSimpleBlock), ebml::size_bytes(size, 8), body});
  return ebml::cat({File(Shape{}), ebml::element(ebml::kCluster, ebml::cat({ebml::uinteger(ebml::kTimecode, 200),
                                                                             block}))});
}

// A third Cluster with a crafted laced block, then a good block of 60 bytes.
Bytes LacedCluster(const Bytes& laced) {
  return ebml::cat({File(Shape{}), ebml::master(ebml::kCluster, {
      ebml::uinteger(ebml::kTimecode, 200), laced, ebml::simple_block(1, 10, ebml::kKeyFrame, {Frame(60, 6)})})});
}

// `depth` masters of `id` inside each other around one TagName, inside a Tag
// that sits before the Clusters.
Bytes Nested(uint32_t outer, uint32_t id, int depth) {
  Bytes inside = ebml::str(ebml::kTagName, "deep");
  for (int i = 0; i < depth; ++i) inside = ebml::element(id, inside);
  Shape s;
  s.insert = {outer, inside};
  return File(s);
}

Bytes WithScale(uint64_t scale) {
  Shape s;
  s.timecode_scale = scale;
  return File(s);
}

Bytes WithClusterTimes(uint64_t first, uint64_t second) {
  Shape s;
  s.cluster_time[0] = first;
  s.cluster_time[1] = second;
  return File(s);
}

Bytes WithCodecPrivateClaiming(uint64_t size) {
  Shape s;
  s.codec_private = ebml::cat({ebml::id_bytes(ebml::kCodecPrivate), ebml::size_bytes(size, 8), Bytes(16, 0x77)});
  return File(s);
}

Bytes WithInfoChild(const Bytes& child) {
  Shape s;
  s.insert = {ebml::kInfo, child};
  return File(s);
}

Bytes WithCue(uint64_t time, uint64_t position) {
  Shape s;
  s.insert = {ebml::kCues, ebml::master(ebml::kCuePoint, {ebml::uinteger(ebml::kCueTime, time),
      ebml::master(ebml::kCueTrackPositions, {ebml::uinteger(ebml::kCueTrack, 1),
                                              ebml::uinteger(ebml::kCueClusterPosition, position)})})};
  return File(s);
}

// ---- The table.

// kSome: frames of the undamaged file, in its order, none invented (damage may cost any of them).
enum class Frames { kExactly, kSome };

struct Case {
  const char* name;
  Bytes file;
  int parse;  // parse_mkvfile's answer
  int rating;
  Frames frames;
  std::vector<uint32_t> sizes;  // the frames delivered, or those that may be
};

void PrintTo(const Case& c, std::ostream* out) { *out << c.name; }

std::vector<Case> NamedCases() {
  const double kHuge = std::numeric_limits<double>::max();
  return {
      {"Undamaged", File(Shape{}), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      // Sizes at the 32-bit edge.
      {"ClusterSizeFFFFFFFF", ClusterClaiming(0xFFFFFFFF), kParseSucceeded, 80, Frames::kExactly, {100, 101, 102, 90}},
      {"ClusterSize2To32Plus1", ClusterClaiming(k2To32 + 1), kParseSucceeded, 80, Frames::kExactly,
       {100, 101, 102, 90}},
      // A block that claims more than the file holds is never complete: its frame is not delivered.
      {"SimpleBlockSizeFFFFFFFF", BlockClaiming(0xFFFFFFFF), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      {"SimpleBlockSize2To32Plus1", BlockClaiming(k2To32 + 1), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      // Lace sizes are taken by their low 32 bits as signed, sums wrap in 32 bits, and a
      // frame below 1 byte is passed over. 0xFFFFFFFF is -1: the last frame gets 41 of the
      // block's 40 bytes, the next block is read one byte late, and the channel's error
      // drops the media buffer it was filling, which may hold any of the frames before.
      {"EbmlLaceSizeFFFFFFFF",
       LacedCluster(LacedBlock(ebml::kEbmlLacing, 1, ebml::size_bytes(0xFFFFFFFF, 5), 40)), kParseSucceeded, 80,
       Frames::kSome, {100, 101, 102, 41}},
      // 2^32 + 1 is a 1-byte frame, and the last one gets the other 39.
      {"EbmlLaceSize2To32Plus1",
       LacedCluster(LacedBlock(ebml::kEbmlLacing, 1, ebml::size_bytes(k2To32 + 1, 5), 40)), kParseSucceeded, 80,
       Frames::kExactly, {100, 101, 102, 1, 39, 60}},
      // 2^31 and 2^31 + 4 are negative in 32 bits and passed over; their sum wraps to 4,
      // which leaves 36 bytes to the last frame.
      {"EbmlLaceSumAbove2To32",
       LacedCluster(LacedBlock(ebml::kEbmlLacing, 2, ebml::cat({ebml::size_bytes(k2To32 / 2, 5), LaceDelta(4, 5)}),
                               40)),
       kParseSucceeded, 80, Frames::kExactly, {100, 101, 102, 36, 60}},
      {"XiphLaceLongerThanTheBlock",
       LacedCluster(LacedBlock(ebml::kXiphLacing, 1, Bytes(40, 0xFF), 10)), kParseSucceeded, 80, Frames::kExactly,
       {100, 101, 102}},
      {"FixedLaceOf256FramesInFiveBytes", LacedCluster(LacedBlock(ebml::kFixedLacing, 255, {}, 5)), kParseSucceeded,
       80, Frames::kExactly, {100, 101, 102, 60}},
      // A binary above the size limit ends the parse as a limit exceeded.
      {"CodecPrivateOf2To32Minus1Declared", WithCodecPrivateClaiming(0xFFFFFFFF), kParseNoMemory, 0,
       Frames::kExactly, {}},
      // Times and scales near the 64-bit limits.
      {"TimecodeScaleMax", WithScale(UINT64_MAX), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      {"TimecodeScale2To63", WithScale(uint64_t{1} << 63), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      // Times wrap in 64 bits; a block whose time comes out below the start (0) is dropped:
      // ticks of 2^64 - 1 and 2^64 - 2 are -1 and -2 ms, the Block 20 ticks later is at 19 ms.
      {"ClusterTimesMax", WithClusterTimes(UINT64_MAX, UINT64_MAX - 1), kParseSucceeded, 80, Frames::kExactly, {101}},
      // INT64_MAX ms is -1 ms in 64 bits, 2^63 ms is 0.
      {"ClusterTimesAroundInt64Max", WithClusterTimes(uint64_t{INT64_MAX}, uint64_t{INT64_MAX} + 1), kParseSucceeded,
       80, Frames::kExactly, {101, 102}},
      {"DurationLargestDouble", WithInfoChild(ebml::f64(ebml::kDuration, kHuge)), kParseSucceeded, 80,
       Frames::kExactly, kAllFrames},
      {"DurationInfinite", WithInfoChild(ebml::f64(ebml::kDuration, INFINITY)), kParseSucceeded, 80, Frames::kExactly,
       kAllFrames},
      {"DurationNotANumber", WithInfoChild(ebml::f64(ebml::kDuration, NAN)), kParseSucceeded, 80, Frames::kExactly,
       kAllFrames},
      {"DurationNegative", WithInfoChild(ebml::f64(ebml::kDuration, -1e30)), kParseSucceeded, 80, Frames::kExactly,
       kAllFrames},
      {"CueTimeAndPositionMax", WithCue(UINT64_MAX, UINT64_MAX), kParseSucceeded, 80, Frames::kExactly, kAllFrames},
      // Nesting thousands of levels deep.
      {"SimpleTagsNested5000Deep", Nested(ebml::kTag, ebml::kSimpleTag, 5000), kParseSucceeded, 80, Frames::kExactly,
       kAllFrames},
      {"ClustersNested3000Deep", Nested(ebml::kSegment, ebml::kCluster, 3000), kParseSucceeded, 80, Frames::kExactly,
       kAllFrames},
      {"BlockGroupsNested3000Deep", Nested(ebml::kCluster, ebml::kBlockGroup, 3000), kParseSucceeded, 80,
       Frames::kExactly, kAllFrames},
      {"UnknownMastersNested3000Deep", Nested(ebml::kSegment, kSomeUnknownId, 3000), kParseSucceeded, 80,
       Frames::kExactly, kAllFrames},
  };
}

// Zero-size and unknown-size elements as the first child at every level:
// each master of the file, and each kind of child it may hold.
std::vector<Case> EveryLevelCases() {
  struct Level {
    const char* name;
    uint32_t into;
    std::vector<std::pair<const char*, uint32_t>> children;
  };
  const std::vector<Level> levels = {
      {"EbmlHeader", ebml::kEbmlHeader, {{"DocType", ebml::kDocType}, {"EbmlVersion", ebml::kEbmlVersion}}},
      {"Segment", ebml::kSegment, {{"Info", ebml::kInfo}, {"Tracks", ebml::kTracks}, {"Cluster", ebml::kCluster},
                                   {"Cues", ebml::kCues}, {"Tags", ebml::kTags}, {"SeekHead", ebml::kSeekHead},
                                   {"Void", ebml::kVoid}, {"Unknown", kSomeUnknownId}}},
      {"Info", ebml::kInfo, {{"TimecodeScale", ebml::kTimecodeScale}, {"Duration", ebml::kDuration},
                             {"Title", ebml::kTitle}}},
      {"Tracks", ebml::kTracks, {{"TrackEntry", ebml::kTrackEntry}}},
      {"TrackEntry", ebml::kTrackEntry, {{"TrackNumber", ebml::kTrackNumber}, {"CodecId", ebml::kCodecId},
                                         {"CodecPrivate", ebml::kCodecPrivate}, {"Audio", ebml::kAudio},
                                         {"Video", ebml::kVideo}, {"ContentEncodings", ebml::kContentEncodings}}},
      {"Audio", ebml::kAudio, {{"SamplingFrequency", ebml::kSamplingFrequency}, {"Channels", ebml::kChannels}}},
      {"Cluster", ebml::kCluster, {{"Timecode", ebml::kTimecode}, {"SimpleBlock", ebml::kSimpleBlock},
                                   {"BlockGroup", ebml::kBlockGroup}, {"Unknown", kSomeUnknownId}}},
      {"BlockGroup", ebml::kBlockGroup, {{"Block", ebml::kBlock}, {"BlockDuration", ebml::kBlockDuration},
                                         {"ReferenceBlock", ebml::kReferenceBlock}}},
      {"Cues", ebml::kCues, {{"CuePoint", ebml::kCuePoint}}},
      {"CuePoint", ebml::kCuePoint, {{"CueTime", ebml::kCueTime}, {"CueTrackPositions", ebml::kCueTrackPositions}}},
      {"CueTrackPositions", ebml::kCueTrackPositions, {{"CueTrack", ebml::kCueTrack},
                                                       {"CueClusterPosition", ebml::kCueClusterPosition}}},
      {"Tags", ebml::kTags, {{"Tag", ebml::kTag}}},
      {"Tag", ebml::kTag, {{"SimpleTag", ebml::kSimpleTag}}},
      {"SimpleTag", ebml::kSimpleTag, {{"TagName", ebml::kTagName}, {"TagString", ebml::kTagString}}},
  };
  std::vector<Case> cases;
  for (const Level& level : levels) {
    for (const auto& [child_name, id] : level.children) {
      for (bool unknown : {false, true}) {
        Shape s;
        s.insert = {level.into, unknown ? ebml::unknown_size(id, {}) : ebml::element(id, {})};
        static std::vector<std::string> names;  // the cases keep pointers to their names
        names.push_back(std::string(unknown ? "UnknownSize" : "ZeroSize") + child_name + "In" + level.name);
        cases.push_back({names.back().c_str(), File(s), 0, 0, Frames::kSome, kAllFrames});
      }
    }
  }
  return cases;
}

// ---- Running a case.

std::string WriteTemp(const Bytes& bytes, const std::string& name) {
  const std::string path = testing::TempDir() + "kelvane_crafted_" + std::to_string(getpid()) + "_" + name + ".mkv";
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
  return path;
}

bool DeclaredParse(int result) {
  return result == kParseSucceeded || result == kParseMalformed || result == kParseIncomplete ||
         result == kParseNoMemory;
}

// Header parse and playback; `named` rows also pin the parse answer, the rating and the frames.
void RunCase(const Case& c, bool named) {
  HostPlugin();
  const int64_t live = host::LiveBlockCount();
  {
    testing_support::HeaderParse parse(c.file);
    const int result = parse.Parse();
    EXPECT_TRUE(DeclaredParse(result)) << result;
    if (named) {
      EXPECT_EQ(result, c.parse);
    }
  }
  const std::string path = WriteTemp(c.file, c.name);
  for (uint32_t buffer_size : {7u, 4096u}) {
    SCOPED_TRACE(testing::Message() << "input buffers of " << buffer_size << " bytes");
    host::RunnerOptions options;
    options.input_buffer_size = buffer_size;
    const host::RunResult run = host::RunGraph(HostPlugin(), path, options);
    EXPECT_TRUE(run.rating == 0 || run.rating == 80) << run.rating;
    if (named) {
      EXPECT_EQ(run.rating, c.rating);
    }
    std::vector<uint32_t> sizes;
    for (const host::ChannelRun& channel : run.channels) {
      EXPECT_TRUE(channel.end_result == 2 || channel.end_result == 1) << channel.end_result;
      EXPECT_EQ(channel.foreign_elements, 0u);
      for (const host::RunFrame& frame : channel.frames) sizes.push_back(frame.size);
    }
    if (c.frames == Frames::kExactly) {
      EXPECT_EQ(sizes, c.sizes);
    } else {
      size_t matched = 0;
      for (size_t i = 0; i < c.sizes.size() && matched < sizes.size(); ++i) matched += c.sizes[i] == sizes[matched];
      EXPECT_EQ(matched, sizes.size()) << testing::PrintToString(sizes);
    }
  }
  std::remove(path.c_str());
  EXPECT_EQ(host::LiveBlockCount(), live);
}

class CraftedFileTest : public testing::TestWithParam<Case> {};
TEST_P(CraftedFileTest, EndsAsDeclared) { RunCase(GetParam(), true); }
INSTANTIATE_TEST_SUITE_P(Named, CraftedFileTest, testing::ValuesIn(NamedCases()),
                         [](const testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

class EveryLevelTest : public testing::TestWithParam<Case> {};
TEST_P(EveryLevelTest, EndsWithADeclaredAnswerAndFramesOfTheUndamagedFile) { RunCase(GetParam(), false); }
INSTANTIATE_TEST_SUITE_P(ZeroAndUnknownSize, EveryLevelTest, testing::ValuesIn(EveryLevelCases()),
                         [](const testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

}  // namespace
