#include "host/mpeg4_vol.h"

#include "host/bit_reader.h"

namespace host {
namespace {

constexpr uint32_t kExtendedPar = 15;
constexpr uint32_t kFineGranularityScalable = 0x12;  // a layer header of another syntax
constexpr uint32_t kShapeRectangular = 0;
constexpr uint32_t kShapeGrayscale = 3;
constexpr size_t kBitmapInfoHeaderSize = 40;

// Pixel aspect ratios of aspect_ratio_info 1 to 5; 6 to 14 are reserved.
constexpr uint8_t kParTable[6][2] = {{0, 0}, {1, 1}, {12, 11}, {10, 11}, {16, 11}, {40, 33}};

bool is_vol_start_code(const uint8_t* p) { return p[0] == 0 && p[1] == 0 && p[2] == 1 && (p[3] & 0xF0) == 0x20; }

void skip_vbv_parameters(BitReader& bits) {
  // first/latter half bit rate, first/latter half buffer size, first/latter
  // half occupancy, with their marker bits.
  bits.Skip(15 + 1 + 15 + 1 + 15 + 1 + 3 + 11 + 1 + 15 + 1);
}

unsigned bits_for(uint32_t value) {
  unsigned count = 1;
  while (count < 32 && (value >> count) != 0) ++count;
  return count;
}

}  // namespace

bool ParseMpeg4Vol(const uint8_t* vol, size_t size, PictureShape* shape) {
  BitReader bits(vol, size);
  bits.Skip(1);  // random_accessible_vol
  if (bits.Bits(8) == kFineGranularityScalable) return false;
  uint32_t verid = 1;
  if (bits.Flag()) {  // is_object_layer_identifier
    verid = bits.Bits(4);
    bits.Skip(3);  // video_object_layer_priority
  }
  PictureShape parsed;
  uint32_t aspect = bits.Bits(4);
  if (aspect == kExtendedPar) {
    parsed.aspect_width = bits.Bits(8);
    parsed.aspect_height = bits.Bits(8);
  } else if (aspect < 6) {
    parsed.aspect_width = kParTable[aspect][0];
    parsed.aspect_height = kParTable[aspect][1];
  }
  if (parsed.aspect_width == 0 || parsed.aspect_height == 0) parsed.aspect_width = parsed.aspect_height = 0;

  if (bits.Flag()) {  // vol_control_parameters
    bits.Skip(2 + 1);  // chroma_format, low_delay
    if (bits.Flag()) skip_vbv_parameters(bits);
  }
  uint32_t shape_code = bits.Bits(2);
  if (shape_code == kShapeGrayscale && verid != 1) bits.Skip(4);  // video_object_layer_shape_extension
  bits.Skip(1);  // marker
  uint32_t time_resolution = bits.Bits(16);
  bits.Skip(1);  // marker
  if (bits.failed() || time_resolution == 0) return false;
  if (bits.Flag()) bits.Skip(bits_for(time_resolution - 1));  // fixed_vop_time_increment
  // Only a rectangular layer carries its size; for other shapes it stays unknown.
  if (shape_code == kShapeRectangular) {
    bits.Skip(1);  // marker
    parsed.width = bits.Bits(13);
    bits.Skip(1);  // marker
    parsed.height = bits.Bits(13);
  }
  if (bits.failed()) return false;
  *shape = parsed;
  return true;
}

bool ParseMpeg4VideoConfig(const uint8_t* config, size_t size, PictureShape* shape) {
  size_t start = 0;
  // A BITMAPINFOHEADER (V_MS/VFW/FOURCC) starts with its own size, 40, little-endian;
  // its size fields could imitate a start code.
  if (size >= kBitmapInfoHeaderSize && config[0] == kBitmapInfoHeaderSize && config[1] == 0 && config[2] == 0 &&
      config[3] == 0) {
    start = kBitmapInfoHeaderSize;
  }
  for (size_t i = start; size >= 4 && i <= size - 4; ++i) {
    if (is_vol_start_code(config + i)) return ParseMpeg4Vol(config + i + 4, size - i - 4, shape);
  }
  return false;
}

}  // namespace host
