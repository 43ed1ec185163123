#include "core/flac_config.h"

#include <cstring>

#include "core/status.h"

namespace {

constexpr uint32_t kStreamHeaderSize = 42;  // "fLaC", block header, STREAMINFO
constexpr uint32_t kStreamInfoLength = 34;
constexpr uint8_t kStreamInfoType = 0;

uint32_t be16(const uint8_t* p) { return static_cast<uint32_t>(p[0]) << 8 | p[1]; }
uint32_t be24(const uint8_t* p) { return static_cast<uint32_t>(p[0]) << 16 | be16(p + 1); }

}  // namespace

int parse_flac_stream_header(const uint8_t* codec_private, uint32_t size, mkv_flac_config* config) {
  if (!codec_private || size < kStreamHeaderSize || std::memcmp(codec_private, "fLaC", 4) != 0) {
    return kStatusInvalidArgument;
  }
  // Only the first block matters; the last-block flag is ignored, so headers
  // followed by comment or seek-table blocks are accepted.
  if ((codec_private[4] & 0x7F) != kStreamInfoType) return kStatusInvalidArgument;
  if (be24(codec_private + 5) != kStreamInfoLength) return kStatusInvalidArgument;

  const uint8_t* info = codec_private + 8;
  mkv_flac_config unpacked{};
  unpacked.min_block_size = be16(info);
  unpacked.max_block_size = be16(info + 2);
  unpacked.min_frame_size = be24(info + 4);
  unpacked.max_frame_size = be24(info + 7);
  unpacked.sample_rate = be24(info + 10) >> 4;
  unpacked.channels = ((info[12] >> 1) & 0x07) + 1;
  unpacked.bits_per_sample = (static_cast<uint32_t>(info[12] & 0x01) << 4 | info[13] >> 4) + 1;
  unpacked.total_samples = static_cast<uint64_t>(info[13] & 0x0F) << 32 | static_cast<uint64_t>(info[14]) << 24 |
                           static_cast<uint64_t>(info[15]) << 16 | static_cast<uint64_t>(info[16]) << 8 | info[17];
  unpacked.filled = 1;

  if (unpacked.min_block_size > unpacked.max_block_size || unpacked.min_frame_size > unpacked.max_frame_size ||
      unpacked.sample_rate == 0) {
    return kStatusInvalidArgument;
  }
  *config = unpacked;
  return kStatusOk;
}

int setup_flac_codec_config(uint8_t* config_bytes, uint8_t** extra_ptr, uint32_t* extra_size,
                            const uint8_t* codec_private, uint32_t codec_private_size) {
  *extra_ptr = nullptr;
  *extra_size = 0;
  mkv_flac_config config;
  int status = parse_flac_stream_header(codec_private, codec_private_size, &config);
  if (status != kStatusOk) return status;
  // Byte 28 of the format is not 8-byte aligned: copy, never cast.
  std::memcpy(config_bytes, &config, sizeof config);
  *extra_ptr = config_bytes;
  *extra_size = kFlacConfigSize;
  return kStatusOk;
}
