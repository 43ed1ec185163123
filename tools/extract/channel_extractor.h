#pragma once
// One channel's road from output media buffers to its file. The plug-in
// announces decoder-configuration packets (property 30) ahead of the first
// frame and a frame in several pieces with properties 7 and 8 (the prefix of
// a header-stripped track is such a piece); the pieces are handed to the
// writer as the references they are. Only a frame whose pieces straddle two
// output buffers is copied, because the earlier buffer's input goes back to
// the pool before the frame is complete.

#include <sys/uio.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/media_buffer.h"
#include "tools/extract/frame_writer.h"
#include "tools/progress_bar.h"

class ChannelExtractor {
 public:
  ChannelExtractor(std::unique_ptr<FrameWriter> writer, ProgressBar* progress)
      : writer_(std::move(writer)), progress_(progress) {}

  // On the channel's sink thread, while the buffer's elements are readable.
  void Consume(MmfMra* buffer);
  // After playback; false when anything failed (see error()).
  bool Finish();

  uint64_t frames() const { return frames_; }
  uint64_t bytes() const { return bytes_; }
  const std::string& error() const { return error_; }

 private:
  void Property(uint32_t type, uint64_t value);
  void Piece(uint8_t* address, uint32_t size);
  void Deliver();
  void Begin();  // the writer gets the configuration packets once, before the first frame
  void Check(bool ok);

  std::unique_ptr<FrameWriter> writer_;
  ProgressBar* progress_;
  std::vector<Bytes> config_;
  uint32_t config_left_ = 0;
  bool begun_ = false;
  bool failed_ = false;
  bool in_parts_ = false;   // a frame announced by property 7 is being put together
  bool last_part_ = false;  // property 8 came: the next piece ends the frame
  uint64_t time_us_ = 0;    // the last presentation time
  uint64_t frame_time_us_ = 0;
  std::vector<iovec> pieces_;  // of the frame being put together, in the current buffer
  Bytes carried_;              // its bytes from earlier buffers
  uint64_t frames_ = 0;
  uint64_t bytes_ = 0;
  std::string error_;
};
