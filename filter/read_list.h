#pragma once
// "MediaListMaker": during trick play the streamer reads only the byte ranges
// the filter names; each next range is one cue point's cluster, found from the
// previous request's time moved by TrickTime and the scan speed.

#include "filter/mkv_filter.h"
#include "platform/read_list.h"

constexpr uint32_t kTrickForward = 512;
constexpr uint32_t kTrickBackward = 1024;

// 0, or the framework's error from MmfAcquireReadList (out not written).
// A null previous entry, or one that is not the current entry, gets the
// current entry back and acquires nothing.
[[nodiscard]] int GetNextReadList(MkvChannel* input, MmfReadListEntry** out, MmfReadListEntry* previous);
