#pragma once
// `extract --timestamps`: beside a track's file, NAME.timestamps.txt in
// timestamp format v2 (the first line "# timestamp format v2", then each
// frame's presentation time in milliseconds, in ascending order, and the
// end of the last frame), as mkvextract's timestamps_v2 mode writes it. The
// frames pass on unchanged.

#include <memory>
#include <string>

#include "tools/extract/frame_writer.h"

class TimestampRecorder : public FrameWriter {
 public:
  TimestampRecorder(OutputFile* out, std::unique_ptr<FrameWriter> inner, std::string path,
                    uint64_t default_duration_ns, uint64_t timecode_scale_ns)
      : FrameWriter(out), inner_(std::move(inner)), path_(std::move(path)),
        default_duration_ns_(default_duration_ns), timecode_scale_ns_(timecode_scale_ns) {}
  bool Begin(const std::vector<Bytes>& config) override { return inner_->Begin(config) || Fail(inner_->error()); }
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  std::unique_ptr<FrameWriter> inner_;
  std::string path_;
  uint64_t default_duration_ns_;
  uint64_t timecode_scale_ns_;
  std::vector<uint64_t> times_ns_;
  uint64_t lace_time_us_ = 0;  // the time of the frames of the block being read
  uint64_t lace_index_ = 0;
};
