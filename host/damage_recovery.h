#pragma once
// What the runner does when a channel fails on damaged input, with the
// framework's own operations only. A failing channel stops every other one
// (the filter's control state), so first each channel that was stopped before
// it got as far catches up: the others are released, the graph goes back to
// the cue point at or before the earliest frame one of them still lacks, and
// those channels play on, dropping what they passed on before, until each has
// failed too or reached the end. Then, all channels acquired again, playback
// goes on from the first cue point after the furthest frame any channel
// delivered, with a gap noted in each channel that failed. Cue points are
// found through the filter's time conversion; a file without cues can only be
// played again from its start, so it is caught up but not recovered.

#include <vector>

#include "host/graph_runner.h"
#include "host/playback_control.h"

namespace host {

struct RecoveryLinks {
  const MmfMediaOutputOps* output;
  const MmfTimeConverterOps* converter;
  MmfFilterHandle* handle;
  MmfMemoryPool* output_pool;  // the output channels' memory pool, for a channel acquired again
  PlaybackControl* playback;
};

// Runs once the sinks have started; returns when every one has ended for good
// (the caller then calls Finish). `channels` and `runs` are in the order of the sinks.
void RecoverFromDamage(const RecoveryLinks& links, const std::vector<MmfChannel*>& channels,
                       std::vector<ChannelRun>* runs, int recoveries);

}  // namespace host
