// Every fixture played through a real graph (streamer → kelvane → one sink
// per acquired channel) at several input buffer sizes: each offered track's
// frames, times, sizes and checksums equal what mkvinfo listed for the file.

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "tests/plugin/graph_harness.h"
#include "tests/plugin/playback_expectations.h"

namespace {

using namespace playback_test;

constexpr uint32_t kBufferSizes[] = {1000, 4096, 32768, 1u << 20};

class PlaybackFixtureTest : public testing::TestWithParam<std::string> {};

TEST_P(PlaybackFixtureTest, EveryTrackDeliversTheListedFramesAtEveryBufferSize) {
  const std::string name = GetParam();
  const FixtureExpectation fixture = testing_support::LoadFixture(name);
  const std::vector<uint64_t> offered = OfferedTracks(fixture);
  if (fixture.doc_type != "matroska" || offered.empty()) {
    host::RunResult refused = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(name), {});
    EXPECT_EQ(refused.rating, 0);
    EXPECT_TRUE(refused.channels.empty());
    return;
  }
  for (uint32_t size : kBufferSizes) {
    SCOPED_TRACE("input buffers of " + std::to_string(size) + " bytes");
    host::RunnerOptions all;
    all.input_buffer_size = size;
    CheckRun(name, fixture, offered, host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(name), all));
    if (offered.size() < 2) continue;
    for (size_t k = 0; k < offered.size(); ++k) {
      SCOPED_TRACE("only channel " + std::to_string(k) + " acquired");
      host::RunnerOptions one = all;
      one.channels = {static_cast<int32_t>(k)};
      CheckRun(name, fixture, offered, host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(name), one));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, PlaybackFixtureTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const testing::TestParamInfo<std::string>& info) { return info.param; });

}  // namespace
