// Playback after a seek (the framework's order: ConvertToPosition, Seek,
// Flush, then the streamer's next buffer headed by a time marker). The
// marker sets the start time: without preroll, blocks before it are dropped;
// with preroll, they are delivered, each headed by a marker of its own time.

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "host/file_streamer.h"
#include "host/memory_pools.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"
#include "tests/plugin/playback_expectations.h"
#include "tests/support/cluster_driver.h"

namespace {

using namespace playback_test;

constexpr int kSeekCue = 20;  // long_cues: 10 s

struct Pulled {
  std::vector<Frame> frames;
  std::vector<bool> marked;            // per frame: a marker of its own time came since the last frame
  std::vector<uint64_t> markers;       // values of properties 3
  std::vector<uint64_t> preroll;       // values of properties 125
  bool marker_heads_first_frame = false;
  int end = 0;
};

// Whole frames of one channel (split ones put back together) until NextBuffer
// answers anything but 256.
Pulled PullAll(const MmfMediaOutputOps* output, MmfChannel* channel) {
  Pulled pulled;
  uint64_t time = 0;
  bool in_parts = false;
  std::vector<uint8_t> frame;
  std::vector<uint64_t> since_last;  // markers since the last frame
  for (;;) {
    MmfMra* mra = nullptr;
    pulled.end = output->NextBuffer(channel, &mra);
    if (pulled.end != kMmfBufferDelivered) break;
    uint32_t kind = 0;
    for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
      if (kind == kMmfElementProperty) {
        uint32_t type = 0, low = 0;
        uint16_t high = 0;
        MmfGetMraPropertyElement(mra, i, &type, &low, &high);
        const uint64_t value = MmfPropertyValue(low, high);
        if (type == kMmfPropTimeMarker) {
          pulled.markers.push_back(value);
          since_last.push_back(value);
          if (pulled.frames.empty()) pulled.marker_heads_first_frame = true;
        }
        if (type == kMmfPropPrerollTime) pulled.preroll.push_back(value);
        if (type == kMmfPropVideoTime || type == kMmfPropAudioTime) time = value;
        if (type == kMmfPropConfigCount) i += low;  // the configuration packets are not frames
        if (type == kMmfPropFramePart) in_parts = true;
        if (type == kMmfPropFrameEnd) in_parts = false;
        continue;
      }
      MmfPoolBuffer* handle = nullptr;
      uint8_t* address = nullptr;
      uint32_t size = 0;
      MmfGetMraBufferElement(mra, i, &handle, &address, &size);
      frame.insert(frame.end(), address, address + size);
      if (in_parts) continue;
      pulled.frames.push_back({time, static_cast<uint32_t>(frame.size()),
                               testing_support::Adler32(frame.data(), frame.size())});
      pulled.marked.push_back(std::find(since_last.begin(), since_last.end(), time) != since_last.end());
      since_last.clear();
      frame.clear();
    }
    MmfReleaseMra(mra);
  }
  return pulled;
}

struct SeekCase {
  const char* name;
  int32_t preroll;
  uint64_t past_cue_us;  // the seek time lies this far after the cue point's
};

class SeekPlaybackTest : public testing::TestWithParam<SeekCase> {};

