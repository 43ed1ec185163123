#pragma once
// `extract --timestamps`: beside a track's file, NAME.timestamps.txt in
// timestamp format v2 (the first line "# timestamp format v2", then each
// frame's presentation time in milliseconds, in ascending order), as
// mkvextract's timestamps_v2 mode writes it. The frames pass on unchanged.

#include <memory>
#include <string>

#include "tools/extract/frame_writer.h"

class TimestampRecorder : public FrameWriter {
 public:
  TimestampRecorder(OutputFile* out, std::unique_ptr<FrameWriter> inner, std::string path)
      : FrameWriter(out), inner_(std::move(inner)), path_(std::move(path)) {}
  bool Begin(const std::vector<Bytes>& config) override { return inner_->Begin(config) || Fail(inner_->error()); }
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  std::unique_ptr<FrameWriter> inner_;
  std::string path_;
  std::vector<uint64_t> times_us_;
};
