// ConvertToPosition, ConvertToTime and Seek through the plug-in's tables on
// long_cues (cue table from mkvinfo) and no_cues.

#include <gtest/gtest.h>

#include "tests/plugin/graph_harness.h"
#include "tests/support/playback_expectations.h"

namespace {

using plugin_test::Connected;
using plugin_test::ConnectFile;
using plugin_test::HostPlugin;

struct Converter {
  MmfFilterHandle* handle;
  int ToPosition(uint64_t time, uint64_t* position) const {
    return HostPlugin().converter()->ConvertToPosition(handle, 0, time, position);
  }
  int ToTime(uint64_t position, uint64_t* time) const {
    return HostPlugin().converter()->ConvertToTime(handle, 0, position, time);
  }
};

TEST(TimeConversionTest, LongCuesConvertsThroughItsCueTable) {
  const playback_test::CueModel cues("long_cues");
  Connected c = ConnectFile("long_cues");
  ASSERT_EQ(c.graph->rating(), 80);
  Converter convert{c.graph->handle()};
  ASSERT_EQ(cues.times.size(), 50u);
  for (size_t i = 0; i < cues.times.size(); ++i) {
    SCOPED_TRACE(i);
    const bool last = i + 1 == cues.times.size();
    uint64_t position = 0, time = 1;
    EXPECT_EQ(convert.ToPosition(cues.times[i], &position), 0);
    EXPECT_EQ(position, cues.positions[last ? i - 1 : i]);  // the last cue's own time gives the one before
    EXPECT_EQ(convert.ToPosition(cues.times[i] + 1, &position), 0);
    EXPECT_EQ(position, cues.positions[i]);
    EXPECT_EQ(convert.ToTime(cues.positions[i], &time), 0);
    EXPECT_EQ(time, cues.times[i]);
    EXPECT_EQ(convert.ToTime(cues.positions[i] + 1, &time), 0);
    EXPECT_EQ(time, last ? 0 : cues.times[i]);  // between two clusters: the earlier cue
  }
  uint64_t time = 1;
  EXPECT_EQ(convert.ToTime(cues.positions[0] - 1, &time), 0);
  EXPECT_EQ(time, 0u);
}

TEST(TimeConversionTest, WithoutCuesOnlyTheFirstClusterConverts) {
  const uint64_t first_cluster = playback_test::CueModel("no_cues").first_cluster;
  Connected c = ConnectFile("no_cues");
  ASSERT_EQ(c.graph->rating(), 80);
  Converter convert{c.graph->handle()};
  uint64_t position = 0, time = 1;
  EXPECT_EQ(convert.ToPosition(0, &position), 0);
  EXPECT_EQ(position, first_cluster);
  EXPECT_EQ(convert.ToPosition(1, &position), 4002);
  EXPECT_EQ(convert.ToTime(first_cluster, &time), 0);
  EXPECT_EQ(time, 0u);
  EXPECT_EQ(convert.ToTime(first_cluster + 1, &time), 4002);
  EXPECT_EQ(HostPlugin().seeker()->Seek(c.graph->handle(), 0, 0, first_cluster), 0);
}

// What the channels then deliver is checked by the controlled seeks.
TEST(TimeConversionTest, WithPrerollConvertToTimeReportsTheAskedTime) {
  Connected c = ConnectFile("long_cues");
  ASSERT_EQ(c.graph->rating(), 80);
  const int32_t enable = 1;
  ASSERT_EQ(HostPlugin().resources()->SetResource(c.graph->handle(), "EnablePreroll", &enable), 0);
  Converter convert{c.graph->handle()};
  uint64_t position = 0, time = 0;
  ASSERT_EQ(convert.ToPosition(7000000, &position), 0);
  EXPECT_EQ(convert.ToTime(12345, &time), 0);
  EXPECT_EQ(time, 7000000u);
  EXPECT_EQ(convert.ToTime(position, &time), 0);
  EXPECT_EQ(time, 7000000u);  // long_cues has a cue point every 0.5 s
}

}  // namespace
