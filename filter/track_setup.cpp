#include "filter/track_setup.h"

#include <cstring>

#include "core/codec_table.h"
#include "core/flac_config.h"
#include "core/memory.h"
#include "filter/decoder_config.h"
#include "filter/mkv_context.h"
#include "platform/ao_log.h"
#include "platform/decoder_config.h"

namespace {

constexpr uint64_t kTrackVideo = 1;
constexpr uint64_t kTrackAudio = 2;

constexpr uint32_t kFourccFlac = fourcc_value("FLAC");
constexpr uint32_t kFourccVorbis = fourcc_value("VRBS");
constexpr uint32_t kFourccPcm = fourcc_value("RAWA");
constexpr uint32_t kFourccAacMpeg4 = fourcc_value("M4AC");
constexpr uint32_t kFourccAacMpeg2 = fourcc_value("M2AC");
constexpr uint32_t kFourccWvc1 = fourcc_value("WVC1");

constexpr uint32_t kBitsPerSample = 16;
constexpr uint32_t kAacConfigMarker = 2;
constexpr uint32_t kFormatConstant = 2;  // words 1040 and 1076
constexpr uint32_t kVideoWord16 = 16;
constexpr uint32_t kDefaultFrameRate = 24;
constexpr uint32_t kPcmLittleEndian = 1;
constexpr uint32_t kPcmBigEndian = 2;
constexpr uint32_t kBitmapInfoHeaderSize = 40;
constexpr uint32_t kBitmapCompressionOffset = 16;

// The framework expects a truncating conversion; out-of-range values saturate
// as the target's conversion instruction does, never undefined behaviour.
int32_t ToInt32(double value) {
  if (!(value == value)) return 0;
  if (value >= 2147483647.0) return INT32_MAX;
  if (value <= -2147483648.0) return INT32_MIN;
  return static_cast<int32_t>(value);
}

uint64_t ToUint64(double value) {
  if (!(value > 0)) return 0;
  if (value >= 18446744073709551615.0) return UINT64_MAX;
  return static_cast<uint64_t>(value);
}

char* CopyName(const char* text) {
  size_t size = std::strlen(text) + 1;
  auto* copy = static_cast<char*>(mem_alloc(size));
  if (copy) std::memcpy(copy, text, size);
  return copy;
}

void RaiseDuration(MkvContext* context, int32_t duration) {
  if (static_cast<int64_t>(duration) > static_cast<int64_t>(context->Duration)) {
    context->Duration = static_cast<uint64_t>(static_cast<int64_t>(duration));
  }
}

uint32_t BigEndianWord(const uint8_t* bytes) {
  return uint32_t{bytes[0]} << 24 | uint32_t{bytes[1]} << 16 | uint32_t{bytes[2]} << 8 | bytes[3];
}

void FillCommon(MmfMediaFormat& format, const MmfMediaFormat& input, double segment_duration) {
  format.duration = ToUint64(segment_duration / 1000.0);
  format.word_1088 = 0;
  format.pcm_byte_order = 0;
  format.no_seek_test = input.no_seek_test;
  format.word_1104 = input.word_1104;
  format.data_rate = input.data_rate;
  format.buffer_size = input.buffer_size;
  format.extra_size = 0;
  format.word_1076 = kFormatConstant;
  format.word_1040 = kFormatConstant;
  format.buffer_count = 0;
}

void SetExtraData(MkvChannel* channel, const mkv_track_info& track, uint32_t track_index) {
  MmfMediaFormat& format = channel->Format;
  if (format.fourcc == kFourccFlac) {
    uint8_t* config = format.media.audio.codec_config;
    if (setup_flac_codec_config(config, &format.extra_ptr, &format.extra_size, track.codec_private,
                                track.codec_private_size) != 0) {
      AoLog(kAoLogDegraded, "kelvane: track %d: cannot set extra_ptr for FLAC stream", static_cast<int>(track_index));
    }
    return;
  }
  format.extra_ptr = track.codec_private;
  format.extra_size = track.codec_private_size;
  if (format.fourcc == kFourccVorbis) SplitVorbisHeaders(channel->State, track.codec_private, track.codec_private_size);
}

bool SetUpAudio(MkvContext* context, MkvChannel* channel, const mkv_track_info& track) {
  MmfMediaFormat& format = channel->Format;
  MmfAudioFormat& audio = format.media.audio;
  audio.bits_per_sample = kBitsPerSample;
  audio.channels = static_cast<uint32_t>(track.channels);
  audio.sample_rate = static_cast<uint32_t>(ToInt32(track.sampling_frequency));
  audio.duration = ToInt32(context->FileInfo.duration / 1000.0);
  RaiseDuration(context, audio.duration);

  format.stream_type = kMmfStreamPcmAudio;
  if (format.fourcc != kFourccPcm) {
    format.stream_type = static_cast<uint32_t>(kMmfStreamEncodedAudio);
    if (format.fourcc == kFourccAacMpeg4 || format.fourcc == kFourccAacMpeg2) {
      audio.codec_config[0] = kAacConfigMarker;
      audio.codec_config[1] = 0;
      format.word_1104 = kAacConfigMarker;
    }
  } else if (std::strstr(track.codec_id, "/LIT")) {
    format.pcm_byte_order = kPcmLittleEndian;
  } else if (std::strstr(track.codec_id, "/BIG")) {
    format.pcm_byte_order = kPcmBigEndian;
  }
  channel->Name = CopyName("EncodedAudioOut");
  return channel->Name != nullptr;
}

uint32_t FrameRate(uint64_t default_duration) {
  if (default_duration == 0) {
    AoLog(kAoLogNotice, "kelvane:  No default duration, frame rate is inaccurate.");
    return kDefaultFrameRate;
  }
  return static_cast<uint32_t>((10000000000ull / default_duration + 5) / 10);
}

bool SetUpVideo(MkvContext* context, MkvChannel* channel, const mkv_track_info& track) {
  MmfMediaFormat& format = channel->Format;
  MmfVideoFormat& video = format.media.video;
  const mkv_file_info& info = context->FileInfo;
  video.duration = ToInt32(static_cast<double>(info.timecode_scale) * info.duration / 1000.0);
  video.frame_rate = FrameRate(track.default_duration);
  RaiseDuration(context, video.duration);
  video.word_36 = 1;
  video.height = static_cast<uint32_t>(track.pixel_height);
  video.width = static_cast<uint32_t>(track.pixel_width);

  MmDecoderConfigInfo shape{0, 0, 1, 1};
  bool parsed = track.codec_private &&
                MmParseDecoderConfig(track.codec_private, track.codec_private_size, format.fourcc, &shape, 0) == 0;
  video.pixel_aspect_width = static_cast<uint16_t>(parsed ? shape.PixelAspectWidth : 1);
  video.pixel_aspect_height = static_cast<uint16_t>(parsed ? shape.PixelAspectHeight : 1);
  video.word_16 = kVideoWord16;
  format.stream_type = static_cast<uint32_t>(kMmfStreamEncodedVideo);
  channel->Name = CopyName("EncodedVideoOut");
  if (!channel->Name) return false;

  // A BITMAPINFOHEADER names the real codec in its compression field.
  if (std::strcmp(track.codec_id, "V_MS/VFW/FOURCC") == 0 && track.codec_private &&
      track.codec_private_size >= kBitmapInfoHeaderSize) {
    format.fourcc = BigEndianWord(track.codec_private + kBitmapCompressionOffset);
    if (format.fourcc == kFourccWvc1 && track.codec_private_size > kBitmapInfoHeaderSize) {
      format.extra_ptr = track.codec_private + kBitmapInfoHeaderSize;
      format.extra_size = track.codec_private_size - kBitmapInfoHeaderSize;
    }
  }
  return true;
}

}  // namespace

