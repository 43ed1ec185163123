// Channel threads at different paces and a controller thread that seeks,
// pauses and resumes at random moments (fixed seeds, bounded rounds), then
// stops: nothing hangs, and between two seeks each channel delivers its
// track's frames without loss, repetition or reordering, from the first frame
// of the Cluster that the seek's cue search picks.

#include <chrono>
#include <map>
#include <random>
#include <thread>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/fixtures.h"

namespace {

struct Listed {
  uint64_t time_us;
  uint32_t size, adler32;
  size_t block;
};

constexpr uint64_t kCueTrack = 1;  // every cue point of these fixtures names the video track

class StressFixture {
 public:
  explicit StressFixture(const std::string& name) : expect_(testing_support::LoadFixture(name)) {
    const uint64_t scale = expect_.timecode_scale / 1000;
    for (size_t b = 0; b < expect_.blocks.size(); ++b) {
      for (const auto& frame : expect_.blocks[b].frames) {
        tracks_[expect_.blocks[b].track].push_back(
            {uint64_t(expect_.blocks[b].ticks) * scale, frame.size, frame.adler32, b});
      }
    }
    for (const auto& cue : expect_.cues) cue_times_.push_back(cue.time_ticks * scale);
    cluster_blocks_.resize(cue_times_.size());
    for (size_t c = 0; c < cue_times_.size(); ++c) {
      while (cluster_blocks_[c] < expect_.blocks.size() &&
             !(expect_.blocks[cluster_blocks_[c]].track == kCueTrack &&
               uint64_t(expect_.blocks[cluster_blocks_[c]].ticks) * scale == cue_times_[c])) {
        ++cluster_blocks_[c];
      }
    }
  }

  const std::vector<Listed>& track(uint64_t number) const { return tracks_.at(number); }

  // Index in the track's frames where playback resumes after a seek to t:
  // the Cluster of the backward cue search.
  size_t ResumeAt(uint64_t track, uint64_t t) const {
    size_t f = 0;
    while (f + 1 < cue_times_.size() && cue_times_[f] <= t) ++f;
    size_t cue = f;
    if (cue_times_[f] > t) {
      cue = f == 0 ? 0 : f - 1;
    } else if (!(t > cue_times_[f]) && f > 0) {
      cue = f - 1;
    }
    const auto& frames = tracks_.at(track);
    size_t i = 0;
    while (i < frames.size() && frames[i].block < cluster_blocks_[cue]) ++i;
    return i;
  }

 private:
  testing_support::FixtureExpectation expect_;
  std::map<uint64_t, std::vector<Listed>> tracks_;
  std::vector<uint64_t> cue_times_;
  std::vector<size_t> cluster_blocks_;
};

bool SameFrame(const host::RunFrame& got, const Listed& want) {
  return got.time_us == want.time_us && got.size == want.size && got.adler32 == want.adler32;
}

struct StressCase {
  const char* file;
  uint32_t seed;
  uint64_t seek_range_us;  // seek targets fall in [0, this)
};

class ControlStressTest : public testing::TestWithParam<StressCase> {};

TEST_P(ControlStressTest, RandomSeeksPausesAndAStopNeitherHangNorLoseFrames) {
  const StressCase& c = GetParam();
  StressFixture fx(c.file);
  std::vector<uint64_t> targets;
  host::RunnerOptions options;
  options.input_buffer_size = 2048;  // many buffers: the ring fills and the faster channel waits
  options.sink_delay_us = {0, 200, 50, 0};
  options.script = [&targets, &c](host::PlaybackControl& control) {
    std::mt19937 random(c.seed);
    for (int round = 0; round < 30; ++round) {
      switch (random() % 4) {
        case 0:
        case 1:
          targets.push_back(random() % c.seek_range_us);
          EXPECT_EQ(control.Seek(targets.back()), 0);
          break;
        case 2:
          EXPECT_EQ(control.Pause(), 0);
          break;
        default:
          EXPECT_EQ(control.Resume(), 0);
          break;
      }
      std::this_thread::sleep_for(std::chrono::microseconds(random() % 3000));
    }
    (void)control.Stop();
  };
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(c.file), options);
  ASSERT_EQ(result.channels.size(), c.file == std::string("long_cues") ? 2u : 4u) << result.error;
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE(run.name);
    const uint64_t track = uint64_t(run.index) + 1;
    const std::vector<Listed>& listed = fx.track(track);
    EXPECT_TRUE(run.end_result == kMmfEndOfStream || run.end_result == 16) << run.end_result;
    EXPECT_EQ(run.foreign_elements, 0u);
    EXPECT_FALSE(run.frames.empty());
    ASSERT_EQ(run.seeks.size(), targets.size());
    for (size_t k = 0; k <= targets.size(); ++k) {
      const size_t from = k == 0 ? 0 : run.seeks[k - 1];
      const size_t to = k < targets.size() ? run.seeks[k] : run.frames.size();
      const size_t first = k == 0 ? 0 : fx.ResumeAt(track, targets[k - 1]);
      for (size_t j = from; j < to; ++j) {
        const size_t want = first + (j - from);
        ASSERT_TRUE(want < listed.size() && SameFrame(run.frames[j], listed[want]))
            << "segment " << k << " (after the seek to " << (k ? targets[k - 1] : 0) << " us), frame " << j - from
            << " at " << run.frames[j].time_us << " us";
      }
    }
  }
}

// long_cues: two channels, 50 cue points; multi_audio: four channels, two cue points.
INSTANTIATE_TEST_SUITE_P(Seeds, ControlStressTest,
                         testing::Values(StressCase{"long_cues", 1, 26000000}, StressCase{"long_cues", 7, 26000000},
                                         StressCase{"long_cues", 2026, 26000000},
                                         StressCase{"multi_audio", 3, 2500000}),
                         [](const testing::TestParamInfo<StressCase>& info) {
                           return std::string(info.param.file) + "_seed" + std::to_string(info.param.seed);
                         });

}  // namespace
