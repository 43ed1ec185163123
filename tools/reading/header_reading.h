#pragma once
// The tool's one way into a file's headers: the demuxer's own header parse
// (the code the plug-in runs when it rates a file), then, on an input that
// seeks, a walk over the elements for what that parse does not keep.

#include <string>
#include <vector>

#include "tools/reading/file_facts.h"

namespace reading {

struct HeaderReading {
  bool ok = false;       // the header parse accepted the file
  std::string failure;   // when not: why, in words
  int parse_answer = 0;  // the header parse's own answer, for diagnostics
  bool read_ebml_header = false;  // parts of `facts` read before a failure
  bool read_segment_info = false;
  FileFacts facts;
};

struct ReadOptions {
  bool seekable = true;  // false: the input is read once, front to back (a pipe)
  bool walk = true;      // also walk the elements for tags, chapters, attachments
};

// `path` "-" is standard input. An input that cannot seek is never walked.
HeaderReading ReadHeaders(const std::string& path, const ReadOptions& options);

// The tracks the plug-in offers a channel for, in file order (the channels'
// order), and the file's TimecodeScale; false when the headers cannot be parsed.
bool ReadOfferedTracks(const std::string& path, std::vector<TrackFacts>* tracks, uint64_t* timecode_scale = nullptr);

// Why the plug-in would refuse a file, in the same words for every command:
// "not a Matroska file", "DocType webm is not played...", "no track this
// plug-in plays..."; empty when the headers give no reason.
std::string RefusalReason(const std::string& path);

// The plug-in's four-character code as text ("AVC1"), '?' for bytes that do not print.
std::string FourccText(uint32_t code);

}  // namespace reading
