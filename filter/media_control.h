#pragma once
// "MediaControl": the filter's control state, which the delivery path and the
// ring obey. Each operation takes StateLock; a failed lock changes nothing.

#include "filter/mkv_filter.h"

constexpr uint32_t kControlRunning = 64;
constexpr uint32_t kControlResumed = 256;
constexpr uint32_t kControlPausableMask = 0x785;
constexpr int kStopAfterError = 4041;

int Start(MkvFilter* filter);
// 0; 4041 when the state was 1 (it becomes 16 all the same). Wakes every
// thread waiting for room in the ring.
int Stop(MkvFilter* filter);
int Pause(MkvFilter* filter);
int Resume(MkvFilter* filter);
// The current control state.
int Status(MkvFilter* filter);
