#include "filter/decoder_config.h"

#include "platform/ao_log.h"

namespace {

constexpr uint32_t kVorbisPacketCount = 3;
constexpr uint32_t kMinVorbisPrivate = 4;
constexpr uint8_t kXiphLaceContinues = 255;

}  // namespace

void ClearDecoderConfig(MkvChannelState* state) {
  state->DecoderConfigCount = 0;
  for (const uint8_t*& data : state->DecoderConfigData) data = nullptr;
}

void SplitVorbisHeaders(MkvChannelState* state, const uint8_t* codec_private, uint32_t size) {
  if (size < kMinVorbisPrivate) {
    ClearDecoderConfig(state);
    return;
  }
  if (codec_private[0] != kVorbisPacketCount - 1) {
    AoLog(kAoLogDegraded, "kelvane: Vorbis header has wrong packet count = %d", codec_private[0]);
    ClearDecoderConfig(state);
    return;
  }

  // Sizes of the first two packets; the third takes whatever remains.
  uint32_t left = size - 1;
  uint32_t p = 1;
  uint32_t sizes[kVorbisPacketCount] = {};
  uint32_t sum = 0;
  for (uint32_t j = 0; j < kVorbisPacketCount - 1; ++j) {
    uint8_t byte;
    do {
      byte = codec_private[p++];
      sizes[j] += byte;
      --left;
    } while (byte == kXiphLaceContinues && left != 0);
    sum += sizes[j];
    if (left == 0) break;
  }
  int64_t last = static_cast<int64_t>(left) - sum;
  if (last < 1) {
    AoLog(kAoLogDegraded, "kelvane: Vorbis config too small.");
    ClearDecoderConfig(state);
    return;
  }
  sizes[2] = static_cast<uint32_t>(last);

  const uint8_t* packet = codec_private + p;
  for (uint32_t j = 0; j < kVorbisPacketCount; ++j) {
    state->DecoderConfigData[j] = packet;
    state->DecoderConfigSize[j] = sizes[j];
    packet += sizes[j];
  }
  if (packet > codec_private + size) {
    ClearDecoderConfig(state);
    return;
  }
  state->DecoderConfigCount = kVorbisPacketCount;
}
