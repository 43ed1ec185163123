// Several channels pulling at different speeds from one ring that fills up:
// each still gets exactly its track's frames. Run under ThreadSanitizer by
// the tsan preset.

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "tests/plugin/graph_harness.h"
#include "tests/plugin/playback_expectations.h"

namespace {

using namespace playback_test;

struct ThreadsCase {
  const char* fixture;
  uint32_t input_buffer_size;
  std::vector<uint32_t> sink_delay_us;  // per channel
};

class PlaybackThreadsTest : public testing::TestWithParam<ThreadsCase> {};

TEST_P(PlaybackThreadsTest, ChannelsAtDifferentSpeedsEachGetTheirWholeTrack) {
  const ThreadsCase& c = GetParam();
  const FixtureExpectation fixture = testing_support::LoadFixture(c.fixture);
  const std::vector<uint64_t> offered = OfferedTracks(fixture);
  ASSERT_GE(offered.size(), 2u);
  host::RunnerOptions options;
  options.input_buffer_size = c.input_buffer_size;
  options.sink_delay_us = c.sink_delay_us;
  CheckRun(c.fixture, fixture, offered,
           host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(c.fixture), options));
}

// Each file is larger than 39 input buffers: while a slow sink
// sleeps after its first buffer, the fast channels fill the ring and wait for
// room until the slow one moves past the tail.
INSTANTIATE_TEST_SUITE_P(
    Speeds, PlaybackThreadsTest,
    testing::Values(ThreadsCase{"long_cues", 1000, {0, 3000}}, ThreadsCase{"long_cues", 1000, {3000, 0}},
                    ThreadsCase{"multi_audio", 1000, {2000, 0, 1000, 0}}, ThreadsCase{"multi_audio", 1000, {0, 0, 0, 3000}}),
    [](const testing::TestParamInfo<ThreadsCase>& info) {
      return std::string(info.param.fixture) + "_" + std::to_string(info.index);
    });

}  // namespace
