#pragma once
// Where the runner may put its threads. The channel threads of one graph
// take turns under the plug-in's ring lock: on one core, each hand-off is a
// switch on that core rather than a wake-up sent to another, and the other
// core is left to the streamer's reader. Left to the scheduler, threads that
// do much work of their own (checksums, writing files) run better.

#include <thread>

namespace host {

struct ThreadPlacement {
  int channels_cpu = -1;  // -1: anywhere
  int reader_cpu = -1;
};

// The first two CPUs this process may run on, for the channels and the
// reader; anywhere for both when it may run on fewer than two.
ThreadPlacement PlaceChannelsTogether();

// Keeps `thread` on `cpu`; nothing for -1, or when the system refuses (the
// thread then runs anywhere, as before).
void KeepOnCpu(std::thread& thread, int cpu);

}  // namespace host
