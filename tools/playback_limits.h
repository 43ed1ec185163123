#pragma once
// `kelvane packets --until TIME` and `--frames N`: playback ends early, as a
// framework ends it, with the filter's Stop, once every acquired channel has
// reached TIME or delivered N frames after the control actions (so that a
// seek's landing can be looked at without playing to the end). Frames a
// channel delivers past its limit before the Stop takes effect are left out.

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "host/graph_runner.h"

// The options' lines for the help text.
extern const char kLimitUsage[];

struct LimitOptions {
  std::optional<uint64_t> until_us;
  std::optional<uint64_t> frames;
};

// Like ParseControlOption: 1 taken, 0 not a limit option, -1 with *error.
int ParseLimitOption(int argc, char** argv, int* i, LimitOptions* limits, std::string* error);

class PlaybackLimits {
 public:
  // `channels`: the output channel indexes that play.
  PlaybackLimits(const LimitOptions& limits, std::vector<int32_t> channels);

  bool active() const { return limits_.until_us || limits_.frames; }
  // Runs the control actions, then waits for the limits and stops playback;
  // takes over on_frames (passing the frames within the limits on to the
  // consumer set before).
  void Apply(host::RunnerOptions* run);
  // After playback: the kept frames within the limits, the actions' answers,
  // and a run stopped by the limits counted as whole.
  void Settle(host::RunResult* result) const;

 private:
  struct Channel {
    std::atomic<uint64_t> counted{0};
    std::atomic<bool> done{false};
  };
  static void OnFrames(void* user, int32_t channel, const host::RunFrame* frames, size_t count);
  static host::RunFrame* Room(void* user, int32_t channel, size_t* room);
  bool AllDone() const;

  LimitOptions limits_;
  std::vector<int32_t> indexes_;
  std::unique_ptr<Channel[]> channels_;  // by output channel index
  size_t channel_slots_ = 0;
  std::atomic<bool> counting_{false};  // the control actions are done
  std::atomic<bool> stopped_{false};
  std::vector<int> control_results_;
  void (*forward_)(void* user, int32_t channel, const host::RunFrame* frames, size_t count) = nullptr;
  host::RunFrame* (*forward_room_)(void* user, int32_t channel, size_t* room) = nullptr;
  void* forward_user_ = nullptr;
};
