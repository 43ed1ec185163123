#include "host/avc_sps.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/bit_writer.h"

namespace {

using Bytes = std::vector<uint8_t>;
using host::PictureShape;
using testing_support::BitWriter;

// avcC records written by ffmpeg/libx264; sizes and aspect ratios as ffprobe
// reports them for the decoded frames.
const struct {
  const char* name;
  Bytes record;
  uint32_t width, height, sar_width, sar_height;
} kEncoderRecords[] = {
    {"High 4:2:2 with JVT scaling lists, SAR 5:7",
     {0x01, 0x7A, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1C, 0x67, 0x7A, 0x00, 0x0B, 0xBC, 0xD9, 0x42,
      0xC4, 0xEF, 0xFC, 0x00, 0x14, 0x00, 0x1C, 0x40, 0x00, 0x00, 0x03, 0x00, 0x40, 0x00, 0x00,
      0x0C, 0x83, 0xC5, 0x0A, 0x65, 0x80, 0x01, 0x00, 0x07, 0x68, 0xEB, 0xE3, 0xCB, 0x30, 0x02,
      0xC0, 0xFE, 0xF8, 0xF8, 0x00},
     176, 144, 5, 7},
    {"High 4:4:4 Predictive, SAR 40:33",
     {0x01, 0xF4, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0xF4, 0x00, 0x0B, 0x91, 0x9B, 0x28, 0x58,
      0x9D, 0x82, 0x88, 0x00, 0x00, 0x03, 0x00, 0x08, 0x00, 0x00, 0x03, 0x01, 0x90, 0x78, 0xA1, 0x4C,
      0xB0, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xC4, 0x48, 0x44, 0xFF, 0xF8, 0xF8, 0x00},
     176, 144, 40, 33},
    {"High, interlaced 720x480, SAR 10:11",
     {0x01, 0x64, 0x00, 0x1E, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x64, 0x00, 0x1E, 0xAC, 0xD9, 0x40, 0xB4,
      0x7B, 0x60, 0x62, 0x00, 0x00, 0x03, 0x00, 0x02, 0x00, 0x00, 0x03, 0x00, 0x64, 0x3E, 0x28, 0x53,
      0x2C, 0x01, 0x00, 0x06, 0x68, 0xFB, 0xA3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00},
     720, 480, 10, 11},
    {"High, 200x90 cropped from 208x96, Extended_SAR 97:60",
     {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1E, 0x67, 0x64, 0x00, 0x0B, 0xAC, 0xD9, 0x43, 0x4D, 0xE5,
      0x93, 0xFF, 0x00, 0x61, 0x00, 0x3C, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20,
      0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00},
     200, 90, 97, 60},
    {"Constrained Baseline 1920x1080, SAR 1:1",
     {0x01, 0x42, 0xC0, 0x28, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01,
      0xE0, 0x08, 0x9F, 0x97, 0x01, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03,
      0x03, 0x20, 0xF1, 0x83, 0x2A, 0x01, 0x00, 0x04, 0x68, 0xCE, 0x0F, 0xC8},
     1920, 1080, 1, 1},
};

TEST(AvcSpsTest, EncoderRecordsGiveFfprobesShape) {
  for (const auto& c : kEncoderRecords) {
    PictureShape shape;
    ASSERT_TRUE(host::ParseAvcDecoderConfig(c.record.data(), c.record.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, c.height) << c.name;
    EXPECT_EQ(shape.aspect_width, c.sar_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.sar_height) << c.name;
  }
}

TEST(AvcSpsTest, EmulationPreventionBytesAreRemoved) {
  const struct {
    Bytes payload;
    Bytes rbsp;
  } cases[] = {
      {{0x00, 0x00, 0x03, 0x01}, {0x00, 0x00, 0x01}},
      {{0x00, 0x00, 0x03, 0x00, 0x00, 0x03}, {0x00, 0x00, 0x00, 0x00}},
      {{0x00, 0x00, 0x00, 0x03, 0x02}, {0x00, 0x00, 0x00, 0x02}},
      {{0x00, 0x00, 0x03, 0x03}, {0x00, 0x00, 0x03}},
      {{0x00, 0x03, 0x00, 0x03}, {0x00, 0x03, 0x00, 0x03}},
      {{0x01, 0x00, 0x00, 0x03}, {0x01, 0x00, 0x00}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(host::RemoveEmulationPrevention(c.payload.data(), c.payload.size()), c.rbsp)
        << testing::PrintToString(c.payload);
  }
}

// The fields of a sequence parameter set that decide the picture's shape.
struct Sps {
  uint32_t profile_idc = 100;
  uint32_t chroma_format_idc = 1;
  bool separate_colour_planes = false;
  uint32_t bit_depth_minus8 = 0;
  bool scaling_lists = false;
  uint32_t poc_type = 0;
  uint32_t poc_cycle = 3;
  uint32_t width_in_mbs = 20;  // 320x240
  uint32_t height_in_map_units = 15;
  bool frame_mbs_only = true;
  bool cropping = false;
  uint32_t crop_left = 0, crop_right = 0, crop_top = 0, crop_bottom = 0;
  bool vui = true;
  bool aspect_present = true;
  uint32_t aspect_idc = 1;
  uint32_t sar_width = 0, sar_height = 0;
};

Bytes sps_nal(const Sps& s) {
  BitWriter w;
  w.Bits(8, s.profile_idc).Bits(8, 0).Bits(8, 40).Golomb(0);
  if (s.profile_idc == 100 || s.profile_idc == 122 || s.profile_idc == 244) {
    w.Golomb(s.chroma_format_idc);
    if (s.chroma_format_idc == 3) w.Flag(s.separate_colour_planes);
    w.Golomb(s.bit_depth_minus8).Golomb(s.bit_depth_minus8).Flag(false).Flag(s.scaling_lists);
    if (s.scaling_lists) {
      int lists = s.chroma_format_idc == 3 ? 12 : 8;
      for (int i = 0; i < lists; ++i) {
        w.Flag(i != 2);  // one list absent
        if (i == 2) continue;
        if (i % 2) {
          w.SignedGolomb(-8);  // next scale 0: the default list, one delta only
        } else {
          for (int j = 0; j < (i < 6 ? 16 : 64); ++j) w.SignedGolomb(j % 3 - 1);
        }
      }
    }
  }
  w.Golomb(0).Golomb(s.poc_type);  // log2_max_frame_num_minus4
  if (s.poc_type == 0) w.Golomb(2);
  if (s.poc_type == 1) {
    w.Flag(false).SignedGolomb(-1).SignedGolomb(2).Golomb(s.poc_cycle);
    for (uint32_t i = 0; i < s.poc_cycle && i < 300; ++i) w.SignedGolomb(static_cast<int64_t>(i) - 2);
  }
  w.Golomb(4).Flag(false).Golomb(s.width_in_mbs - 1).Golomb(s.height_in_map_units - 1).Flag(s.frame_mbs_only);
  if (!s.frame_mbs_only) w.Flag(true);
  w.Flag(true).Flag(s.cropping);
  if (s.cropping) w.Golomb(s.crop_left).Golomb(s.crop_right).Golomb(s.crop_top).Golomb(s.crop_bottom);
  w.Flag(s.vui);
  if (s.vui) {
    w.Flag(s.aspect_present);
    if (s.aspect_present) {
      w.Bits(8, s.aspect_idc);
      if (s.aspect_idc == 255) w.Bits(16, s.sar_width).Bits(16, s.sar_height);
    }
    w.Bits(8, 0);  // overscan, video signal, chroma location, timing, HRDs, pic_struct, restriction: absent
  }
  Bytes nal = {0x67};
  Bytes payload = testing_support::EscapeRbsp(w.rbsp());
  nal.insert(nal.end(), payload.begin(), payload.end());
  return nal;
}

TEST(AvcSpsTest, AspectRatioIdcMapsToTheSampleAspectTable) {
  const uint32_t table[17][2] = {{0, 0},   {1, 1},   {12, 11}, {10, 11}, {16, 11},  {40, 33},
                                 {24, 11}, {20, 11}, {32, 11}, {80, 33}, {18, 11},  {15, 11},
                                 {64, 33}, {160, 99}, {4, 3},  {3, 2},   {2, 1}};
  for (uint32_t idc = 1; idc <= 16; ++idc) {
    Sps sps;
    sps.aspect_idc = idc;
    Bytes nal = sps_nal(sps);
    PictureShape shape;
    ASSERT_TRUE(host::ParseAvcSps(nal.data(), nal.size(), &shape)) << idc;
    EXPECT_EQ(shape.aspect_width, table[idc][0]) << idc;
    EXPECT_EQ(shape.aspect_height, table[idc][1]) << idc;
  }
}

TEST(AvcSpsTest, UnspecifiedAspectRatioLeavesItUnknown) {
  const struct {
    const char* name;
    bool vui, present;
    uint32_t idc, sar_width, sar_height;
    uint32_t expected_width, expected_height;
  } cases[] = {
      {"Extended_SAR", true, true, 255, 64, 45, 64, 45},
      {"Extended_SAR of 16-bit values", true, true, 255, 65535, 65534, 65535, 65534},
      {"Extended_SAR with zero width", true, true, 255, 0, 45, 0, 0},
      {"Extended_SAR with zero height", true, true, 255, 64, 0, 0, 0},
      {"idc 0, unspecified", true, true, 0, 0, 0, 0, 0},
      {"reserved idc 17", true, true, 17, 0, 0, 0, 0},
      {"reserved idc 254", true, true, 254, 0, 0, 0, 0},
      {"no aspect_ratio_info", true, false, 0, 0, 0, 0, 0},
      {"no VUI", false, false, 0, 0, 0, 0, 0},
  };
  for (const auto& c : cases) {
    Sps sps;
    sps.vui = c.vui;
    sps.aspect_present = c.present;
    sps.aspect_idc = c.idc;
    sps.sar_width = c.sar_width;
    sps.sar_height = c.sar_height;
    Bytes nal = sps_nal(sps);
    PictureShape shape;
    ASSERT_TRUE(host::ParseAvcSps(nal.data(), nal.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, 320u) << c.name;
    EXPECT_EQ(shape.aspect_width, c.expected_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.expected_height) << c.name;
  }
}

TEST(AvcSpsTest, CroppingCountsInChromaSamplesAndFieldLines) {
  auto cropped = [](Sps s, uint32_t left, uint32_t right, uint32_t top, uint32_t bottom) {
    s.cropping = true;
    s.crop_left = left;
    s.crop_right = right;
    s.crop_top = top;
    s.crop_bottom = bottom;
    return s;
  };
  Sps hd;
  hd.width_in_mbs = 120;
  hd.height_in_map_units = 68;
  Sps hd_fields = hd;
  hd_fields.frame_mbs_only = false;
  hd_fields.height_in_map_units = 34;
  Sps baseline;
  baseline.profile_idc = 66;
  Sps chroma422;
  chroma422.profile_idc = 122;
  chroma422.chroma_format_idc = 2;
  Sps chroma444;
  chroma444.profile_idc = 244;
  chroma444.chroma_format_idc = 3;
  Sps planes444 = chroma444;
  planes444.separate_colour_planes = true;
  planes444.frame_mbs_only = false;
  planes444.height_in_map_units = 8;
  Sps monochrome_fields;
  monochrome_fields.chroma_format_idc = 0;
  monochrome_fields.frame_mbs_only = false;
  Sps scaled420 = hd;
  scaled420.scaling_lists = true;
  Sps scaled444 = chroma444;
  scaled444.scaling_lists = true;
  scaled444.bit_depth_minus8 = 2;
  Sps poc1 = baseline;
  poc1.poc_type = 1;
  Sps poc2 = baseline;
  poc2.poc_type = 2;

  const struct {
    const char* name;
    Sps sps;
    uint32_t width, height;
  } cases[] = {
      {"4:2:0 frames, no cropping", hd, 1920, 1088},
      {"4:2:0 frames, 1088 to 1080", cropped(hd, 0, 0, 0, 4), 1920, 1080},
      {"4:2:0 fields, 1088 to 1080", cropped(hd_fields, 0, 0, 0, 2), 1920, 1080},
      {"baseline has 4:2:0 units", cropped(baseline, 1, 2, 3, 4), 314, 226},
      {"4:2:2 units 2 by 1", cropped(chroma422, 0, 4, 0, 8), 312, 232},
      {"4:4:4 units 1 by 1", cropped(chroma444, 3, 0, 5, 0), 317, 235},
      {"separate planes, fields: units 1 by 2", cropped(planes444, 1, 0, 1, 0), 319, 254},
      {"monochrome fields: units 1 by 2", cropped(monochrome_fields, 0, 5, 0, 3), 315, 474},
      {"scaling lists of 4:2:0", cropped(scaled420, 0, 0, 0, 4), 1920, 1080},
      {"twelve scaling lists of 4:4:4, 10 bits", scaled444, 320, 240},
      {"picture order type 1 with a cycle", poc1, 320, 240},
      {"picture order type 2", poc2, 320, 240},
  };
  for (const auto& c : cases) {
    Sps sps = c.sps;
    sps.aspect_idc = 14;
    Bytes nal = sps_nal(sps);
    PictureShape shape;
    ASSERT_TRUE(host::ParseAvcSps(nal.data(), nal.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, c.height) << c.name;
    // The aspect ratio comes after everything above: a field read wrongly shifts it.
    EXPECT_EQ(shape.aspect_width, 4u) << c.name;
    EXPECT_EQ(shape.aspect_height, 3u) << c.name;
  }
}

TEST(AvcSpsTest, OutOfRangeFieldsAreRefused) {
  Sps base;
  auto with = [&](auto change) {
    Sps s = base;
    change(s);
    return sps_nal(s);
  };
  Bytes not_sps = sps_nal(base);
  not_sps[0] = 0x68;
  const struct {
    const char* name;
    Bytes nal;
  } cases[] = {
      {"a PPS", not_sps},
      {"header byte only", {0x67}},
      {"chroma_format_idc 4", with([](Sps& s) { s.chroma_format_idc = 4; })},
      {"bit depth 15", with([](Sps& s) { s.bit_depth_minus8 = 7; })},
      {"picture order type 3", with([](Sps& s) { s.poc_type = 3; })},
      {"picture order cycle of 256", with([](Sps& s) { s.poc_type = 1; s.poc_cycle = 256; })},
      {"cropping the whole width", with([](Sps& s) { s.cropping = true; s.crop_left = 80; s.crop_right = 80; })},
      {"cropping the whole height", with([](Sps& s) { s.cropping = true; s.crop_bottom = 120; })},
      {"picture 65536 wide", with([](Sps& s) { s.width_in_mbs = 4096; })},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    shape.width = 77;
    EXPECT_FALSE(host::ParseAvcSps(c.nal.data(), c.nal.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, 77u) << c.name;
  }
}

TEST(AvcSpsTest, MalformedRecordsAreRefused) {
  const Bytes& good = kEncoderRecords[0].record;
  auto changed = [&](size_t offset, uint8_t value) {
    Bytes b = good;
    b[offset] = value;
    return b;
  };
  const struct {
    const char* name;
    Bytes record;
  } cases[] = {
      {"empty", {}},
      {"seven bytes", Bytes(good.begin(), good.begin() + 7)},
      {"configuration version 0", changed(0, 0)},
      {"no SPS", changed(5, 0xE0)},
      {"SPS length beyond the record", changed(7, 0x2B)},
      {"SPS length 0", changed(7, 0x00)},
      {"SPS cut short", Bytes(good.begin(), good.begin() + 20)},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    EXPECT_FALSE(host::ParseAvcDecoderConfig(c.record.data(), c.record.size(), &shape)) << c.name;
  }
}

// Whatever the bytes, the parser stays inside them (the sanitizers watch) and
// either refuses or reports a sane picture.
TEST(AvcSpsTest, DamagedRecordsNeverYieldAnInsaneShape) {
  for (const auto& c : kEncoderRecords) {
    for (size_t cut = 0; cut < c.record.size(); ++cut) {
      Bytes prefix(c.record.begin(), c.record.begin() + static_cast<std::ptrdiff_t>(cut));
      PictureShape shape;
      if (host::ParseAvcDecoderConfig(prefix.data(), prefix.size(), &shape)) {
        EXPECT_EQ(shape.width, c.width) << c.name << " cut at " << cut;
        EXPECT_EQ(shape.aspect_width, c.sar_width) << c.name << " cut at " << cut;
      }
    }
    for (size_t at = 8; at < c.record.size(); ++at) {
      for (uint8_t value : {0x00, 0x01, 0x03, 0x7F, 0x80, 0xFF}) {
        Bytes damaged = c.record;
        damaged[at] = value;
        PictureShape shape;
        if (host::ParseAvcDecoderConfig(damaged.data(), damaged.size(), &shape)) {
          EXPECT_GT(shape.width, 0u);
          EXPECT_LE(shape.width, 65535u);
          EXPECT_GT(shape.height, 0u);
          EXPECT_LE(shape.height, 65535u);
        }
      }
    }
  }
}

}  // namespace
