// ConvertToPosition, ConvertToTime and Seek through the plug-in's tables on
// long_cues (cue table from mkvinfo) and no_cues; file offsets found in the
// file's own bytes.

#include <algorithm>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/plugin/graph_harness.h"
#include "tests/support/fixtures.h"

namespace {

using plugin_test::Connected;
using plugin_test::ConnectFile;
using plugin_test::HostPlugin;

size_t Find(const std::vector<uint8_t>& bytes, std::vector<uint8_t> pattern, size_t from = 0) {
  return size_t(std::search(bytes.begin() + ptrdiff_t(from), bytes.end(), pattern.begin(), pattern.end()) -
                bytes.begin());
}

// Offset of the Segment's data: after its ID and its size field.
uint64_t SegmentData(const std::vector<uint8_t>& bytes) {
  size_t id = Find(bytes, {0x18, 0x53, 0x80, 0x67});
  uint8_t first = bytes.at(id + 4);
  int length = 1;
  while (!(first & (0x80 >> (length - 1)))) ++length;
  return id + 4 + uint64_t(length);
}

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
  testing_support::FixtureExpectation fx = testing_support::LoadFixture("long_cues");
  const uint64_t segment = SegmentData(testing_support::ReadFixtureBytes("long_cues"));
  Connected c = ConnectFile("long_cues");
  ASSERT_EQ(c.graph->rating(), 80);
  Converter convert{c.graph->handle()};
  const auto& cues = fx.cues;
  ASSERT_EQ(cues.size(), 50u);
  const uint64_t us_per_tick = fx.timecode_scale / 1000;
  auto time_of = [&](size_t i) { return cues[i].time_ticks * us_per_tick; };
  auto position_of = [&](size_t i) { return cues[i].cluster_position + segment; };

  for (size_t i = 0; i < cues.size(); ++i) {
    SCOPED_TRACE(i);
    const bool last = i + 1 == cues.size();
    uint64_t position = 0, time = 1;
    EXPECT_EQ(convert.ToPosition(time_of(i), &position), 0);
    EXPECT_EQ(position, position_of(last ? i - 1 : i));  // the last cue's own time gives the one before
    EXPECT_EQ(convert.ToPosition(time_of(i) + 1, &position), 0);
    EXPECT_EQ(position, position_of(i));

    EXPECT_EQ(convert.ToTime(position_of(i), &time), 0);
    EXPECT_EQ(time, time_of(i));
    EXPECT_EQ(convert.ToTime(position_of(i) + 1, &time), 0);
    EXPECT_EQ(time, last ? 0 : time_of(i));  // between two clusters: the earlier cue
  }
  uint64_t time = 1;
  EXPECT_EQ(convert.ToTime(position_of(0) - 1, &time), 0);
  EXPECT_EQ(time, 0u);
}

TEST(TimeConversionTest, WithoutCuesOnlyTheFirstClusterConverts) {
  const std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("no_cues");
  const uint64_t first_cluster = Find(bytes, {0x1F, 0x43, 0xB6, 0x75}, size_t(SegmentData(bytes)));
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

TEST(TimeConversionTest, PrerollReportsTheAskedTimeOnceAndMarksAcquiredChannels) {
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

  EXPECT_EQ(HostPlugin().seeker()->Seek(c.graph->handle(), 0, 7000000, position), 0);
  for (int32_t k = 0; k < c.channel_count(); ++k) {
    EXPECT_EQ(c.channel(k).State->PrerollTime, 7000000u);
    EXPECT_EQ(c.channel(k).State->PrerollPending, 1);
  }
}

}  // namespace
