#pragma once
// The framework's media format record: 1128 bytes that travel between the
// filter and the framework, describing one channel's stream. Offsets are fixed
// by the framework and identical on 32-bit and 64-bit builds; the last field
// is a pointer at 1120, so on 32-bit four bytes of padding close the record.
// Words that the filter only copies or sets to constants keep neutral names:
// their meaning belongs to the framework.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

// stream_type values.
enum {
  kMmfStreamPcmAudio = 4,
  kMmfStreamEncodedVideo = (int)0x80000002u,
  kMmfStreamEncodedAudio = (int)0x80000004u,
};

typedef struct MmfAudioFormat {
  uint32_t channels;         // 8
  uint32_t bits_per_sample;  // 12
  uint32_t sample_rate;      // 16, Hz
  uint32_t reserved_20;      // 20
  int32_t duration;          // 24
  uint8_t codec_config[48];  // 28..75: AAC bytes 28/29, or the FLAC configuration record
} MmfAudioFormat;

typedef struct MmfVideoFormat {
  uint32_t width;              // 8
  uint32_t height;             // 12
  uint32_t word_16;            // 16
  uint32_t frame_rate;         // 20, frames per second
  uint32_t reserved_24;        // 24
  int32_t duration;            // 28, microseconds
  uint16_t pixel_aspect_width;   // 32
  uint16_t pixel_aspect_height;  // 34
  uint32_t word_36;            // 36
} MmfVideoFormat;

typedef struct MmfMediaFormat {
  uint32_t stream_type;  // 0
  uint32_t fourcc;       // 4, first character in the most significant byte
  union {
    MmfAudioFormat audio;
    MmfVideoFormat video;
    uint8_t bytes[1024];
  } media;                       // 8..1031
  uint32_t buffer_size;          // 1032, the read unit in bytes
  uint32_t buffer_count;         // 1036
  uint32_t word_1040;            // 1040
  uint8_t reserved_1044[32];     // 1044..1075
  uint32_t word_1076;            // 1076
  uint64_t duration;             // 1080
  uint32_t word_1088;            // 1088
  uint32_t pcm_byte_order;       // 1092: 1 little endian, 2 big endian, 0 not PCM
  uint32_t no_seek_test;         // 1096: 1 = the input is not to be tested for seeking
  uint32_t reserved_1100;        // 1100
  uint32_t word_1104;            // 1104
  uint32_t data_rate;            // 1108: above 50000 asks for the larger header buffer
  uint32_t reserved_1112;        // 1112
  uint32_t extra_size;           // 1116, bytes at extra_ptr
  uint8_t* extra_ptr;            // 1120, the codec's extra data; not owned by the record
#if UINTPTR_MAX == 0xFFFFFFFFu
  uint32_t reserved_1124;        // 1124: padding to the framework's size on 32-bit
#endif
} MmfMediaFormat;

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfMediaFormat> && std::is_trivially_copyable_v<MmfMediaFormat>);
static_assert(sizeof(MmfMediaFormat) == 1128, "the framework's format record is 1128 bytes");
static_assert(__builtin_offsetof(MmfMediaFormat, fourcc) == 4);
static_assert(__builtin_offsetof(MmfMediaFormat, media.audio.channels) == 8);
static_assert(__builtin_offsetof(MmfMediaFormat, media.audio.sample_rate) == 16);
static_assert(__builtin_offsetof(MmfMediaFormat, media.audio.duration) == 24);
static_assert(__builtin_offsetof(MmfMediaFormat, media.audio.codec_config) == 28);
static_assert(__builtin_offsetof(MmfMediaFormat, media.video.frame_rate) == 20);
static_assert(__builtin_offsetof(MmfMediaFormat, media.video.duration) == 28);
static_assert(__builtin_offsetof(MmfMediaFormat, media.video.pixel_aspect_width) == 32);
static_assert(__builtin_offsetof(MmfMediaFormat, media.video.pixel_aspect_height) == 34);
static_assert(__builtin_offsetof(MmfMediaFormat, media.video.word_36) == 36);
static_assert(__builtin_offsetof(MmfMediaFormat, buffer_size) == 1032);
static_assert(__builtin_offsetof(MmfMediaFormat, buffer_count) == 1036);
static_assert(__builtin_offsetof(MmfMediaFormat, word_1040) == 1040);
static_assert(__builtin_offsetof(MmfMediaFormat, word_1076) == 1076);
static_assert(__builtin_offsetof(MmfMediaFormat, duration) == 1080);
static_assert(__builtin_offsetof(MmfMediaFormat, word_1088) == 1088);
static_assert(__builtin_offsetof(MmfMediaFormat, pcm_byte_order) == 1092);
static_assert(__builtin_offsetof(MmfMediaFormat, no_seek_test) == 1096);
static_assert(__builtin_offsetof(MmfMediaFormat, word_1104) == 1104);
static_assert(__builtin_offsetof(MmfMediaFormat, data_rate) == 1108);
static_assert(__builtin_offsetof(MmfMediaFormat, extra_size) == 1116);
static_assert(__builtin_offsetof(MmfMediaFormat, extra_ptr) == 1120);
#endif
