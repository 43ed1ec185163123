// Playback control on a running graph (streamer, kelvane, one sink thread
// per channel): the control state machine, seeks with and without preroll,
// and random seeks, pauses, resumes and scans on channel threads. What each
// channel delivers after a seek is checked against the fixtures' cue tables
// and block lists from mkvinfo.

#include <mutex>
#include <random>
#include <span>
#include <thread>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "host/graph_runner.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/playback_expectations.h"

namespace {

using namespace playback_test;

enum class Op { kStart, kStop, kPause, kResume, kStatus };

TEST(MediaControlTest, EachOperationMovesTheState) {
  const struct {
    uint32_t before;
    Op op;
    int result;  // -1: the state after (Status)
    uint32_t after;
  } rows[] = {{16, Op::kStart, 0, 64}, {64, Op::kResume, 0, 256}, {256, Op::kPause, 0, 64}, {1, Op::kPause, 0, 64},
              {16, Op::kPause, 0, 16},  // paused when stopped: nothing changes
              {64, Op::kStop, 0, 16}, {16, Op::kStop, 0, 16}, {1, Op::kStop, 4041, 16}, {256, Op::kStatus, -1, 256}};
  plugin_test::Connected connected = plugin_test::ConnectFile("tiny_avc");
  ASSERT_TRUE(connected.graph->rated());
  const auto* control = plugin_test::HostPlugin().Get<MmfMediaControlOps>("MediaControl");
  int (*const call[])(MmfFilterHandle*) = {control->Start, control->Stop, control->Pause, control->Resume, control->Status};
  for (const auto& c : rows) {
    SCOPED_TRACE(testing::Message() << "operation " << int(c.op) << " in state " << c.before);
    connected.context()->ControlState = c.before;
    EXPECT_EQ(call[int(c.op)](connected.graph->handle()), c.result == -1 ? int(c.after) : c.result);
    EXPECT_EQ(connected.context()->ControlState, c.after);
  }
}

// The metadata event goes out once, at the first call, whatever the state.
TEST(MediaControlNextBufferTest, StatesBelowRunningExceptFourAreAnsweredAtOnce) {
  plugin_test::Connected connected = plugin_test::ConnectFile("tiny_avc");
  ASSERT_TRUE(connected.graph->rated());
  const MmfMediaOutputOps* output = plugin_test::HostPlugin().output();
  static std::vector<std::pair<uint32_t, uint32_t>> posted;  // event, bytes of data
  posted.clear();
  plugin_test::HostPlugin().Get<MmfEventProducerOps>("MediaEventProducer")->EventSetPostFunction(
      connected.graph->handle(), [](MmfFilterHandle*, uint32_t event, const void*, uint32_t bytes) {
        posted.emplace_back(event, bytes);
      });
  for (uint32_t state : {0u, 1u, 2u, 16u, 32u}) {
    connected.context()->ControlState = state;
    MmfMra* mra = reinterpret_cast<MmfMra*>(&state);
    EXPECT_EQ(output->NextBuffer(AsFrameworkChannel(&connected.channel(0)), &mra), static_cast<int>(state));
    EXPECT_EQ(mra, nullptr);
    EXPECT_EQ(connected.channel(0).State->DecoderConfigSent, 0u) << "nothing was touched";
  }
  EXPECT_EQ(posted, (std::vector<std::pair<uint32_t, uint32_t>>{{4, 8}}));
}

// long_cues, no_cues and multi_audio offer their tracks 1, 2, ... as channels 0, 1, ...
uint64_t TrackOf(const host::ChannelRun& run) { return uint64_t(run.index) + 1; }

// The frames between control sequence k - 1 and k (0: from the start).
std::vector<host::RunFrame> Segment(const host::ChannelRun& run, size_t k) {
  const size_t from = k == 0 ? 0 : run.seeks.at(k - 1);
  const size_t to = k < run.seeks.size() ? run.seeks[k] : run.frames.size();
  return {run.frames.begin() + ptrdiff_t(from), run.frames.begin() + ptrdiff_t(to)};
}

// The preroll-time properties (125) each channel received, from the sinks' threads.
struct PrerollTimes {
  std::mutex mutex;
  std::map<int32_t, std::vector<uint64_t>> values;
  static void Record(void* user, int32_t channel, MmfMra* mra) {
    auto* self = static_cast<PrerollTimes*>(user);
    std::lock_guard<std::mutex> lock(self->mutex);
    for (const host::MraElement& e : std::span(host::MraElements(mra), mra->ElementCount)) {
      if (e.kind == kMmfElementProperty && e.type == kMmfPropPrerollTime) {
        self->values[channel].push_back(MmfPropertyValue(e.low, e.high));
      }
    }
  }
};

struct SeekCase {
  const char* name;
  std::vector<uint64_t> targets;  // each seek waits for the clock to pass 1 s
  bool preroll;
};

class ControlledSeekTest : public testing::TestWithParam<SeekCase> {};

// After a seek to T each channel's first frame is the first frame of its track
// in the Cluster of the backward cue search for T, and it goes on in file
// order (to the end after the last seek). A time marker (property 3) heads
// the first block delivered and, with preroll, every block earlier than the
// start time (T; else the cue's time), which is delivered instead of dropped.
TEST_P(ControlledSeekTest, EachChannelResumesAtTheFirstFrameOfTheChosenCluster) {
  const SeekCase& c = GetParam();
  CueModel fx("long_cues");
  PrerollTimes preroll;
  host::RunnerOptions options;
  options.input_buffer_size = 4096;
  for (uint64_t target : c.targets) options.actions.push_back({host::ControlAction::kSeek, 1000000, target, 0});
  options.preroll = c.preroll;
  options.on_buffer = PrerollTimes::Record;
  options.user = &preroll;
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile("long_cues"), options);
  ASSERT_TRUE(result.ok) << result.error;
  ASSERT_EQ(result.control_results, std::vector<int>(c.targets.size(), 0));
  ASSERT_EQ(result.channels.size(), 2u);
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE(run.name);
    const std::vector<Listed>& listed = fx.tracks.at(TrackOf(run));
    ASSERT_EQ(run.seeks.size(), c.targets.size());
    EXPECT_EQ(Follows(Segment(run, 0), listed, 0, false), "") << "before the first seek";
    for (size_t k = 0; k < c.targets.size(); ++k) {
      SCOPED_TRACE("after the seek to " + std::to_string(c.targets[k]));
      const uint64_t target = c.targets[k];
      const size_t cue = fx.Backward(target);
      const size_t from = fx.FirstFrameInCluster(TrackOf(run), cue);
      const std::vector<host::RunFrame> got = Segment(run, k + 1);
      ASSERT_EQ(Follows(got, listed, from, k + 1 == c.targets.size()), "");
      const uint64_t start = c.preroll && target != 0 ? target : fx.times[cue];
      for (size_t j = 0; j < got.size(); ++j) {
        const Listed& frame = listed[from + j];
        const bool preroll_block = c.preroll && frame.time_us < start;
        // A preroll block that goes on in the next input buffer is marked again there.
        if (frame.block_start || !preroll_block) {
          EXPECT_EQ(got[j].marked, frame.block_start && (preroll_block || j == 0))
              << "frame " << j << " at " << frame.time_us << " us";
        }
      }
    }
    // With preroll the last seek reports its time once; an earlier one may be
    // overtaken by the next before anything is delivered.
    const std::vector<uint64_t>& reported = preroll.values[run.index];
    ASSERT_EQ(reported.empty(), !c.preroll);
    size_t k = 0;
    for (uint64_t time : reported) {
      while (k < c.targets.size() && c.targets[k] != time) ++k;
      EXPECT_LT(k++, c.targets.size()) << time << " us reported out of order or twice";
    }
    EXPECT_TRUE(!c.preroll || reported.back() == c.targets.back()) << "the last seek's time comes last";
  }
}

