#pragma once
// Codecs whose frames, put one after the other, are already a stream that
// decoders read (MPEG audio, AC-3, DTS, MPEG-1/2 and MPEG-4 Part 2 video).
// For video the decoder configuration (the sequence or VOL headers) goes
// first unless the first frame begins with it.

#include "tools/extract/frame_writer.h"

class ElementaryWriter : public FrameWriter {
 public:
  // `header_skip`: bytes of the decoder configuration before its headers (a
  // Video for Windows track's 40-byte BITMAPINFOHEADER).
  ElementaryWriter(OutputFile* out, bool headers_first, size_t header_skip = 0)
      : FrameWriter(out), headers_first_(headers_first), header_skip_(header_skip) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;

 private:
  bool headers_first_;
  size_t header_skip_;
  Bytes headers_;  // still to be written before the first frame
};
