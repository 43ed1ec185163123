#pragma once
// The host's graph clock: the media time of the frames consumed so far, as the
// consumer at the end of the graph reports it. A graph is given its clock with
// AttachGraphClock; MmfGetGraphClock then hands it to the graph's filters.

#include <atomic>
#include <cstdint>

#include "platform/graph.h"

namespace host {

class GraphClock {
 public:
  GraphClock();
  // The consumer has used every frame up to this media time (microseconds).
  void Consumed(uint64_t media_time_us) { consumed_.store(media_time_us); }
  uint64_t Now() const { return consumed_.load(); }

  MmfClock* handle() { return reinterpret_cast<MmfClock*>(this); }
  static const MmfClockOps* Ops();

 private:
  std::atomic<uint64_t> consumed_{0};
};

// The graph's clock from now on (null detaches it). The clock must outlive the attachment.
void AttachGraphClock(MmfGraph* graph, GraphClock* clock);

}  // namespace host
