#pragma once
// Which cue point a seek or a scan lands on, as a model to compare the
// filter's cue search with: F is the first cue point later than the target
// (else the last), in list order; forward takes F; backward takes the one
// before F (F itself when it is the first), except that a target beyond the
// last cue point takes the last. Times compare as signed 64-bit numbers.

#include <cstddef>
#include <cstdint>
#include <vector>

namespace testing_support {

inline size_t ChosenCue(const std::vector<uint64_t>& times, uint64_t target, bool forward) {
  const auto t = static_cast<int64_t>(target);
  size_t f = 0;
  while (f + 1 < times.size() && static_cast<int64_t>(times[f]) <= t) ++f;
  if (forward || (f + 1 == times.size() && t > static_cast<int64_t>(times[f]))) return f;
  return f == 0 ? 0 : f - 1;
}

}  // namespace testing_support
