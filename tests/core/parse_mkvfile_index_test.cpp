#include <gtest/gtest.h>

#include <string>

#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/indexed_file.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;
using testing_support::IndexedFile;

Bytes video_track(uint64_t number) {
  return master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, 1), str(kCodecId, "V_MPEG4/ISO/AVC"),
                              bin(kCodecPrivate, filler(12, 0x01)), uinteger(kDefaultDuration, 40000000),
                              master(kVideo, {uinteger(kPixelWidth, 320), uinteger(kPixelHeight, 240)})});
}
Bytes audio_track(uint64_t number) {
  return master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, 2), str(kCodecId, "A_AC3"),
                              master(kAudio, {f64(kSamplingFrequency, 48000.0), uinteger(kChannels, 2)})});
}
Bytes simple_tag(std::string_view name, std::string_view value) {
  return master(kSimpleTag, {str(kTagName, name), str(kTagString, value)});
}

// SeekHead, Info, Tracks (tracks alternate video, audio), a Cluster, Cues, Tags.
Bytes indexed_file(int track_count, int tag_count) {
  Bytes tracks;
  for (int i = 0; i < track_count; ++i) {
    Bytes track = i % 2 ? audio_track(static_cast<uint64_t>(i + 1)) : video_track(static_cast<uint64_t>(i + 1));
    tracks.insert(tracks.end(), track.begin(), track.end());
  }
  Bytes tags;
  const char* names[] = {"TITLE", "ARTIST", "GENRE", "ALBUM", "COMMENT", "ENCODER"};
  for (int i = 0; i < tag_count; ++i) {
    Bytes tag = simple_tag(names[i % 6], "value " + std::to_string(i));
    tags.insert(tags.end(), tag.begin(), tag.end());
  }
  Bytes cues = master(kCues, {master(kCuePoint, {uinteger(kCueTime, 0), master(kCueTrackPositions, {uinteger(kCueTrack, 1), uinteger(kCueClusterPosition, 300), master(kCueReference, {uinteger(kCueRefTime, 1)})})}),
                              master(kCuePoint, {uinteger(kCueTime, 40), master(kCueTrackPositions, {uinteger(kCueTrack, 2), uinteger(kCueClusterPosition, 300)})})});
  return IndexedFile({{master(kInfo, {uinteger(kTimecodeScale, 1000000), f64(kDuration, 2000.0), str(kTitle, "t")}), kInfo},
                      {element(kTracks, tracks), kTracks},
                      {master(kCluster, {uinteger(kTimecode, 0), bin(kSimpleBlock, filler(600))})},
                      {cues, kCues},
                      {element(kTags, master(kTag, {tags})), kTags}});
}

TEST(ParseMkvfileTest, MetadataListHasMatchingTagsPlusTwoPlusNinePerTrack) {
  const struct {
    int tracks;
    int tags;  // every sixth is an ENCODER tag, which is not offered
    int32_t entries;
    const char* last_key;
  } cases[] = {
      {1, 0, 11, "SampleRate"}, {2, 6, 25, "SampleRate"}, {3, 1, 30, "SampleRate"},
      {22, 50, 242, "SampleRate"},
      {23, 50, 250, "Channels"},  // 42 tags + 2 + 9 x 22 = 242: the 23rd track adds eight of its nine
      {24, 50, 250, "Channels"},
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

// Every allocation of a header parse with seek lists, cues and tags fails in
// turn: a failure during the walk ends the parse with -4, one while the list
// is built leaves a successful parse with a shorter list, and nothing leaks.
TEST(ParseMkvfileTest, EveryFailedAllocationIsAnsweredAndLeaksNothing) {
  Bytes file = indexed_file(3, 7);
  uint64_t walk_allocations;
  uint64_t all_allocations;
  int32_t full_list;
  {
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    HeaderParse parse(file, HeaderParseOptions{.metadata = list});
    uint64_t before = host::AllocationCount();
    ASSERT_EQ(parse.Parse(), kParseSucceeded);
    all_allocations = host::AllocationCount() - before;
    full_list = list->entry_count;
    walk_allocations = all_allocations - 2 * static_cast<uint64_t>(full_list);
    FreeMetadata(list);
  }
  ASSERT_GT(walk_allocations, 20u);

  for (uint64_t failing = 1; failing <= all_allocations + 1; ++failing) {
    int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    {
      HeaderParse parse(file, HeaderParseOptions{.metadata = list});
      ASSERT_TRUE(parse.stream_ready());
      host::FailNthAllocation(failing);
      int result = parse.Parse();
      host::FailNthAllocation(0);
      if (failing <= walk_allocations) {
        EXPECT_EQ(result, kParseNoMemory) << failing;
        EXPECT_EQ(list->entry_count, 0) << failing;
      } else {
        EXPECT_EQ(result, kParseSucceeded) << failing;
        int32_t expected = failing <= all_allocations
                               ? static_cast<int32_t>((failing - walk_allocations - 1) / 2)
                               : full_list;
        EXPECT_EQ(list->entry_count, expected) << failing;
      }
    }
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live) << failing;
  }
}

}  // namespace
