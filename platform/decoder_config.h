#pragma once
// The framework's decoder-configuration parser: reads a codec's configuration
// bytes (a track's CodecPrivate) and reports the picture shape it describes.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct MmDecoderConfigInfo {
  uint32_t Width;              // coded picture size, 0 when unknown
  uint32_t Height;
  uint32_t PixelAspectWidth;   // the shape of one pixel; left as the caller set it when unknown
  uint32_t PixelAspectHeight;
} MmDecoderConfigInfo;

// fourcc: the codec's four characters as a big-endian number ("AVC1" = 0x41564331).
// flags: 0. Returns 0 when the configuration was understood.
int MmParseDecoderConfig(const uint8_t* config, uint32_t size, uint32_t fourcc, MmDecoderConfigInfo* info,
                         uint32_t flags);

#ifdef __cplusplus
}
static_assert(sizeof(MmDecoderConfigInfo) == 16, "four words");
#endif
