// Files whose SeekHead lists their parts: the jump over clusters to the index
// behind them, the metadata list that the header parse builds, and every
// allocation of such a parse failing in turn.

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;

struct SegmentPart {
  Bytes bytes;
  uint32_t listed_as = 0;  // the ID the SeekHead names for this part; 0: not listed
};

// EBML header, then a Segment of a SeekHead and the parts in order. Seek
// positions are written 8 bytes wide, so the SeekHead's size never depends on
// them; `tail` is appended inside the SeekHead after its entries.
Bytes IndexedFile(const std::vector<SegmentPart>& parts, const Bytes& tail = {}) {
  auto seek_head = [&](const std::vector<uint64_t>& positions) {
    Bytes payload;
    for (size_t i = 0; i < parts.size(); ++i) {
      if (parts[i].listed_as == 0) continue;
      payload = cat({payload, master(kSeek, {element(kSeekId, id_bytes(parts[i].listed_as)), uinteger(kSeekPosition, positions[i], 8)})});
    }
    return element(kSeekHead, cat({payload, tail}), 8);
  };
  std::vector<uint64_t> positions(parts.size(), 0);  // from the Segment's data start
  uint64_t position = seek_head(positions).size();
  for (size_t i = 0; i < parts.size(); ++i) {
    positions[i] = position;
    position += parts[i].bytes.size();
  }
  Bytes segment = seek_head(positions);
  for (const SegmentPart& part : parts) segment = cat({segment, part.bytes});
  return cat({ebml_header(), element(kSegment, segment, 8)});
}

Bytes info() { return master(kInfo, {uinteger(kTimecodeScale, 1000000), f64(kDuration, 2000.0), str(kTitle, "t")}); }
Bytes cluster(uint64_t timecode, size_t payload) { return master(kCluster, {uinteger(kTimecode, timecode), bin(kSimpleBlock, filler(payload))}); }
Bytes cue_point(uint64_t time, uint64_t track, const Bytes& more = {}) {
  return master(kCuePoint, {uinteger(kCueTime, time),
                            master(kCueTrackPositions, {uinteger(kCueTrack, track), uinteger(kCueClusterPosition, 300, 8), more})});
}
Bytes tags(const std::vector<std::string>& names, const std::string& value) {
  Bytes out;
  for (size_t i = 0; i < names.size(); ++i) {
    out = cat({out, master(kSimpleTag, {str(kTagName, names[i]), str(kTagString, value + std::to_string(i))})});
  }
  return master(kTags, {element(kTag, out)});
}
// Tracks alternate video and audio.
Bytes tracks(int count) {
  Bytes out;
  for (uint64_t n = 1; n <= uint64_t(count); ++n) {
    out = cat({out, n % 2 ? master(kTrackEntry, {uinteger(kTrackNumber, n), uinteger(kTrackType, 1), str(kCodecId, "V_MPEG4/ISO/AVC"),
                                                 bin(kCodecPrivate, filler(12, 0x01)), uinteger(kDefaultDuration, 40000000),
                                                 master(kVideo, {uinteger(kPixelWidth, 320), uinteger(kPixelHeight, 240)})})
                          : master(kTrackEntry, {uinteger(kTrackNumber, n), uinteger(kTrackType, 2), str(kCodecId, "A_AC3"),
                                                 master(kAudio, {f64(kSamplingFrequency, 48000.0), uinteger(kChannels, 2)})})});
  }
  return element(kTracks, out);
}
// A byte that cannot start an ID: reading it ends the walk of the Segment.
Bytes trap() { return Bytes{0x00, 0x00, 0x00}; }

bool has_tag(const mkv_file_info& info, const char* value) {
  for (uint32_t i = 0; i < info.tag_count; ++i) {
    if (info.tags[i].string && std::strcmp(info.tags[i].string, value) == 0) return true;
  }
  return false;
}

// Segment: SeekHead, Info, Tracks, C1, C2, Tags "middle", trap, C4, Cues, Tags "end".
// The trap stands where a third Cluster would be: a walk that reaches it loses
// the rest of the Segment, so what was read behind it shows whether it was
// jumped over. The walk reads next the first seek target at or after its
// position that is not a Cluster.
TEST(ParseElementTest, SeekTargetsBehindTheClustersAreJumpedTo) {
  const uint32_t no = 0;
  const struct {
    const char* name;
    uint32_t listed[10];  // per part, in the order above
    Bytes seek_head_tail;
    bool middle_tags_read, cues_read;
  } cases[] = {
      {"cues and tags behind everything", {no, no, no, no, no, no, no, kCues, kTags}, {}, false, true},
      {"tags between clusters, then cues", {no, no, no, no, kTags, no, no, kCues, kTags}, {}, true, true},
      {"only clusters", {no, no, kCluster, kCluster, no, no, kCluster}, {}, true, false},
      {"only targets behind the first cluster", {kInfo, kTracks}, {}, true, false},
      {"damaged SeekHead", {no, no, no, no, no, no, no, kCues, kTags}, Bytes{0x00, 0x00}, true, false},
  };
  for (const auto& c : cases) {
    std::vector<SegmentPart> parts = {{info()}, {tracks(1)}, {cluster(0, 2000)}, {cluster(1, 2000)}, {tags({"A"}, "middle")},
                                      {trap()}, {cluster(3, 2000)}, {master(kCues, {cue_point(0, 1)})}, {tags({"A"}, "end")}};
    for (size_t i = 0; i < parts.size(); ++i) parts[i].listed_as = c.listed[i];
    HeaderParse parse(IndexedFile(parts, c.seek_head_tail));
    (void)parse.Parse();
    EXPECT_EQ(has_tag(parse.info(), "middle0"), c.middle_tags_read) << c.name;
    EXPECT_EQ(parse.info().cue_points.count, c.cues_read ? 1u : 0u) << c.name;
    EXPECT_EQ(has_tag(parse.info(), "end0"), c.cues_read) << c.name;
  }
}

