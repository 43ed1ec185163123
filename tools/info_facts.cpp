#include <cstdlib>

#include "tools/info_output.h"

using reading::FileFacts;
using reading::TagFacts;
using reading::TrackFacts;

namespace {

std::optional<uint64_t> Number(const std::optional<std::string>& text) {
  if (!text || text->empty() || text->find_first_not_of("0123456789") != std::string::npos) return std::nullopt;
  return std::strtoull(text->c_str(), nullptr, 10);
}

}  // namespace

TrackStatistics StatisticsOf(const FileFacts& facts, const TrackFacts& track) {
  TrackStatistics out;
  for (const TagFacts& tag : facts.tags) {
    bool aimed = false;
    for (uint64_t uid : tag.track_uids) aimed = aimed || uid == track.uid;
    if (!aimed) continue;
    for (const reading::SimpleTagFacts& simple : tag.simple_tags) {
      if (simple.depth != 0) continue;
      if (simple.name == "BPS") out.bit_rate = Number(simple.value);
      if (simple.name == "NUMBER_OF_BYTES") out.bytes = Number(simple.value);
      if (simple.name == "NUMBER_OF_FRAMES") out.frames = Number(simple.value);
      if (simple.name == "DURATION" && simple.value) out.duration = simple.value;
    }
  }
  return out;
}

std::optional<uint64_t> OverallBitRate(const FileFacts& facts) {
  const std::optional<uint64_t> ns = facts.info.DurationNs();
  if (!ns || *ns == 0 || facts.file_size == 0) return std::nullopt;
  return static_cast<uint64_t>(static_cast<double>(facts.file_size) * 8e9 / static_cast<double>(*ns) + 0.5);
}

const char* TagTargetKind(const TagFacts& tag) {
  if (!tag.track_uids.empty()) return "track";
  if (!tag.chapter_uids.empty()) return "chapter";
  if (!tag.attachment_uids.empty()) return "attachment";
  if (!tag.edition_uids.empty()) return "edition";
  return "file";
}

std::string TagTargetLabel(const FileFacts& facts, const TagFacts& tag) {
  std::string label = TagTargetKind(tag);
  auto list = [&](const std::vector<uint64_t>& uids, bool tracks) {
    for (size_t i = 0; i < uids.size(); ++i) {
      std::string item = "uid " + std::to_string(uids[i]);
      for (const TrackFacts& track : facts.tracks) {
        if (tracks && track.uid == uids[i]) item = std::to_string(track.number);
      }
      label += (i ? ", " : " ") + item;
    }
  };
  if (!tag.track_uids.empty()) {
    list(tag.track_uids, true);
  } else if (!tag.chapter_uids.empty()) {
    list(tag.chapter_uids, false);
  } else if (!tag.attachment_uids.empty()) {
    list(tag.attachment_uids, false);
  } else if (!tag.edition_uids.empty()) {
    list(tag.edition_uids, false);
  }
  return label;
}

std::string CompressionName(uint64_t algorithm) {
  switch (algorithm) {
    case 0: return "zlib";
    case 1: return "bzlib";
    case 2: return "lzo1x";
    case 3: return "header removal";
    default: return "algorithm " + std::to_string(algorithm);
  }
}
