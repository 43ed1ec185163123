// `kelvane info --json`: the fields of docs/json.md, section info.

#include "tools/info_output.h"
#include "tools/json_writer.h"
#include "tools/media_words.h"
#include "tools/reading/header_reading.h"

using namespace reading;

namespace {

constexpr int kSchemaVersion = 2;

void Maybe(JsonWriter& out, const char* key, const std::optional<std::string>& value) {
  out.FieldOrNull(key, value ? value->c_str() : nullptr);
}
void Maybe(JsonWriter& out, const char* key, const std::optional<uint64_t>& value) {
  out.Key(key);
  value ? out.Uint(*value) : out.Null();
}
void Maybe(JsonWriter& out, const char* key, const std::optional<int64_t>& value) {
  out.Key(key);
  value ? out.Int(*value) : out.Null();
}

void Uids(JsonWriter& out, const char* key, const std::vector<uint64_t>& uids) {
  out.Key(key);
  out.BeginArray(true);
  for (uint64_t uid : uids) out.Uint(uid);
  out.EndArray();
}

void WriteHeader(JsonWriter& out, const EbmlHeaderFacts& ebml) {
  out.Key("ebml_header");
  out.BeginObject();
  out.Field("ebml_version", ebml.version);
  out.Field("ebml_read_version", ebml.read_version);
  out.Field("ebml_max_id_length", ebml.max_id_length);
  out.Field("ebml_max_size_length", ebml.max_size_length);
  out.Field("doc_type", ebml.doc_type);
  out.Field("doc_type_version", ebml.doc_type_version);
  out.Field("doc_type_read_version", ebml.doc_type_read_version);
  out.EndObject();
}

void WriteSegmentInfo(JsonWriter& out, const FileFacts& facts) {
  const SegmentInfoFacts& info = facts.info;
  out.Key("segment_info");
  out.BeginObject();
  out.Field("timecode_scale_ns", info.timecode_scale);
  out.Key("duration_ticks");
  info.duration_ticks ? out.Double(*info.duration_ticks) : out.Null();
  const std::optional<uint64_t> ns = info.DurationNs();
  Maybe(out, "duration_ns", ns);
  Maybe(out, "duration", ns ? std::optional<std::string>(ClockTime(*ns)) : std::nullopt);
  Maybe(out, "date_utc_ns", info.date_utc_ns);
  Maybe(out, "date_utc", info.date_utc_ns ? std::optional<std::string>(IsoDate(*info.date_utc_ns)) : std::nullopt);
  Maybe(out, "title", info.title);
  Maybe(out, "muxing_app", info.muxing_app);
  Maybe(out, "writing_app", info.writing_app);
  Maybe(out, "overall_bit_rate_bps", OverallBitRate(facts));
  out.EndObject();
}

void WriteTrack(JsonWriter& out, const FileFacts& facts, const TrackFacts& track) {
  out.BeginObject();
  out.Field("number", track.number);
  out.Field("uid", track.uid);
  out.Field("type", TrackTypeName(track.type));
  out.Field("type_code", track.type);
  out.Field("codec_id", track.codec_id);
  const std::string words = CodecName(track.codec_id, track.codec_private);
  out.FieldOrNull("codec", words.empty() ? nullptr : words.c_str());
  Maybe(out, "codec_name", track.codec_name);
  const std::string fourcc = FourccText(track.offered_fourcc);
  out.FieldOrNull("fourcc", track.offered_fourcc ? fourcc.c_str() : nullptr);
  out.Field("codec_private_size", track.codec_private.size());
  Maybe(out, "name", track.name);
  out.Field("language", track.language);
  out.Field("language_stated", track.language_stated);
  Maybe(out, "language_ietf", track.language_ietf);
  out.Field("flag_default", track.flag_default);
  out.Field("flag_forced", track.flag_forced);
  out.Field("flag_enabled", track.flag_enabled);
  if (track.type == 1) {
    out.Field("width", track.pixel_width);
    out.Field("height", track.pixel_height);
    out.Field("display_width", track.display_width);
    out.Field("display_height", track.display_height);
  } else if (track.type == 2) {
    out.Field("sampling_frequency_hz", track.sampling_frequency);
    out.Field("channels", track.channels);
    out.Field("bit_depth", track.bit_depth);
  }
  out.Field("default_duration_ns", track.default_duration_ns);
  out.Field("content_encodings", track.content_encodings.size());
  const std::optional<uint64_t> compression = track.FrameCompression();
  Maybe(out, "compression", compression ? std::optional<std::string>(CompressionName(*compression)) : std::nullopt);
  out.Field("encrypted", track.encrypted);
  const TrackStatistics stats = StatisticsOf(facts, track);
  out.Key("statistics");
  out.BeginObject(true);
  Maybe(out, "bit_rate_bps", stats.bit_rate);
  Maybe(out, "bytes", stats.bytes);
  Maybe(out, "frames", stats.frames);
  Maybe(out, "duration", stats.duration);
  out.EndObject();
  out.EndObject();
}

void WriteCuePoint(JsonWriter& out, const char* key, const std::optional<CueSummary::Point>& point) {
  out.Key(key);
  if (!point) return out.Null();
  out.BeginObject(true);
  out.Field("time_ticks", point->time_ticks);
  out.Field("track", point->track);
  out.Field("cluster_position", point->cluster_position);
  out.EndObject();
}

void WriteTags(JsonWriter& out, const FileFacts& facts) {
  out.Key("tags");
  out.BeginArray();
  for (const TagFacts& tag : facts.tags) {
    for (const SimpleTagFacts& simple : tag.simple_tags) {
      out.BeginObject(true);
      out.Field("name", simple.name);
      Maybe(out, "value", simple.value);
      out.Field("binary", simple.binary);
      out.Field("language", simple.language);
      out.Field("default", simple.is_default);
      out.Field("depth", simple.depth);
      out.Key("target");
      if (!facts.walked) {
        out.Null();
      } else {
        out.BeginObject(true);
        out.Field("kind", TagTargetKind(tag));
        out.Field("type_value", tag.target_type_value);
        Maybe(out, "type", tag.target_type);
        Uids(out, "track_uids", tag.track_uids);
        Uids(out, "edition_uids", tag.edition_uids);
        Uids(out, "chapter_uids", tag.chapter_uids);
        Uids(out, "attachment_uids", tag.attachment_uids);
        out.EndObject();
      }
      out.EndObject();
    }
  }
  out.EndArray();
}

void WriteChapter(JsonWriter& out, const ChapterFacts& chapter) {
  out.BeginObject();
  out.Field("uid", chapter.uid);
  out.Field("start_ns", chapter.start_ns);
  Maybe(out, "end_ns", chapter.end_ns);
  out.Field("start", ClockTime(chapter.start_ns));
  Maybe(out, "end", chapter.end_ns ? std::optional<std::string>(ClockTime(*chapter.end_ns)) : std::nullopt);
  out.Field("hidden", chapter.hidden);
  out.Field("enabled", chapter.enabled);
  out.Key("names");
  out.BeginArray();
  for (const ChapterName& name : chapter.names) {
    out.BeginObject(true);
    out.Field("name", name.text);
    out.Key("languages");
    out.BeginArray(true);
    for (const std::string& language : name.languages) out.String(language);
    out.EndArray();
    out.Key("languages_ietf");
    out.BeginArray(true);
    for (const std::string& language : name.languages_ietf) out.String(language);
    out.EndArray();
    out.EndObject();
  }
  out.EndArray();
  out.Key("chapters");
  out.BeginArray();
  for (const ChapterFacts& child : chapter.children) WriteChapter(out, child);
  out.EndArray();
  out.EndObject();
}

void WriteChaptersAndAttachments(JsonWriter& out, const FileFacts& facts) {
  out.Key("editions");
  if (!facts.walked) {
    out.Null();
  } else {
    out.BeginArray();
    for (const EditionFacts& edition : facts.editions) {
      out.BeginObject();
      out.Field("uid", edition.uid);
      out.Field("default", edition.is_default);
      out.Field("hidden", edition.hidden);
      out.Field("ordered", edition.ordered);
      out.Key("chapters");
      out.BeginArray();
      for (const ChapterFacts& chapter : edition.chapters) WriteChapter(out, chapter);
      out.EndArray();
      out.EndObject();
    }
    out.EndArray();
  }
  out.Key("attachments");
  if (!facts.walked) return out.Null();
  out.BeginArray();
  for (const AttachmentFacts& file : facts.attachments) {
    out.BeginObject(true);
    out.Field("uid", file.uid);
    out.Field("file_name", file.name);
    out.Field("mime_type", file.mime_type);
    Maybe(out, "description", file.description);
    out.Field("size", file.size);
    out.EndObject();
  }
  out.EndArray();
}

}  // namespace

