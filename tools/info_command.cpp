// `kelvane info FILE`: the file model after a header parse — EBML header,
// Segment Info, tracks, cue summary, tags — and the metadata list.

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <cstring>

#include "core/codec_table.h"
#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/input_streams.h"
#include "stream/mkvvstream.h"
#include "tools/commands.h"

namespace {

constexpr int64_t kHeaderBufferSize = 480;

const char* OrNone(const char* text) { return text ? text : "(none)"; }

void PrintHeader(const mkv_file_info& info) {
  std::printf("EBML header\n");
  std::printf("  EBMLVersion: %" PRIu64 "\n", info.ebml_version);
  std::printf("  EBMLReadVersion: %" PRIu64 "\n", info.ebml_read_version);
  std::printf("  EBMLMaxIDLength: %" PRIu64 "\n", info.ebml_max_id_length);
  std::printf("  EBMLMaxSizeLength: %" PRIu64 "\n", info.ebml_max_size_length);
  std::printf("  DocType: %s\n", info.doc_type);
  std::printf("  DocTypeVersion: %" PRIu64 "\n", info.doc_type_version);
  std::printf("  DocTypeReadVersion: %" PRIu64 "\n", info.doc_type_read_version);
}

void PrintSegmentInfo(const mkv_file_info& info) {
  std::printf("Segment Info\n");
  std::printf("  TimecodeScale: %" PRIu64 "\n", info.timecode_scale);
  std::printf("  Duration: %.6f\n", info.duration);
  std::printf("  DurationNs: %.0f\n", std::round(info.duration * static_cast<double>(info.timecode_scale)));
  std::printf("  DateUTC: %" PRId64 "\n", info.date_utc);
  std::printf("  Title: %s\n", OrNone(info.title));
  std::printf("  MuxingApp: %s\n", OrNone(info.muxing_app));
  std::printf("  WritingApp: %s\n", OrNone(info.writing_app));
}

const char* TrackTypeName(uint64_t type) {
  switch (type) {
    case 1: return "video";
    case 2: return "audio";
    case 17: return "subtitles";
    default: return "other";
  }
}

void PrintTracks(const mkv_file_info& info) {
  std::printf("Tracks: %u (video %u, audio %u)\n", info.track_count, info.video_track_count,
              info.audio_track_count);
  for (uint32_t i = 0; i < info.track_count; ++i) {
    const mkv_track_info& track = info.tracks[i];
    uint32_t fourcc = lookup_codec_fourcc(track.codec_id);
    char code[5] = {static_cast<char>(fourcc >> 24), static_cast<char>(fourcc >> 16), static_cast<char>(fourcc >> 8),
                    static_cast<char>(fourcc), 0};
    std::printf("  Track %" PRIu64 ": %s %s (%s) CodecPrivate %u bytes", track.track_number,
                TrackTypeName(track.track_type), OrNone(track.codec_id), fourcc ? code : "not offered",
                track.codec_private_size);
    if (track.track_type == 1) {
      std::printf(", %" PRIu64 "x%" PRIu64, track.pixel_width, track.pixel_height);
    } else if (track.track_type == 2) {
      std::printf(", %.0f Hz, %" PRIu64 " channels", track.sampling_frequency, track.channels);
      if (track.bit_depth) std::printf(", %" PRIu64 " bits", track.bit_depth);
    }
    if (track.default_duration) std::printf(", frame %" PRIu64 " ns", track.default_duration);
    if (track.language) std::printf(", language %s", track.language);
    if (track.content_encoding_count) {
      std::printf(", %u content encoding(s)%s%s", track.content_encoding_count, track.compressed ? " compressed" : "",
                  track.encrypted ? " encrypted" : "");
    }
    std::printf("\n");
  }
}

void PrintCues(const mkv_file_info& info) {
  std::printf("Cues: %u cue points\n", info.cue_points.count);
  if (info.cue_points.count == 0) return;
  const auto* first = static_cast<const mkv_cue_point*>(info.cue_points.head->data);
  const auto* last = static_cast<const mkv_cue_point*>(info.cue_points.tail->data);
  for (const auto* point : {first, last}) {
    const char* which = point == first ? "first" : "last";
    if (point->track_positions.count == 0) continue;
    const auto* position = static_cast<const mkv_cue_track_position*>(point->track_positions.head->data);
    std::printf("  %s: time %" PRIu64 " track %" PRIu64 " cluster at %" PRIu64 "\n", which, point->cue_time,
                position->cue_track, position->cue_cluster_position);
  }
}

void PrintTags(const mkv_file_info& info) {
  std::printf("Tags: %u\n", info.tag_count);
  for (uint32_t i = 0; i < info.tag_count; ++i) {
    const mkv_tag_entry& tag = info.tags[i];
    std::printf("  %s = %s\n", OrNone(tag.name), tag.string ? tag.string : tag.binary ? "(binary)" : "(none)");
  }
}

void PrintMetadata(const mkv_metadata_list& list) {
  std::printf("Metadata: %d entries\n", list.entry_count);
  for (int32_t i = 0; i < list.entry_count; ++i) {
    const char* key = list.key[i];
    switch (list.value_type[i]) {
      case kMetadataTypeUtf8:
        std::printf("  %s UTF8 %.*s\n", key, list.value_size[i], static_cast<const char*>(list.value[i]));
        break;
      case kMetadataTypeNum4: {
        uint32_t value;
        std::memcpy(&value, list.value[i], sizeof value);
        std::printf("  %s NUM4 %u (0x%08X)\n", key, value, value);
        break;
      }
      case kMetadataTypeNum8: {
        int64_t value;
        std::memcpy(&value, list.value[i], sizeof value);
        std::printf("  %s NUM8 %" PRId64 "\n", key, value);
        break;
      }
      default: std::printf("  %s (unknown type)\n", key);
    }
  }
}

}  // namespace

int RunInfo(int argc, char** argv) {
  if (argc != 1 || !std::strcmp(argv[0], "--help")) {
    std::fprintf(argc == 1 ? stdout : stderr, "usage: kelvane info FILE   (FILE may be - for standard input)\n");
    return argc == 1 ? 0 : 2;
  }
  auto input = host::OpenFileStream(argv[0], true);
  if (!input) {
    std::fprintf(stderr, "kelvane: cannot open '%s'\n", argv[0]);
    return 1;
  }
  mkvvstream stream;
  if (mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, input->seekable()) != 0) {
    std::fprintf(stderr, "kelvane: '%s' is too short to be a Matroska file\n", argv[0]);
    return 1;
  }
  static mkv_file_info info;  // large: keep it off the stack
  std::memset(&info, 0, sizeof info);
  mkv_parse_limits limits{kDefaultMaxStringSize, input->seekable() ? 1u : 0u};
  info.parse_limits = &limits;
  info.metadata = mem_new_zeroed<mkv_metadata_list>();

  int result = info.metadata ? parse_mkvfile(&info, &stream) : kParseNoMemory;
  if (info.parse_flags & kMetEbmlHeader) PrintHeader(info);
  if (info.parse_flags & kMetInfo) PrintSegmentInfo(info);
  int exit_code = 0;
  if (result == kParseSucceeded) {
    PrintTracks(info);
    PrintCues(info);
    PrintTags(info);
    PrintMetadata(*info.metadata);
  } else {
    std::fprintf(stderr, "kelvane: '%s' is not a Matroska file kelvane can read (header parse answered %d)\n",
                 argv[0], result);
    exit_code = 1;
  }
  FreeMetadata(info.metadata);
  destroy_mkv_file_info(&info);
  mkvvstream_destroy(&stream);
  return exit_code;
}
