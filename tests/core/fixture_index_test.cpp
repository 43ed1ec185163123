// Cues, tags and the metadata list of every real file against what mkvinfo
// and ffprobe report about it.

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <tuple>
#include <vector>

#include "core/header/element_walker.h"
#include "core/status.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

using testing_support::ExpectedCue;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;

using Cue = std::tuple<uint64_t, uint64_t, uint64_t, uint64_t>;  // time, track, cluster position, block

std::vector<Cue> cues_of(const mkv_file_info& info) {
  std::vector<Cue> out;
  mkv_queue_node* point_node = info.cue_points.head;
  for (uint32_t p = 0; p < info.cue_points.count; ++p, point_node = point_node->next) {
    const auto* point = static_cast<const mkv_cue_point*>(point_node->data);
    mkv_queue_node* node = point->track_positions.head;
    for (uint32_t t = 0; t < point->track_positions.count; ++t, node = node->next) {
      const auto* position = static_cast<const mkv_cue_track_position*>(node->data);
      out.emplace_back(point->cue_time, position->cue_track, position->cue_cluster_position, position->cue_block_number);
    }
  }
  return out;
}

std::vector<Cue> cues_of(const std::vector<ExpectedCue>& cues) {
  std::vector<Cue> out;
  for (const ExpectedCue& cue : cues) out.emplace_back(cue.time_ticks, cue.track, cue.cluster_position, cue.block_number);
  return out;
}

std::string text_value(const mkv_metadata_list& list, int i) {
  return std::string(static_cast<const char*>(list.value[i]), static_cast<size_t>(list.value_size[i]));
}

// The values of every entry under `key`, in list order, as numbers.
std::vector<int64_t> numbers(const mkv_metadata_list& list, const char* key) {
  std::vector<int64_t> out;
  for (int i = 0; i < list.entry_count; ++i) {
    if (std::strcmp(list.key[i], key) != 0) continue;
    if (list.value_type[i] == kMetadataTypeNum8) out.push_back(*static_cast<const int64_t*>(list.value[i]));
    else out.push_back(*static_cast<const uint32_t*>(list.value[i]));
  }
  return out;
}