TrackSetup SetUpTrackChannel(MkvFilter* filter, const MmfMediaFormat& input, uint32_t track_index,
                             MkvChannel* channel) {
  MkvContext* context = filter->Context;
  const mkv_track_info& track = context->FileInfo.tracks[track_index];
  if (track.encrypted) {
    AoLog(kAoLogNotice, "kelvane:  track %d is encrypted.  Encryption not supported.", static_cast<int>(track_index));
    return TrackSetup::kSkipped;
  }
  if (!track.codec_id) return TrackSetup::kSkipped;
  MmfMediaFormat& format = channel->Format;
  format.fourcc = lookup_codec_fourcc(track.codec_id);
  if (format.fourcc == 0) return TrackSetup::kSkipped;

  FillCommon(format, input, context->FileInfo.duration);
  if (track.compressed) ++context->ExtraBufferCount;

  MkvChannelState* state = channel->State;
  if (track.codec_private) {
    state->DecoderConfigCount = 1;
    state->DecoderConfigData[0] = track.codec_private;
    state->DecoderConfigSize[0] = track.codec_private_size;
  }
  SetExtraData(channel, track, track_index);

  bool named = true;
  if (track.track_type == kTrackAudio) {
    named = SetUpAudio(context, channel, track);
  } else if (track.track_type == kTrackVideo) {
    named = SetUpVideo(context, channel, track);
  }
  if (!named) return TrackSetup::kNoMemory;

  state->Track = &track;
  state->AheadElement = -1;
  return TrackSetup::kSetUp;
}
