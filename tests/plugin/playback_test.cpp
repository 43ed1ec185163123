// Output assembly through a real graph (streamer → kelvane → one sink per
// acquired channel) on crafted input: what lies between Clusters, laces with
// empty frames or bytes after their last frame, more input properties than an
// output buffer has room for, a decoder configuration too large, the timestamp
// type of each track type. (Every fixture is played in tests/conformance.)

#include <algorithm>
#include <fstream>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "host/memory_pools.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/block_builder.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;

// Info and Tracks of a file with one MP3 track (of another type if asked).
Bytes AudioHeader(uint64_t track_type = 2) {
  Bytes tracks = master(kTracks, {master(kTrackEntry, {uinteger(kTrackNumber, 1), uinteger(kTrackUid, 1),
      uinteger(kTrackType, track_type), str(kCodecId, "A_MPEG/L3"),
      master(kAudio, {f64(kSamplingFrequency, 44100), uinteger(kChannels, 1)})})});
  return cat({master(kInfo, {uinteger(kTimecodeScale, 1000000)}), tracks});
}

Bytes MatroskaFile(const Bytes& segment) { return cat({ebml_header(), element(kSegment, segment)}); }

// Clusters 100 ms apart with one one-frame block each; `between[i]` follows Cluster i.
Bytes AudioFile(const std::vector<Bytes>& between) {
  Bytes segment = AudioHeader();
  for (size_t i = 0; i <= between.size(); ++i) {
    Bytes frame(100 + i, static_cast<uint8_t>(i + 1));
    segment = cat({segment, master(kCluster, {uinteger(kTimecode, 100 * i), simple_block(1, 0, kKeyFrame, {frame})})});
    if (i < between.size()) segment = cat({segment, between[i]});
  }
  return MatroskaFile(segment);
}

// One Cluster that holds `blocks`.
Bytes OneCluster(std::initializer_list<Bytes> blocks, uint64_t track_type = 2) {
  Bytes cluster = uinteger(kTimecode, 0);
  for (const Bytes& block : blocks) cluster = cat({cluster, block});
  return MatroskaFile(cat({AudioHeader(track_type), element(kCluster, cluster)}));
}

// Each element's property type (0 for a buffer element), as the sinks consumed them.
void Record(void* user, int32_t, MmfMra* mra) {
  for (const host::MraElement& e : std::span(host::MraElements(mra), mra->ElementCount)) {
    static_cast<std::vector<uint32_t>*>(user)->push_back(e.kind == kMmfElementProperty ? e.type : 0);
  }
}

host::RunResult Play(const std::string& path, std::vector<uint32_t>* trace, uint32_t buffer_size = 65536,
                     host::RunnerOptions options = {}) {
  options.input_buffer_size = buffer_size;
  options.on_buffer = Record;
  options.user = trace;
  return host::RunGraph(plugin_test::HostPlugin(), path, options);
}

// Skip marks (37) and runs of buffer elements (0), in order.
std::vector<uint32_t> SkipMarksAndFrames(const std::vector<uint32_t>& trace) {
  std::vector<uint32_t> seen;
  for (uint32_t type : trace) {
    if ((type == kMmfPropSkipMark || type == 0) && (seen.empty() || seen.back() != type || type != 0)) {
      seen.push_back(type);
    }
  }
  return seen;
}

struct LaceCase {
  const char* name;
  Bytes file;
  std::vector<Bytes> frames;  // what the track must deliver, in order
  uint32_t time_type = kMmfPropAudioTime;  // the only timestamp property delivered
  bool unsupported = false;                // the track type is not one of audio, video and subtitle
  std::vector<uint32_t> marks = {0};       // skip marks and runs of frames (SkipMarksAndFrames)
};

class PlaybackLaceTest : public testing::TestWithParam<LaceCase> {};

