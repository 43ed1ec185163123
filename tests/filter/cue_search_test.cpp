// GetCueingPosition and ValidateCueingTable, built into this binary (the
// plug-in hides them), over cue tables made in memory: the rules of the
// search and which positions count. Real cue tables are searched through the
// plug-in's seeks and scans.

#include <memory>
#include <vector>

#include <gtest/gtest.h>

#include "core/memory.h"
#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "tests/support/log_recorder.h"

namespace {

constexpr uint64_t kSegmentData = 100;
constexpr uint64_t kNone = 0x7FFFFFFFFFFFFFFF;

struct CuePosition {
  uint64_t track, cluster;
};
struct CueRow {
  uint64_t ticks;
  std::vector<CuePosition> positions;
};

// A filter whose channels carry the given track numbers, and a cue table.
class CueTable {
 public:
  CueTable(const std::vector<CueRow>& rows, const std::vector<uint64_t>& channel_tracks, uint64_t scale = 1000000)
      : context_(std::make_unique<MkvContext>()),
        channels_(channel_tracks.size()),
        states_(channel_tracks.size()),
        tracks_(channel_tracks.size()) {
    filter_.Context = context_.get();
    filter_.OutputChannels = channels_.data();
    context_->OutputChannelCount = int32_t(channel_tracks.size());
    for (size_t k = 0; k < channel_tracks.size(); ++k) {
      tracks_[k].track_number = channel_tracks[k];
      states_[k].Track = &tracks_[k];
      channels_[k].State = &states_[k];
    }
    mkv_file_info& info = context_->FileInfo;
    info.timecode_scale = scale;
    info.segment_data_position = kSegmentData;
    info.parse_flags = rows.empty() ? 0 : kMetCues;
    for (const CueRow& row : rows) {
      auto* cue = mem_new_zeroed<mkv_cue_point>();
      cue->cue_time = row.ticks;
      for (const CuePosition& p : row.positions) {
        auto* position = mem_new_zeroed<mkv_cue_track_position>();
        position->cue_track = p.track;
        position->cue_cluster_position = p.cluster;
        EXPECT_TRUE(mkv_queue_append(&cue->track_positions, position));
      }
      EXPECT_TRUE(mkv_queue_append(&info.cue_points, cue));
    }
  }
  ~CueTable() { free_cue_points(&context_->FileInfo.cue_points); }

  void Acquire(size_t k) { states_[k].Acquired = 1; }

  struct Found {
    int result;
    uint64_t time, position;
  };
  Found Search(uint64_t time_us, bool forward) {
    Found found{0, time_us, 0};
    found.result = GetCueingPosition(&filter_, &found.time, forward, &found.position);
    return found;
  }
  uint32_t flags() const { return context_->CueTableFlags; }

 private:
  MkvFilter filter_{};
  std::unique_ptr<MkvContext> context_;
  std::vector<MkvChannel> channels_;
  std::vector<MkvChannelState> states_;
  std::vector<mkv_track_info> tracks_;
};

// Cue points at 0, 5 and 10 s, each with one cluster of track 1.
const std::vector<CueRow> kThreeCues = {{0, {{1, 1000}}}, {5000, {{1, 2000}}}, {10000, {{1, 3000}}}};

TEST(GetCueingPositionTest, ChoosesTheCuePointByDirection) {
  struct Case {
    uint64_t time_s_x10;  // tenths of a second
    bool forward;
    uint64_t found_s;
    uint64_t cluster;
  };
  const Case cases[] = {
      {70, false, 5, 2000},   {50, false, 5, 2000},  {100, false, 5, 2000}, {120, false, 10, 3000},
      {0, false, 0, 1000},    {50, true, 10, 3000},  {120, true, 10, 3000}, {0, true, 5, 2000},
      {101, false, 10, 3000}, {49, false, 0, 1000},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.time_s_x10 / 10.0 << " s " << (c.forward ? "forward" : "backward"));
    CueTable table(kThreeCues, {1});
    CueTable::Found found = table.Search(c.time_s_x10 * 100000, c.forward);
    EXPECT_EQ(found.result, 0);
    EXPECT_EQ(found.time, c.found_s * 1000000);
    EXPECT_EQ(found.position, c.cluster + kSegmentData);
  }
}

TEST(GetCueingPositionTest, PositionComesFromTheEarliestCountingCluster) {
  struct Case {
    const char* name;
    std::vector<CuePosition> positions;
    std::vector<uint64_t> channel_tracks;
    int acquired;  // channel index, -1 none
    uint64_t position;
  };
  const Case cases[] = {
      {"track without a channel", {{7, 500}}, {1}, -1, kNone},
      {"two counting positions", {{1, 900}, {2, 400}}, {1, 2}, -1, 400 + kSegmentData},
      {"only the acquired track counts", {{2, 400}, {1, 900}}, {1, 2}, 0, 900 + kSegmentData},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CueTable table({{0, c.positions}}, c.channel_tracks);
    if (c.acquired >= 0) table.Acquire(size_t(c.acquired));
    CueTable::Found found = table.Search(0, false);
    EXPECT_EQ(found.result, 0);
    EXPECT_EQ(found.position, c.position);
    EXPECT_EQ(table.flags(), c.acquired >= 0 ? kCueTableValidated : kCueTableValidated | kCueTableAllTracksCount);
  }
}

TEST(GetCueingPositionTest, FileWithoutCuesAnswers48AndWritesNothing) {
  testing_support::LogRecorder log;
  CueTable table({}, {1});
  CueTable::Found found = table.Search(5, true);
  EXPECT_EQ(found.result, 48);
  EXPECT_EQ(found.time, 5u);
  EXPECT_EQ(found.position, 0u);
  EXPECT_TRUE(log.Contains(5, "kelvane: GetCueingPosition no cueing data."));
}

TEST(GetCueingPositionTest, ScaleBelowOneMicrosecondGivesTimeZero) {
  CueTable table({{0, {{1, 10}}}, {900, {{1, 20}}}}, {1}, 999);
  EXPECT_EQ(table.Search(0, true).time, 0u);
}

}  // namespace
