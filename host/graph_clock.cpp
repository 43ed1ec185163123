#include "host/graph_clock.h"

#include <map>
#include <mutex>

#include "platform/mmf_status.h"

namespace {

std::mutex clocks_mutex;
std::map<MmfGraph*, host::GraphClock*>& Clocks() {
  static std::map<MmfGraph*, host::GraphClock*> clocks;
  return clocks;
}

// `which` 1 asks for the time of the frames consumed; it is the only time this clock keeps.
uint64_t OpGetTime(MmfClock* clock, uint32_t, uint32_t, uint32_t, uint32_t, uint32_t) {
  return clock ? reinterpret_cast<host::GraphClock*>(clock)->Now() : 0;
}

const MmfClockOps kClockOps = {
    .Reserved0 = nullptr,
    .Reserved1 = nullptr,
    .Reserved2 = nullptr,
    .Reserved3 = nullptr,
    .GetTime = OpGetTime,
};

}  // namespace

namespace host {

GraphClock::GraphClock() = default;

const MmfClockOps* GraphClock::Ops() { return &kClockOps; }

void AttachGraphClock(MmfGraph* graph, GraphClock* clock) {
  std::lock_guard lock(clocks_mutex);
  if (clock) {
    Clocks()[graph] = clock;
  } else {
    Clocks().erase(graph);
  }
}

}  // namespace host

extern "C" int MmfGetGraphClock(MmfGraph* graph, MmfClock** clock, const MmfClockOps** ops) {
  if (!graph || !clock || !ops) return kMmfInvalidArgument;
  std::lock_guard lock(clocks_mutex);
  auto found = Clocks().find(graph);
  if (found == Clocks().end()) return kMmfNotAvailable;
  *clock = found->second->handle();
  *ops = &kClockOps;
  return kMmfOk;
}
