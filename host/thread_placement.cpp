#include "host/thread_placement.h"

#include <pthread.h>
#include <sched.h>

namespace host {

ThreadPlacement PlaceChannelsTogether() {
  cpu_set_t allowed;
  CPU_ZERO(&allowed);
  if (sched_getaffinity(0, sizeof allowed, &allowed) != 0) return {};
  int found[2] = {-1, -1};
  int count = 0;
  for (int cpu = 0; cpu < CPU_SETSIZE && count < 2; ++cpu) {
    if (CPU_ISSET(cpu, &allowed)) found[count++] = cpu;
  }
  if (count < 2) return {};
  return ThreadPlacement{found[0], found[1]};
}

void KeepOnCpu(std::thread& thread, int cpu) {
  if (cpu < 0 || cpu >= CPU_SETSIZE || !thread.joinable()) return;
  cpu_set_t set;
  CPU_ZERO(&set);
  CPU_SET(cpu, &set);
  (void)pthread_setaffinity_np(thread.native_handle(), sizeof set, &set);
}

void WaitForTurnOnCore(std::thread& thread) {
#ifdef SCHED_BATCH
  if (!thread.joinable()) return;
  const sched_param param{};
  (void)pthread_setschedparam(thread.native_handle(), SCHED_BATCH, &param);
#else
  (void)thread;
#endif
}

}  // namespace host
