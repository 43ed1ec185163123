#include "tools/extract/timestamp_recorder.h"

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstring>

bool TimestampRecorder::Frame(const FrameView& frame) {
  times_us_.push_back(frame.time_us);
  return inner_->Frame(frame) || Fail(inner_->error());
}

bool TimestampRecorder::Finish() {
  const bool inner_ok = inner_->Finish() || Fail(inner_->error());
  std::sort(times_us_.begin(), times_us_.end());
  FILE* out = std::fopen(path_.c_str(), "w");
  if (!out) return Fail("cannot write " + path_ + ": " + std::strerror(errno));
  std::fputs("# timestamp format v2\n", out);
  for (uint64_t us : times_us_) {
    // Milliseconds, with the microseconds as decimals only where there are any.
    char fraction[8] = "";
    if (us % 1000) {
      std::snprintf(fraction, sizeof fraction, ".%03" PRIu64, us % 1000);
      for (size_t end = std::strlen(fraction); fraction[end - 1] == '0';) fraction[--end] = '\0';
    }
    std::fprintf(out, "%" PRIu64 "%s\n", us / 1000, fraction);
  }
  if (std::fclose(out) != 0) return Fail("cannot write " + path_ + ": " + std::strerror(errno));
  return inner_ok;
}
