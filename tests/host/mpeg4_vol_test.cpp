#include "host/mpeg4_vol.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/bit_writer.h"

namespace {

using Bytes = std::vector<uint8_t>;
using host::PictureShape;

// Configurations written by ffmpeg's mpeg4 and libxvid encoders (visual object
// sequence, visual object, layer, user data); ffprobe's size and aspect ratio.
const struct {
  const char* name;
  Bytes config;
  uint32_t width, height, par_width, par_height;
} kEncoderConfigs[] = {
    {"mpeg4, extended PAR", {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xC4, 0xF8, 0x28, 0x3D, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00, 0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63}, 176, 144, 5, 7},
    {"mpeg4, table PAR", {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xC4, 0xA5, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00, 0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63}, 176, 144, 16, 11},
    {"xvid, control parameters", {0x00, 0x00, 0x01, 0xB0, 0x03, 0x00, 0x00, 0x01, 0xB5, 0x09, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xBC, 0x24, 0x1E, 0xC4, 0x00, 0x67, 0x0C, 0x16, 0x10, 0x48, 0x51, 0x8F, 0x00, 0x00, 0x01, 0xB2, 0x58, 0x76, 0x69, 0x44}, 176, 144, 9, 7},
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

// Layer headers the encoders above never write; 352x288 when rectangular.
struct Vol {
  uint32_t object_type = 1;
  uint32_t verid = 0;  // 0: no layer identifier
  uint32_t aspect = 3;
  uint32_t par = 0;  // extended PAR width and height, 8 bits each
  bool vbv = false;
  uint32_t shape = 0;
  uint32_t time_resolution = 25;
  unsigned increment_bits = 0;  // 0: no fixed rate
};

Bytes vol_with_start_code(const Vol& v, uint8_t code = 0x20) {
  testing_support::BitWriter w;
  w.Bits(24, 1).Bits(8, code).Bits(1, 0).Bits(8, v.object_type).Bits(1, v.verid != 0);
  if (v.verid) w.Bits(4, v.verid).Bits(3, 1);
  w.Bits(4, v.aspect);
  if (v.aspect == 15) w.Bits(16, v.par);
  w.Bits(1, v.vbv);  // control parameters only with VBV parameters
  if (v.vbv) w.Bits(4, 0x7).Bits(51, 0).Bits(28, 0xFFFFFFF);
  w.Bits(2, v.shape);
  if (v.shape == 3 && v.verid > 1) w.Bits(4, 0);
  w.Bits(1, 1).Bits(16, v.time_resolution).Bits(1, 1).Bits(1, v.increment_bits != 0).Bits(v.increment_bits, 1);
  if (v.shape == 0) w.Bits(1, 1).Bits(13, 352).Bits(1, 1).Bits(13, 288).Bits(1, 1);
  return w.bytes();
}

TEST(Mpeg4VolTest, OptionalFieldsAndAspectCodesAreRead) {
  const struct {
    const char* name;
    Vol vol;
    uint32_t width, par_width, par_height;
  } cases[] = {
      {"525-line 16:9", {.aspect = 5}, 352, 40, 33},
      {"extended 255:254", {.aspect = 15, .par = 0xFFFE}, 352, 255, 254},
      {"extended with zero height", {.aspect = 15, .par = 0x0500}, 352, 0, 0},
      {"forbidden 0", {.aspect = 0}, 352, 0, 0},
      {"reserved 6", {.aspect = 6}, 352, 0, 0},
      {"layer identifier", {.verid = 2}, 352, 10, 11},
      {"VBV parameters", {.vbv = true}, 352, 10, 11},
      {"fixed rate, resolution 1", {.time_resolution = 1, .increment_bits = 1}, 352, 10, 11},
      {"fixed rate, resolution 3", {.time_resolution = 3, .increment_bits = 2}, 352, 10, 11},
      {"fixed rate, resolution 32768", {.time_resolution = 32768, .increment_bits = 15}, 352, 10, 11},
      {"fixed rate, resolution 32769", {.time_resolution = 32769, .increment_bits = 16}, 352, 10, 11},
      {"binary shape has no size", {.shape = 1}, 0, 10, 11},
      {"grayscale shape, version 2", {.verid = 2, .shape = 3}, 0, 10, 11},
  };
  for (const auto& c : cases) {
    Bytes config = vol_with_start_code(c.vol);
    PictureShape shape;
    ASSERT_TRUE(host::ParseMpeg4VideoConfig(config.data(), config.size(), &shape)) << c.name;
    EXPECT_EQ(shape.width, c.width) << c.name;
    EXPECT_EQ(shape.height, c.width ? 288u : 0u) << c.name;
    EXPECT_EQ(shape.aspect_width, c.par_width) << c.name;
    EXPECT_EQ(shape.aspect_height, c.par_height) << c.name;
  }
}

TEST(Mpeg4VolTest, LayerHeaderIsFoundOnlyBehindItsStartCode) {
  Bytes vol = vol_with_start_code({});
  // A BITMAPINFOHEADER whose width bytes imitate a layer start code (00 00 01 20).
  Bytes behind_bitmap_info = {0x28, 0x00, 0x00, 0x00, 0x00, 0x00, 0x01, 0x20, 0x90, 0x00, 0x00, 0x00, 0x01, 0x00};
  behind_bitmap_info.resize(40, 0x00);
  behind_bitmap_info.insert(behind_bitmap_info.end(), vol.begin(), vol.end());
  Bytes cut(vol.begin(), vol.end() - 2);
  const struct {
    const char* name;
    Bytes config;
    bool found;
  } cases[] = {
      {"behind a BITMAPINFOHEADER", behind_bitmap_info, true},
      {"last layer start code 0x2F", vol_with_start_code({}, 0x2F), true},
      {"start code 0x30 is no layer", vol_with_start_code({}, 0x30), false},
      {"no start code", Bytes(vol.begin() + 3, vol.end()), false},
      {"start code at the very end", {0x11, 0x00, 0x00, 0x01, 0x20}, false},
      {"cut inside the height", cut, false},
      {"time resolution 0", vol_with_start_code({.time_resolution = 0}), false},
      {"fine granularity scalable layer", vol_with_start_code({.object_type = 0x12}), false},
  };
  for (const auto& c : cases) {
    PictureShape shape;
    shape.width = 77;
    EXPECT_EQ(host::ParseMpeg4VideoConfig(c.config.data(), c.config.size(), &shape), c.found) << c.name;
    EXPECT_EQ(shape.width, c.found ? 352u : 77u) << c.name;
  }
}

}  // namespace
