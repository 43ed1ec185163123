#include "tools/playback_limits.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "host/playback_control.h"
#include "platform/mmf_status.h"

const char kLimitUsage[] =
    "  --until TIME        after the control actions, stop once every channel reaches TIME\n"
    "                      seconds (frames from TIME on are left out)\n"
    "  --frames N          after the control actions, stop once every channel has delivered\n"
    "                      N more frames\n";

namespace {

constexpr int kControlStopped = 16;  // NextBuffer's answer once the filter is stopped
constexpr double kMaxSeconds = 1e9;

}  // namespace

int ParseLimitOption(int argc, char** argv, int* i, LimitOptions* limits, std::string* error) {
  const char* arg = argv[*i];
  const bool until = !std::strcmp(arg, "--until");
  if (!until && std::strcmp(arg, "--frames") != 0) return 0;
  const char* form = until ? "TIME, seconds (12.5)" : "N, a number of frames from 1 to 4294967295";
  if (*i + 1 >= argc) {
    *error = std::string(arg) + " needs a value: " + form;
    return -1;
  }
  const char* value = argv[++*i];
  char* end = nullptr;
  if (until) {
    const double seconds = std::strtod(value, &end);
    if (end != value && !*end && seconds >= 0 && seconds <= kMaxSeconds) {
      limits->until_us = static_cast<uint64_t>(std::llround(seconds * 1e6));
      return 1;
    }
  } else {
    const unsigned long long frames = std::strtoull(value, &end, 10);
    if (end != value && !*end && value[0] != '-' && frames >= 1 && frames <= 0xFFFFFFFFull) {
      limits->frames = frames;
      return 1;
    }
  }
  *error = std::string(arg) + ": '" + value + "' is not " + form;
  return -1;
}

PlaybackLimits::PlaybackLimits(const LimitOptions& limits, std::vector<int32_t> channels)
    : limits_(limits), indexes_(std::move(channels)) {
  for (int32_t index : indexes_) channel_slots_ = std::max(channel_slots_, static_cast<size_t>(index) + 1);
  channels_ = std::make_unique<Channel[]>(channel_slots_);
}

bool PlaybackLimits::AllDone() const {
  return std::all_of(indexes_.begin(), indexes_.end(),
                     [this](int32_t index) { return channels_[static_cast<size_t>(index)].done.load(); });
}

void PlaybackLimits::Apply(host::RunnerOptions* run) {
  if (!active()) return;
  forward_ = run->on_frames;
  forward_user_ = run->user;
  run->on_frames = OnFrames;
  run->user = this;
  forward_room_ = run->frame_room;
  if (forward_room_) run->frame_room = Room;
  // Without actions the limits hold from the first frame: the sinks may be
  // far ahead by the time the controller's thread runs.
  counting_ = run->actions.empty();
  run->script = [this, actions = run->actions](host::PlaybackControl& control) {
    control_results_ = control.Run(actions);
    counting_ = true;
    if (control.WaitUntil([this] { return AllDone(); })) {
      stopped_ = true;
      (void)control.Stop();
    }
  };
}

host::RunFrame* PlaybackLimits::Room(void* user, int32_t index, size_t* room) {
  auto* self = static_cast<PlaybackLimits*>(user);
  return self->forward_room_(self->forward_user_, index, room);
}

void PlaybackLimits::OnFrames(void* user, int32_t index, const host::RunFrame* frames, size_t count) {
  auto* self = static_cast<PlaybackLimits*>(user);
  size_t kept = count;
  if (self->counting_ && index >= 0 && static_cast<size_t>(index) < self->channel_slots_) {
    Channel& channel = self->channels_[static_cast<size_t>(index)];
    for (size_t i = 0; i < count; ++i) {
      if (channel.done || (self->limits_.until_us && frames[i].time_us >= *self->limits_.until_us)) {
        channel.done = true;
        kept = i;
        break;
      }
      if (self->limits_.frames && ++channel.counted >= *self->limits_.frames) {
        channel.done = true;
        kept = i + 1;
        break;
      }
    }
  }
  if (self->forward_) self->forward_(self->forward_user_, index, frames, kept);
}

void PlaybackLimits::Settle(host::RunResult* result) const {
  if (!active()) return;
  result->control_results = control_results_;
  for (host::ChannelRun& run : result->channels) {
    // Kept frames: those after the last control sequence count against the limits.
    const size_t start = run.seeks.empty() ? 0 : std::min(run.seeks.back(), run.frames.size());
    size_t end = run.frames.size();
    for (size_t i = start; limits_.until_us && i < end; ++i) {
      if (run.frames[i].time_us >= *limits_.until_us) end = i;
    }
    if (limits_.frames) end = std::min<size_t>(end, start + *limits_.frames);
    run.frames.resize(end);
  }
  if (!stopped_) return;
  const bool ended = std::all_of(result->channels.begin(), result->channels.end(), [](const host::ChannelRun& run) {
    return run.end_result == kMmfEndOfStream || run.end_result == kControlStopped;
  });
  if (!ended) return;
  // The stop was the limits' own: a channel it caught waiting for room or input
  // ended where it was asked to, as one that reached the end of the file first.
  result->ok = true;
  result->error.clear();
  for (host::ChannelRun& run : result->channels) {
    if (run.end_result == kControlStopped) run.end_result = kMmfEndOfStream;
  }
}
