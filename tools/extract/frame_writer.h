#pragma once
// One channel's file format. A writer is handed the decoder-configuration
// packets the plug-in delivered ahead of the frames, then every whole frame
// as the pieces it arrived in (references into the input buffers, valid only
// during the call), then the end. Each call answers false after a failure,
// which the output file (or `error`) describes.

#include <sys/uio.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "tools/extract/output_file.h"

using Bytes = std::vector<uint8_t>;

// What the channel's format record and the track's headers say about it.
struct ChannelFacts {
  int32_t channel = -1;  // output channel index
  uint64_t track = 0;    // Matroska track number
  std::string codec_id;
  uint32_t fourcc = 0;
  bool video = false;
  uint32_t channels = 0;        // audio
  uint32_t sample_rate = 0;     // audio, Hz
  uint32_t bit_depth = 0;       // audio, from the track; 0 not stated
  uint32_t pcm_byte_order = 0;  // 1 little endian, 2 big endian, 0 not PCM
  uint64_t default_duration_ns = 0;  // 0: not stated
  uint64_t timecode_scale_ns = 0;    // the file's TimecodeScale
  bool zlib_frames = false;          // stored with zlib content compression
  bool zlib_private = false;         // the compression covers the CodecPrivate too
};

struct FrameView {
  const iovec* pieces = nullptr;
  size_t count = 0;
  size_t size = 0;  // bytes in all pieces
  uint64_t time_us = 0;
};

class FrameWriter {
 public:
  explicit FrameWriter(OutputFile* out) : out_(out) {}
  virtual ~FrameWriter() = default;
  FrameWriter(const FrameWriter&) = delete;
  FrameWriter& operator=(const FrameWriter&) = delete;

  virtual bool Begin(const std::vector<Bytes>& config) = 0;
  virtual bool Frame(const FrameView& frame) = 0;
  virtual bool Finish() { return out_->Close(); }

  // Why the last call failed, when the output file does not say.
  const std::string& error() const { return out_->failed() ? out_->error() : error_; }

 protected:
  bool Fail(const std::string& why) {
    if (error_.empty()) error_ = why;
    return false;
  }
  OutputFile* out_;
  std::string error_;
};

// Copies `length` bytes at `offset` of the frame into `out` (false when the
// frame is shorter); reads across piece boundaries.
bool CopyFrameBytes(const FrameView& frame, size_t offset, size_t length, uint8_t* out);

// Appends to `list` the pieces that cover `length` bytes at `offset` of the frame.
void AppendFrameRange(const FrameView& frame, size_t offset, size_t length, std::vector<iovec>* list);
