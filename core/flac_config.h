#pragma once
// The FLAC decoder's configuration: the STREAMINFO block of an A_FLAC track's
// CodecPrivate ("fLaC", block header, 34 bytes), unpacked into the fixed
// 48-byte record the decoder reads through the output format's extra data.

#include <cstdint>
#include <type_traits>

// Note the order: the maximum of each pair comes before the minimum.
struct mkv_flac_config {
  uint32_t max_block_size;   // samples
  uint32_t min_block_size;
  uint32_t max_frame_size;   // bytes; 0 = unknown
  uint32_t min_frame_size;
  uint32_t sample_rate;      // Hz, never 0
  uint32_t channels;         // 1..8
  uint32_t bits_per_sample;  // 1..32
  uint32_t reserved0;
  uint64_t total_samples;    // 36 bits; words 8 and 9 in the machine's order
  uint32_t filled;           // 1: the record holds a STREAMINFO
  uint32_t reserved1;
};
static_assert(sizeof(mkv_flac_config) == 48, "twelve words");
static_assert(__builtin_offsetof(mkv_flac_config, total_samples) == 32, "total samples in words 8 and 9");
static_assert(std::is_standard_layout_v<mkv_flac_config> && std::is_trivially_copyable_v<mkv_flac_config>);

// Bytes of the media format that hold the record, counted from the format's start.
constexpr uint32_t kFlacConfigFormatOffset = 28;
constexpr uint32_t kFlacConfigSize = sizeof(mkv_flac_config);

// Validates `codec_private` and unpacks its STREAMINFO into *config.
// 0, or 22 when the bytes are not a usable FLAC header (*config then untouched).
[[nodiscard]] int parse_flac_stream_header(const uint8_t* codec_private, uint32_t size, mkv_flac_config* config);

// Builds the record in place for a media format: `config_bytes` is the
// format's byte 28 (any alignment), `extra_ptr`/`extra_size` its extra-data
// fields. Both are cleared first; on success the 48 bytes are written and the
// extra data points at them. 0, or 22 with the 48 bytes left untouched.
[[nodiscard]] int setup_flac_codec_config(uint8_t* config_bytes, uint8_t** extra_ptr, uint32_t* extra_size,
                                          const uint8_t* codec_private, uint32_t codec_private_size);
