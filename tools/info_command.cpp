// `kelvane info [--json] FILE`: the file model after a header parse — EBML
// header, Segment Info, tracks, cue summary, tags — and the metadata list.
// The framework has no operation that hands out the file model, so this
// command links the demuxer's own header parser (core/) and runs it over the
// file: it shows what the plug-in reads, including tracks it does not offer.

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
#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/json_writer.h"

const char kInfoHelp[] =
    "usage: kelvane info [--json] FILE\n"
    "\n"
    "Parses the headers of a Matroska file and prints what they say: the EBML header, Segment\n"
    "Info, every track (with the four-character code the plug-in offers it under, or \"not\n"
    "offered\"), the first and last cue point, the tags, and the metadata list. The file is read\n"
    "with the demuxer's own header parser, linked into this program: the framework has no\n"
    "operation that hands out this model, so unlike probe and packets this command does not\n"
    "go through the loaded plug-in.\n"
    "\n"
    "FILE may be - for standard input.\n"
    "\n"
    "options:\n"
    "  --json           one JSON document instead of text (docs/json.md, section info)\n"
    "  -h, --help       this text\n"
    "\n"
    "exit codes: 0 ok; 1 the file cannot be read or is not Matroska the parser accepts; 2 usage\n"
    "\n"
    "examples:\n"
    "  kelvane info movie.mkv\n"
    "  kelvane info --json movie.mkv | jq '.tracks[].codec_id'\n"
    "  cat movie.mkv | kelvane info -\n";

namespace {

constexpr int64_t kHeaderBufferSize = 480;
constexpr int kSchemaVersion = 1;

const char* OrNone(const char* text) { return text ? text : "(none)"; }

const char* ParseFailure(int result) {
  switch (result) {
    case kParseMalformed: return "the headers are malformed";
    case kParseIncomplete: return "required header elements are missing";
    case kParseNoMemory: return "out of memory or past a parse limit";
    default: return "the header parse failed";
  }
}

const char* TrackTypeName(uint64_t type) {
  switch (type) {
    case 1: return "video";
    case 2: return "audio";
    case 17: return "subtitles";
    default: return "other";
  }
}

// The plug-in's four-character code for the track's codec, empty when it
// offers none: for a codec it does not know, or an encrypted track.
std::string OfferedFourcc(const mkv_track_info& track) {
  uint32_t fourcc = track.encrypted ? 0 : lookup_codec_fourcc(track.codec_id);
  if (!fourcc) return {};
  std::string code;
  for (int shift = 24; shift >= 0; shift -= 8) code += static_cast<char>(fourcc >> shift);
  return code;
}

double DurationNs(const mkv_file_info& info) {
  return std::round(info.duration * static_cast<double>(info.timecode_scale));
}

const mkv_cue_track_position* FirstPosition(const mkv_cue_point* point) {
  if (!point || point->track_positions.count == 0) return nullptr;
  return static_cast<const mkv_cue_track_position*>(point->track_positions.head->data);
}

const mkv_cue_point* CueAt(const mkv_queue_node* node) {
  return node ? static_cast<const mkv_cue_point*>(node->data) : nullptr;
}

struct MetadataEntry {
  const char* key;
  const char* type;  // "UTF8", "NUM4", "NUM8" or "unknown"
  std::string text;  // UTF8
  int64_t number = 0;
};

MetadataEntry ReadEntry(const mkv_metadata_list& list, int32_t i) {
  MetadataEntry entry{list.key[i], "unknown", {}};
  switch (list.value_type[i]) {
    case kMetadataTypeUtf8:
      entry.type = "UTF8";
      entry.text.assign(static_cast<const char*>(list.value[i]), static_cast<size_t>(list.value_size[i]));
      break;
    case kMetadataTypeNum4: {
      uint32_t value;
      std::memcpy(&value, list.value[i], sizeof value);
      entry.type = "NUM4";
      entry.number = value;
      break;
    }
    case kMetadataTypeNum8:
      std::memcpy(&entry.number, list.value[i], sizeof entry.number);
      entry.type = "NUM8";
      break;
    default: break;
  }
  return entry;
}

// ---- text ----

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
  std::printf("  DurationNs: %.0f\n", DurationNs(info));
  std::printf("  DateUTC: %" PRId64 "\n", info.date_utc);
  std::printf("  Title: %s\n", OrNone(info.title));
  std::printf("  MuxingApp: %s\n", OrNone(info.muxing_app));
  std::printf("  WritingApp: %s\n", OrNone(info.writing_app));
}

