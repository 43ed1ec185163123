#pragma once
// AAC as an ADTS stream (.aac): every frame behind a 7-byte header whose
// profile, sampling-frequency index and channel configuration come from the
// AudioSpecificConfig (or, without one, from the codec ID and the format).

#include "tools/extract/frame_writer.h"

class AdtsWriter : public FrameWriter {
 public:
  AdtsWriter(OutputFile* out, const ChannelFacts& facts) : FrameWriter(out), facts_(facts) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;

 private:
  ChannelFacts facts_;
  uint32_t profile_ = 1;  // audio object type - 1: 0 Main, 1 LC, 2 SSR, 3 LTP
  uint32_t frequency_index_ = 0;
  uint32_t channel_config_ = 0;
  std::vector<iovec> list_;
};
