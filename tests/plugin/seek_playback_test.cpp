// Playback after a flush and a seek: the streamer's time marker sets the start
// time, blocks before it are dropped and the first block delivered after it
// carries the marker.

#include <gtest/gtest.h>

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
  std::vector<uint64_t> markers;  // values of properties 3
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
        if (type == kMmfPropTimeMarker) pulled.markers.push_back(MmfPropertyValue(low, high));
        if (type == kMmfPropVideoTime || type == kMmfPropAudioTime) time = MmfPropertyValue(low, high);
        if (type == kMmfPropConfigCount) i += low;  // the configuration packets are not frames
        if (type == kMmfPropFramePart) in_parts = true;
        if (type == kMmfPropFrameEnd) in_parts = false;
        if (type == kMmfPropTimeMarker && pulled.frames.empty()) pulled.marker_heads_first_frame = true;
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
      frame.clear();
    }
    MmfReleaseMra(mra);
  }
  return pulled;
}

TEST(SeekPlaybackTest, AfterFlushAndSeekEachTrackRestartsAtTheCueTime) {
  const FixtureExpectation fixture = testing_support::LoadFixture("long_cues");
  const std::vector<uint64_t> offered = OfferedTracks(fixture);
  ASSERT_EQ(offered.size(), 2u);
  std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("long_cues");
  const uint64_t first_cluster = testing_support::FirstClusterOffset(bytes.data(), bytes.size());
  const uint64_t segment_data = first_cluster - fixture.cues[0].cluster_position;
  const uint64_t seek_time = fixture.cues[kSeekCue].time_ticks * (fixture.timecode_scale / 1000);
  const uint64_t seek_position = fixture.cues[kSeekCue].cluster_position + segment_data;

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
  const MmfMediaOutputOps* output = plugin_test::HostPlugin().output();
  const auto* flush = plugin_test::HostPlugin().Get<MmfMediaFlushOps>("MediaFlush");
  ASSERT_EQ(plugin_test::HostPlugin().Get<MmfMediaControlOps>("MediaControl")->Start(handle), 0);

  // Play a little from the start, then flush and seek.
  ASSERT_EQ(streamer.Seek(first_cluster, 0), 0);
  for (int k = 0; k < 2; ++k) {
    MmfMra* mra = nullptr;
    ASSERT_EQ(output->NextBuffer(AsFrameworkChannel(&connected.channel(0)), &mra), kMmfBufferDelivered);
    MmfReleaseMra(mra);
  }
  ASSERT_EQ(flush->Flush(handle), 0);
  ASSERT_EQ(streamer.Seek(seek_position, seek_time), 0);

  for (int32_t k = 0; k < 2; ++k) {
    SCOPED_TRACE("channel " + std::to_string(k));
    Pulled pulled = PullAll(output, AsFrameworkChannel(&connected.channel(k)));
    EXPECT_EQ(pulled.end, kMmfEndOfStream);
    std::vector<Frame> expected;
    for (const Frame& f : ExpectedFrames("long_cues", fixture, offered[static_cast<size_t>(k)])) {
      if (f.time_us >= seek_time) expected.push_back(f);
    }
    ASSERT_FALSE(expected.empty());
    EXPECT_EQ(FirstDifference(pulled.frames, expected), "");
    ASSERT_FALSE(pulled.markers.empty());
    EXPECT_TRUE(pulled.marker_heads_first_frame) << "the first block after the seek carries the time marker";
    EXPECT_EQ(pulled.markers.front(), expected.empty() ? 0 : expected.front().time_us);
  }
  flush->Flush(handle);
}

}  // namespace
