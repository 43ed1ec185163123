#pragma once
// Stand-ins for the operations whose behaviour is not built yet. Each answers
// the refusal its operation already knows, so a framework that calls them sees
// a filter that cannot do the thing rather than a crash:
//  - TrickQuery: 0, no trick-play capability;
//  - every other operation: 4044, not available.
// The thin interface file has already answered 22 for null arguments.

#include <cstdint>

#include "filter/mkv_filter.h"
#include "platform/interfaces.h"

constexpr int kPendingNotAvailable = 4044;

int PendingNotAvailable();
int PendingTrickQuery();