TEST_P(PlaybackLaceTest, DeliversEveryFrameOnceAndPassesOverTheRest) {
  const LaceCase& c = GetParam();
  const std::string path = testing::TempDir() + c.name + ".mkv";
  std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(c.file.data()), c.file.size());
  std::vector<std::pair<uint32_t, uint32_t>> want;
  for (const Bytes& f : c.frames) want.emplace_back(f.size(), testing_support::Adler32(f.data(), f.size()));
  for (uint32_t size : {7u, 64u, 100u, 1000u, 32768u}) {
    SCOPED_TRACE(size);
    std::vector<uint32_t> trace;
    testing_support::LogRecorder log;
    host::RunResult result = Play(path, &trace, size);
    ASSERT_TRUE(result.ok) << result.error;
    ASSERT_EQ(result.channels.size(), 1u);
    EXPECT_EQ(SkipMarksAndFrames(trace), c.marks) << "each block after a skipped element comes after one skip mark";
    EXPECT_EQ(result.channels[0].skip_marks, uint64_t(std::count(c.marks.begin(), c.marks.end(), kMmfPropSkipMark)));
    std::vector<std::pair<uint32_t, uint32_t>> got;
    for (const host::RunFrame& f : result.channels[0].frames) got.emplace_back(f.size, f.adler32);
    EXPECT_EQ(got, want);
    for (uint32_t type : {kMmfPropVideoTime, kMmfPropAudioTime, kMmfPropSubtitleTime}) {
      EXPECT_EQ(std::count(trace.begin(), trace.end(), type) != 0, type == c.time_type) << type;
    }
    EXPECT_EQ(log.Contains(3, "kelvane:  Unsupported channel type."), c.unsupported);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Laces, PlaybackLaceTest,
    testing::Values(
        // Tags, Cues and a Void between Clusters.
        LaceCase{"ElementsBetweenClusters",
                 AudioFile({master(kTags, {master(kTag, {master(kSimpleTag, {str(kTagName, "TITLE"),
                                                                            str(kTagString, "between")})})}),
                            master(kCues, {master(kCuePoint, {uinteger(kCueTime, 0)})}), element(kVoid, filler(3000))}),
                 {Bytes(100, 1), Bytes(101, 2), Bytes(102, 3), Bytes(103, 4)}, kMmfPropAudioTime, false,
                 {0, kMmfPropSkipMark, 0, kMmfPropSkipMark, 0, kMmfPropSkipMark, 0}},
        // A fixed-size lace of 3 frames over 32 bytes: 10 bytes each, 2 left over.
        LaceCase{"FixedLaceRemainder",
                 OneCluster({simple_block(1, 0, kKeyFrame | kFixedLacing,
                                          {Bytes(10, 0x11), Bytes(10, 0x22), cat({Bytes(10, 0x33), {0xEE, 0xEF}})}),
                             simple_block(1, 10, kKeyFrame, {Bytes(12, 0x55)})}),
                 {Bytes(10, 0x11), Bytes(10, 0x22), Bytes(10, 0x33), Bytes(12, 0x55)}},
        LaceCase{"EmptyFrameInLace",
                 OneCluster({ebml_laced_block(1, 0, kKeyFrame, {Bytes{}, Bytes(9, 0x44), Bytes(5, 0x45)}),
                             simple_block(1, 10, kKeyFrame, {Bytes(12, 0x55)})}),
                 {Bytes(9, 0x44), Bytes(5, 0x45), Bytes(12, 0x55)}},
        LaceCase{"EveryFrameEmpty",
                 OneCluster({xiph_laced_block(1, 0, kKeyFrame, {Bytes{}, Bytes{}, Bytes{}}),
                             simple_block(1, 10, kKeyFrame, {Bytes(12, 0x55)})}),
                 {Bytes(12, 0x55)}},
        LaceCase{"SubtitleTrack", OneCluster({simple_block(1, 0, kKeyFrame, {Bytes(12, 0x55)})}, 17),
                 {Bytes(12, 0x55)}, kMmfPropSubtitleTime},
        LaceCase{"ComplexTrackTimedAsAudio", OneCluster({simple_block(1, 0, kKeyFrame, {Bytes(12, 0x55)})}, 3),
                 {Bytes(12, 0x55)}, kMmfPropAudioTime, true}),
    [](const testing::TestParamInfo<LaceCase>& info) { return info.param.name; });

