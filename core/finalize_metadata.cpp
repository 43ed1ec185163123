#include <cmath>
#include <cstring>

#include "core/codec_table.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "platform/decoder_config.h"

namespace {

constexpr uint64_t kVideoTrack = 1;
constexpr uint64_t kAudioTrack = 2;
constexpr uint32_t kMediaTypeVideo = 0x80000002;
constexpr uint32_t kMediaTypeAudio = 0x80000004;

struct tag_key {
  const char* tag_name;
  const char* key;
};
const tag_key offered_tags[] = {
    {"TITLE", "Name"}, {"ARTIST", "Artist"}, {"GENRE", "Genre"}, {"ALBUM", "Album"}, {"COMMENT", "Comment"},
};

int add_num4(mkv_metadata_list* list, const char* key, uint32_t value) {
  return add_metadata_entry(list, "NUM4", key, &value, sizeof value);
}

int add_num8(mkv_metadata_list* list, const char* key, int64_t value) {
  return add_metadata_entry(list, "NUM8", key, &value, sizeof value);
}

// Converting a double that does not fit is undefined, and a hostile file can
// write any double: NaN gives 0, values beyond the range stop at its ends.
int64_t truncate_to_int64(double value) {
  if (std::isnan(value)) return 0;
  if (value >= 9223372036854775808.0) return INT64_MAX;
  if (value < -9223372036854775808.0) return INT64_MIN;
  return static_cast<int64_t>(value);
}

int32_t truncate_to_int32(double value) {
  if (std::isnan(value)) return 0;
  if (value >= 2147483648.0) return INT32_MAX;
  if (value <= -2147483649.0) return INT32_MIN;
  return static_cast<int32_t>(value);
}

int add_tags(const mkv_file_info* info, mkv_metadata_list* list) {
  uint32_t tags = info->tag_count < kMaxTags ? info->tag_count : kMaxTags;
  for (uint32_t i = 0; i < tags; ++i) {
    const mkv_tag_entry& tag = info->tags[i];
    if (!tag.name || !tag.string) continue;
    for (const tag_key& row : offered_tags) {
      if (std::strcmp(tag.name, row.tag_name) != 0) continue;
      // `length` counts the TagString or TagBinary read last; the string
      // block ends in a NUL, so stopping there never reads past it.
      uint32_t bytes = tag.length;
      if (const void* nul = std::memchr(tag.string, '\0', bytes)) bytes = static_cast<uint32_t>(static_cast<const char*>(nul) - tag.string);
      int status = add_metadata_entry(list, "UTF8", row.key, tag.string, static_cast<int32_t>(bytes));
      if (status != kStatusOk) return status;
      break;
    }
  }
  return kStatusOk;
}

// Frames per second, rounded, from nanoseconds per frame.
uint32_t frame_rate(uint64_t default_duration) {
  if (default_duration == 0) return 0;
  return static_cast<uint32_t>((10000000000ull / default_duration + 5) / 10);
}

// The shape of one pixel, as the framework reads it from the codec's configuration.
void pixel_aspect(const mkv_track_info& track, uint32_t fourcc, uint32_t* width, uint32_t* height) {
  MmDecoderConfigInfo config{0, 0, 1, 1};
  if (fourcc != 0 && track.codec_private) {
    (void)MmParseDecoderConfig(track.codec_private, track.codec_private_size, fourcc, &config, 0);
  }
  *width = config.PixelAspectWidth;
  *height = config.PixelAspectHeight;
}

int add_track(const mkv_file_info* info, const mkv_track_info& track, mkv_metadata_list* list) {
  bool video = track.track_type == kVideoTrack;
  uint32_t fourcc = lookup_codec_fourcc(track.codec_id);
  uint32_t aspect_width = 1;
  uint32_t aspect_height = 1;
  if (video) pixel_aspect(track, fourcc, &aspect_width, &aspect_height);
  int64_t duration_us = truncate_to_int64(static_cast<double>(info->timecode_scale) * info->duration / 1000.0);
  uint32_t sample_rate = video ? frame_rate(track.default_duration)
                               : static_cast<uint32_t>(truncate_to_int32(track.sampling_frequency));

  int status = add_num4(list, "MediaType", video ? kMediaTypeVideo : kMediaTypeAudio);
  if (status == kStatusOk) status = add_num4(list, "Fourcc", fourcc);
  if (status == kStatusOk) status = add_num4(list, "Width", video ? static_cast<uint32_t>(track.pixel_width) : 0);
  if (status == kStatusOk) status = add_num4(list, "Height", video ? static_cast<uint32_t>(track.pixel_height) : 0);
  if (status == kStatusOk) status = add_num4(list, "PixelWidth", aspect_width);
  if (status == kStatusOk) status = add_num4(list, "PixelHeight", aspect_height);
  if (status == kStatusOk) status = add_num8(list, "Duration", duration_us);
  if (status == kStatusOk) status = add_num4(list, "Channels", video ? 0 : static_cast<uint32_t>(track.channels));
  if (status == kStatusOk) status = add_num4(list, "SampleRate", sample_rate);
  return status;
}

}  // namespace

int FinalizeMetadata(mkv_file_info* info) {
  mkv_metadata_list* list = info->metadata;
  if (!list) return kStatusOk;

  int status = add_tags(info, list);
  if (status != kStatusOk) return status;
  bool seekable = info->parse_limits && info->parse_limits->input_seekable && (info->parse_flags & kMetCues);
  status = add_num4(list, "Seekable", seekable ? 1 : 0);
  if (status != kStatusOk) return status;
  status = add_num4(list, "TrackCount", info->video_track_count + info->audio_track_count);
  if (status != kStatusOk) return status;

  uint32_t tracks = info->track_count < kMaxTracks ? info->track_count : kMaxTracks;
  for (uint32_t i = 0; i < tracks; ++i) {
    const mkv_track_info& track = info->tracks[i];
    if (track.track_type != kVideoTrack && track.track_type != kAudioTrack) continue;
    status = add_track(info, track, list);
    if (status != kStatusOk) return status;
  }
  return kStatusOk;
}
