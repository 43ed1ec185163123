#pragma once
// FLAC as a native FLAC stream (.flac): "fLaC", the metadata blocks of the
// decoder configuration (STREAMINFO first) with the last one flagged as
// last, then the frames as they are.

#include "tools/extract/frame_writer.h"

class FlacWriter : public FrameWriter {
 public:
  using FrameWriter::FrameWriter;
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override { return out_->Write(frame.pieces, frame.count); }
};