void PrintTracks(const mkv_file_info& info) {
  std::printf("Tracks: %u (video %u, audio %u)\n", info.track_count, info.video_track_count,
              info.audio_track_count);
  for (uint32_t i = 0; i < info.track_count; ++i) {
    const mkv_track_info& track = info.tracks[i];
    std::string fourcc = OfferedFourcc(track);
    std::printf("  Track %" PRIu64 ": %s %s (%s) CodecPrivate %u bytes", track.track_number,
                TrackTypeName(track.track_type), OrNone(track.codec_id), fourcc.empty() ? "not offered" : fourcc.c_str(),
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
  const mkv_cue_point* first = CueAt(info.cue_points.head);
  const mkv_cue_point* last = CueAt(info.cue_points.tail);
  for (const mkv_cue_point* point : {first, last}) {
    const mkv_cue_track_position* position = FirstPosition(point);
    if (!position) continue;
    std::printf("  %s: time %" PRIu64 " track %" PRIu64 " cluster at %" PRIu64 "\n", point == first ? "first" : "last",
                point->cue_time, position->cue_track, position->cue_cluster_position);
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
    MetadataEntry entry = ReadEntry(list, i);
    if (!std::strcmp(entry.type, "UTF8")) {
      std::printf("  %s UTF8 %s\n", entry.key, entry.text.c_str());
    } else if (!std::strcmp(entry.type, "NUM4")) {
      std::printf("  %s NUM4 %" PRId64 " (0x%08" PRIX64 ")\n", entry.key, entry.number, entry.number);
    } else if (!std::strcmp(entry.type, "NUM8")) {
      std::printf("  %s NUM8 %" PRId64 "\n", entry.key, entry.number);
    } else {
      std::printf("  %s (unknown type)\n", entry.key);
    }
  }
}

void PrintText(const mkv_file_info& info) {
  PrintHeader(info);
  PrintSegmentInfo(info);
  PrintTracks(info);
  PrintCues(info);
  PrintTags(info);
  PrintMetadata(*info.metadata);
}

// ---- JSON ----

void WriteHeader(JsonWriter& out, const mkv_file_info& info) {
  out.Key("ebml_header");
  out.BeginObject();
  out.Field("ebml_version", info.ebml_version);
  out.Field("ebml_read_version", info.ebml_read_version);
  out.Field("ebml_max_id_length", info.ebml_max_id_length);
  out.Field("ebml_max_size_length", info.ebml_max_size_length);
  out.Field("doc_type", info.doc_type);
  out.Field("doc_type_version", info.doc_type_version);
  out.Field("doc_type_read_version", info.doc_type_read_version);
  out.EndObject();
}

void WriteSegmentInfo(JsonWriter& out, const mkv_file_info& info) {
  out.Key("segment_info");
  out.BeginObject();
  out.Field("timecode_scale_ns", info.timecode_scale);
  out.Field("duration_ticks", info.duration);
  out.Field("duration_ns", static_cast<int64_t>(DurationNs(info)));
  out.Field("date_utc_ns", info.date_utc);
  out.FieldOrNull("title", info.title);
  out.FieldOrNull("muxing_app", info.muxing_app);
  out.FieldOrNull("writing_app", info.writing_app);
  out.EndObject();
}

void WriteTrack(JsonWriter& out, const mkv_track_info& track) {
  out.BeginObject();
  out.Field("number", track.track_number);
  out.Field("type", TrackTypeName(track.track_type));
  out.Field("type_code", track.track_type);
  out.FieldOrNull("codec_id", track.codec_id);
  std::string fourcc = OfferedFourcc(track);
  out.FieldOrNull("fourcc", fourcc.empty() ? nullptr : fourcc.c_str());
  out.Field("codec_private_size", track.codec_private_size);
  if (track.track_type == 1) {
    out.Field("width", track.pixel_width);
    out.Field("height", track.pixel_height);
  } else if (track.track_type == 2) {
    out.Field("sampling_frequency_hz", track.sampling_frequency);
    out.Field("channels", track.channels);
    out.Field("bit_depth", track.bit_depth);
  }
  out.Field("default_duration_ns", track.default_duration);
  out.FieldOrNull("language", track.language);
  out.Field("content_encodings", track.content_encoding_count);
  out.Field("compressed", track.compressed != 0);
  out.Field("encrypted", track.encrypted != 0);
  out.EndObject();
}

void WriteCuePoint(JsonWriter& out, const char* key, const mkv_cue_point* point) {
  out.Key(key);
  const mkv_cue_track_position* position = FirstPosition(point);
  if (!position) return out.Null();
  out.BeginObject(true);
  out.Field("time_ticks", point->cue_time);
  out.Field("track", position->cue_track);
  out.Field("cluster_position", position->cue_cluster_position);
  out.EndObject();
}

void WriteJson(const char* file, const mkv_file_info& info) {
  JsonWriter out(stdout);
  out.BeginObject();
  out.Field("schema_version", kSchemaVersion);
  out.Field("command", "info");
  out.Field("file", file);
  WriteHeader(out, info);
  WriteSegmentInfo(out, info);
  out.Key("tracks");
  out.BeginArray();
  for (uint32_t i = 0; i < info.track_count; ++i) WriteTrack(out, info.tracks[i]);
  out.EndArray();
  out.Key("cues");
  out.BeginObject();
  out.Field("count", info.cue_points.count);
  WriteCuePoint(out, "first", CueAt(info.cue_points.head));
  WriteCuePoint(out, "last", CueAt(info.cue_points.tail));
  out.EndObject();
  out.Key("tags");
  out.BeginArray();
  for (uint32_t i = 0; i < info.tag_count; ++i) {
    const mkv_tag_entry& tag = info.tags[i];
    out.BeginObject(true);
    out.FieldOrNull("name", tag.name);
    out.FieldOrNull("value", tag.string);
    out.Field("binary", tag.binary != nullptr);
    out.EndObject();
  }
  out.EndArray();
  out.Key("metadata");
  out.BeginArray();
  for (int32_t i = 0; i < info.metadata->entry_count; ++i) {
    MetadataEntry entry = ReadEntry(*info.metadata, i);
    out.BeginObject(true);
    out.Field("key", entry.key);
    out.Field("type", entry.type);
    out.Key("value");
    if (!std::strcmp(entry.type, "UTF8")) {
      out.String(entry.text);
    } else if (!std::strcmp(entry.type, "unknown")) {
      out.Null();
    } else {
      out.Int(entry.number);
    }
    out.EndObject();
  }
  out.EndArray();
  out.EndObject();
  out.Finish();
}

}  // namespace

int RunInfo(int argc, char** argv) {
  const char* file = nullptr;
  bool json = false;
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (IsHelpOption(arg)) return PrintHelp(kInfoHelp);
    if (!std::strcmp(arg, "--json")) {
      json = true;
    } else if (int code = TakeFile("info", arg, &file); code != kExitOk) {
      return code;
    }
  }
  if (!file) return UsageError("info", "no FILE given");
  if (int code = CheckInputFile("info", file); code != kExitOk) return code;

  const bool from_stdin = !std::strcmp(file, "-");
  auto input = host::OpenFileStream(file, !from_stdin);
  if (!input) return Failure("info", "cannot open %s", file);
  mkvvstream stream;
  if (mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, input->seekable()) != 0) {
    return Failure("info", "%s: not a Matroska file: too short for an EBML header", file);
  }
  static mkv_file_info info;  // large: keep it off the stack
  std::memset(&info, 0, sizeof info);
  mkv_parse_limits limits{kDefaultMaxStringSize, input->seekable() ? 1u : 0u};
  info.parse_limits = &limits;
  info.metadata = mem_new_zeroed<mkv_metadata_list>();

  int result = info.metadata ? parse_mkvfile(&info, &stream) : kParseNoMemory;
  int exit_code = kExitOk;
  if (result == kParseSucceeded) {
    json ? WriteJson(file, info) : PrintText(info);
  } else {
    // What was read before the parse stopped still helps to see why.
    if (!json && (info.parse_flags & kMetEbmlHeader)) PrintHeader(info);
    if (!json && (info.parse_flags & kMetInfo)) PrintSegmentInfo(info);
    exit_code = Failure("info", "%s: not a Matroska file the demuxer's parser accepts: %s (answer %d)", file,
                        ParseFailure(result), result);
  }
  if (info.metadata) FreeMetadata(info.metadata);
  destroy_mkv_file_info(&info);
  mkvvstream_destroy(&stream);
  return exit_code;
}
