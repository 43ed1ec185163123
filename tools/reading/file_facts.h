#pragma once
// What the tool reads from a Matroska file's headers, in records of its own:
// the rest of the tool sees these, never the demuxer's file model. The
// EBML header, Segment Info, tracks, cues and metadata list come from the
// demuxer's own header parse; track languages in BCP 47, tag targets,
// chapters and attachments from a walk over the elements beside it.

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace reading {

struct EbmlHeaderFacts {
  uint64_t version = 0;
  uint64_t read_version = 0;
  uint64_t max_id_length = 0;
  uint64_t max_size_length = 0;
  std::string doc_type;
  uint64_t doc_type_version = 0;
  uint64_t doc_type_read_version = 0;
};

struct SegmentInfoFacts {
  uint64_t timecode_scale = 0;            // nanoseconds per tick
  std::optional<double> duration_ticks;   // absent: unknown
  std::optional<int64_t> date_utc_ns;     // since 2001-01-01T00:00:00 UTC; absent: unknown
  std::optional<std::string> title;
  std::optional<std::string> muxing_app;
  std::optional<std::string> writing_app;

  std::optional<uint64_t> DurationNs() const;
};

// ContentEncodingType 0 and the algorithms of ContentCompAlgo.
constexpr uint64_t kCompressionZlib = 0;
constexpr uint64_t kCompressionHeaderRemoval = 3;

struct ContentEncodingFacts {
  uint64_t order = 0;
  uint64_t scope = 1;   // bit 0: the frames
  bool compression = true;  // ContentEncodingType 0; else encryption
  uint64_t comp_algo = 0;
  std::vector<uint8_t> comp_settings;
};

struct TrackFacts {
  uint64_t number = 0;
  uint64_t uid = 0;
  uint64_t type = 0;  // 1 video, 2 audio, 17 subtitles...
  std::string codec_id;
  std::optional<std::string> codec_name;  // CodecName
  std::vector<uint8_t> codec_private;
  std::optional<std::string> name;
  std::string language = "eng";  // Language, or the Matroska default when absent
  bool language_stated = false;
  std::optional<std::string> language_ietf;  // LanguageBCP47
  bool flag_enabled = true;
  bool flag_default = true;
  bool flag_forced = false;
  uint64_t default_duration_ns = 0;  // 0: absent
  uint64_t pixel_width = 0;
  uint64_t pixel_height = 0;
  uint64_t display_width = 0;
  uint64_t display_height = 0;
  double sampling_frequency = 0;  // Hz
  uint64_t channels = 0;
  uint64_t bit_depth = 0;  // 0: absent
  std::vector<ContentEncodingFacts> content_encodings;
  bool encrypted = false;
  uint32_t offered_fourcc = 0;  // the four-character code the plug-in offers it under; 0: not offered

  // ContentCompAlgo of the compression applied to the frames, if any.
  std::optional<uint64_t> FrameCompression() const;
  // BCP 47 tag if stated, else the Language.
  const std::string& ShownLanguage() const { return language_ietf ? *language_ietf : language; }
};

struct CueSummary {
  uint32_t count = 0;
  struct Point {
    uint64_t time_ticks = 0;
    uint64_t track = 0;
    uint64_t cluster_position = 0;  // relative to the Segment's data
  };
  std::optional<Point> first;
  std::optional<Point> last;
};

struct SimpleTagFacts {
  std::string name;
  std::optional<std::string> value;  // TagString
  bool binary = false;
  std::string language = "und";
  bool is_default = true;
  int depth = 0;  // 0 for a tag's own SimpleTags, 1 for one nested in those...
};

struct TagFacts {
  uint64_t target_type_value = 50;
  std::optional<std::string> target_type;
  std::vector<uint64_t> track_uids;
  std::vector<uint64_t> edition_uids;
  std::vector<uint64_t> chapter_uids;
  std::vector<uint64_t> attachment_uids;
  std::vector<SimpleTagFacts> simple_tags;
};

struct ChapterName {
  std::string text;
  std::vector<std::string> languages;       // ChapLanguage ("eng" when none is stated)
  std::vector<std::string> languages_ietf;  // ChapLanguageBCP47
};

struct ChapterFacts {
  uint64_t uid = 0;
  uint64_t start_ns = 0;
  std::optional<uint64_t> end_ns;
  bool hidden = false;
  bool enabled = true;
  std::vector<ChapterName> names;
  std::vector<ChapterFacts> children;
};

struct EditionFacts {
  uint64_t uid = 0;
  bool hidden = false;
  bool is_default = false;
  bool ordered = false;
  std::vector<ChapterFacts> chapters;
};

struct AttachmentFacts {
  uint64_t uid = 0;
  std::string name;
  std::string mime_type;
  std::optional<std::string> description;
  uint64_t size = 0;
  uint64_t data_offset = 0;  // in the file
};

struct MetadataEntry {
  std::string key;
  std::string type;  // "UTF8", "NUM4", "NUM8" or "unknown"
  std::string text;  // UTF8
  int64_t number = 0;
};

struct FileFacts {
  uint64_t file_size = 0;  // 0: unknown (a stream)
  EbmlHeaderFacts ebml;
  SegmentInfoFacts info;
  std::vector<TrackFacts> tracks;
  CueSummary cues;
  std::vector<MetadataEntry> metadata;
  // From the walk beside the header parse; false for an input that cannot
  // seek, which is read once: tags are then the parse's, without targets.
  bool walked = false;
  std::vector<TagFacts> tags;
  std::vector<EditionFacts> editions;
  std::vector<AttachmentFacts> attachments;
  std::optional<std::string> walk_stopped;  // why the walk ended before the file did
};

}  // namespace reading