TEST(ParseMkvfileFixtureTest, CuesTagsAndMetadataAgreeWithTheTools) {
  const char* offered[][2] = {{"TITLE", "Name"}, {"ARTIST", "Artist"}, {"GENRE", "Genre"}, {"ALBUM", "Album"},
                              {"COMMENT", "Comment"}};
  std::vector<std::string> names = testing_support::FixtureNames();
  ASSERT_FALSE(names.empty());
  for (const std::string& name : names) {
    SCOPED_TRACE(name);
    testing_support::FixtureExpectation expected = testing_support::LoadFixture(name);
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    HeaderParse parse(testing_support::ReadFixtureBytes(name), HeaderParseOptions{.metadata = list});
    ASSERT_EQ(parse.Parse(), kParseSucceeded);
    const mkv_file_info& info = parse.info();

    EXPECT_EQ(info.cue_points.count, expected.cue_point_count);
    EXPECT_EQ(cues_of(info), cues_of(expected.cues));
    EXPECT_EQ((info.parse_flags & kMetCues) != 0, expected.cue_point_count > 0);

    std::vector<std::pair<std::string, std::string>> tags;
    for (uint32_t i = 0; i < info.tag_count; ++i) {
      tags.emplace_back(info.tags[i].name ? info.tags[i].name : "", info.tags[i].string ? info.tags[i].string : "");
    }
    EXPECT_EQ(tags, expected.tags);

    // The list starts with the offered tags, in file order, without a NUL.
    std::vector<std::pair<std::string, std::string>> offered_expected, offered_listed;
    for (const auto& [tag_name, text] : expected.tags) {
      for (const auto& row : offered) {
        if (tag_name == row[0]) offered_expected.emplace_back(row[1], text);
      }
    }
    for (int i = 0; i < list->entry_count && list->value_type[i] == kMetadataTypeUtf8; ++i) {
      offered_listed.emplace_back(list->key[i], text_value(*list, i));
    }
    EXPECT_EQ(offered_listed, offered_expected);
    EXPECT_EQ(numbers(*list, "Seekable"), std::vector<int64_t>{expected.cue_point_count > 0 ? 1 : 0});

    // Nine entries per audio or video track, with the tools' figures.
    std::vector<int64_t> widths, heights, channels, rates, durations, pixel_widths, pixel_heights;
    for (const auto& track : expected.tracks) {
      if (track.type != "video" && track.type != "audio") continue;
      bool video = track.type == "video";
      widths.push_back(video ? static_cast<int64_t>(track.width) : 0);
      heights.push_back(video ? static_cast<int64_t>(track.height) : 0);
      channels.push_back(video ? 0 : static_cast<int64_t>(track.channels ? track.channels : 1));
      rates.push_back(video ? (track.default_duration ? (10000000000 / track.default_duration + 5) / 10 : 0)
                            : static_cast<int64_t>(track.sampling_frequency ? track.sampling_frequency : 8000.0));
      durations.push_back(static_cast<int64_t>(expected.duration_ns / 1000));
      // The framework reads the pixel shape from AVC and MPEG-4 part 2
      // configurations only. ffprobe's figure comes from the container
      // instead when a display size in pixels differs from the picture size:
      // such a track is not compared (-1).
      bool shaped = video && track.sar_num != 0 && (track.codec == "V_MPEG4/ISO/AVC" || track.codec == "V_MPEG4/ISO/ASP");
      auto field = [&](const char* key) { return track.fields.count(key) ? track.fields.at(key) : std::string(); };
      bool from_container = !field("display_width").empty() && field("display_unit").empty() &&
                            (field("display_width") != std::to_string(track.width) ||
                             field("display_height") != std::to_string(track.height));
      pixel_widths.push_back(shaped && from_container ? -1 : shaped ? int64_t{track.sar_num} : 1);
      pixel_heights.push_back(shaped && from_container ? -1 : shaped ? int64_t{track.sar_den} : 1);
    }
    EXPECT_EQ(list->entry_count, static_cast<int32_t>(offered_expected.size() + 2 + 9 * widths.size()));
    EXPECT_EQ(numbers(*list, "Width"), widths);
    EXPECT_EQ(numbers(*list, "Height"), heights);
    EXPECT_EQ(numbers(*list, "Channels"), channels);
    EXPECT_EQ(numbers(*list, "SampleRate"), rates);
    std::vector<int64_t> listed_widths = numbers(*list, "PixelWidth"), listed_heights = numbers(*list, "PixelHeight");
    ASSERT_EQ(listed_widths.size(), pixel_widths.size());
    ASSERT_EQ(listed_heights.size(), pixel_heights.size());
    for (size_t i = 0; i < pixel_widths.size(); ++i) {
      if (pixel_widths[i] < 0) continue;
      EXPECT_EQ(listed_widths[i], pixel_widths[i]) << "track " << i;
      EXPECT_EQ(listed_heights[i], pixel_heights[i]) << "track " << i;
    }
    // A track is offered only with a codec the player supports: Opus parses
    // like any other track but gets no four-character code.
    std::vector<int64_t> fourccs = numbers(*list, "Fourcc");
    ASSERT_EQ(fourccs.size(), widths.size());
    size_t av_index = 0;
    for (const auto& track : expected.tracks) {
      if (track.type != "video" && track.type != "audio") continue;
      EXPECT_EQ(fourccs[av_index++] == 0, track.codec == "A_OPUS" || track.codec.rfind("V_VP", 0) == 0) << track.codec;
    }
    std::vector<int64_t> listed_durations = numbers(*list, "Duration");
    ASSERT_EQ(listed_durations.size(), durations.size());
    for (size_t i = 0; i < durations.size(); ++i) {
      // mkvinfo prints nanoseconds rounded from the same double.
      EXPECT_NEAR(static_cast<double>(listed_durations[i]), static_cast<double>(durations[i]), 1.0);
    }
    FreeMetadata(list);
  }
}

TEST(ParseMkvfileFixtureTest, IndexBehindTheClustersIsReachedWithoutReadingThem) {
  testing_support::FixtureExpectation expected = testing_support::LoadFixture("long_cues");
  HeaderParse parse(testing_support::ReadFixtureBytes("long_cues"));
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(parse.info().cue_points.count, 50u);
  EXPECT_EQ(parse.info().tag_count, expected.tags.size());
  EXPECT_LT(parse.input().counters().bytes_read, expected.file_size / 10);
}

}  // namespace
