#include "tools/reading/header_reading.h"

#include <cstring>

#include "core/codec_table.h"
#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/input_streams.h"
#include "stream/mkvvstream.h"
#include "tools/reading/walk_facts.h"

namespace reading {

namespace {

constexpr int64_t kHeaderBufferSize = 480;  // what the plug-in reads headers through

const char* ParseFailure(int answer) {
  switch (answer) {
    case kParseMalformed: return "the headers are malformed";
    case kParseIncomplete: return "it lacks the EBML header, Segment Info or track entries";
    case kParseNoMemory: return "an element is past the header parse's limits";
    default: return "the header parse failed";
  }
}

std::optional<std::string> Text(const char* text) {
  return text ? std::optional<std::string>(text) : std::nullopt;
}

void TakeHeader(const mkv_file_info& info, FileFacts* facts) {
  facts->ebml = {info.ebml_version, info.ebml_read_version, info.ebml_max_id_length, info.ebml_max_size_length,
                 info.doc_type, info.doc_type_version, info.doc_type_read_version};
}

void TakeSegmentInfo(const mkv_file_info& info, FileFacts* facts) {
  SegmentInfoFacts& out = facts->info;
  out.timecode_scale = info.timecode_scale;
  // The parse keeps 0 for an absent Duration and DateUTC; the walk tells them apart where it runs.
  if (info.duration > 0) out.duration_ticks = info.duration;
  if (info.date_utc != 0) out.date_utc_ns = info.date_utc;
  out.title = Text(info.title);
  out.muxing_app = Text(info.muxing_app);
  out.writing_app = Text(info.writing_app);
}

TrackFacts TakeTrack(const mkv_track_info& track) {
  TrackFacts out;
  out.number = track.track_number;
  out.uid = track.track_uid;
  out.type = track.track_type;
  out.codec_id = track.codec_id ? track.codec_id : "";
  out.codec_name = Text(track.codec_name);
  if (track.codec_private) out.codec_private.assign(track.codec_private, track.codec_private + track.codec_private_size);
  out.name = Text(track.name);
  if (track.language) {
    out.language = track.language;
    out.language_stated = true;
  }
  out.flag_enabled = track.flag_enabled != 0;
  out.flag_default = track.flag_default != 0;
  out.flag_forced = track.flag_forced != 0;
  out.default_duration_ns = track.default_duration;
  out.pixel_width = track.pixel_width;
  out.pixel_height = track.pixel_height;
  out.display_width = track.display_width;
  out.display_height = track.display_height;
  out.sampling_frequency = track.sampling_frequency;
  out.channels = track.channels;
  out.bit_depth = track.bit_depth;
  for (uint32_t i = 0; i < track.content_encoding_count && i < kMaxContentEncodings; ++i) {
    const mkv_content_encoding& encoding = track.content_encodings[i];
    ContentEncodingFacts facts;
    facts.order = encoding.order;
    facts.scope = encoding.scope;
    facts.compression = encoding.type == 0;
    facts.comp_algo = encoding.comp_algo;
    if (encoding.comp_settings) {
      facts.comp_settings.assign(encoding.comp_settings, encoding.comp_settings + encoding.comp_settings_size);
    }
    out.content_encodings.push_back(std::move(facts));
  }
  out.encrypted = track.encrypted != 0;
  // The plug-in sets up no channel for an encrypted track or a codec it does not know.
  if (!out.encrypted) out.offered_fourcc = lookup_codec_fourcc(track.codec_id);
  return out;
}

CueSummary::Point CuePoint(const mkv_queue_node* node) {
  const auto* point = static_cast<const mkv_cue_point*>(node->data);
  CueSummary::Point out{point->cue_time, 0, 0};
  if (point->track_positions.count && point->track_positions.head) {
    const auto* position = static_cast<const mkv_cue_track_position*>(point->track_positions.head->data);
    out.track = position->cue_track;
    out.cluster_position = position->cue_cluster_position;
  }
  return out;
}

MetadataEntry TakeEntry(const mkv_metadata_list& list, int32_t i) {
  MetadataEntry entry{list.key[i] ? list.key[i] : "", "unknown", {}, 0};
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

void TakeModel(const mkv_file_info& info, FileFacts* facts) {
  for (uint32_t i = 0; i < info.track_count && i < kMaxTracks; ++i) facts->tracks.push_back(TakeTrack(info.tracks[i]));
  facts->cues.count = info.cue_points.count;
  if (info.cue_points.head) facts->cues.first = CuePoint(info.cue_points.head);
  if (info.cue_points.tail) facts->cues.last = CuePoint(info.cue_points.tail);
  // Without the walk, the parse's SimpleTags stand in one group of unknown target.
  if (info.tag_count) {
    TagFacts group;
    for (uint32_t i = 0; i < info.tag_count && i < kMaxTags; ++i) {
      const mkv_tag_entry& tag = info.tags[i];
      SimpleTagFacts simple;
      simple.name = tag.name ? tag.name : "";
      simple.value = Text(tag.string);
      simple.binary = tag.binary != nullptr;
      group.simple_tags.push_back(std::move(simple));
    }
    facts->tags.push_back(std::move(group));
  }
  for (int32_t i = 0; info.metadata && i < info.metadata->entry_count; ++i) {
    facts->metadata.push_back(TakeEntry(*info.metadata, i));
  }
}

}  // namespace

std::optional<uint64_t> SegmentInfoFacts::DurationNs() const {
  if (!duration_ticks) return std::nullopt;
  return static_cast<uint64_t>(*duration_ticks * static_cast<double>(timecode_scale) + 0.5);
}

std::optional<uint64_t> TrackFacts::FrameCompression() const {
  for (const ContentEncodingFacts& encoding : content_encodings) {
    if (encoding.compression && (encoding.scope & 1)) return encoding.comp_algo;
  }
  return std::nullopt;
}

std::string FourccText(uint32_t code) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    const char c = static_cast<char>(code >> shift & 0xFF);
    text += c >= 32 && c < 127 ? c : '?';
  }
  return text;
}

