// Seeks and trick play during playback, done by the host's controller on a
// running graph (streamer, kelvane, one sink thread per channel). What each
// channel delivers after a seek or a jump is checked against the fixtures'
// cue tables and block lists from mkvinfo.

#include <algorithm>
#include <map>
#include <random>
#include <thread>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/fixtures.h"

namespace {

// One frame of a track as the fixture lists it, and the block it is in.
struct Listed {
  uint64_t time_us;
  uint32_t size, adler32;
  size_t block;      // index in the file's block list
  bool block_start;  // the block's first frame
};

struct Fixture {
  explicit Fixture(const std::string& name) : expect(testing_support::LoadFixture(name)) {
    scale = expect.timecode_scale / 1000;
    for (size_t b = 0; b < expect.blocks.size(); ++b) {
      const auto& block = expect.blocks[b];
      for (size_t f = 0; f < block.frames.size(); ++f) {
        tracks[block.track].push_back(
            {uint64_t(block.ticks) * scale, block.frames[f].size, block.frames[f].adler32, b, f == 0});
      }
    }
    for (const auto& cue : expect.cues) {
      if (!cue_times.empty() && cue_times.back() == cue.time_ticks * scale) continue;
      cue_times.push_back(cue.time_ticks * scale);
      cue_tracks.push_back(cue.track);
    }
  }

  // The first cue point after t, or the last.
  size_t Forward(uint64_t t) const {
    size_t f = 0;
    while (f + 1 < cue_times.size() && cue_times[f] <= t) ++f;
    return f;
  }
  // The last cue point at or before t (the first when none is), except that
  // the last one's own time gives the one before.
  size_t Backward(uint64_t t) const {
    const size_t f = Forward(t);
    if (cue_times[f] > t) return f == 0 ? 0 : f - 1;
    return t > cue_times[f] || f == 0 ? f : f - 1;
  }

  // Index in `track`'s frames of its first frame in the Cluster of cue point
  // i: a Cluster opens with its cue track's block at the cue time.
  size_t FirstFrameInCluster(uint64_t track, size_t cue) const {
    size_t start = 0;
    while (start < expect.blocks.size() && !(expect.blocks[start].track == cue_tracks[cue] &&
                                             uint64_t(expect.blocks[start].ticks) * scale == cue_times[cue])) {
      ++start;
    }
    const auto& frames = tracks.at(track);
    size_t i = 0;
    while (i < frames.size() && frames[i].block < start) ++i;
    return i;
  }

  testing_support::FixtureExpectation expect;
  uint64_t scale = 0;
  std::map<uint64_t, std::vector<Listed>> tracks;
  std::vector<uint64_t> cue_times;
  std::vector<uint64_t> cue_tracks;
};

// long_cues and no_cues offer their tracks 1 and 2 as channels 0 and 1.
uint64_t TrackOf(const host::ChannelRun& run) { return uint64_t(run.index) + 1; }

// The frames between control sequence k - 1 and k (0: from the start).
std::vector<host::RunFrame> Segment(const host::ChannelRun& run, size_t k) {
  const size_t from = k == 0 ? 0 : run.seeks.at(k - 1);
  const size_t to = k < run.seeks.size() ? run.seeks[k] : run.frames.size();
  return {run.frames.begin() + ptrdiff_t(from), run.frames.begin() + ptrdiff_t(to)};
}

// "" when `got` is listed[from...] in order (all of it to the end when
// `to_end`), else the first difference.
std::string Follows(const std::vector<host::RunFrame>& got, const std::vector<Listed>& listed, size_t from,
                    bool to_end) {
  for (size_t j = 0; j < got.size(); ++j) {
    if (from + j >= listed.size()) return "frame " + std::to_string(j) + " is past the track's end";
    const Listed& want = listed[from + j];
    if (got[j].time_us != want.time_us || got[j].size != want.size || got[j].adler32 != want.adler32) {
      return "frame " + std::to_string(j) + ": got " + std::to_string(got[j].time_us) + " us " +
             std::to_string(got[j].size) + " bytes, expected " + std::to_string(want.time_us) + " us " +
             std::to_string(want.size) + " bytes";
    }
  }
  if (to_end && from + got.size() != listed.size()) {
    return std::to_string(got.size()) + " frames, expected " + std::to_string(listed.size() - from);
  }
  return "";
}

host::RunnerOptions Options(std::vector<host::ControlAction> actions, bool preroll = false) {
  host::RunnerOptions options;
  options.input_buffer_size = 4096;
  options.actions = std::move(actions);
  options.preroll = preroll;
  return options;
}

host::RunResult Play(const host::RunnerOptions& options, const std::string& name = "long_cues") {
  return host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(name), options);
}

host::ControlAction SeekTo(uint64_t time_us, uint64_t at_us) { return {host::ControlAction::kSeek, at_us, time_us, 0}; }

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
  Fixture fx("long_cues");
  std::vector<host::ControlAction> actions;
  for (uint64_t target : c.targets) actions.push_back(SeekTo(target, 1000000));
  host::RunResult result = Play(Options(actions, c.preroll));
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
      const uint64_t start = c.preroll && target != 0 ? target : fx.cue_times[cue];
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
  Fixture fx("no_cues");
  host::RunResult result = Play(Options({SeekTo(5000000, 500000), SeekTo(0, 1000000)}), "no_cues");
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