INSTANTIATE_TEST_SUITE_P(LongCues, ControlledSeekTest,
                         testing::Values(SeekCase{"IntoTheMiddleOfACluster", {12300000}, false},
                                         SeekCase{"ExactlyOnACuePoint", {3000000}, false},
                                         SeekCase{"OnTheLastCuePointGivesTheOneBefore", {24500000}, false},
                                         SeekCase{"PastTheLastCuePoint", {24900000}, false},
                                         SeekCase{"ToTheStart", {0}, false},
                                         SeekCase{"ThreeSeeksForwardAndBack", {20100000, 5200000, 17750000}, false},
                                         SeekCase{"PrerollMarksTheEarlierBlocks", {7300000}, true},
                                         SeekCase{"PrerollTwice", {16450000, 2250000}, true}),
                         [](const testing::TestParamInfo<SeekCase>& info) { return info.param.name; });

// Without Cues only the start can be found: a seek to 0 plays the file again,
// any other time is refused with 4002 and playback goes on where it was.
TEST(ControlledSeekWithoutCuesTest, ZeroReplaysAndAnyOtherTimeIsRefusedWithoutLosingAFrame) {
  CueModel fx("no_cues");
  host::RunnerOptions options;
  options.input_buffer_size = 4096;
  options.actions = {{host::ControlAction::kSeek, 500000, 5000000, 0}, {host::ControlAction::kSeek, 1000000, 0, 0}};
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile("no_cues"), options);
  ASSERT_TRUE(result.ok) << result.error;
  EXPECT_EQ(result.control_results, (std::vector<int>{4002, 0}));
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE(run.name);
    const std::vector<Listed>& listed = fx.tracks.at(TrackOf(run));
    ASSERT_EQ(run.seeks.size(), 2u);
    std::vector<host::RunFrame> before = Segment(run, 0), kept = Segment(run, 1);
    before.insert(before.end(), kept.begin(), kept.end());
    EXPECT_EQ(Follows(before, listed, 0, false), "") << "the refused seek loses nothing";
    EXPECT_EQ(Follows(Segment(run, 2), listed, 0, true), "") << "the seek to 0 plays it all again";
  }
}

