// Trick play through the streamer's list mode with requests longer than
// TrickTime's bytes (several Clusters each): the channel still delivers only
// the first TrickTime of media after each jump, and drops the rest it reads.

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

constexpr uint32_t kForward = 512;
constexpr uint32_t kSpeed = 100;         // with TrickTime 500 ms: a step of 1 s
constexpr int32_t kRequestBytes = 16384;  // several Clusters; a read past the end of the file ends the stream
constexpr int kFirstCue = 4;

TEST(TrickPlaybackTest, ScanForwardDeliversTheFirstTrickTimeAfterEachJump) {
  const CueModel cues("long_cues");
  const uint64_t file_size = testing_support::ReadFixtureBytes("long_cues").size();
  host::MemoryPool pool(65536, 8);
  auto source = host::OpenFileStream(plugin_test::FixtureFile("long_cues"), true);
  host::FileStreamer streamer(source.get(), host::StreamerConfig{4096, 128});
  host::SetupOptions options;
  options.configure_outputs = false;
  options.upstream = host::FileStreamer::Ops();
  options.input_pool = host::MemoryPool::Ops();
  options.input_pool_param = pool.handle();
  plugin_test::Connected connected = plugin_test::ConnectFile("long_cues", true, options);
  ASSERT_TRUE(connected.graph->rated());
  const host::Plugin& plugin = plugin_test::HostPlugin();
  MmfFilterHandle* handle = connected.graph->handle();
  MmfChannel* video = AsFrameworkChannel(&connected.channel(0));
  const host::OutputChannelSetup& setup = connected.graph->outputs()[0];
  ASSERT_EQ(plugin.output()->AcquireOutputChannel(video), 0);
  ASSERT_EQ(plugin.output()->SetOutputFormat(video, &setup.offered), 0);
  ASSERT_EQ(plugin.output()->SetOutputChannelMemoryPool(video, host::MemoryPool::Ops(), pool.handle()), 0);
  handle->InputChannel->Peer = streamer.output();
  streamer.ConnectListMaker(plugin.Get<MmfListMakerOps>("MediaListMaker"), handle->InputChannel);

  // The first request of a forward scan, as a scan would fill it.
  MkvContext* context = connected.context();
  ASSERT_NE(context->ByteRate, 0);
  ASSERT_EQ(MmfAcquireReadList(context->ReadList, &context->CurrentReadList), 0);
  MmfReadRequest& first = *context->CurrentReadList->Request;
  first.Position = cues.positions[kFirstCue];
  first.Time = cues.times[kFirstCue];
  first.Length = kRequestBytes;
  context->CurrentReadList->Ready = 1;
  context->TrickMode = kForward;
  context->TrickSpeed = kSpeed;
  ASSERT_EQ(plugin.Get<MmfMediaControlOps>("MediaControl")->Start(handle), 0);
  ASSERT_EQ(streamer.SetListMode(1), 0);

  // Each step: the first cue point after the last one's time + 1 s, until none
  // is left or a request reaches the end of the file.
  const uint64_t window = 1000 * static_cast<uint64_t>(context->TrickTime);
  std::vector<Frame> expected;
  for (size_t cue = kFirstCue;;) {
    for (const Listed& f : cues.tracks.at(1)) {
      if (f.time_us >= cues.times[cue] && f.time_us <= cues.times[cue] + window) expected.push_back(f);
    }
    // The streamer ends the stream when a request reads into the end of the file.
    if (cues.positions[cue] + kRequestBytes >= file_size) break;
    const size_t next = cues.Forward(cues.times[cue] + 2 * window);
    if (cues.times[next] <= cues.times[cue] + 2 * window) break;
    cue = next;
  }

  std::vector<Frame> got;
  uint64_t time = 0;
  int result;
  MmfMra* mra = nullptr;
  while ((result = plugin.output()->NextBuffer(video, &mra)) == kMmfBufferDelivered) {
    uint32_t kind = 0;
    for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
      if (kind == kMmfElementProperty) {
        uint32_t type = 0, low = 0;
        uint16_t high = 0;
        MmfGetMraPropertyElement(mra, i, &type, &low, &high);
        if (type == kMmfPropConfigCount) i += low;
        if (type == kMmfPropVideoTime) time = MmfPropertyValue(low, high);
        EXPECT_NE(type, kMmfPropFramePart) << "no frame of the windows is cut by the end of a request";
        continue;
      }
      MmfPoolBuffer* buffer = nullptr;
      uint8_t* address = nullptr;
      uint32_t size = 0;
      MmfGetMraBufferElement(mra, i, &buffer, &address, &size);
      got.push_back({time, size, testing_support::Adler32(address, size)});
    }
    MmfReleaseMra(mra);
  }
  EXPECT_EQ(result, kMmfEndOfStream);
  EXPECT_EQ(FirstDifference(got, expected), "");
  plugin.Get<MmfMediaFlushOps>("MediaFlush")->Flush(handle);
  plugin.output()->ReleaseOutputChannel(video);
}

}  // namespace
