#pragma once
// Codecs without a stream format of their own (MS MPEG-4 V3, SVQ3,
// VfW-wrapped video...): NAME.raw holds the decoder-configuration packets and
// then the frames back to back, and NAME.index says where each one is, one
// text line each:
//   config OFFSET SIZE
//   frame OFFSET SIZE TIME_US
// (byte offsets into NAME.raw; presentation time in microseconds); lines
// starting with # are comments.

#include <string>

#include "tools/extract/frame_writer.h"

class RawIndexWriter : public FrameWriter {
 public:
  RawIndexWriter(OutputFile* out, const std::string& index_path, const ChannelFacts& facts);
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  bool Line(const char* kind, uint64_t offset, size_t size, const uint64_t* time_us);
  bool FlushIndex();

  OutputFile index_;
  std::string index_path_;
  ChannelFacts facts_;
  std::string pending_;  // index lines not yet written
};
