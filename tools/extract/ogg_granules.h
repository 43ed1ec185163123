#pragma once
// Granule positions of the packets of an Ogg logical stream, which depend on
// the codec: Vorbis counts samples, Theora counts frames since the last key
// frame. Each codec's three headers are read first.

#include <cstdint>
#include <memory>
#include <vector>

#include "tools/extract/frame_writer.h"
#include "tools/extract/vorbis_blocks.h"

class OggGranules {
 public:
  virtual ~OggGranules() = default;
  // False when the headers cannot be read.
  virtual bool Init(const std::vector<Bytes>& headers) = 0;
  // The granule position at the end of the next packet, whose first byte is
  // given (0 for an empty packet).
  virtual int64_t After(uint8_t first_byte, size_t size) = 0;
};

class VorbisGranules : public OggGranules {
 public:
  bool Init(const std::vector<Bytes>& headers) override { return blocks_.Init(headers[0], headers[2]); }
  int64_t After(uint8_t first_byte, size_t) override { return samples_ += blocks_.Samples(first_byte); }

 private:
  VorbisBlocks blocks_;
  int64_t samples_ = 0;
};

// The key frame's number shifted left by the identification
// header's KFGSHIFT, plus the frames since that key frame.
class TheoraGranules : public OggGranules {
 public:
  bool Init(const std::vector<Bytes>& headers) override;
  int64_t After(uint8_t first_byte, size_t size) override;

 private:
  int shift_ = 0;
  int64_t frames_ = 0;  // before the next packet
  int64_t key_frame_ = 0;
  int64_t first_frame_ = 1;  // the number of the first frame
};

// The three headers of a Xiph-laced CodecPrivate (a count byte, two laced
// sizes, the packets); empty when it is malformed.
std::vector<Bytes> SplitXiphLacing(const Bytes& laced);
