#pragma once
// What the demuxer's header parse does not keep, read by a walk over the
// file's elements: whether Duration and DateUTC are there, each track's
// LanguageBCP47, the tags with their targets, the chapters and the
// attachments. The walk passes over the Clusters with the SeekHead's help.

#include <string>

#include "tools/reading/element_walk.h"
#include "tools/reading/file_facts.h"

namespace reading {

// Fills facts->walked, tags, editions, attachments and walk_stopped, and the
// Segment Info's and tracks' fields named above. False when the file cannot be opened.
bool WalkFacts(const std::string& path, FileFacts* facts);

// Walks the whole file (a seekable regular file) for the visitor.
WalkEnd WalkFile(const std::string& path, ElementVisitor& visitor, const WalkOptions& options, bool* opened);

}  // namespace reading
