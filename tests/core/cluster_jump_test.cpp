#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "core/header/element_walker.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/indexed_file.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::IndexedFile;
using testing_support::SegmentPart;

Bytes info() { return master(kInfo, {uinteger(kTimecodeScale, 1000000), f64(kDuration, 1000.0)}); }
Bytes tracks() { return master(kTracks, {master(kTrackEntry, {uinteger(kTrackNumber, 1), uinteger(kTrackType, 1)})}); }
Bytes cluster(uint64_t timecode, size_t payload) {
  return master(kCluster, {uinteger(kTimecode, timecode), bin(kSimpleBlock, filler(payload))});
}
Bytes cues(uint64_t cluster_position) {
  return master(kCues, {master(kCuePoint, {uinteger(kCueTime, 0), master(kCueTrackPositions, {uinteger(kCueTrack, 1),
                                                                                               uinteger(kCueClusterPosition, cluster_position, 8)})})});
}
Bytes tags(const char* title) {
  return master(kTags, {master(kTag, {master(kSimpleTag, {str(kTagName, "TITLE"), str(kTagString, title)})})});
}
// A byte that cannot start an ID: reading it ends the walk of the Segment.
Bytes trap() { return Bytes{0x00, 0x00, 0x00}; }

bool has_tag(mkv_file_info& info, const char* value) {
  for (uint32_t i = 0; i < info.tag_count; ++i) {
    if (info.tags[i].string && std::strcmp(info.tags[i].string, value) == 0) return true;
  }
  return false;
}

// Segment: SeekHead, Info, Tracks, C1, C2, Tags "middle", trap, C4, Cues, Tags "end".
// The trap stands where a third Cluster would be: a walk that reaches it loses
// the rest of the Segment, so what was read behind it shows whether it was
// jumped over.
TEST(ParseElementTest, FirstSeekTargetAtOrAfterTheCurrentPositionThatIsNotAClusterIsReadNext) {
  const uint32_t no = 0;
  const struct {
    const char* name;
    uint32_t listed[10];  // per part, in the order above
    Bytes seek_head_tail;
    bool middle_tags_read;
    bool cues_read;
  } cases[] = {
      {"cues and tags behind everything", {no, no, no, no, no, no, no, kCues, kTags}, {}, false, true},
      {"tags between clusters, then cues", {no, no, no, no, kTags, no, no, kCues, kTags}, {}, true, true},
      {"only clusters", {no, no, kCluster, kCluster, no, no, kCluster}, {}, true, false},
      {"cues listed under the Cluster ID", {no, no, no, no, no, no, no, kCluster}, {}, true, false},
      {"only targets behind the first cluster", {kInfo, kTracks}, {}, true, false},
      {"damaged SeekHead", {no, no, no, no, no, no, no, kCues, kTags}, Bytes{0x00, 0x00}, true, false},
      {"no entries", {}, {}, true, false},
  };
  for (const auto& c : cases) {
    std::vector<SegmentPart> parts = {{info()},      {tracks()}, {cluster(0, 2000)}, {cluster(1, 2000)},
                                      {tags("middle")}, {trap()},   {cluster(3, 2000)}, {cues(0)},
                                      {tags("end")}};
    for (size_t i = 0; i < parts.size(); ++i) parts[i].listed_as = c.listed[i];
    HeaderParse parse(IndexedFile(parts, c.seek_head_tail));
    (void)parse.Parse();
    EXPECT_EQ(has_tag(parse.info(), "middle"), c.middle_tags_read) << c.name;
    EXPECT_EQ(parse.info().cue_points.count, c.cues_read ? 1u : 0u) << c.name;
    EXPECT_EQ(has_tag(parse.info(), "end"), c.cues_read) << c.name;
  }
}

struct ParseCost {
  uint64_t bytes_read;
  uint32_t cue_points;
  bool tags_read;
};

ParseCost parse_file_with_clusters(int clusters, bool listed) {
  constexpr size_t kClusterPayload = 64 * 1024;
  std::vector<SegmentPart> parts = {{info(), kInfo}, {tracks(), kTracks}};
  for (int i = 0; i < clusters; ++i) parts.push_back({cluster(static_cast<uint64_t>(i), kClusterPayload)});
  parts.push_back({cues(0), kCues});
  parts.push_back({tags("end"), kTags});
  if (!listed) {
    for (SegmentPart& part : parts) part.listed_as = 0;
  }
  HeaderParse parse(IndexedFile(parts));
  (void)parse.Parse();
  return {parse.input().counters().bytes_read, parse.info().cue_points.count, has_tag(parse.info(), "end")};
}

TEST(ParseElementTest, SeekHeadMakesTheBytesReadIndependentOfTheFileSize) {
  ParseCost small = parse_file_with_clusters(4, true);
  ParseCost large = parse_file_with_clusters(160, true);  // about 10 MiB of clusters
  EXPECT_EQ(small.cue_points, 1u);
  EXPECT_EQ(large.cue_points, 1u);
  EXPECT_TRUE(small.tags_read);
  EXPECT_TRUE(large.tags_read);
  EXPECT_EQ(large.bytes_read, small.bytes_read);
  EXPECT_LT(large.bytes_read, 4096u);

  // Without the SeekHead's entries every Cluster header costs a buffer refill.
  ParseCost walked = parse_file_with_clusters(160, false);
  EXPECT_EQ(walked.cue_points, 1u);
  EXPECT_GT(walked.bytes_read, 160u * 64);
}

}  // namespace
