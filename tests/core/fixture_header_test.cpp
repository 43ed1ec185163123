// Every real file through the header parse, against what mkvinfo and ffprobe
// report about it: Info, the track records, cues, tags, the FLAC configuration
// and the metadata list. (The frames of the track stored with header removal
// are compared, prefix put back, in the plug-in's playback test.)

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <memory>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include "core/flac_config.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;
using testing_support::HeaderParse;

TEST(FixtureIndexTest, ListsEveryFileOnce) {
  std::vector<std::string> names = testing_support::FixtureNames();
  std::set<std::string> listed(names.begin(), names.end()), on_disk;
  EXPECT_EQ(listed.size(), names.size());
  for (const auto& entry : std::filesystem::directory_iterator(KELVANE_FIXTURE_DIR)) {
    if (entry.path().extension() == ".mkv") on_disk.insert(entry.path().stem().string());
  }
  EXPECT_EQ(listed, on_disk);
}

std::string text(const char* s) { return s ? s : ""; }

std::string type_name(uint64_t track_type) {
  return track_type == 1 ? "video" : track_type == 2 ? "audio" : track_type == 0x11 ? "subtitles" : "other";
}

// mkvinfo lists only the elements a file holds; an absent one has the record's default.
uint64_t field_or(const ExpectedTrack& track, const char* key, uint64_t absent) {
  auto it = track.fields.find(key);
  return it == track.fields.end() ? absent : std::stoull(it->second);
}

void expect_track_matches(const mkv_track_info& track, const ExpectedTrack& want) {
  SCOPED_TRACE("track " + std::to_string(want.number));
  EXPECT_EQ(track.track_number, want.number);
  EXPECT_EQ(track.track_uid, want.uid);
  EXPECT_EQ(type_name(track.track_type), want.type);
  EXPECT_EQ(text(track.codec_id), want.codec);
  EXPECT_EQ(text(track.language), want.language);
  EXPECT_EQ(track.codec_private_size, want.codec_private_size);
  EXPECT_EQ(track.pixel_width, want.width);
  EXPECT_EQ(track.pixel_height, want.height);
  EXPECT_EQ(track.display_unit, field_or(want, "display_unit", 0));
  EXPECT_EQ(track.default_duration, want.default_duration);
  EXPECT_DOUBLE_EQ(track.sampling_frequency, want.fields.count("sampling_frequency") ? want.sampling_frequency : 8000.0);
  EXPECT_EQ(track.channels, field_or(want, "channels", 1));
  EXPECT_EQ(track.bit_depth, want.bit_depth);
  EXPECT_EQ(track.flag_default, field_or(want, "flag_default", 1));
  EXPECT_EQ(track.flag_lacing, field_or(want, "flag_lacing", 1));
  EXPECT_EQ(track.compressed, want.fields.count("compression"));
  EXPECT_EQ(track.encrypted, want.fields.count("encryption"));
  if (want.fields.count("compression") && track.content_encoding_count > 0) {
    const std::string& algorithm = want.fields.at("compression");
    EXPECT_EQ(track.content_encodings[0].comp_algo, algorithm == "zlib" ? 0u : algorithm == "header_removal" ? 3u : 99u);
  }
  if (want.codec == "A_FLAC") {
    mkv_flac_config config{};
    ASSERT_EQ(parse_flac_stream_header(track.codec_private, track.codec_private_size, &config), kStatusOk);
    EXPECT_EQ(config.sample_rate, want.flac_sample_rate);
    EXPECT_EQ(config.channels, want.flac_channels);
    EXPECT_EQ(config.bits_per_sample, want.flac_bits);
  }
}

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