struct StressCase {
  const char* file;
  uint32_t seed;
  uint64_t seek_range_us;  // seek targets fall in [0, this)
  // Scans started while the channels play in place of pauses and resumes:
  // only that nothing hangs, races (ThreadSanitizer) or points astray is checked.
  bool scans = false;
};

class ControlStressTest : public testing::TestWithParam<StressCase> {};

// Channel threads at different paces and a controller thread that seeks,
// pauses and resumes at random moments (fixed seeds, bounded rounds), then
// stops: nothing hangs, and between two seeks each channel delivers its
// track's frames without loss, repetition or reordering, from the first frame
// of the Cluster that the seek's cue search picks.
TEST_P(ControlStressTest, RandomSeeksPausesAndAStopNeitherHangNorLoseFrames) {
  const StressCase& c = GetParam();
  CueModel fx(c.file);
  std::vector<uint64_t> targets;
  host::RunnerOptions options;
  options.input_buffer_size = 2048;  // many buffers: the ring fills and the faster channel waits
  options.sink_delay_us = {0, 200, 50, 0};
  options.script = [&targets, &c](host::PlaybackControl& control) {
    std::mt19937 random(c.seed);
    for (int round = 0; round < 30; ++round) {
      const uint32_t pick = random() % 4;
      if (pick < 2) {
        targets.push_back(random() % c.seek_range_us);
        EXPECT_EQ(control.Seek(targets.back()), 0);
      } else if (c.scans) {
        EXPECT_EQ(control.ScanWhilePlaying(pick == 2, 100 + random() % 400), 0);
      } else {
        EXPECT_EQ(pick == 2 ? control.Pause() : control.Resume(), 0);
      }
      std::this_thread::sleep_for(std::chrono::microseconds(random() % 3000));
    }
    (void)control.Stop();
  };
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(c.file), options);
  ASSERT_EQ(result.channels.size(), c.file == std::string("long_cues") ? 2u : 4u) << result.error;
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE(run.name);
    EXPECT_TRUE(run.end_result == kMmfEndOfStream || run.end_result == 16) << run.end_result;
    EXPECT_EQ(run.foreign_elements, 0u);
    EXPECT_FALSE(run.frames.empty());
    if (c.scans) continue;
    ASSERT_EQ(run.seeks.size(), targets.size());
    for (size_t k = 0; k <= targets.size(); ++k) {
      const size_t first = k == 0 ? 0 : fx.FirstFrameInCluster(TrackOf(run), fx.Backward(targets[k - 1]));
      ASSERT_EQ(Follows(Segment(run, k), fx.tracks.at(TrackOf(run)), first, false), "")
          << "segment " << k << " (after the seek to " << (k ? targets[k - 1] : 0) << " us)";
    }
  }
}

// long_cues: two channels, 50 cue points; multi_audio: four channels, two cue points.
INSTANTIATE_TEST_SUITE_P(Seeds, ControlStressTest,
                         testing::Values(StressCase{"long_cues", 1, 26000000}, StressCase{"long_cues", 7, 26000000},
                                         StressCase{"long_cues", 2026, 26000000},
                                         StressCase{"multi_audio", 3, 2500000},
                                         StressCase{"long_cues", 11, 26000000, true}),
                         [](const testing::TestParamInfo<StressCase>& info) {
                           return std::string(info.param.file) + "_seed" + std::to_string(info.param.seed) +
                                  (info.param.scans ? "_scans" : "");
                         });

}  // namespace
