#include "host/damage_recovery.h"

#include <algorithm>

#include "host/memory_pools.h"
#include "platform/mmf_status.h"

namespace host {
namespace {

constexpr uint64_t kNoPosition = 0x7FFFFFFFFFFFFFFFull;  // ConvertToPosition: no cue point counts
constexpr uint64_t kFirstStepUs = 1000000;
constexpr uint64_t kLatestTimeUs = uint64_t{1} << 42;  // 50 days: past every cue point

struct Cues {
  const MmfTimeConverterOps* converter;
  MmfFilterHandle* handle;

  // The Cluster that a seek to `time_us` starts at; false when none can be found.
  bool PositionAt(uint64_t time_us, uint64_t* position) const {
    return converter->ConvertToPosition(handle, 0, time_us, position) == kMmfOk && *position != kNoPosition;
  }

  // The time of the cue point at `position`. With "EnablePreroll" the first
  // conversion after ConvertToPosition answers that call's time instead.
  bool TimeAt(uint64_t position, uint64_t* time_us) const {
    (void)converter->ConvertToTime(handle, 0, position, time_us);
    return converter->ConvertToTime(handle, 0, position, time_us) == kMmfOk;
  }

  // A time whose seek starts at or before `offset`, trying `hint` first, then
  // the time of each cue point before the one it gave: false when none does.
  bool AtOrBefore(uint64_t offset, uint64_t hint, uint64_t* time_us) const {
    uint64_t t = hint, position = 0;
    for (;;) {
      if (!PositionAt(t, &position)) {
        if (t == 0) return false;
        t = 0;  // without cues only the start can be found
        continue;
      }
      if (position <= offset) break;
      uint64_t cue_time = 0;
      if (t == 0 || !TimeAt(position, &cue_time)) return false;
      t = std::min(t, cue_time) - (cue_time > 0 ? 1 : 0);
    }
    *time_us = t;
    return true;
  }

  // The earliest time whose seek starts after `offset`, when there is one.
  // The seek's cue search goes backward, so the start moves on with the time:
  // a search doubling the step, then halving the interval.
  bool After(uint64_t offset, uint64_t* time_us) const {
    uint64_t position = 0, low = 0, high = kFirstStepUs;
    if (PositionAt(0, &position) && position > offset) {
      *time_us = 0;
      return true;
    }
    while (!(PositionAt(high, &position) && position > offset)) {
      if (high >= kLatestTimeUs) return false;
      low = high;
      high *= 2;
    }
    while (high - low > 1) {
      const uint64_t middle = low + (high - low) / 2;
      (PositionAt(middle, &position) && position > offset ? high : low) = middle;
    }
    *time_us = high;
    return true;
  }

  // The cue point's own time for a seek to `time_us`.
  uint64_t CueTime(uint64_t time_us) const {
    uint64_t position = 0, cue_time = time_us;
    if (PositionAt(time_us, &position)) (void)TimeAt(position, &cue_time);
    return cue_time;
  }
};

bool Ended(const ChannelRun& run) { return run.failed || run.end_result == kMmfEndOfStream; }

}  // namespace

void RecoverFromDamage(const RecoveryLinks& links, const std::vector<MmfChannel*>& channels,
                       std::vector<ChannelRun>* runs, int recoveries) {
  const Cues cues{links.converter, links.handle};
  std::vector<bool> released(channels.size(), false);
  auto acquire_again = [&] {
    for (size_t i = 0; i < channels.size(); ++i) {
      if (!released[i]) continue;
      released[i] = false;
      (void)links.output->AcquireOutputChannel(channels[i]);
      (void)links.output->SetOutputChannelMemoryPool(channels[i], MemoryPool::Ops(), links.output_pool);
    }
  };
  uint64_t gone_past = 0;  // the furthest damage recovered from
  for (;;) {
    if (!links.playback->WaitIdle()) return;
    std::vector<bool> ended(runs->size());
    uint64_t lacking = UINT64_MAX, hint = UINT64_MAX, furthest = gone_past;
    bool failed = false, lagging = false;
    for (size_t i = 0; i < runs->size(); ++i) {
      const ChannelRun& run = (*runs)[i];
      ended[i] = Ended(run);
      failed = failed || run.failed;
      furthest = std::max(furthest, run.frame_end);
      if (ended[i]) continue;
      lagging = true;
      lacking = std::min(lacking, run.frame_count ? run.frame_end : 0);
      hint = std::min(hint, run.frame_count ? run.last_time_us : 0);
    }
    if (!failed) return;
    uint64_t time_us = 0;
    if (lagging) {
      // Only the channels that lag are acquired: the others would hold the ring.
      // One that delivered nothing yet goes back to the start.
      uint64_t position = 0;
      if (lacking == 0 ? !cues.PositionAt(0, &position) : !cues.AtOrBefore(lacking, hint, &time_us)) return;
      (void)links.playback->Reposition(time_us, ended, [&] {
        for (size_t i = 0; i < channels.size(); ++i) {
          if (ended[i] && !released[i]) released[i] = links.output->ReleaseOutputChannel(channels[i]) == kMmfOk;
        }
      });
      continue;
    }
    if (recoveries-- <= 0 || !cues.After(furthest, &time_us)) return;
    const uint64_t cue_time = cues.CueTime(time_us);
    uint64_t position = 0;
    gone_past = cues.PositionAt(time_us, &position) ? position : furthest;
    for (ChannelRun& run : *runs) {
      if (!run.failed) continue;
      run.failed = false;
      // Failing again before a frame came: still the same gap, now to the next cue point.
      if (!run.gaps.empty() && run.gaps.back().at == run.frame_count) run.gaps.pop_back();
      run.gaps.push_back(Gap{static_cast<size_t>(run.frame_count), run.last_time_us, cue_time, furthest});
    }
    (void)links.playback->Reposition(time_us, std::vector<bool>(channels.size(), false), acquire_again);
  }
}

}  // namespace host
