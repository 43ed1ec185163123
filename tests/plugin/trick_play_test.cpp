// Trick play through the plug-in's tables. Scans drive a real file streamer
// in list mode: every request it reads (time marker, file offset, bytes) must
// be the cue point that long_cues.cues leads to: each next request names the
// Cluster of the cue point that the previous request's time, moved by
// TrickTime and the speed, leads to. Through the streamer's list mode the
// channel delivers only the first TrickTime of media after each jump.

#include <span>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "host/call_failures.h"
#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/memory_pools.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/playback_expectations.h"
#include "tests/support/log_recorder.h"

namespace {

using plugin_test::HostPlugin;

constexpr uint32_t kBufferSize = 1024;

const MmfTrickPlayOps& Trick() { return *HostPlugin().Get<MmfTrickPlayOps>("MediaTrickPlay"); }

// One request as the streamer read it: the time marker heading its first
// buffer, that buffer's file offset, and the bytes read until the next marker.
struct Read {
  uint64_t time, offset, bytes;
  bool operator==(const Read&) const = default;
};

// A file with the streamer, its list maker and the graph clock connected as
// the framework connects them; `channels` are the outputs acquired. With
// `plays` the plug-in reads its input from the streamer in buffers of 4096.
class TrickPlayTest : public testing::Test {
 protected:
  void Connect(const std::string& name, std::vector<int32_t> channels, bool plays = false) {
    host::SetupOptions options;
    options.configure_outputs = false;
    host::StreamerConfig config{kBufferSize, 16};
    if (plays) {
      options.upstream = host::FileStreamer::Ops();
      options.input_pool = host::MemoryPool::Ops();
      options.input_pool_param = pool_.handle();
      config = {4096, 128};
    } else {
      options.buffer_size = kBufferSize;
    }
    // The streamer is the input channel's Peer, its list mode asks the
    // plug-in's list maker, and it reads on from where the rating left the input.
    source_ = host::OpenFileStream(plugin_test::FixtureFile(name), true);
    streamer_ = std::make_unique<host::FileStreamer>(source_.get(), config);
    options.upstream_output = streamer_->output();
    connected_ = plugin_test::ConnectFile(name, true, options);
    ASSERT_TRUE(connected_.graph->rated());
    handle_ = connected_.graph->handle();
    streamer_->ConnectListMaker(HostPlugin().Get<MmfListMakerOps>("MediaListMaker"), handle_->InputChannel);
    ASSERT_EQ(streamer_->Seek(static_cast<uint64_t>(connected_.stream->Tell()), 0), 0);
    for (int32_t k : channels) {
      ASSERT_EQ(HostPlugin().output()->AcquireOutputChannel(AsFrameworkChannel(&connected_.channel(k))), 0);
    }
    host::AttachGraphClock(handle_->Graph, &clock_);
  }

  void TearDown() override {
    if (!handle_) return;
    host::AttachGraphClock(handle_->Graph, nullptr);
    for (int32_t k = 0; k < connected_.channel_count(); ++k) {
      (void)HostPlugin().output()->ReleaseOutputChannel(AsFrameworkChannel(&connected_.channel(k)));
    }
    connected_.graph.reset();
    handle_ = nullptr;
  }

  // What the streamer reads until it ends or `limit` buffers were read.
  std::vector<Read> Reads(int limit, int* end = nullptr) {
    std::vector<Read> reads;
    int result = kMmfBufferDelivered;
    for (int n = 0; n < limit && result == kMmfBufferDelivered; ++n) {
      MmfMra* mra = nullptr;
      result = host::FileStreamer::Ops()->NextBuffer(streamer_->output(), &mra);
      if (result != kMmfBufferDelivered) break;
      uint64_t offset = 0;
      for (const host::MraElement& e : std::span(host::MraElements(mra), mra->ElementCount)) {
        const uint64_t value = MmfPropertyValue(e.low, e.high);
        if (e.kind == kMmfElementProperty && e.type == kMmfPropTimeMarker) reads.push_back({value, 0, 0});
        if (e.kind == kMmfElementProperty && e.type == kMmfPropFileOffset) offset = value;
        if (e.kind != kMmfElementBuffer || reads.empty()) continue;
        if (reads.back().bytes == 0) reads.back().offset = offset;
        EXPECT_EQ(offset, reads.back().offset + reads.back().bytes) << "a request is read in one stretch";
        reads.back().bytes += e.size;
      }
      MmfReleaseMra(mra);
    }
    if (end) *end = result;
    return reads;
  }