void expect_metadata_matches(const mkv_metadata_list& list, const FixtureExpectation& expected) {
  // First the offered tags, in file order, without a NUL.
  const char* offered[][2] = {{"TITLE", "Name"}, {"ARTIST", "Artist"}, {"GENRE", "Genre"}, {"ALBUM", "Album"},
                              {"COMMENT", "Comment"}};
  std::vector<std::pair<std::string, std::string>> offered_expected, offered_listed;
  for (const auto& [tag_name, value] : expected.tags) {
    for (const auto& row : offered) {
      if (tag_name == row[0]) offered_expected.emplace_back(row[1], value);
    }
  }
  for (int i = 0; i < list.entry_count && list.value_type[i] == kMetadataTypeUtf8; ++i) {
    offered_listed.emplace_back(list.key[i], std::string(static_cast<const char*>(list.value[i]),
                                                         static_cast<size_t>(list.value_size[i])));
  }
  EXPECT_EQ(offered_listed, offered_expected);
  EXPECT_EQ(numbers(list, "Seekable"), std::vector<int64_t>{expected.cue_point_count > 0 ? 1 : 0});

  // Then nine entries per audio or video track, with the tools' figures.
  std::vector<int64_t> widths, heights, channels, rates, fourcc_zero;
  std::vector<std::pair<int64_t, int64_t>> shapes;  // -1: not compared
  for (const auto& track : expected.tracks) {
    if (track.type != "video" && track.type != "audio") continue;
    bool video = track.type == "video";
    widths.push_back(video ? static_cast<int64_t>(track.width) : 0);
    heights.push_back(video ? static_cast<int64_t>(track.height) : 0);
    channels.push_back(video ? 0 : static_cast<int64_t>(track.channels ? track.channels : 1));
    rates.push_back(video ? (track.default_duration ? (10000000000 / track.default_duration + 5) / 10 : 0)
                          : static_cast<int64_t>(track.sampling_frequency ? track.sampling_frequency : 8000.0));
    // An unsupported codec parses like any other but gets no four-character code.
    fourcc_zero.push_back(track.codec == "A_OPUS" || track.codec.rfind("V_VP", 0) == 0);
    // The framework reads the pixel shape from AVC and MPEG-4 part 2
    // configurations only. ffprobe takes it from the container instead when a
    // display size in pixels differs from the picture: such a track is not compared.
    bool shaped = video && track.sar_num != 0 && (track.codec == "V_MPEG4/ISO/AVC" || track.codec == "V_MPEG4/ISO/ASP");
    bool from_container = field_or(track, "display_unit", 0) == 0 && field_or(track, "display_width", 0) != 0 &&
                          (field_or(track, "display_width", 0) != track.width ||
                           field_or(track, "display_height", 0) != track.height);
    shapes.emplace_back(!shaped ? std::pair<int64_t, int64_t>{1, 1}
                        : from_container ? std::pair<int64_t, int64_t>{-1, -1}
                                         : std::pair<int64_t, int64_t>{track.sar_num, track.sar_den});
  }
  EXPECT_EQ(list.entry_count, static_cast<int32_t>(offered_expected.size() + 2 + 9 * widths.size()));
  EXPECT_EQ(numbers(list, "Width"), widths);
  EXPECT_EQ(numbers(list, "Height"), heights);
  EXPECT_EQ(numbers(list, "Channels"), channels);
  EXPECT_EQ(numbers(list, "SampleRate"), rates);
  std::vector<int64_t> fourccs = numbers(list, "Fourcc"), pixel_widths = numbers(list, "PixelWidth"),
                       pixel_heights = numbers(list, "PixelHeight"), durations = numbers(list, "Duration");
  ASSERT_EQ(fourccs.size(), widths.size());
  ASSERT_EQ(pixel_widths.size(), widths.size());
  ASSERT_EQ(pixel_heights.size(), widths.size());
  ASSERT_EQ(durations.size(), widths.size());
  for (size_t i = 0; i < widths.size(); ++i) {
    EXPECT_EQ(fourccs[i] == 0, fourcc_zero[i] != 0) << "track " << i;
    if (shapes[i].first >= 0) {
      EXPECT_EQ(std::make_pair(pixel_widths[i], pixel_heights[i]), shapes[i]) << "track " << i;
    }
    // mkvinfo prints nanoseconds rounded from the same double.
    EXPECT_NEAR(static_cast<double>(durations[i]), static_cast<double>(expected.duration_ns / 1000), 1.0);
  }
}

class FixtureHeaderTest : public testing::TestWithParam<std::string> {};

TEST_P(FixtureHeaderTest, AgreesWithMkvinfoAndFfprobe) {
  FixtureExpectation expected = testing_support::LoadFixture(GetParam());
  std::unique_ptr<mkv_metadata_list, void (*)(mkv_metadata_list*)> list(mem_new_zeroed<mkv_metadata_list>(),
                                                                        FreeMetadata);
  ASSERT_NE(list, nullptr);
  HeaderParse parse(testing_support::ReadFixtureBytes(GetParam()), {.metadata = list.get()});
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  const mkv_file_info& info = parse.info();

  EXPECT_EQ(info.timecode_scale, expected.timecode_scale);
  if (expected.has_duration) {
    EXPECT_NEAR(info.duration * static_cast<double>(info.timecode_scale), static_cast<double>(expected.duration_ns), 1.0);
  }
  EXPECT_EQ(text(info.title), expected.title);
  EXPECT_EQ(text(info.muxing_app), expected.muxing_app);
  EXPECT_EQ(text(info.writing_app), expected.writing_app);

  ASSERT_EQ(info.track_count, expected.tracks.size());
  uint32_t video = 0, audio = 0;
  for (uint32_t i = 0; i < info.track_count; ++i) {
    expect_track_matches(info.tracks[i], expected.tracks[i]);
    video += expected.tracks[i].type == "video";
    audio += expected.tracks[i].type == "audio";
  }
  EXPECT_EQ(info.video_track_count, video);
  EXPECT_EQ(info.audio_track_count, audio);

  std::vector<Cue> cues;
  for (const auto& cue : expected.cues) cues.emplace_back(cue.time_ticks, cue.track, cue.cluster_position, cue.block_number);
  EXPECT_EQ(info.cue_points.count, expected.cue_point_count);
  EXPECT_EQ(cues_of(info), cues);
  EXPECT_EQ((info.parse_flags & kMetCues) != 0, expected.cue_point_count > 0);

  std::vector<std::pair<std::string, std::string>> tags;
  for (uint32_t i = 0; i < info.tag_count; ++i) tags.emplace_back(text(info.tags[i].name), text(info.tags[i].string));
  EXPECT_EQ(tags, expected.tags);

  expect_metadata_matches(*list, expected);
}

INSTANTIATE_TEST_SUITE_P(Fixtures, FixtureHeaderTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const auto& info) { return info.param; });

}  // namespace
