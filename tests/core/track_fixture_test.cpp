#include <gtest/gtest.h>

#include <string>

#include "core/flac_config.h"
#include "core/status.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;
using testing_support::HeaderParse;

std::string type_name(uint64_t track_type) {
  switch (track_type) {
    case 1: return "video";
    case 2: return "audio";
    case 0x11: return "subtitles";
    default: return "other";
  }
}

// mkvinfo lists only the elements a file holds; an absent one has the record's default.
uint64_t field_or(const ExpectedTrack& track, const char* key, uint64_t absent) {
  auto it = track.fields.find(key);
  return it == track.fields.end() ? absent : std::stoull(it->second);
}

void expect_track_matches(const mkv_track_info& track, const ExpectedTrack& want, const std::string& label) {
  EXPECT_EQ(track.track_number, want.number) << label;
  EXPECT_EQ(track.track_uid, want.uid) << label;
  EXPECT_EQ(type_name(track.track_type), want.type) << label;
  EXPECT_EQ(std::string(track.codec_id ? track.codec_id : ""), want.codec) << label;
  EXPECT_EQ(std::string(track.language ? track.language : ""), want.language) << label;
  EXPECT_EQ(track.codec_private_size, want.codec_private_size) << label;
  EXPECT_EQ(track.pixel_width, want.width) << label;
  EXPECT_EQ(track.pixel_height, want.height) << label;
  EXPECT_EQ(track.display_unit, field_or(want, "display_unit", 0)) << label;
  EXPECT_EQ(track.default_duration, want.default_duration) << label;
  EXPECT_DOUBLE_EQ(track.sampling_frequency, want.fields.count("sampling_frequency") ? want.sampling_frequency : 8000.0)
      << label;
  EXPECT_EQ(track.channels, field_or(want, "channels", 1)) << label;
  EXPECT_EQ(track.bit_depth, want.bit_depth) << label;
  EXPECT_EQ(track.flag_default, field_or(want, "flag_default", 1)) << label;
  EXPECT_EQ(track.flag_lacing, field_or(want, "flag_lacing", 1)) << label;
  EXPECT_EQ(track.compressed, want.fields.count("compression")) << label;
  EXPECT_EQ(track.encrypted, want.fields.count("encryption")) << label;
  if (want.fields.count("compression")) {
    ASSERT_GE(track.content_encoding_count, 1u) << label;
    const std::string& algorithm = want.fields.at("compression");
    EXPECT_EQ(track.content_encodings[0].comp_algo, algorithm == "zlib" ? 0u : algorithm == "header_removal" ? 3u : 99u)
        << label;
  }
}

// Track records are filled whatever the rest of the parse makes of a file.
TEST(TrackHandlerTest, FixtureTrackRecordsMatchMkvinfo) {
  size_t tracks_seen = 0;
  for (const std::string& name : testing_support::FixtureNames()) {
    FixtureExpectation expected = testing_support::LoadFixture(name);
    HeaderParse parse(testing_support::ReadFixtureBytes(name));
    (void)parse.Parse();
    const mkv_file_info& file = parse.info();
    ASSERT_EQ(file.track_count, expected.tracks.size()) << name;
    uint32_t video = 0;
    uint32_t audio = 0;
    for (uint32_t i = 0; i < file.track_count; ++i) {
      const ExpectedTrack& want = expected.tracks[i];
      expect_track_matches(file.tracks[i], want, name + " track " + std::to_string(want.number));
      video += want.type == "video";
      audio += want.type == "audio";
    }
    EXPECT_EQ(file.video_track_count, video) << name;
    EXPECT_EQ(file.audio_track_count, audio) << name;
    tracks_seen += file.track_count;
  }
  EXPECT_GT(tracks_seen, 40u);
}

TEST(FlacConfigTest, FixtureCodecPrivateUnpacksToFfprobesFormat) {
  int flac_tracks = 0;
  for (const std::string& name : testing_support::FixtureNames()) {
    FixtureExpectation expected = testing_support::LoadFixture(name);
    HeaderParse parse(testing_support::ReadFixtureBytes(name));
    (void)parse.Parse();
    for (uint32_t i = 0; i < parse.info().track_count && i < expected.tracks.size(); ++i) {
      const mkv_track_info& track = parse.info().tracks[i];
      const ExpectedTrack& want = expected.tracks[i];
      if (want.codec != "A_FLAC") continue;
      ++flac_tracks;
      mkv_flac_config config{};
      ASSERT_EQ(parse_flac_stream_header(track.codec_private, track.codec_private_size, &config), kStatusOk) << name;
      EXPECT_EQ(config.sample_rate, want.flac_sample_rate) << name;
      EXPECT_EQ(config.channels, want.flac_channels) << name;
      EXPECT_EQ(config.bits_per_sample, want.flac_bits) << name;
      EXPECT_LE(config.min_block_size, config.max_block_size) << name;
      EXPECT_EQ(config.filled, 1u) << name;
    }
  }
  EXPECT_GE(flac_tracks, 1);
}

}  // namespace
