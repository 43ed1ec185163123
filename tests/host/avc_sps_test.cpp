#include "host/avc_sps.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/bit_writer.h"

namespace {

using Bytes = std::vector<uint8_t>;
using host::PictureShape;

// avcC records written by ffmpeg/libx264 (testsrc, setsar; several with
// emulation-prevention bytes); size and aspect ratio as ffprobe reports them
// for the decoded frames.
const struct {
  const char* name;
  Bytes record;
  uint32_t width, height, sar_width, sar_height;
} kEncoderRecords[] = {
    {"4:2:0 frames 200x90 of 208x96, Extended_SAR", {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1E, 0x67, 0x64, 0x00, 0x0B, 0xAC, 0xD9, 0x43, 0x4D, 0xE5, 0x93, 0xFF, 0x00, 0x61, 0x00, 0x3C, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00}, 200, 90, 97, 60},
    {"4:2:2 frames 200x90", {0x01, 0x7A, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1A, 0x67, 0x7A, 0x00, 0x0B, 0xBC, 0xD9, 0x43, 0x4D, 0xE5, 0x9F, 0x0F, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFE, 0xF8, 0xF8, 0x00}, 200, 90, 3, 2},
    {"4:4:4 frames 200x90", {0x01, 0xF4, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0xF4, 0x00, 0x0B, 0x91, 0x9B, 0x28, 0x69, 0xBC, 0x4C, 0xF8, 0x80, 0x80, 0x00, 0x00, 0x03, 0x00, 0x80, 0x00, 0x00, 0x19, 0x07, 0x8A, 0x14, 0xCB, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xC4, 0x48, 0x44, 0xFF, 0xF8, 0xF8, 0x00}, 200, 90, 2, 1},
    {"monochrome frames 200x90", {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x64, 0x00, 0x0B, 0xF3, 0x65, 0x0D, 0x37, 0x89, 0x9F, 0x06, 0x6C, 0x80, 0x00, 0x00, 0x03, 0x00, 0x80, 0x00, 0x00, 0x19, 0x07, 0x8A, 0x14, 0xCB, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFC, 0xF8, 0xF8, 0x00}, 200, 90, 24, 11},
    {"4:2:0 fields 704x472", {0x01, 0x64, 0x00, 0x1E, 0xFF, 0xE1, 0x00, 0x1A, 0x67, 0x64, 0x00, 0x1E, 0xAC, 0xD9, 0x40, 0xB0, 0x7B, 0xF7, 0x83, 0x88, 0x00, 0x00, 0x03, 0x00, 0x08, 0x00, 0x00, 0x03, 0x01, 0x90, 0xF8, 0xA1, 0x4C, 0xB0, 0x01, 0x00, 0x06, 0x68, 0xFB, 0xA3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00}, 704, 472, 20, 11},
    {"4:2:2 fields 720x480", {0x01, 0x7A, 0x00, 0x1E, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x7A, 0x00, 0x1E, 0xBC, 0xD9, 0x40, 0xB4, 0x7B, 0x61, 0x42, 0x00, 0x00, 0x03, 0x00, 0x02, 0x00, 0x00, 0x03, 0x00, 0x64, 0x3E, 0x28, 0x53, 0x2C, 0x01, 0x00, 0x07, 0x68, 0xFB, 0xA3, 0xCB, 0x30, 0x02, 0xC0, 0xFE, 0xF8, 0xF8, 0x00}, 720, 480, 18, 11},
    {"4:4:4 176x144, SAR 40:33", {0x01, 0xF4, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0xF4, 0x00, 0x0B, 0x91, 0x9B, 0x28, 0x58, 0x9D, 0x82, 0x88, 0x00, 0x00, 0x03, 0x00, 0x08, 0x00, 0x00, 0x03, 0x01, 0x90, 0x78, 0xA1, 0x4C, 0xB0, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xC4, 0x48, 0x44, 0xFF, 0xF8, 0xF8, 0x00}, 176, 144, 40, 33},
    {"Constrained Baseline 1920x1080", {0x01, 0x42, 0xC0, 0x28, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01, 0xE0, 0x08, 0x9F, 0x97, 0x01, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x83, 0x2A, 0x01, 0x00, 0x04, 0x68, 0xCE, 0x0F, 0xC8}, 1920, 1080, 1, 1},
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

// What libx264 never writes: scaling lists in the SPS, other picture order
// types, unusual aspect codes, out-of-range values. 320x240 unless cropped.
struct Sps {
  uint32_t chroma_format_idc = 1;
  bool scaling_lists = false;
  uint32_t bit_depth_minus8 = 0;
  uint32_t poc_type = 0;
  uint32_t poc_cycle = 3;
  uint32_t crop_right = 0;
  uint32_t width_in_mbs = 20;
  int aspect_idc = 14;  // -1: no aspect_ratio_info; -2: no VUI
  uint32_t sar_width = 0, sar_height = 0;
};

Bytes sps_nal(const Sps& s) {
  testing_support::BitWriter w;
  w.Bits(8, 0x67).Bits(8, 100).Bits(16, 40).Golomb(0).Golomb(s.chroma_format_idc);
  if (s.chroma_format_idc == 3) w.Bits(1, 0);
  w.Golomb(s.bit_depth_minus8).Golomb(s.bit_depth_minus8).Bits(1, 0).Bits(1, s.scaling_lists);
  for (int i = 0; s.scaling_lists && i < (s.chroma_format_idc == 3 ? 12 : 8); ++i) {
    w.Bits(1, i != 2);  // list 2 absent, odd lists ended early by a zero scale
    for (int j = 0; i != 2 && j < (i % 2 ? 1 : i < 6 ? 16 : 64); ++j) w.SignedGolomb(i % 2 ? -8 : j % 3 - 1);
  }
  w.Golomb(0).Golomb(s.poc_type);
  if (s.poc_type == 0) w.Golomb(2);
  if (s.poc_type == 1) {
    w.Bits(1, 0).SignedGolomb(-1).SignedGolomb(2).Golomb(s.poc_cycle);
    for (uint32_t i = 0; i < s.poc_cycle; ++i) w.SignedGolomb(static_cast<int64_t>(i) - 2);
  }
  w.Golomb(4).Bits(1, 0).Golomb(s.width_in_mbs - 1).Golomb(14).Bits(1, 1).Bits(1, 1).Bits(1, s.crop_right != 0);
  if (s.crop_right) w.Golomb(0).Golomb(s.crop_right).Golomb(0).Golomb(0);
  w.Bits(1, s.aspect_idc != -2);
  if (s.aspect_idc != -2) w.Bits(1, s.aspect_idc >= 0);
  if (s.aspect_idc >= 0) w.Bits(8, static_cast<uint64_t>(s.aspect_idc));
  if (s.aspect_idc == 255) w.Bits(16, s.sar_width).Bits(16, s.sar_height);
  w.Bits(9, 1);  // the rest of the VUI absent, stop bit
  return testing_support::EscapeRbsp(w.bytes());  // the header byte 0x67 needs no escape
}

TEST(AvcSpsTest, RareButValidFieldsAreStepped) {
  const struct {
    const char* name;
    Sps sps;
    uint32_t width, sar_width, sar_height;
  } cases[] = {
      {"eight scaling lists", {.scaling_lists = true}, 320, 4, 3},
      {"twelve scaling lists of 4:4:4, 10 bits", {.chroma_format_idc = 3, .scaling_lists = true, .bit_depth_minus8 = 2}, 320, 4, 3},
      {"picture order type 1 with a cycle", {.poc_type = 1}, 320, 4, 3},
      {"picture order type 2", {.poc_type = 2}, 320, 4, 3},
      {"4:2:0 crop counts chroma samples", {.crop_right = 3}, 314, 4, 3},
      {"idc 13", {.aspect_idc = 13}, 320, 160, 99},
      {"idc 0 is unspecified", {.aspect_idc = 0}, 320, 0, 0},
      {"reserved idc 17", {.aspect_idc = 17}, 320, 0, 0},
      {"Extended_SAR of 16-bit values", {.aspect_idc = 255, .sar_width = 65535, .sar_height = 65534}, 320, 65535, 65534},
      {"Extended_SAR whose zero run is escaped", {.aspect_idc = 255, .sar_width = 0x8000, .sar_height = 1}, 320, 0x8000, 1},
      {"Extended_SAR with zero width", {.aspect_idc = 255, .sar_width = 0, .sar_height = 45}, 320, 0, 0},
      {"no aspect_ratio_info", {.aspect_idc = -1}, 320, 0, 0},
      {"no VUI", {.aspect_idc = -2}, 320, 0, 0},
  };
  for (const auto& c : cases) {
    Bytes nal = sps_nal(c.sps);
    PictureShape shape;
    ASSERT_TRUE(host::ParseAvcSps(nal.data(), nal.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, 240u) << c.name;
    EXPECT_EQ(shape.aspect_width, c.sar_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.sar_height) << c.name;
  }
}

TEST(AvcSpsTest, OutOfRangeSpsOrRecordIsRefused) {
  auto record = [](Bytes sps) {
    Bytes r = {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, static_cast<uint8_t>(sps.size())};
    r.insert(r.end(), sps.begin(), sps.end());
    return r;
  };
  Bytes pps = sps_nal({});
  pps[0] = 0x68;
  Bytes good = record(sps_nal({}));
  Bytes no_sps = good;
  no_sps[5] = 0xE0;
  const struct {
    const char* name;
    Bytes record;
  } cases[] = {
      {"chroma_format_idc 4", record(sps_nal({.chroma_format_idc = 4}))},
      {"bit depth 15", record(sps_nal({.bit_depth_minus8 = 7}))},
      {"picture order type 3", record(sps_nal({.poc_type = 3}))},
      {"picture order cycle of 256", record(sps_nal({.poc_type = 1, .poc_cycle = 256}))},
      {"cropping the whole width", record(sps_nal({.crop_right = 160}))},
      {"picture 65536 wide", record(sps_nal({.width_in_mbs = 4096}))},
      {"a PPS where the SPS belongs", record(pps)},
      {"header byte only", record({0x67})},
      {"no SPS", no_sps},
      {"SPS longer than the record", Bytes(good.begin(), good.end() - 1)},
      {"configuration version 0", [&] { Bytes b = good; b[0] = 0; return b; }()},
      {"seven bytes", Bytes(good.begin(), good.begin() + 7)},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    shape.width = 77;
    EXPECT_FALSE(host::ParseAvcDecoderConfig(c.record.data(), c.record.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, 77u) << c.name;
  }
}

// Whatever the bytes, the parser stays inside them (the sanitizers watch) and
// either refuses or reports a picture of sane size.
TEST(AvcSpsTest, DamagedRecordsNeverYieldAnInsaneShape) {
  for (const auto& c : kEncoderRecords) {
    for (size_t at = 6; at < c.record.size(); ++at) {
      for (uint8_t value : {0x00, 0x01, 0x03, 0x7F, 0x80, 0xFF}) {
        Bytes damaged = c.record;
        damaged[at] = value;
        PictureShape shape;
        if (!host::ParseAvcDecoderConfig(damaged.data(), damaged.size(), &shape)) continue;
        EXPECT_TRUE(shape.width > 0 && shape.width <= 65535 && shape.height > 0 && shape.height <= 65535)
            << c.name << " byte " << at << " = " << int{value};
      }
    }
  }
}

}  // namespace