HeaderReading ReadHeaders(const std::string& path, const ReadOptions& options) {
  HeaderReading out;
  auto input = host::OpenFileStream(path, options.seekable);
  if (!input) {
    out.failure = "cannot open it";
    return out;
  }
  out.facts.file_size = options.seekable ? input->Length() : 0;
  mkvvstream stream;
  if (mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, options.seekable) != 0) {
    out.failure = "not a Matroska file: it is empty";
    return out;
  }
  auto* info = mem_new_zeroed<mkv_file_info>();  // large: keep it off the stack
  mkv_parse_limits limits{kDefaultMaxStringSize, options.seekable ? 1u : 0u};
  if (info) {
    info->parse_limits = &limits;
    info->metadata = mem_new_zeroed<mkv_metadata_list>();
  }
  out.parse_answer = info && info->metadata ? parse_mkvfile(info, &stream) : kParseNoMemory;
  out.ok = out.parse_answer == kParseSucceeded;
  if (info) {
    out.read_ebml_header = (info->parse_flags & kMetEbmlHeader) != 0;
    out.read_segment_info = (info->parse_flags & kMetInfo) != 0;
    if (out.read_ebml_header) TakeHeader(*info, &out.facts);
    if (out.read_segment_info) TakeSegmentInfo(*info, &out.facts);
    if (out.ok) TakeModel(*info, &out.facts);
    if (info->metadata) FreeMetadata(info->metadata);
    destroy_mkv_file_info(info);
    mem_free(info);
  }
  mkvvstream_destroy(&stream);
  if (!out.ok) {
    out.failure = out.read_ebml_header ? std::string("not a Matroska file the demuxer reads: ") +
                                             ParseFailure(out.parse_answer)
                                       : "not a Matroska file";
    return out;
  }
  if (options.walk && options.seekable) WalkFacts(path, &out.facts);
  return out;
}

bool ReadOfferedTracks(const std::string& path, std::vector<TrackFacts>* tracks, uint64_t* timecode_scale) {
  HeaderReading reading = ReadHeaders(path, {true, false});
  if (timecode_scale) *timecode_scale = reading.facts.info.timecode_scale;
  for (TrackFacts& track : reading.facts.tracks) {
    if (track.offered_fourcc) tracks->push_back(std::move(track));
  }
  return reading.ok;
}

std::string RefusalReason(const std::string& path) {
  HeaderReading reading = ReadHeaders(path, {true, false});
  if (!reading.ok) return reading.failure;
  if (reading.facts.ebml.doc_type != "matroska") {
    return "DocType " + reading.facts.ebml.doc_type + " is not played: the plug-in plays DocType matroska";
  }
  std::string codecs;
  for (const TrackFacts& track : reading.facts.tracks) {
    if (track.offered_fourcc) return {};
    codecs += (codecs.empty() ? "" : ", ") + track.codec_id + (track.encrypted ? " (encrypted)" : "");
  }
  return "no track this plug-in plays (its tracks: " + (codecs.empty() ? std::string("none") : codecs) + ")";
}

}  // namespace reading