  MkvContext* context() { return connected_.context(); }
  int Scan(bool forward, uint32_t speed) {
    return forward ? Trick().ScanForward(handle_, speed) : Trick().ScanBackward(handle_, speed);
  }

  playback_test::CueModel cues_{"long_cues"};
  host::MemoryPool pool_{65536, 8};
  std::unique_ptr<host::InputStream> source_;
  std::unique_ptr<host::FileStreamer> streamer_;
  plugin_test::Connected connected_;
  MmfFilterHandle* handle_ = nullptr;
  host::GraphClock clock_;
};

struct ScanCase {
  const char* name;
  bool forward;
  uint32_t speed;
  uint64_t now_us;
  std::vector<int32_t> channels = {0, 1};
  int32_t skip_start = 0;  // TrickPlaySkipStartSpeed when set
  uint64_t end_us = 0;     // when set: ScanEnd at this time after three buffers of the scan
};

class ScanTest : public TrickPlayTest, public testing::WithParamInterface<ScanCase> {};

// Every step of a scan reads TrickTime's bytes (byte rate 2000 B/s × 500 ms =
// 1000, raised to a whole input buffer) at the next cue point of the scan, and
// the scan ends with a request of length -1 at the end of the cue table. An
// audio-only scan slower than TrickPlaySkipStartSpeed streams every frame on
// from the next cue point instead.
TEST_P(ScanTest, EveryStepReadsTheClusterOfTheExpectedCuePoint) {
  const ScanCase& k = GetParam();
  Connect("long_cues", k.channels);
  if (k.skip_start) {
    ASSERT_EQ(HostPlugin().resources()->SetResource(handle_, "TrickPlaySkipStartSpeed", &k.skip_start), 0);
  }
  const bool skips = k.channels != std::vector<int32_t>{1} || k.speed >= uint32_t(k.skip_start);
  context()->ByteRate = 2000;
  clock_.Consumed(k.now_us);
  const uint64_t skip = 500 * (1000 * uint64_t(k.speed)) / 100;
  std::vector<Read> expected;
  size_t cue = k.forward ? cues_.Forward(k.now_us) : cues_.Backward(k.now_us);
  for (;;) {
    expected.push_back({cues_.times.at(cue), cues_.positions.at(cue), skips ? kBufferSize : 6 * kBufferSize});
    const uint64_t t = cues_.times.at(cue);
    const size_t next = k.forward ? cues_.Forward(t + 500000 + skip) : cues_.Backward(t > skip ? t - skip : t);
    if (cues_.times.at(next) == t || !skips) break;
    cue = next;
  }
  ASSERT_EQ(Scan(k.forward, k.speed), 0);
  EXPECT_EQ(context()->TrickMode, !skips ? 0u : k.forward ? 512u : 1024u);
  EXPECT_EQ(context()->CurrentReadList->Request->Length, int32_t(kBufferSize));
  if (k.end_us) {  // a normal request in the scan's direction, then the file in order from it
    (void)Reads(3);
    clock_.Consumed(k.end_us);
    ASSERT_EQ(Trick().ScanEnd(handle_), 0);
    EXPECT_EQ(context()->TrickMode, 0u);
    EXPECT_EQ(context()->TrickSpeed, 0u);
    const size_t at = k.forward ? cues_.Forward(k.end_us) : cues_.Backward(k.end_us);
    EXPECT_EQ(Reads(8), (std::vector<Read>{{cues_.times.at(at), cues_.positions.at(at), 8 * kBufferSize}}));
    return;
  }
  int end = 0;
  EXPECT_EQ(Reads(skips ? 500 : 6, &end), expected) << (skips ? "one request per cue point" : "the file in order");
  if (!skips) return;
  EXPECT_EQ(context()->TrickSpeed, k.speed);
  EXPECT_EQ(end, kMmfEndOfStream);
  EXPECT_EQ(context()->CurrentReadList->Request->Length, -1);
}

INSTANTIATE_TEST_SUITE_P(LongCues, ScanTest,
                         testing::Values(ScanCase{"ForwardSpeed100From3s", true, 100, 3000000},
                                         ScanCase{"ForwardSpeed400From0", true, 400, 0},
                                         ScanCase{"ForwardSpeed0BetweenCues", true, 0, 20250000},
                                         ScanCase{"BackwardSpeed200From20s", false, 200, 20000000},
                                         ScanCase{"BackwardSpeed100FromTheEnd", false, 100, 30000000},
                                         ScanCase{"AudioOnlySlow", true, 800, 9100000, {1}, 1000},
                                         ScanCase{"AudioOnlyAtTheSkipSpeed", true, 1000, 9100000, {1}, 1000},
                                         ScanCase{"VideoOnlySlow", true, 800, 9100000, {0}, 1000},
                                         ScanCase{"AudioAndVideoSlow", true, 800, 9100000, {0, 1}, 1000},
                                         ScanCase{"ForwardThenEnd", true, 100, 4000000, {0, 1}, 0, 12250000},
                                         ScanCase{"BackwardThenEnd", false, 100, 4000000, {0, 1}, 0, 12250000}),
                         [](const testing::TestParamInfo<ScanCase>& info) { return info.param.name; });

TEST_F(TrickPlayTest, TheRequestIsTrickTimesBytesRaisedToWholeInputBuffersAndEndsWithoutAByteRate) {
  Connect("long_cues", {0, 1});
  context()->ByteRate = 100000;  // 50000 bytes in 500 ms: 49 buffers of 1024
  clock_.Consumed(7200000);
  ASSERT_EQ(Trick().ScanForward(handle_, 100), 0);
  const MmfReadRequest& request = *context()->CurrentReadList->Request;
  EXPECT_EQ(request.Length, 50176);
  EXPECT_EQ(request.Time, cues_.times.at(cues_.Forward(7200000)));
  EXPECT_EQ(context()->CurrentReadList->Ready, 1u);

  // The list maker hands an entry other than the current one the current one back.
  MmfReadListEntry* current = context()->CurrentReadList;
  const auto* list_maker = HostPlugin().Get<MmfListMakerOps>("MediaListMaker");
  for (MmfReadListEntry* other : {static_cast<MmfReadListEntry*>(nullptr), current + 1}) {
    MmfReadListEntry* out = nullptr;
    ASSERT_EQ(list_maker->GetNextReadList(handle_->InputChannel, &out, other), 0);
    EXPECT_EQ(out, current);
  }
  // A failed acquisition of the next entry is answered and leaves the current one.
  testing_support::LogRecorder log;
  host::FailNextCall(host::FrameworkCall::kAcquireReadList, 12);
  MmfReadListEntry* next = nullptr;
  EXPECT_EQ(list_maker->GetNextReadList(handle_->InputChannel, &next, current), 12);
  EXPECT_TRUE(log.Contains(2, "kelvane: GetNextReadList MmfAcquireReadList() failed err = 12"));
  EXPECT_EQ(next, nullptr);
  EXPECT_EQ(context()->CurrentReadList, current);
  // Without a byte rate the next request ends the stream.
  context()->ByteRate = 0;
  ASSERT_EQ(list_maker->GetNextReadList(handle_->InputChannel, &next, current), 0);
  EXPECT_NE(next, current);
  EXPECT_EQ(next->Request->Length, -1);
}

TEST_F(TrickPlayTest, WithoutCuesASkippingScanEndsTheStreamAndTheNoSkipScanFails) {
  Connect("no_cues", {1});
  testing_support::LogRecorder log;
  ASSERT_EQ(Trick().ScanForward(handle_, 100), 0);
  EXPECT_TRUE(log.Contains(3, "kelvane: ScanForward cueing points weren't enough to trick play."));
  EXPECT_EQ(context()->CurrentReadList->Request->Length, -1);
  int end = 0;
  EXPECT_TRUE(Reads(4, &end).empty());
  EXPECT_EQ(end, kMmfEndOfStream);

  int32_t skip_start = 1000;
  ASSERT_EQ(HostPlugin().resources()->SetResource(handle_, "TrickPlaySkipStartSpeed", &skip_start), 0);
  EXPECT_EQ(Trick().ScanForward(handle_, 800), 48);
}

// Each scan answers a failure of the graph clock or of a framework call with
// its error and says so; a failed switch of list mode comes after the request
// and TrickMode are set.
TEST_F(TrickPlayTest, AFailedFrameworkCallFailsEveryScanAndSaysSo) {
  struct Row {
    host::FrameworkCall call;  // kCount: no graph clock
    int error;
    const char* message;
    uint32_t modes[3];  // TrickMode after ScanForward, ScanBackward, ScanEnd
  };
  const Row rows[] = {{host::FrameworkCall::kCount, kMmfNotAvailable, " failed to get current time.", {0, 0, 0}},
                      {host::FrameworkCall::kAcquireReadList, 12, " MmfAcquireReadList() failed err = 12", {0, 0, 0}},
                      {host::FrameworkCall::kStreamerSetListMode, 12, " MmfStreamerSetListMode() failed err = 12",
                       {512, 1024, 0}}};
  for (const Row& row : rows) {
    SCOPED_TRACE(row.message);
    Connect("long_cues", {0, 1});
    if (row.call == host::FrameworkCall::kCount) host::AttachGraphClock(handle_->Graph, nullptr);
    testing_support::LogRecorder log;
    const char* names[] = {"ScanForward", "ScanBackward", "ScanEnd"};
    for (int op = 0; op < 3; ++op) {
      if (row.call != host::FrameworkCall::kCount) host::FailNextCall(row.call, row.error);
      EXPECT_EQ(op < 2 ? Scan(op == 0, 100) : Trick().ScanEnd(handle_), row.error);
      EXPECT_TRUE(log.Contains(2, std::string("kelvane: ") + names[op] + row.message)) << names[op];
      EXPECT_EQ(context()->TrickMode, row.modes[op]) << names[op];
    }
    EXPECT_EQ(Trick().TrickQuery(handle_), 8);
    TearDown();
  }
}

// Requests longer than TrickTime's bytes (several Clusters each, 16384 bytes:
// a read past the end of the file ends the stream): the channel still
// delivers only the first TrickTime of media after each jump.
TEST_F(TrickPlayTest, ScanForwardDeliversTheFirstTrickTimeAfterEachJump) {
  using namespace playback_test;
  constexpr int kFirstCue = 4;
  constexpr int32_t kRequestBytes = 16384;
  const uint64_t file_size = testing_support::ReadFixtureBytes("long_cues").size();
  Connect("long_cues", {0}, true);
  const host::Plugin& plugin = HostPlugin();
  MmfChannel* video = AsFrameworkChannel(&connected_.channel(0));
  ASSERT_EQ(plugin.output()->SetOutputFormat(video, &connected_.graph->outputs()[0].offered), 0);
  ASSERT_EQ(plugin.output()->SetOutputChannelMemoryPool(video, host::MemoryPool::Ops(), pool_.handle()), 0);

  // The first request of a forward scan, as a scan would fill it.
  MkvContext* context = connected_.context();
  ASSERT_NE(context->ByteRate, 0);
  ASSERT_EQ(MmfAcquireReadList(context->ReadList, &context->CurrentReadList), 0);
  MmfReadRequest& first = *context->CurrentReadList->Request;
  first.Position = cues_.positions[kFirstCue];
  first.Time = cues_.times[kFirstCue];
  first.Length = kRequestBytes;
  context->CurrentReadList->Ready = 1;
  context->TrickMode = 512;  // forward
  context->TrickSpeed = 100;  // with TrickTime 500 ms: a step of 1 s
  ASSERT_EQ(plugin.Get<MmfMediaControlOps>("MediaControl")->Start(handle_), 0);
  ASSERT_EQ(streamer_->SetListMode(1), 0);

  // Each step: the first cue point after the last one's time + 1 s, until none
  // is left or a request reaches the end of the file.
  const uint64_t window = 1000 * static_cast<uint64_t>(context->TrickTime);
  std::vector<Frame> expected;
  for (size_t cue = kFirstCue;;) {
    for (const Listed& f : cues_.tracks.at(1)) {
      if (f.time_us >= cues_.times[cue] && f.time_us <= cues_.times[cue] + window) expected.push_back(f);
    }
    // The streamer ends the stream when a request reads into the end of the file.
    if (cues_.positions[cue] + kRequestBytes >= file_size) break;
    const size_t next = cues_.Forward(cues_.times[cue] + 2 * window);
    if (cues_.times[next] <= cues_.times[cue] + 2 * window) break;
    cue = next;
  }

  std::vector<Frame> got;
  uint64_t time = 0;
  int result;
  MmfMra* mra = nullptr;
  while ((result = plugin.output()->NextBuffer(video, &mra)) == kMmfBufferDelivered) {
    const auto elements = std::span(host::MraElements(mra), mra->ElementCount);
    for (size_t i = 0; i < elements.size(); ++i) {
      const host::MraElement& e = elements[i];
      if (e.kind == kMmfElementBuffer) got.push_back({time, e.size, testing_support::Adler32(e.address, e.size)});
      else if (e.type == kMmfPropConfigCount) i += e.low;
      else if (e.type == kMmfPropVideoTime) time = MmfPropertyValue(e.low, e.high);
      else EXPECT_NE(e.type, kMmfPropFramePart) << "no frame of the windows is cut by the end of a request";
    }
    MmfReleaseMra(mra);
  }
  EXPECT_EQ(result, kMmfEndOfStream);
  EXPECT_EQ(FirstDifference(got, expected), "");
  plugin.Get<MmfMediaFlushOps>("MediaFlush")->Flush(handle_);
}

}  // namespace
