// What a channel sends besides frames: the frame prefix that header
// stripping removed (copied once into an input-pool buffer) and the first
// buffer, which carries the decoder-configuration packets.

#include <cstring>

#include "filter/output_assembly.h"
#include "filter/output_elements.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"

namespace {

constexpr uint64_t kHeaderStripping = 3;

const mkv_content_encoding* StrippedHeader(const mkv_track_info* track) {
  for (uint32_t i = 0; i < track->content_encoding_count && i < kMaxContentEncodings; ++i) {
    const mkv_content_encoding& encoding = track->content_encodings[i];
    if (encoding.comp_algo == kHeaderStripping && encoding.comp_settings) return &encoding;
  }
  return nullptr;
}

}  // namespace

int PrepareFramePrefix(MkvChannelState* state, MkvContext* context) {
  if (!state->Track || !state->Track->compressed || state->ConfigBuffer) return kMmfOk;
  // The file model is shared and read-only here: a track without a stripped
  // header keeps its flag, and is looked through again (at most five records).
  const mkv_content_encoding* encoding = StrippedHeader(state->Track);
  if (!encoding) return kMmfOk;
  if (!context->InputPool || !context->InputPoolParam) return kNextBufferError;
  MmfPoolBuffer* buffer = nullptr;
  if (context->InputPool->AcquireBuffer(context->InputPoolParam, &buffer, 0) != 0 || !buffer) return kNextBufferError;
  (void)context->InputPool->MapBuffer(buffer);
  if (encoding->comp_settings_size > buffer->Size) {
    (void)context->InputPool->ReleaseMappedBuffer(buffer);
    return kNextBufferError;
  }
  std::memcpy(buffer->Data, encoding->comp_settings, encoding->comp_settings_size);
  state->ConfigBuffer = buffer;
  state->ConfigBufferSize = encoding->comp_settings_size;
  return kMmfOk;
}

int DeliverDecoderConfig(MkvChannelState* state) {
  MmfPoolBuffer* buffer = nullptr;
  if (!state->OutPool || state->OutPool->AcquireBuffer(state->OutPoolParam, &buffer, 0) != 0 || !buffer) {
    AoLog(kAoLogFailure, "kelvane->AcquireBuffer() failed");
    (void)MmfReleaseMra(state->OutMra);
    state->OutMra = nullptr;
    return kNextBufferError;
  }
  auto fail = [&] {
    (void)state->OutPool->ReleaseBuffer(buffer);
    (void)MmfReleaseMra(state->OutMra);
    state->OutMra = nullptr;
    return kNextBufferError;
  };
  if (state->Track->codec_private_size > buffer->Size) {
    AoLog(kAoLogFailure, "kelvane:  decoder config of size %d too large to fit in IOV.",
          static_cast<int>(state->Track->codec_private_size));
    return fail();
  }
  if (SetOutProperty(state, kMmfPropConfigCount, state->DecoderConfigCount) != 0) {
    AoLog(kAoLogFailure, "kelvane MmfSetMraPropertyElement() failed.");
    return fail();
  }
  uint32_t used = 0;
  for (uint32_t i = 0; i < state->DecoderConfigCount && i < kMaxDecoderConfigPackets; ++i) {
    uint32_t size = state->DecoderConfigSize[i];
    if (used + size > buffer->Size) return fail();
    if (size) std::memcpy(buffer->Data + used, state->DecoderConfigData[i], size);
    if (SetOutBuffer(state, buffer, buffer->Data + used, size) != 0) {
      AoLog(kAoLogFailure, "kelvane MmfSetMraBufferElement() failed ");
      return fail();
    }
    used += size;
  }
  // The media buffer's elements hold the pool buffer from here on.
  (void)state->OutPool->ReleaseBuffer(buffer);
  state->DecoderConfigSent = 1;
  return kMmfBufferDelivered;
}
