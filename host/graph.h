#pragma once
// The host's graph record, behind the framework's opaque MmfGraph: what a
// filter can ask of the graph it belongs to.

#include <cstdint>

#include "platform/graph.h"

struct MmfGraph {
  uint32_t Flags = 0;  // kMmfGraph... bits, answered by MmfGetGraphParams
};
