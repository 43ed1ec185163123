#pragma once
// The codecs kelvane offers: a track is played only when its CodecID equals a
// row exactly (case-sensitive; prefixes and extensions match nothing).

#include <cstdint>

struct mkv_codec_row {
  const char* codec_id;
  const char* fourcc;  // four characters
};

constexpr int kSupportedCodecCount = 29;
extern const mkv_codec_row supported_codec_id[kSupportedCodecCount];

// A four-character code as a number, first character most significant ("AVC1" = 0x41564331).
constexpr uint32_t fourcc_value(const char* code) {
  return static_cast<uint32_t>(static_cast<uint8_t>(code[0])) << 24 |
         static_cast<uint32_t>(static_cast<uint8_t>(code[1])) << 16 |
         static_cast<uint32_t>(static_cast<uint8_t>(code[2])) << 8 | static_cast<uint8_t>(code[3]);
}

// The code of the first row whose codec ID equals `codec_id`; 0 for none or a null ID.
uint32_t lookup_codec_fourcc(const char* codec_id);