TEST(PlaybackCasesTest, DecoderConfigurationLargerThanTheOutputBufferEndsTheChannelWithAnError) {
  testing_support::LogRecorder log;
  host::RunnerOptions options;
  options.config_buffer_size = 4096;  // flac's CodecPrivate is 8256 bytes
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile("flac"), options);
  ASSERT_EQ(result.channels.size(), 1u);
  EXPECT_EQ(result.channels[0].end_result, 1);
  EXPECT_EQ(result.channels[0].buffers, 0u);
  EXPECT_TRUE(log.Contains(2, "kelvane:  decoder config of size 8256 too large to fit in IOV."));
}

// An upstream that delivers a whole file, from its first Cluster, in one input
// buffer headed by `properties` file-offset properties.
struct PropertyHeavyUpstream {
  PropertyHeavyUpstream(const std::vector<uint8_t>& file, uint32_t properties)
      : bytes(static_cast<uint32_t>(file.size()), 1), mras(host::MakeMraPool(1, properties + 1)) {
    output.Kind = kMmfChannelKind;
    output.Direction = kMmfDirectionOutput;
    output.State = this;
    const uint64_t start = testing_support::FirstClusterOffset(file.data(), file.size());
    MmfPoolBuffer* buffer = bytes.AcquireWaiting(std::chrono::milliseconds(100));
    std::copy(file.begin() + static_cast<ptrdiff_t>(start), file.end(), buffer->Data);
    EXPECT_EQ(MmfAcquireMra(mras, &mra, 0), 0);
    for (uint32_t i = 0; i < properties; ++i) {
      EXPECT_EQ(MmfSetMraPropertyElement(mra, i, kMmfPropFileOffset, static_cast<uint32_t>(start), 0), 0);
    }
    const auto size = static_cast<uint32_t>(file.size() - start);
    EXPECT_EQ(MmfSetMraBufferElement(mra, properties, buffer, buffer->Data, size), 0);
    host::MemoryPool::Ops()->ReleaseBuffer(buffer);
  }
  ~PropertyHeavyUpstream() {
    if (mra) MmfReleaseMra(mra);
    MmfFreeMraPool(mras);
  }
  static int NextBuffer(MmfChannel* output, MmfMra** buffer) {
    auto* self = static_cast<PropertyHeavyUpstream*>(output->State);
    *buffer = std::exchange(self->mra, nullptr);
    return *buffer ? kMmfBufferDelivered : kMmfEndOfStream;
  }

  host::MemoryPool bytes;
  MmfMraPool* mras;
  MmfMra* mra = nullptr;
  MmfChannel output{};
};

TEST(PlaybackCasesTest, InputWithMorePropertiesThanRoomResumesAtTheSameElement) {
  const std::string name = "tiny_avc";
  PropertyHeavyUpstream upstream(testing_support::ReadFixtureBytes(name), 1500);
  std::vector<uint32_t> trace;
  host::RunnerOptions options;
  MmfMediaOutputOps ops{};
  ops.NextBuffer = PropertyHeavyUpstream::NextBuffer;
  options.upstream = &ops;
  options.upstream_output = &upstream.output;
  host::RunResult result = Play(plugin_test::FixtureFile(name), &trace, 65536, options);
  ASSERT_TRUE(result.ok) << result.error;
  size_t copied = std::count(trace.begin(), trace.end(), kMmfPropFileOffset);
  EXPECT_EQ(copied, 1500u) << "every input property is copied once: none lost, none repeated";
  EXPECT_GE(result.channels[0].buffers, 4u) << "1500 properties need three output buffers besides the configuration";
  const testing_support::FixtureExpectation fixture = testing_support::LoadFixture(name);
  size_t expected_frames = 0;
  for (const auto& block : fixture.blocks) expected_frames += block.frames.size();
  EXPECT_EQ(result.channels[0].frames.size(), expected_frames);
}

}  // namespace
