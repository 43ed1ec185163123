#include "host/mpeg4_vol.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/bit_writer.h"

namespace {

using Bytes = std::vector<uint8_t>;
using host::PictureShape;
using testing_support::BitWriter;

// Configurations written by ffmpeg's mpeg4 encoder (visual object sequence,
// visual object, layer, user data); ffprobe's picture size and aspect ratio.
const struct {
  const char* name;
  Bytes config;
  uint32_t width, height, par_width, par_height;
} kEncoderConfigs[] = {
    {"extended PAR 5:7",
     {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00,
      0x01, 0x20, 0x00, 0xC4, 0xF8, 0x28, 0x3D, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00,
      0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63, 0x35, 0x39, 0x2E, 0x33, 0x37, 0x2E, 0x31, 0x30, 0x30},
     176, 144, 5, 7},
    {"table PAR 16:11",
     {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00,
      0x00, 0x01, 0x20, 0x00, 0xC4, 0xA5, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00,
      0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63, 0x35, 0x39, 0x2E, 0x33, 0x37, 0x2E, 0x31, 0x30, 0x30},
     176, 144, 16, 11},
};

TEST(Mpeg4VolTest, EncoderConfigsGiveFfprobesShape) {
  for (const auto& c : kEncoderConfigs) {
    PictureShape shape;
    ASSERT_TRUE(host::ParseMpeg4VideoConfig(c.config.data(), c.config.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, c.height) << c.name;
    EXPECT_EQ(shape.aspect_width, c.par_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.par_height) << c.name;
  }
}

struct Vol {
  uint32_t object_type = 1;
  bool layer_identifier = false;
  uint32_t verid = 1;
  uint32_t aspect = 1;
  uint32_t par_width = 0, par_height = 0;
  bool control_parameters = false;
  bool vbv_parameters = false;
  uint32_t shape = 0;  // rectangular
  uint32_t time_resolution = 25;
  bool fixed_rate = false;
  unsigned increment_bits = 0;  // what the resolution needs
  uint32_t width = 352, height = 288;
};

Bytes vol_bits(const Vol& v) {
  BitWriter w;
  w.Flag(false).Bits(8, v.object_type).Flag(v.layer_identifier);
  if (v.layer_identifier) w.Bits(4, v.verid).Bits(3, 1);
  w.Bits(4, v.aspect);
  if (v.aspect == 15) w.Bits(8, v.par_width).Bits(8, v.par_height);
  w.Flag(v.control_parameters);
  if (v.control_parameters) {
    w.Bits(2, 1).Flag(true).Flag(v.vbv_parameters);
    if (v.vbv_parameters) {
      w.Bits(15, 0x7FFF).Flag(true).Bits(15, 0).Flag(true).Bits(15, 0x1234).Flag(true);
      w.Bits(3, 5).Bits(11, 0x7FF).Flag(true).Bits(15, 0x4321).Flag(true);
    }
  }
  w.Bits(2, v.shape);
  if (v.shape == 3 && v.verid != 1) w.Bits(4, 0);
  w.Flag(true).Bits(16, v.time_resolution).Flag(true).Flag(v.fixed_rate);
  if (v.fixed_rate) w.Bits(v.increment_bits, 1);
  if (v.shape == 0) w.Flag(true).Bits(13, v.width).Flag(true).Bits(13, v.height).Flag(true);
  w.Bits(8, 0xA5);  // the rest of the layer header
  return w.bytes();
}

Bytes with_start_code(const Bytes& bits, uint8_t code = 0x20) {
  Bytes out = {0x00, 0x00, 0x01, code};
  out.insert(out.end(), bits.begin(), bits.end());
  return out;
}

TEST(Mpeg4VolTest, AspectRatioInfoMapsToThePixelAspectTable) {
  const struct {
    const char* name;
    uint32_t aspect, par_width, par_height;
    uint32_t expected_width, expected_height;
  } cases[] = {
      {"square", 1, 0, 0, 1, 1},         {"625-line 4:3", 2, 0, 0, 12, 11},
      {"525-line 4:3", 3, 0, 0, 10, 11}, {"625-line 16:9", 4, 0, 0, 16, 11},
      {"525-line 16:9", 5, 0, 0, 40, 33}, {"extended 5:7", 15, 5, 7, 5, 7},
      {"extended 255:254", 15, 255, 254, 255, 254}, {"extended with zero width", 15, 0, 7, 0, 0},
      {"extended with zero height", 15, 5, 0, 0, 0}, {"forbidden 0", 0, 0, 0, 0, 0},
      {"reserved 6", 6, 0, 0, 0, 0},     {"reserved 14", 14, 0, 0, 0, 0},
  };
  for (const auto& c : cases) {
    Vol vol;
    vol.aspect = c.aspect;
    vol.par_width = c.par_width;
    vol.par_height = c.par_height;
    Bytes bits = vol_bits(vol);
    PictureShape shape;
    ASSERT_TRUE(host::ParseMpeg4Vol(bits.data(), bits.size(), &shape)) << c.name;
    EXPECT_EQ(shape.aspect_width, c.expected_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.expected_height) << c.name;
    EXPECT_EQ(shape.width, 352u) << c.name;
    EXPECT_EQ(shape.height, 288u) << c.name;
  }
}

TEST(Mpeg4VolTest, OptionalFieldsBeforeTheSizeAreStepped) {
  auto vol_with = [](auto change) {
    Vol v;
    v.aspect = 3;
    change(v);
    return v;
  };
  const struct {
    const char* name;
    Vol vol;
    uint32_t width, height;
  } cases[] = {
      {"layer identifier", vol_with([](Vol& v) { v.layer_identifier = true; v.verid = 2; }), 352, 288},
      {"control parameters without VBV", vol_with([](Vol& v) { v.control_parameters = true; }), 352, 288},
      {"control parameters with VBV",
       vol_with([](Vol& v) { v.control_parameters = true; v.vbv_parameters = true; }), 352, 288},
      {"fixed rate, resolution 1", vol_with([](Vol& v) { v.fixed_rate = true; v.time_resolution = 1; v.increment_bits = 1; }),
       352, 288},
      {"fixed rate, resolution 2", vol_with([](Vol& v) { v.fixed_rate = true; v.time_resolution = 2; v.increment_bits = 1; }),
       352, 288},
      {"fixed rate, resolution 3", vol_with([](Vol& v) { v.fixed_rate = true; v.time_resolution = 3; v.increment_bits = 2; }),
       352, 288},
      {"fixed rate, resolution 25", vol_with([](Vol& v) { v.fixed_rate = true; v.increment_bits = 5; }), 352, 288},
      {"fixed rate, resolution 32768",
       vol_with([](Vol& v) { v.fixed_rate = true; v.time_resolution = 32768; v.increment_bits = 15; }), 352, 288},
      {"fixed rate, resolution 32769",
       vol_with([](Vol& v) { v.fixed_rate = true; v.time_resolution = 32769; v.increment_bits = 16; }), 352, 288},
      {"largest size", vol_with([](Vol& v) { v.width = 8191; v.height = 8190; }), 8191, 8190},
      {"binary shape has no size", vol_with([](Vol& v) { v.shape = 1; }), 0, 0},
      {"binary-only shape has no size", vol_with([](Vol& v) { v.shape = 2; }), 0, 0},
      {"grayscale shape, version 2", vol_with([](Vol& v) { v.shape = 3; v.layer_identifier = true; v.verid = 2; }), 0,
       0},
  };
  for (const auto& c : cases) {
    Bytes bits = vol_bits(c.vol);
    PictureShape shape;
    ASSERT_TRUE(host::ParseMpeg4Vol(bits.data(), bits.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, c.height) << c.name;
    EXPECT_EQ(shape.aspect_width, 10u) << c.name;
    EXPECT_EQ(shape.aspect_height, 11u) << c.name;
  }
}

TEST(Mpeg4VolTest, LayerHeaderIsFoundWhereverItStarts) {
  Bytes vol = with_start_code(vol_bits(Vol{}));
  // A BITMAPINFOHEADER whose width bytes (00 00 01 20 after the size field) imitate a start code.
  Bytes bitmap_info = {0x28, 0x00, 0x00, 0x00, 0x00, 0x00, 0x01, 0x20, 0x90, 0x00, 0x00, 0x00, 0x01, 0x00,
                       0x18, 0x00, 'X',  'V',  'I',  'D',  0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00,
                       0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00};
  ASSERT_EQ(bitmap_info.size(), 40u);
  auto joined = [](Bytes a, const Bytes& b) {
    a.insert(a.end(), b.begin(), b.end());
    return a;
  };
  const struct {
    const char* name;
    Bytes config;
    bool found;
  } cases[] = {
      {"layer header alone", vol, true},
      {"last layer start code 0x2F", with_start_code(vol_bits(Vol{}), 0x2F), true},
      {"behind a BITMAPINFOHEADER", joined(bitmap_info, vol), true},
      {"behind stray bytes", joined({0x00, 0x00, 0x00, 0x12}, vol), true},
      {"start code 0x30 is no layer", with_start_code(vol_bits(Vol{}), 0x30), false},
      {"no start code", vol_bits(Vol{}), false},
      {"start code at the very end", {0x11, 0x00, 0x00, 0x01, 0x20}, false},
      {"three bytes", {0x00, 0x00, 0x01}, false},
      {"empty", {}, false},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    EXPECT_EQ(host::ParseMpeg4VideoConfig(c.config.data(), c.config.size(), &shape), c.found) << c.name;
    if (c.found) {
      EXPECT_EQ(shape.width, 352u) << c.name;
      EXPECT_EQ(shape.aspect_width, 1u) << c.name;
    }
  }
}

TEST(Mpeg4VolTest, UnusableLayerHeadersAreRefused) {
  Vol zero_resolution;
  zero_resolution.time_resolution = 0;
  Vol scalable;
  scalable.object_type = 0x12;
  Bytes full = vol_bits(Vol{});
  const struct {
    const char* name;
    Bytes bits;
  } cases[] = {
      {"time resolution 0", vol_bits(zero_resolution)},
      {"fine granularity scalable layer", vol_bits(scalable)},
      {"cut inside the height", Bytes(full.begin(), full.begin() + 7)},
      {"cut after one byte", Bytes(full.begin(), full.begin() + 1)},
      {"empty", {}},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    shape.width = 77;
    EXPECT_FALSE(host::ParseMpeg4Vol(c.bits.data(), c.bits.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, 77u) << c.name;
  }
}

}  // namespace
