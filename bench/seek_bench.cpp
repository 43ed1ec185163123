// Seeking a long file as a player does: the graph plays, and SEEKS times
// (drawn with a fixed seed over the file's duration) the framework seeks it
// (the filter stopped, ConvertToPosition, Seek, the streamer moved, Flush,
// Start). For each seek: the time from the request until every channel has
// delivered its first frame after it, and the bytes the process read in that
// time (/proc/self/io). One line per seek, "TIME_US LATENCY_US BYTES".
//   seek_bench PLUGIN FILE [SEEKS] [SEED]

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <mutex>
#include <random>
#include <string>
#include <vector>

#include "host/graph_runner.h"
#include "host/playback_control.h"
#include "host/plugin_loader.h"
#include "tools/reading/header_reading.h"

namespace {

using Clock = std::chrono::steady_clock;

uint64_t BytesReadSoFar() {
  std::ifstream io("/proc/self/io");
  std::string key;
  uint64_t value = 0;
  while (io >> key >> value) {
    if (key == "rchar:") return value;
  }
  return 0;
}

// Which channels have delivered a frame since the last seek request.
struct FirstFrames {
  std::mutex mutex;
  std::condition_variable all_seen;
  std::vector<bool> seen;
  size_t left = 0;
  Clock::time_point last;

  void Arm(size_t channels) {
    std::lock_guard lock(mutex);
    seen.assign(channels, false);
    left = channels;
  }
  static void OnFrames(void* user, int32_t channel, const host::RunFrame*, size_t count) {
    auto* self = static_cast<FirstFrames*>(user);
    std::lock_guard lock(self->mutex);
    if (count == 0 || channel < 0 || static_cast<size_t>(channel) >= self->seen.size() || self->seen[channel]) return;
    self->seen[static_cast<size_t>(channel)] = true;
    self->last = Clock::now();
    if (--self->left == 0) self->all_seen.notify_all();
  }
};

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) {
    std::fprintf(stderr, "usage: seek_bench PLUGIN FILE [SEEKS] [SEED]\n");
    return 2;
  }
  const std::string file = argv[2];
  const int seeks = argc > 3 ? std::atoi(argv[3]) : 100;
  const unsigned seed = argc > 4 ? static_cast<unsigned>(std::atoi(argv[4])) : 20240601u;
  std::string error;
  auto plugin = host::Plugin::Load(argv[1], &error);
  if (!plugin) {
    std::fprintf(stderr, "seek_bench: %s\n", error.c_str());
    return 1;
  }
  reading::HeaderReading headers = reading::ReadHeaders(file, {true, false});
  size_t channels = 0;
  for (const reading::TrackFacts& track : headers.facts.tracks) channels += track.offered_fourcc != 0;
  const uint64_t duration_us = headers.facts.info.DurationNs().value_or(0) / 1000;
  if (!headers.ok || channels == 0 || duration_us == 0) {
    std::fprintf(stderr, "seek_bench: %s: no duration or no channel\n", file.c_str());
    return 1;
  }

  std::mt19937_64 random(seed);
  std::uniform_int_distribution<uint64_t> when(0, duration_us - 1);
  FirstFrames first;
  first.Arm(channels);
  host::RunnerOptions run;
  run.checksum = false;
  run.read_ahead = true;
  run.keep_frames = false;
  run.on_frames = FirstFrames::OnFrames;
  run.user = &first;
  int failures = 0;
  run.script = [&](host::PlaybackControl& control) {
    {  // playback is under way on every channel before the first seek
      std::unique_lock lock(first.mutex);
      first.all_seen.wait(lock, [&] { return first.left == 0; });
    }
    for (int i = 0; i < seeks; ++i) {
      const uint64_t time_us = when(random);
      first.Arm(channels);
      const uint64_t bytes_before = BytesReadSoFar();
      const Clock::time_point start = Clock::now();
      if (control.Seek(time_us) != 0) ++failures;
      std::unique_lock lock(first.mutex);
      if (!first.all_seen.wait_for(lock, std::chrono::seconds(20), [&] { return first.left == 0; })) {
        std::fprintf(stderr, "seek_bench: no frame on every channel after a seek to %llu us\n",
                     static_cast<unsigned long long>(time_us));
        ++failures;
        continue;
      }
      const uint64_t bytes = BytesReadSoFar() - bytes_before;
      const auto latency = std::chrono::duration_cast<std::chrono::microseconds>(first.last - start).count();
      std::printf("%llu %lld %llu\n", static_cast<unsigned long long>(time_us), static_cast<long long>(latency),
                  static_cast<unsigned long long>(bytes));
    }
    (void)control.Stop();
  };
  host::RunGraph(*plugin, file, run);
  return failures ? 1 : 0;
}