TEST_P(SeekPlaybackTest, EachTrackRestartsAtTheCuePointsCluster) {
  const SeekCase& c = GetParam();
  const FixtureExpectation fixture = testing_support::LoadFixture("long_cues");
  const std::vector<uint64_t> offered = OfferedTracks(fixture);
  ASSERT_EQ(offered.size(), 2u);
  std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("long_cues");
  const uint64_t first_cluster = testing_support::FirstClusterOffset(bytes.data(), bytes.size());
  const uint64_t segment_data = first_cluster - fixture.cues[0].cluster_position;
  const uint64_t cue_time = fixture.cues[kSeekCue].time_ticks * (fixture.timecode_scale / 1000);
  const uint64_t cue_position = fixture.cues[kSeekCue].cluster_position + segment_data;
  const uint64_t seek_time = cue_time + c.past_cue_us;
  const uint64_t start_time = c.preroll ? seek_time : cue_time;

  host::MemoryPool pool(65536, 8);
  auto source = host::OpenFileStream(plugin_test::FixtureFile("long_cues"), true);
  host::FileStreamer streamer(source.get(), host::StreamerConfig{4096, 128});
  host::SetupOptions options;
  options.upstream = host::FileStreamer::Ops();
  options.input_pool = host::MemoryPool::Ops();
  options.input_pool_param = pool.handle();
  options.output_pool = host::MemoryPool::Ops();
  options.output_pool_param = pool.handle();
  plugin_test::Connected connected = plugin_test::ConnectFile("long_cues", true, options);
  ASSERT_TRUE(connected.graph->rated());
  MmfFilterHandle* handle = connected.graph->handle();
  handle->InputChannel->Peer = streamer.output();
  const host::Plugin& plugin = plugin_test::HostPlugin();
  const MmfMediaOutputOps* output = plugin.output();
  const auto* flush = plugin.Get<MmfMediaFlushOps>("MediaFlush");
  ASSERT_EQ(plugin.resources()->SetResource(handle, "EnablePreroll", &c.preroll), 0);
  ASSERT_EQ(plugin.Get<MmfMediaControlOps>("MediaControl")->Start(handle), 0);

  // Play a little from the start, then seek as the framework does.
  ASSERT_EQ(streamer.Seek(first_cluster, 0), 0);
  for (int k = 0; k < 2; ++k) {
    MmfMra* mra = nullptr;
    ASSERT_EQ(output->NextBuffer(AsFrameworkChannel(&connected.channel(0)), &mra), kMmfBufferDelivered);
    MmfReleaseMra(mra);
  }
  uint64_t position = 0;
  ASSERT_EQ(plugin.converter()->ConvertToPosition(handle, 0, seek_time, &position), 0);
  ASSERT_EQ(position, cue_position);
  ASSERT_EQ(plugin.seeker()->Seek(handle, 0, seek_time, position), 0);
  ASSERT_EQ(flush->Flush(handle), 0);
  ASSERT_EQ(streamer.Seek(position, seek_time), 0);

  for (int32_t k = 0; k < 2; ++k) {
    SCOPED_TRACE("channel " + std::to_string(k));
    Pulled pulled = PullAll(output, AsFrameworkChannel(&connected.channel(k)));
    EXPECT_EQ(pulled.end, kMmfEndOfStream);
    std::vector<Frame> expected;
    for (const Frame& f : ExpectedFrames("long_cues", fixture, offered[static_cast<size_t>(k)])) {
      if (f.time_us >= cue_time) expected.push_back(f);
    }
    ASSERT_FALSE(expected.empty());
    EXPECT_EQ(FirstDifference(pulled.frames, expected), "") << "every frame from the cue point's cluster on";
    EXPECT_TRUE(pulled.marker_heads_first_frame) << "the first block after the seek carries the time marker";
    for (size_t i = 0; i < pulled.frames.size(); ++i) {
      const bool before_start = pulled.frames[i].time_us < start_time;
      if (i > 0 && pulled.frames[i].time_us != pulled.frames[i - 1].time_us) {
        EXPECT_EQ(pulled.marked[i], before_start) << "frame " << i << " at " << pulled.frames[i].time_us << " us";
      }
    }
    EXPECT_EQ(pulled.preroll, c.preroll ? std::vector<uint64_t>{seek_time} : std::vector<uint64_t>{});
  }
  flush->Flush(handle);
}

INSTANTIATE_TEST_SUITE_P(Seeks, SeekPlaybackTest,
                         testing::Values(SeekCase{"OnACuePoint", 0, 0}, SeekCase{"PastACuePoint", 0, 300000},
                                         SeekCase{"PastACuePointWithPreroll", 1, 300000}),
                         [](const testing::TestParamInfo<SeekCase>& info) { return info.param.name; });

}  // namespace
