#include "host/avc_sps.h"

#include <vector>

#include "host/bit_reader.h"

namespace host {
namespace {

constexpr uint8_t kSpsNalType = 7;
constexpr uint8_t kExtendedSar = 255;
constexpr uint64_t kMaxPictureSide = 65535;  // far beyond every level's limit

// Sample aspect ratios of aspect_ratio_idc 1 to 16.
constexpr uint16_t kSarTable[17][2] = {
    {0, 0},   {1, 1},   {12, 11}, {10, 11}, {16, 11}, {40, 33}, {24, 11}, {20, 11},  {32, 11},
    {80, 33}, {18, 11}, {15, 11}, {64, 33}, {160, 99}, {4, 3},  {3, 2},   {2, 1},
};

// Profiles whose SPS carries chroma format, bit depths and scaling matrices.
bool has_chroma_fields(uint32_t profile_idc) {
  switch (profile_idc) {
    case 100: case 110: case 122: case 244: case 44: case 83: case 86:
    case 118: case 128: case 138: case 139: case 134: case 135:
      return true;
    default:
      return false;
  }
}

// The lists are only stepped over; their values do not change the picture's shape.
void skip_scaling_list(BitReader& bits, int size) {
  int32_t last_scale = 8;
  int32_t next_scale = 8;
  for (int j = 0; j < size && !bits.failed(); ++j) {
    if (next_scale != 0) {
      int32_t delta = bits.SignedGolomb();
      next_scale = static_cast<int32_t>((static_cast<int64_t>(last_scale) + delta + 256) % 256);
    }
    if (next_scale != 0) last_scale = next_scale;
  }
}

struct ChromaFormat {
  uint32_t chroma_format_idc = 1;  // 4:2:0 unless the profile says otherwise
  bool separate_colour_planes = false;
};

bool read_chroma_fields(BitReader& bits, ChromaFormat* chroma) {
  chroma->chroma_format_idc = bits.Golomb();
  if (chroma->chroma_format_idc > 3) return false;
  if (chroma->chroma_format_idc == 3) chroma->separate_colour_planes = bits.Flag();
  if (bits.Golomb() > 6 || bits.Golomb() > 6) return false;  // bit depths minus 8
  bits.Skip(1);                                              // qpprime_y_zero_transform_bypass_flag
  if (bits.Flag()) {                                         // seq_scaling_matrix_present_flag
    int lists = chroma->chroma_format_idc != 3 ? 8 : 12;
    for (int i = 0; i < lists; ++i) {
      if (bits.Flag()) skip_scaling_list(bits, i < 6 ? 16 : 64);
    }
  }
  return !bits.failed();
}

bool skip_picture_order_fields(BitReader& bits) {
  uint32_t type = bits.Golomb();
  if (type == 0) {
    if (bits.Golomb() > 12) return false;  // log2_max_pic_order_cnt_lsb_minus4
  } else if (type == 1) {
    bits.Skip(1);  // delta_pic_order_always_zero_flag
    bits.SignedGolomb();
    bits.SignedGolomb();
    uint32_t cycle = bits.Golomb();
    if (cycle > 255) return false;
    for (uint32_t i = 0; i < cycle && !bits.failed(); ++i) bits.SignedGolomb();
  } else if (type > 2) {
    return false;
  }
  return !bits.failed();
}

void read_sample_aspect_ratio(BitReader& bits, PictureShape* shape) {
  if (!bits.Flag()) return;  // aspect_ratio_info_present_flag
  uint32_t idc = bits.Bits(8);
  uint32_t width = 0;
  uint32_t height = 0;
  if (idc == kExtendedSar) {
    width = bits.Bits(16);
    height = bits.Bits(16);
  } else if (idc < 17) {
    width = kSarTable[idc][0];
    height = kSarTable[idc][1];
  }
  // 0 (unspecified), reserved codes and a zero Extended_SAR say nothing.
  if (width == 0 || height == 0) return;
  shape->aspect_width = width;
  shape->aspect_height = height;
}

// A NAL unit's payload without its emulation-prevention bytes (the 03 of
// every 00 00 03).
std::vector<uint8_t> RemoveEmulationPrevention(const uint8_t* payload, size_t size) {
  std::vector<uint8_t> rbsp;
  rbsp.reserve(size);
  int zeros = 0;
  for (size_t i = 0; i < size; ++i) {
    if (zeros >= 2 && payload[i] == 0x03) {
      zeros = 0;
      continue;
    }
    zeros = payload[i] == 0 ? zeros + 1 : 0;
    rbsp.push_back(payload[i]);
  }
  return rbsp;
}

}  // namespace

bool ParseAvcSps(const uint8_t* nal, size_t size, PictureShape* shape) {
  if (size < 2 || (nal[0] & 0x1F) != kSpsNalType) return false;
  std::vector<uint8_t> rbsp = RemoveEmulationPrevention(nal + 1, size - 1);
  BitReader bits(rbsp.data(), rbsp.size());

  uint32_t profile_idc = bits.Bits(8);
  bits.Skip(16);  // constraint flags, level_idc
  if (bits.Golomb() > 31) return false;  // seq_parameter_set_id
  ChromaFormat chroma;
  if (has_chroma_fields(profile_idc) && !read_chroma_fields(bits, &chroma)) return false;
  if (bits.Golomb() > 12) return false;  // log2_max_frame_num_minus4
  if (!skip_picture_order_fields(bits)) return false;
  bits.Golomb();  // max_num_ref_frames
  bits.Skip(1);   // gaps_in_frame_num_value_allowed_flag
  uint64_t width_in_mbs = uint64_t{bits.Golomb()} + 1;
  uint64_t height_in_map_units = uint64_t{bits.Golomb()} + 1;
  bool frame_mbs_only = bits.Flag();
  if (!frame_mbs_only) bits.Skip(1);  // mb_adaptive_frame_field_flag
  bits.Skip(1);                       // direct_8x8_inference_flag

  uint64_t crop_left = 0, crop_right = 0, crop_top = 0, crop_bottom = 0;
  if (bits.Flag()) {
    crop_left = bits.Golomb();
    crop_right = bits.Golomb();
    crop_top = bits.Golomb();
    crop_bottom = bits.Golomb();
  }
  bool has_vui = bits.Flag();
  if (bits.failed()) return false;

  uint64_t field_factor = frame_mbs_only ? 1 : 2;
  uint64_t width = width_in_mbs * 16;
  uint64_t height = field_factor * height_in_map_units * 16;
  // Crop offsets count in chroma samples (and in field lines for field coding).
  bool has_chroma_array = chroma.chroma_format_idc != 0 && !chroma.separate_colour_planes;
  uint64_t crop_unit_x = has_chroma_array && chroma.chroma_format_idc != 3 ? 2 : 1;
  uint64_t crop_unit_y = (has_chroma_array && chroma.chroma_format_idc == 1 ? 2 : 1) * field_factor;
  uint64_t crop_x = crop_unit_x * (crop_left + crop_right);
  uint64_t crop_y = crop_unit_y * (crop_top + crop_bottom);
  if (width > kMaxPictureSide || height > kMaxPictureSide || crop_x >= width || crop_y >= height) return false;

  PictureShape parsed;
  parsed.width = static_cast<uint32_t>(width - crop_x);
  parsed.height = static_cast<uint32_t>(height - crop_y);
  if (has_vui) read_sample_aspect_ratio(bits, &parsed);
  if (bits.failed()) return false;
  *shape = parsed;
  return true;
}

bool ParseAvcDecoderConfig(const uint8_t* record, size_t size, PictureShape* shape) {
  // configurationVersion, profile, compatibility, level, NAL length size,
  // SPS count, then each SPS behind its 16-bit length.
  constexpr size_t kFirstSps = 8;
  if (size < kFirstSps || record[0] != 1 || (record[5] & 0x1F) == 0) return false;
  size_t sps_size = static_cast<size_t>(record[6]) << 8 | record[7];
  return sps_size <= size - kFirstSps && ParseAvcSps(record + kFirstSps, sps_size, shape);
}

}  // namespace host
