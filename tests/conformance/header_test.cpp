// Every real file through the header parse, against what mkvinfo and ffprobe
// report about it: Info, the track records, the picture the framework's
// decoder-configuration parser sees in each AVC and MPEG-4 track, the FLAC
// configuration, cues and tags; the metadata list is built (its rules are
// pinned on crafted files in tests/core/header_test.cpp). (The frames of the
// track stored with header removal are compared, prefix put back, when
// playback_test.cpp here plays it.)

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <memory>
#include <numeric>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include "core/codec_table.h"
#include "core/flac_config.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "platform/decoder_config.h"
#include "tests/support/cluster_driver.h"
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
  for (const auto& entry : std::filesystem::directory_iterator(testing_support::FixturePath("."))) {
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

// ffprobe takes the pixel shape from the container, not from the codec's
// configuration, when a display size in pixels differs from the picture.
bool shape_from_container(const ExpectedTrack& t) {
  const uint64_t width = field_or(t, "display_width", 0), height = field_or(t, "display_height", 0);
  return field_or(t, "display_unit", 0) == 0 && width && height && (width != t.width || height != t.height);
}

// The track record against mkvinfo's; the picture the framework reads from an
// AVC or MPEG-4 part 2 configuration against ffprobe's.
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
    EXPECT_EQ(parse_flac_stream_header(track.codec_private, track.codec_private_size, &config), kStatusOk);
    EXPECT_EQ(config.sample_rate, want.flac_sample_rate);
    EXPECT_EQ(config.channels, want.flac_channels);
    EXPECT_EQ(config.bits_per_sample, want.flac_bits);
  }
  const uint32_t fourcc = lookup_codec_fourcc(track.codec_id);
  // A Video for Windows track's CodecPrivate is a BITMAPINFOHEADER, which the framework's parser does not read.
  if (want.type != "video" || (fourcc != fourcc_value("AVC1") && fourcc != fourcc_value("MP4V")) || !track.codec_private ||
      want.codec == "V_MS/VFW/FOURCC")
    return;
  MmDecoderConfigInfo config = {0, 0, 1, 1};
  EXPECT_EQ(MmParseDecoderConfig(track.codec_private, track.codec_private_size, fourcc, &config, 0), 0);
  EXPECT_EQ(config.Width, want.width);
  EXPECT_EQ(config.Height, want.height);
  const uint32_t divisor = std::gcd(config.PixelAspectWidth, config.PixelAspectHeight);
  const int64_t num = config.PixelAspectWidth / divisor, den = config.PixelAspectHeight / divisor;
  if (shape_from_container(want)) {  // which mkvmerge derived from the codec's
    EXPECT_EQ(field_or(want, "display_height", 0), want.height);
    EXPECT_EQ(field_or(want, "display_width", 0), (want.width * uint64_t(num) + uint64_t(den) / 2) / uint64_t(den));
  } else {
    EXPECT_NE(want.sar_num, 0u) << "ffprobe reported no aspect ratio";
    const uint32_t theirs = std::gcd(want.sar_num, want.sar_den);
    EXPECT_EQ(std::make_pair(num, den), std::make_pair(int64_t(want.sar_num / theirs), int64_t(want.sar_den / theirs)));
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

class FixtureHeaderTest : public testing::TestWithParam<std::string> {};

TEST_P(FixtureHeaderTest, AgreesWithMkvinfoAndFfprobe) {
  FixtureExpectation expected = testing_support::LoadFixture(GetParam());
  std::unique_ptr<mkv_metadata_list, void (*)(mkv_metadata_list*)> list(mem_new_zeroed<mkv_metadata_list>(),
                                                                        FreeMetadata);
  ASSERT_NE(list, nullptr);
  const std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes(GetParam());
  HeaderParse parse(bytes, {.metadata = list.get()});
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  const mkv_file_info& info = parse.info();

  EXPECT_EQ(info.timecode_scale, expected.timecode_scale);
  if (expected.has_duration) {
    EXPECT_NEAR(info.duration * static_cast<double>(info.timecode_scale), static_cast<double>(expected.duration_ns), 1.0);
  }
  EXPECT_EQ(text(info.title), expected.title);
  EXPECT_EQ(text(info.muxing_app), expected.muxing_app);
  EXPECT_EQ(text(info.writing_app), expected.writing_app);

  EXPECT_EQ(info.first_cluster_position, testing_support::FirstClusterOffset(bytes.data(), bytes.size()));
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
}

INSTANTIATE_TEST_SUITE_P(Fixtures, FixtureHeaderTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const auto& info) { return info.param; });

}  // namespace