TEST(ParseElementTest, SeekHeadMakesTheBytesReadIndependentOfTheFileSize) {
  auto parse_with = [](int clusters, bool listed) {
    std::vector<SegmentPart> parts = {{info(), kInfo}, {tracks(1), kTracks}};
    for (int i = 0; i < clusters; ++i) parts.push_back({cluster(uint64_t(i), 64 * 1024)});
    parts.push_back({master(kCues, {cue_point(0, 1)}), kCues});
    parts.push_back({tags({"A"}, "end"), kTags});
    for (SegmentPart& part : parts) part.listed_as = listed ? part.listed_as : 0;
    HeaderParse parse(IndexedFile(parts));
    (void)parse.Parse();
    EXPECT_EQ(parse.info().cue_points.count, 1u) << clusters << " clusters";
    EXPECT_TRUE(has_tag(parse.info(), "end0")) << clusters << " clusters";
    return parse.input().counters().bytes_read;
  };
  uint64_t small = parse_with(4, true), large = parse_with(160, true);  // about 10 MiB of clusters
  EXPECT_EQ(large, small);
  EXPECT_LT(large, 4096u);
  // Without the SeekHead's entries every Cluster header costs a buffer refill.
  EXPECT_GT(parse_with(160, false), 160u * 64);
}

// SeekHead, Info, Tracks, a Cluster, Cues, Tags (every sixth an ENCODER tag, which is not offered).
Bytes indexed_file(int track_count, int tag_count) {
  std::vector<std::string> names;
  for (int i = 0; i < tag_count; ++i) names.push_back(std::vector<std::string>{"TITLE", "ARTIST", "GENRE", "ALBUM", "COMMENT", "ENCODER"}[i % 6]);
  return IndexedFile({{info(), kInfo},
                      {tracks(track_count), kTracks},
                      {cluster(0, 600)},
                      {master(kCues, {cue_point(0, 1, master(kCueReference, {uinteger(kCueRefTime, 1)})), cue_point(40, 2)}), kCues},
                      {tags(names, "value "), kTags}});
}

TEST(ParseMkvfileTest, MetadataListHasMatchingTagsPlusTwoPlusNinePerTrackUpTo250) {
  const struct {
    int tracks, tags;
    int32_t entries;
    const char* last_key;
  } cases[] = {
      {2, 6, 25, "SampleRate"}, {22, 50, 242, "SampleRate"},
      {23, 50, 250, "Channels"},  // 42 tags + 2 + 9 x 22 = 242: the 23rd track adds eight of its nine
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    {
      HeaderParse parse(indexed_file(c.tracks, c.tags), HeaderParseOptions{.metadata = list});
      ASSERT_EQ(parse.Parse(), kParseSucceeded) << c.tracks << "/" << c.tags;
      EXPECT_EQ(parse.info().tag_count, static_cast<uint32_t>(c.tags));
      EXPECT_EQ(parse.info().cue_points.count, 2u);
    }
    ASSERT_EQ(list->entry_count, c.entries) << c.tracks << "/" << c.tags;
    EXPECT_STREQ(list->key[c.entries - 1], c.last_key) << c.tracks << "/" << c.tags;
    EXPECT_EQ(list->key[c.entries], nullptr);
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live);
  }
}

// A failure during the walk ends the parse with -4, one while the list is
// built leaves a successful parse with a shorter list, and nothing leaks.
TEST(ParseMkvfileTest, EveryFailedAllocationIsAnsweredAndLeaksNothing) {
  Bytes file = indexed_file(3, 7);
  uint64_t all_allocations;
  int32_t full_list;
  {
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    HeaderParse parse(file, HeaderParseOptions{.metadata = list});
    uint64_t before = host::AllocationCount();
    ASSERT_EQ(parse.Parse(), kParseSucceeded);
    all_allocations = host::AllocationCount() - before;
    full_list = list->entry_count;
    FreeMetadata(list);
  }
  uint64_t walk_allocations = all_allocations - 2 * static_cast<uint64_t>(full_list);  // key and value per entry
  ASSERT_GT(walk_allocations, 20u);
  for (uint64_t failing = 1; failing <= all_allocations + 1; ++failing) {
    int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    {
      HeaderParse parse(file, HeaderParseOptions{.metadata = list});
      host::FailNthAllocation(failing);
      int result = parse.Parse();
      host::FailNthAllocation(0);
      EXPECT_EQ(result, failing <= walk_allocations ? kParseNoMemory : kParseSucceeded) << failing;
      int32_t entries = failing <= walk_allocations ? 0
                        : failing <= all_allocations ? static_cast<int32_t>((failing - walk_allocations - 1) / 2)
                                                     : full_list;
      EXPECT_EQ(list->entry_count, entries) << failing;
    }
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live) << failing;
  }
}

}  // namespace
