#pragma once
// Video for Windows tracks (V_MS/VFW/FOURCC) other than MPEG-4 Part 2, as
// AVI (.avi): one video stream whose format is the track's
// BITMAPINFOHEADER (the decoder configuration the plug-in delivers), every
// frame a '00dc' chunk, and an idx1 index. Frame rate and counts are filled
// in at the end; the frame rate comes from the track's DefaultDuration, or
// from the frames' times when it has none.

#include "tools/extract/frame_writer.h"

class AviWriter : public FrameWriter {
 public:
  AviWriter(OutputFile* out, const ChannelFacts& facts) : FrameWriter(out), facts_(facts) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  ChannelFacts facts_;
  uint64_t movi_start_ = 0;  // offset of the 'movi' list's type, where index offsets count from
  Bytes index_;              // idx1 entries, 16 bytes each
  uint32_t frames_ = 0;
  uint32_t largest_ = 0;
  uint64_t first_time_us_ = 0;
  uint64_t last_time_us_ = 0;
  size_t stream_header_at_ = 0;  // offset of the 'strh' data
};