void WriteInfoJson(const char* file, const FileFacts& facts) {
  JsonWriter out(stdout);
  out.BeginObject();
  out.Field("schema_version", kSchemaVersion);
  out.Field("command", "info");
  out.Field("file", file);
  Maybe(out, "file_size", facts.file_size ? std::optional<uint64_t>(facts.file_size) : std::nullopt);
  WriteHeader(out, facts.ebml);
  WriteSegmentInfo(out, facts);
  out.Key("tracks");
  out.BeginArray();
  for (const TrackFacts& track : facts.tracks) WriteTrack(out, facts, track);
  out.EndArray();
  out.Key("cues");
  out.BeginObject();
  out.Field("count", facts.cues.count);
  WriteCuePoint(out, "first", facts.cues.first);
  WriteCuePoint(out, "last", facts.cues.last);
  out.EndObject();
  WriteChaptersAndAttachments(out, facts);
  WriteTags(out, facts);
  out.Key("metadata");
  out.BeginArray();
  for (const MetadataEntry& entry : facts.metadata) {
    out.BeginObject(true);
    out.Field("key", entry.key);
    out.Field("type", entry.type);
    out.Key("value");
    if (entry.type == "UTF8") {
      out.String(entry.text);
    } else if (entry.type == "unknown") {
      out.Null();
    } else {
      out.Int(entry.number);
    }
    out.EndObject();
  }
  out.EndArray();
  Maybe(out, "walk_stopped", facts.walk_stopped);
  out.EndObject();
  out.Finish();
}
