#pragma once
// AVC as an Annex B byte stream (.h264): the SPS and PPS of the decoder
// configuration (avcC) first, then every NAL unit of every frame behind a
// start code in place of its length field.

#include "tools/extract/frame_writer.h"

class AnnexBWriter : public FrameWriter {
 public:
  using FrameWriter::FrameWriter;
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;

 private:
  // Bytes of each NAL unit's length field; 0: the frames already carry start codes.
  size_t length_size_ = 0;
  std::vector<iovec> list_;
};
