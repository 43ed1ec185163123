// `kelvane info` as text: what a person opens the file's headers for.

#include <cinttypes>
#include <cstdio>

#include "tools/info_output.h"
#include "tools/media_words.h"
#include "tools/reading/header_reading.h"

using namespace reading;

namespace {

const char* Or(const std::optional<std::string>& text, const char* otherwise) {
  return text ? text->c_str() : otherwise;
}

void PrintHeader(const FileFacts& facts) {
  const EbmlHeaderFacts& ebml = facts.ebml;
  std::printf("EBML header\n");
  std::printf("  DocType: %s (version %" PRIu64 ", read version %" PRIu64 ")\n", ebml.doc_type.c_str(),
              ebml.doc_type_version, ebml.doc_type_read_version);
  std::printf("  EBMLVersion: %" PRIu64 " (read version %" PRIu64 "), IDs up to %" PRIu64 " bytes, sizes up to %" PRIu64
              " bytes\n",
              ebml.version, ebml.read_version, ebml.max_id_length, ebml.max_size_length);
}

void PrintSegmentInfo(const FileFacts& facts) {
  const SegmentInfoFacts& info = facts.info;
  std::printf("Segment Info\n");
  std::printf("  Title: %s\n", Or(info.title, "(none)"));
  const std::optional<uint64_t> ns = info.DurationNs();
  if (ns) {
    std::printf("  Duration: %s (%" PRIu64 " ns)\n", ClockTime(*ns).c_str(), *ns);
  } else {
    std::printf("  Duration: unknown\n");
  }
  std::printf("  Date: %s\n", info.date_utc_ns ? IsoDate(*info.date_utc_ns).c_str() : "unknown");
  std::printf("  TimecodeScale: %" PRIu64 " ns\n", info.timecode_scale);
  std::printf("  MuxingApp: %s\n", Or(info.muxing_app, "(none)"));
  std::printf("  WritingApp: %s\n", Or(info.writing_app, "(none)"));
  if (facts.file_size) std::printf("  File size: %s\n", ByteCount(facts.file_size).c_str());
  if (auto rate = OverallBitRate(facts)) std::printf("  Overall bit rate: %s\n", BitRate(*rate).c_str());
}

void PrintTrack(const FileFacts& facts, const TrackFacts& track) {
  const std::string words = CodecName(track.codec_id, track.codec_private);
  std::printf("  Track %" PRIu64 ": %s, %s%s%s%s, %s\n", track.number, TrackTypeName(track.type),
              words.empty() ? "" : words.c_str(), words.empty() ? "" : " (", track.codec_id.c_str(),
              words.empty() ? "" : ")",
              track.offered_fourcc ? ("offered as " + FourccText(track.offered_fourcc)).c_str() : "not offered");
  if (track.name) std::printf("    Name: %s\n", track.name->c_str());
  std::printf("    Language: %s%s", track.language.c_str(), track.language_stated ? "" : " (not stated: the default)");
  if (track.language_ietf) std::printf(", BCP 47: %s", track.language_ietf->c_str());
  std::printf("\n    Flags: %s, %s%s\n", track.flag_default ? "default" : "not default",
              track.flag_enabled ? "enabled" : "disabled", track.flag_forced ? ", forced" : "");
  if (track.type == 1) {
    std::printf("    Picture: %" PRIu64 "x%" PRIu64, track.pixel_width, track.pixel_height);
    if (track.display_width && track.display_height) {
      std::printf(", display %" PRIu64 "x%" PRIu64, track.display_width, track.display_height);
    }
    if (track.default_duration_ns) {
      std::printf(", %.3f frames/s", 1e9 / static_cast<double>(track.default_duration_ns));
    }
    std::printf("\n");
  } else if (track.type == 2) {
    std::printf("    Sound: %.0f Hz, %" PRIu64 " channel%s", track.sampling_frequency, track.channels,
                track.channels == 1 ? "" : "s");
    if (track.bit_depth) std::printf(", %" PRIu64 " bits", track.bit_depth);
    std::printf("\n");
  }
  if (track.default_duration_ns) std::printf("    Frame duration: %" PRIu64 " ns\n", track.default_duration_ns);
  std::printf("    CodecPrivate: %zu bytes\n", track.codec_private.size());
  if (track.codec_name) std::printf("    CodecName: %s\n", track.codec_name->c_str());
  const TrackStatistics stats = StatisticsOf(facts, track);
  if (stats.bytes || stats.bit_rate) {
    std::printf("    Statistics:");
    if (stats.bytes) std::printf(" %s", ByteCount(*stats.bytes).c_str());
    if (stats.bit_rate) std::printf(", %s", BitRate(*stats.bit_rate).c_str());
    if (stats.frames) std::printf(", %" PRIu64 " frames", *stats.frames);
    if (stats.duration) std::printf(", %s", stats.duration->c_str());
    std::printf("\n");
  }
  if (auto algorithm = track.FrameCompression()) {
    std::printf("    Compression: %s%s\n", CompressionName(*algorithm).c_str(),
                *algorithm == kCompressionZlib && track.offered_fourcc
                    ? " (the plug-in delivers the frames as stored; kelvane extract inflates them)"
                    : "");
  }
  if (track.encrypted) std::printf("    Encrypted: yes (the plug-in does not offer it)\n");
}

void PrintTracks(const FileFacts& facts) {
  unsigned counts[4] = {0, 0, 0, 0};  // video, audio, subtitles, other
  for (const TrackFacts& track : facts.tracks) {
    ++counts[track.type == 1 ? 0 : track.type == 2 ? 1 : track.type == 17 ? 2 : 3];
  }
  std::printf("Tracks: %zu (video %u, audio %u, subtitles %u, other %u)\n", facts.tracks.size(), counts[0], counts[1],
              counts[2], counts[3]);
  for (const TrackFacts& track : facts.tracks) PrintTrack(facts, track);
}

void PrintCues(const FileFacts& facts) {
  std::printf("Cues: %u cue points\n", facts.cues.count);
  for (const auto& [label, point] : {std::pair{"first", facts.cues.first}, std::pair{"last", facts.cues.last}}) {
    if (!point) continue;
    std::printf("  %s: time %" PRIu64 " track %" PRIu64 " cluster at %" PRIu64 "\n", label, point->time_ticks,
                point->track, point->cluster_position);
  }
}

void PrintChapter(const ChapterFacts& chapter, int depth, size_t number) {
  std::printf("%*sChapter %zu: %s", 4 + 2 * depth, "", number, ClockTime(chapter.start_ns).c_str());
  if (chapter.end_ns) std::printf(" - %s", ClockTime(*chapter.end_ns).c_str());
  std::printf("%s%s\n", chapter.hidden ? ", hidden" : "", chapter.enabled ? "" : ", disabled");
  for (const ChapterName& name : chapter.names) {
    std::string languages;
    for (const std::string& language : name.languages_ietf.empty() ? name.languages : name.languages_ietf) {
      languages += (languages.empty() ? "" : ", ") + language;
    }
    std::printf("%*s%s (%s)\n", 6 + 2 * depth, "", name.text.c_str(), languages.c_str());
  }
  for (size_t i = 0; i < chapter.children.size(); ++i) PrintChapter(chapter.children[i], depth + 1, i + 1);
}

void PrintChapters(const FileFacts& facts) {
  std::printf("Chapters: %zu edition%s\n", facts.editions.size(), facts.editions.size() == 1 ? "" : "s");
  for (size_t e = 0; e < facts.editions.size(); ++e) {
    const EditionFacts& edition = facts.editions[e];
    std::printf("  Edition %zu (uid %" PRIu64 "%s%s%s)\n", e + 1, edition.uid, edition.is_default ? ", default" : "",
                edition.hidden ? ", hidden" : "", edition.ordered ? ", ordered" : "");
    for (size_t i = 0; i < edition.chapters.size(); ++i) PrintChapter(edition.chapters[i], 0, i + 1);
  }
}

void PrintAttachments(const FileFacts& facts) {
  std::printf("Attachments: %zu\n", facts.attachments.size());
  for (size_t i = 0; i < facts.attachments.size(); ++i) {
    const AttachmentFacts& file = facts.attachments[i];
    std::printf("  %zu: %s, %s, %s (uid %" PRIu64 ")%s%s\n", i + 1, file.name.c_str(), file.mime_type.c_str(),
                ByteCount(file.size).c_str(), file.uid, file.description ? ": " : "",
                file.description ? file.description->c_str() : "");
  }
}

void PrintTags(const FileFacts& facts) {
  size_t count = 0;
  for (const TagFacts& tag : facts.tags) count += tag.simple_tags.size();
  std::printf("Tags: %zu in %zu group%s\n", count, facts.tags.size(), facts.tags.size() == 1 ? "" : "s");
  for (const TagFacts& tag : facts.tags) {
    if (facts.walked) {
      std::printf("  %s (target type %" PRIu64 "%s%s):\n", TagTargetLabel(facts, tag).c_str(), tag.target_type_value,
                  tag.target_type ? " " : "", tag.target_type ? tag.target_type->c_str() : "");
    } else {
      std::printf("  (targets not read: the input cannot seek)\n");
    }
    for (const SimpleTagFacts& simple : tag.simple_tags) {
      std::printf("%*s%s = %s\n", 4 + 2 * simple.depth, "", simple.name.c_str(),
                  simple.value ? simple.value->c_str() : simple.binary ? "(binary)" : "(none)");
    }
  }
}

void PrintMetadata(const FileFacts& facts) {
  std::printf("Metadata: %zu entries\n", facts.metadata.size());
  for (const MetadataEntry& entry : facts.metadata) {
    if (entry.type == "UTF8") {
      std::printf("  %s UTF8 %s\n", entry.key.c_str(), entry.text.c_str());
    } else if (entry.type == "NUM4") {
      std::printf("  %s NUM4 %" PRId64 " (0x%08" PRIX64 ")\n", entry.key.c_str(), entry.number, entry.number);
    } else if (entry.type == "NUM8") {
      std::printf("  %s NUM8 %" PRId64 "\n", entry.key.c_str(), entry.number);
    } else {
      std::printf("  %s (unknown type)\n", entry.key.c_str());
    }
  }
}

}  // namespace

void PrintInfoText(const FileFacts& facts) {
  PrintHeader(facts);
  PrintSegmentInfo(facts);
  PrintTracks(facts);
  PrintCues(facts);
  if (facts.walked) {
    PrintChapters(facts);
    PrintAttachments(facts);
  } else {
    std::printf("Chapters and attachments: not read (the input cannot seek)\n");
  }
  PrintTags(facts);
  PrintMetadata(facts);
  if (facts.walk_stopped) std::printf("Note: the walk over the elements %s\n", facts.walk_stopped->c_str());
}

// What was read before the header parse gave up still helps to see why.
void PrintPartialInfoText(const FileFacts& facts, bool header, bool segment_info) {
  if (header) PrintHeader(facts);
  if (segment_info) PrintSegmentInfo(facts);
}
