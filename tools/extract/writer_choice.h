#pragma once
// Which file format each codec is written in.

#include <memory>
#include <string>

#include "tools/extract/frame_writer.h"

struct ChosenWriter {
  std::unique_ptr<FrameWriter> writer;
  std::string path;        // the file the writer fills
  std::string index_path;  // raw frames only: their index
};

// The writer for the channel, filling DIR/trackN.EXT through `out`.
ChosenWriter ChooseWriter(const ChannelFacts& facts, const std::string& directory, OutputFile* out);

// What --help lists: one line per codec family.
extern const char kWriterFormatsHelp[];
