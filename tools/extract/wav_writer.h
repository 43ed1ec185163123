#pragma once
// PCM as WAV (.wav): a RIFF header (integer PCM, or IEEE float for float
// codec IDs) whose sizes are filled in at the end. WAV samples are little
// endian, so big-endian frames are byte-swapped on the way out.

#include "tools/extract/frame_writer.h"

class WavWriter : public FrameWriter {
 public:
  WavWriter(OutputFile* out, const ChannelFacts& facts) : FrameWriter(out), facts_(facts) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  ChannelFacts facts_;
  uint32_t sample_bytes_ = 2;
  uint64_t data_size_ = 0;
  Bytes swapped_;
};