// The groups of a scan: each jump's time marker heads the first frame delivered after it.
std::vector<std::vector<host::RunFrame>> Jumps(const std::vector<host::RunFrame>& frames) {
  std::vector<std::vector<host::RunFrame>> jumps;
  for (const host::RunFrame& frame : frames) {
    if (frame.marked || jumps.empty()) jumps.emplace_back();
    jumps.back().push_back(frame);
  }
  return jumps;
}

struct ScanCase {
  const char* name;
  bool forward;
  uint32_t speed;
  uint64_t from_us;  // a seek goes there first, and the scan starts as the clock reads it
};

class ControlledScanTest : public testing::TestWithParam<ScanCase> {};

// Video only: each jump opens a Cluster at a cue point and delivers its frames
// in file order up to TrickTime (500 ms) after the cue's time; each next cue
// point is the one the time moved by TrickTime and the speed leads to, and the
// scan ends at the end of the cue table.
TEST_P(ControlledScanTest, EachJumpDeliversTheFirstTrickTimeOfTheNextCuePointsCluster) {
  const ScanCase& c = GetParam();
  Fixture fx("long_cues");
  const auto kind = c.forward ? host::ControlAction::kScanForward : host::ControlAction::kScanBackward;
  host::RunnerOptions options = Options({SeekTo(c.from_us, 0), {kind, c.from_us, 0, c.speed}});
  options.channels = {0};
  options.trick_time_ms = 500;
  host::RunResult result = Play(options);
  ASSERT_TRUE(result.ok) << result.error;
  ASSERT_EQ(result.control_results, (std::vector<int>{0, 0}));
  const host::ChannelRun& run = result.channels.at(0);
  const std::vector<Listed>& listed = fx.tracks.at(1);
  ASSERT_EQ(run.seeks.size(), 2u);
  const auto jumps = Jumps(Segment(run, 2));
  // Sinks run free: one output buffer may take the clock far ahead before the scan starts.
  ASSERT_FALSE(jumps.empty());
  const uint64_t skip = 500 * (1000 * uint64_t(c.speed)) / 100;
  size_t cue = fx.Forward(jumps[0][0].time_us - 1);
  ASSERT_EQ(fx.cue_times[cue], jumps[0][0].time_us) << "the first jump lands on a cue point";
  if (c.forward) {
    EXPECT_GT(jumps[0][0].time_us, c.from_us) << "the scan starts after the clock's time";
  }
  for (size_t k = 0; k < jumps.size(); ++k) {
    SCOPED_TRACE("jump " + std::to_string(k) + " to " + std::to_string(fx.cue_times[cue]));
    const uint64_t t = fx.cue_times[cue];
    std::vector<Listed> window;
    for (size_t i = fx.FirstFrameInCluster(1, cue); i < listed.size(); ++i) {
      if (listed[i].time_us >= t && listed[i].time_us <= t + 500000) window.push_back(listed[i]);
    }
    EXPECT_EQ(Follows(jumps[k], window, 0, false), "");
    const size_t next = c.forward ? fx.Forward(t + 500000 + skip) : fx.Backward(t > skip ? t - skip : t);
    if (k + 1 == jumps.size()) {
      EXPECT_EQ(fx.cue_times[next], t) << "the last jump is at the end of the cue table";
    }
    cue = next;
  }
}

INSTANTIATE_TEST_SUITE_P(LongCues, ControlledScanTest,
                         testing::Values(ScanCase{"FastForwardSpeed100", true, 100, 2000000},
                                         ScanCase{"FastForwardSpeed300", true, 300, 1000000},
                                         ScanCase{"RewindSpeed100", false, 100, 15000000},
                                         ScanCase{"RewindSpeed250", false, 250, 22000000}),
                         [](const testing::TestParamInfo<ScanCase>& info) { return info.param.name; });

// ScanEnd returns to normal delivery: from the first frame of the Cluster of
// a cue point (the one after the clock's time, which the sinks move), every
// frame to the end.
TEST(ControlledScanEndTest, NormalDeliveryResumesAtTheNextCuePointsCluster) {
  Fixture fx("long_cues");
  host::RunnerOptions options = Options({SeekTo(1000000, 0), {host::ControlAction::kScanForward, 1000000, 0, 100},
                                         {host::ControlAction::kScanEnd, 9000000, 0, 0}});
  host::RunResult result = Play(options);
  ASSERT_TRUE(result.ok) << result.error;
  ASSERT_EQ(result.control_results, (std::vector<int>{0, 0, 0}));
  const host::ChannelRun& video = result.channels.at(0);
  ASSERT_EQ(video.seeks.size(), 3u);
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE(run.name);
    ASSERT_EQ(run.seeks.size(), 3u);
    const std::vector<host::RunFrame> after = Segment(run, 3);
    ASSERT_FALSE(after.empty());
    // The cue point is the first video frame's time; the audio channel opens in the same Cluster.
    const uint64_t resumed = Segment(video, 3).at(0).time_us;
    const size_t cue = fx.Forward(resumed - 1);
    ASSERT_EQ(fx.cue_times[cue], resumed);
    EXPECT_EQ(Follows(after, fx.tracks.at(TrackOf(run)), fx.FirstFrameInCluster(TrackOf(run), cue), true), "");
  }
}

}  // namespace
