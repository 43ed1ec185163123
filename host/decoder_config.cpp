// MmParseDecoderConfig: the picture shape that a video track's configuration
// bytes describe, for the codecs whose configuration carries one.

#include "platform/decoder_config.h"

#include "host/avc_sps.h"
#include "host/mpeg4_vol.h"

namespace {

constexpr uint32_t kFourccAvc1 = 0x41564331;  // "AVC1"
constexpr uint32_t kFourccMp4v = 0x4D503456;  // "MP4V"
constexpr int kConfigUnderstood = 0;
constexpr int kConfigNotUnderstood = -1;

}  // namespace

extern "C" int MmParseDecoderConfig(const uint8_t* config, uint32_t size, uint32_t fourcc,
                                    MmDecoderConfigInfo* info, uint32_t /*flags*/) {
  if (!config || !info) return kConfigNotUnderstood;
  host::PictureShape shape;
  bool understood = false;
  switch (fourcc) {
    case kFourccAvc1: understood = host::ParseAvcDecoderConfig(config, size, &shape); break;
    case kFourccMp4v: understood = host::ParseMpeg4VideoConfig(config, size, &shape); break;
    default: break;
  }
  // Nothing is written unless the whole configuration was read.
  if (!understood) return kConfigNotUnderstood;
  info->Width = shape.width;
  info->Height = shape.height;
  if (shape.aspect_width != 0 && shape.aspect_height != 0) {
    info->PixelAspectWidth = shape.aspect_width;
    info->PixelAspectHeight = shape.aspect_height;
  }
  return kConfigUnderstood;
}
