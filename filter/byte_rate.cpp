#include "core/status.h"
#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "filter/rating.h"
#include "platform/ao_log.h"

void CalcOverallByteRate(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  context->ByteRate = 0;
  uint64_t first_time = 0;
  uint64_t last_time = 0x7FFFFFFFFFFFFFFF;
  uint64_t first_position = 0;
  uint64_t last_position = 0;
  if (GetCueingPosition(filter, &first_time, 0, &first_position) == kStatusOk &&
      GetCueingPosition(filter, &last_time, 0, &last_position) == kStatusOk) {
    int64_t dt = static_cast<int64_t>(last_time - first_time);
    int64_t dpos = static_cast<int64_t>(last_position - first_position);
    int64_t seconds = dt / 1000000;
    // A cue point with no counting position has no cluster to measure from.
    bool found = first_position != kNoCuePosition && last_position != kNoCuePosition;
    if (found && dt > 0 && dpos > 0 && seconds > 0) context->ByteRate = static_cast<int32_t>(dpos / seconds);
  }
  if (context->ByteRate == 0) {
    AoLog(kAoLogDegraded, "kelvane: %s cueing points weren't enough to estimate the bytes per second.",
          "CalcOverallByteRate");
  }
}
