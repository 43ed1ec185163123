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

// Keeps `thread`, once woken by another thread of its core, from taking the
// core from the waker. A channel woken by a ring slot's release would only
// find the ring lock still held by the channel that released it, and go back
// to sleep: two switches for nothing, at every release. Threads of one
// priority under a real-time scheduler behave so; on Linux it is the batch
// policy, which needs no privilege. Nothing when the system refuses.
void WaitForTurnOnCore(std::thread& thread);

}  // namespace host
