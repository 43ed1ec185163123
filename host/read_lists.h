#pragma once
// The host's read lists behind the framework's opaque MmfReadList: a ring of
// entries, each with its requests, for the input channel of a list maker.

#include <cstdint>
#include <mutex>
#include <vector>

#include "platform/read_list.h"

struct MmfReadList {
  MmfChannel* Channel = nullptr;  // the list maker's input channel; Peer is the streamer's output
  std::vector<MmfReadListEntry> Entries;
  std::vector<MmfReadRequest> Requests;  // RequestCount per entry, entry by entry
  uint32_t NextEntry = 0;                // the entry the next acquisition hands out
  std::mutex Mutex;
};
