#include "tools/extract/timestamp_recorder.h"

#include <algorithm>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstring>

bool TimestampRecorder::Frame(const FrameView& frame) {
  // The plug-in delivers every frame of a laced block with the block's time;
  // the frames after the first follow it by the DefaultDuration.
  // The plug-in counts a block's ticks in whole microseconds per tick; with
  // a TimecodeScale that is no whole number of microseconds, the file's own
  // time is the ticks times the scale.
  const uint64_t us_per_tick = timecode_scale_ns_ / 1000;
  uint64_t ns = frame.time_us * 1000;
  if (timecode_scale_ns_ % 1000 && us_per_tick) ns = frame.time_us / us_per_tick * timecode_scale_ns_;
  if (!times_ns_.empty() && frame.time_us == lace_time_us_ && default_duration_ns_) {
    ns += ++lace_index_ * default_duration_ns_;
  } else {
    lace_time_us_ = frame.time_us;
    lace_index_ = 0;
  }
  times_ns_.push_back(ns);
  return inner_->Frame(frame) || Fail(inner_->error());
}

bool TimestampRecorder::Finish() {
  const bool inner_ok = inner_->Finish() || Fail(inner_->error());
  std::sort(times_ns_.begin(), times_ns_.end());
  // As mkvextract does, the end of the last frame closes the list.
  if (!times_ns_.empty() && default_duration_ns_) times_ns_.push_back(times_ns_.back() + default_duration_ns_);
  FILE* out = std::fopen(path_.c_str(), "w");
  if (!out) return Fail("cannot write " + path_ + ": " + std::strerror(errno));
  std::fputs("# timestamp format v2\n", out);
  for (uint64_t ns : times_ns_) {
    // Milliseconds, with decimals only as far as they are not 0.
    char fraction[8] = "";
    if (ns % 1000000) {
      std::snprintf(fraction, sizeof fraction, ".%06" PRIu64, ns % 1000000);
      for (size_t end = std::strlen(fraction); fraction[end - 1] == '0';) fraction[--end] = '\0';
    }
    std::fprintf(out, "%" PRIu64 "%s\n", ns / 1000000, fraction);
  }
  if (std::fclose(out) != 0) return Fail("cannot write " + path_ + ": " + std::strerror(errno));
  return inner_ok;
}
