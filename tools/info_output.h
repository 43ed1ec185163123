#pragma once
// `kelvane info`'s outputs: the file's facts as text or JSON, and the
// element tree. Shared here: what both outputs derive from the facts.

#include <cstdint>
#include <optional>
#include <string>

#include "tools/reading/file_facts.h"

// A track's statistics tags (mkvmerge writes them: BPS, NUMBER_OF_BYTES,
// NUMBER_OF_FRAMES, DURATION), from the tags aimed at its TrackUID.
struct TrackStatistics {
  std::optional<uint64_t> bit_rate;  // bits per second
  std::optional<uint64_t> bytes;
  std::optional<uint64_t> frames;
  std::optional<std::string> duration;  // as written: "00:00:02.037000000"
};
TrackStatistics StatisticsOf(const reading::FileFacts& facts, const reading::TrackFacts& track);

// Bits per second over the whole file, when its size and duration are known.
std::optional<uint64_t> OverallBitRate(const reading::FileFacts& facts);

// What a tag applies to: "file", "track 2", "chapter 123", "attachment 77", "edition 5".
std::string TagTargetLabel(const reading::FileFacts& facts, const reading::TagFacts& tag);
// "file", "track", "chapter", "attachment" or "edition".
const char* TagTargetKind(const reading::TagFacts& tag);

// "zlib", "bzlib", "lzo1x", "header removal" or "algorithm N".
std::string CompressionName(uint64_t algorithm);

void PrintInfoText(const reading::FileFacts& facts);
// The EBML header and Segment Info of a file the header parse gave up on, as far as they were read.
void PrintPartialInfoText(const reading::FileFacts& facts, bool header, bool segment_info);
void WriteInfoJson(const char* file, const reading::FileFacts& facts);
// The element tree; the exit code (1 when the walk stopped before the file's end).
int PrintElementTree(const char* file, bool json);
