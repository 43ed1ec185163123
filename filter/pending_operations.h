#pragma once
// Stand-ins for the operations whose behaviour is not built yet. Each answers
// the refusal its operation already knows, so a framework that calls them sees
// a filter that cannot do the thing rather than a crash:
//  - rating operations (SniffStream, RateInputFormat): 0, not this filter's stream;
//  - operations that list (IterateOutputChannels, IterateOutputFormats,
//    VerifyOutputFormat): nothing to list, null or 0;
//  - NextBuffer: 1, the error result, with no media buffer;
//  - time conversion: 4002, no conversion; SeekQuery: 1, cannot seek;
//  - TrickQuery: 0, no trick-play capability;
//  - every other operation: 4044, not available.
// The thin interface file has already answered 22 for null arguments.

#include <cstdint>

#include "filter/mkv_filter.h"
#include "platform/interfaces.h"

constexpr int kPendingNotAvailable = 4044;

int PendingRating();
int PendingNotAvailable();
MkvChannel* PendingIterateOutputChannels();
int PendingIterateOutputFormats();
int PendingVerifyOutputFormat();
int PendingNextBuffer(MmfMra** buffer);
int PendingConversion();
int PendingSeekQuery();
int PendingTrickQuery();
