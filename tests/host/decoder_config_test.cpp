#include "platform/decoder_config.h"

#include <gtest/gtest.h>

#include <cstring>
#include <numeric>
#include <string>
#include <vector>

#include "core/codec_table.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

using Bytes = std::vector<uint8_t>;

constexpr uint32_t kAvc1 = 0x41564331;
constexpr uint32_t kMp4v = 0x4D503456;

// ffmpeg/libx264, 1920x1080 Constrained Baseline with SAR 1:1.
const Bytes kAvcRecord = {0x01, 0x42, 0xC0, 0x28, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01,
                          0xE0, 0x08, 0x9F, 0x97, 0x01, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03,
                          0x03, 0x20, 0xF1, 0x83, 0x2A, 0x01, 0x00, 0x04, 0x68, 0xCE, 0x0F, 0xC8};
// ffmpeg mpeg4, 176x144 with the reserved aspect_ratio_info 7 patched in (byte 21: 0xA5 -> 0xBD).
const Bytes kMpeg4ReservedAspect = {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00,
                                    0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xC4, 0xBD, 0x88, 0x00,
                                    0xCD, 0x05, 0x84, 0x12, 0x14, 0x43};

// The caller's preset stays unless the configuration says otherwise.
TEST(DecoderConfigTest, OnlyAnUnderstoodConfigurationChangesTheRecord) {
  const struct {
    const char* name;
    const Bytes& config;
    uint32_t fourcc;
    bool understood;
    MmDecoderConfigInfo expected;
  } cases[] = {
      {"AVC1", kAvcRecord, kAvc1, true, {1920, 1080, 1, 1}},
      {"MP4V with a reserved aspect code", kMpeg4ReservedAspect, kMp4v, true, {176, 144, 33, 44}},
      {"lower-case avc1", kAvcRecord, fourcc_value("avc1"), false, {11, 22, 33, 44}},
      {"AVC configuration under MP4V", kAvcRecord, kMp4v, false, {11, 22, 33, 44}},
      {"MPEG-4 configuration under AVC1", kMpeg4ReservedAspect, kAvc1, false, {11, 22, 33, 44}},
  };
  for (const auto& c : cases) {
    MmDecoderConfigInfo info = {11, 22, 33, 44};
    int result = MmParseDecoderConfig(c.config.data(), static_cast<uint32_t>(c.config.size()), c.fourcc, &info, 0);
    EXPECT_EQ(result == 0, c.understood) << c.name;
    EXPECT_EQ(0, std::memcmp(&info, &c.expected, sizeof info))
        << c.name << ": " << info.Width << "x" << info.Height << " " << info.PixelAspectWidth << ":"
        << info.PixelAspectHeight;
  }
  EXPECT_NE(MmParseDecoderConfig(nullptr, 0, kAvc1, nullptr, 0), 0);
}

struct Fraction {
  uint64_t num, den;
};
Fraction reduced(uint64_t num, uint64_t den) {
  uint64_t divisor = std::gcd(num, den);
  return divisor ? Fraction{num / divisor, den / divisor} : Fraction{num, den};
}

uint64_t field_or_zero(const testing_support::ExpectedTrack& track, const char* key) {
  auto it = track.fields.find(key);
  return it == track.fields.end() ? 0 : std::stoull(it->second);
}

// A display size in pixels (unit 0, the default) that differs from the picture
// makes ffprobe report the container's aspect ratio rather than the codec's.
bool container_sets_aspect(const testing_support::ExpectedTrack& track) {
  uint64_t display_width = field_or_zero(track, "display_width");
  uint64_t display_height = field_or_zero(track, "display_height");
  return field_or_zero(track, "display_unit") == 0 && display_width != 0 && display_height != 0 &&
         (display_width != track.width || display_height != track.height);
}

// Our header parse finds each video track's CodecPrivate; the framework's
// parser must see in it the picture ffprobe saw.
TEST(DecoderConfigTest, FixtureTracksMatchFfprobe) {
  int checked = 0;
  int non_square = 0;
  for (const std::string& name : testing_support::FixtureNames()) {
    testing_support::FixtureExpectation expected = testing_support::LoadFixture(name);
    testing_support::HeaderParse parse(testing_support::ReadFixtureBytes(name));
    (void)parse.Parse();
    const mkv_file_info& file = parse.info();
    ASSERT_EQ(file.track_count, expected.tracks.size()) << name;
    for (uint32_t i = 0; i < file.track_count; ++i) {
      const mkv_track_info& track = file.tracks[i];
      const testing_support::ExpectedTrack& want = expected.tracks[i];
      uint32_t fourcc = lookup_codec_fourcc(track.codec_id);
      if ((fourcc != kAvc1 && fourcc != kMp4v) || !track.codec_private) continue;
      std::string label = name + " track " + std::to_string(want.number);
      MmDecoderConfigInfo info = {0, 0, 1, 1};
      ASSERT_EQ(MmParseDecoderConfig(track.codec_private, track.codec_private_size, fourcc, &info, 0), 0) << label;
      EXPECT_EQ(info.Width, want.width) << label;
      EXPECT_EQ(info.Height, want.height) << label;
      Fraction ours = reduced(info.PixelAspectWidth, info.PixelAspectHeight);
      if (container_sets_aspect(want)) {
        // mkvmerge derived that display size from the codec's aspect ratio.
        ASSERT_EQ(field_or_zero(want, "display_height"), want.height) << label;
        EXPECT_EQ(field_or_zero(want, "display_width"), (want.width * ours.num + ours.den / 2) / ours.den) << label;
        ++checked;
        if (ours.num != ours.den) ++non_square;
        continue;
      }
      ASSERT_NE(want.sar_num, 0u) << label << ": ffprobe reported no aspect ratio";
      Fraction theirs = reduced(want.sar_num, want.sar_den);
      EXPECT_EQ(ours.num, theirs.num) << label;
      EXPECT_EQ(ours.den, theirs.den) << label;
      ++checked;
      if (theirs.num != theirs.den) ++non_square;
    }
  }
  // The anamorphic AVC fixtures and the MPEG-4 one at least.
  EXPECT_GE(checked, 10);
  EXPECT_GE(non_square, 3);
}

}  // namespace
