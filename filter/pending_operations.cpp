#include "filter/pending_operations.h"

#include "platform/mmf_status.h"

int PendingRating() { return kMmfRatingRefused; }
int PendingNotAvailable() { return kPendingNotAvailable; }
MkvChannel* PendingIterateOutputChannels() { return nullptr; }
int PendingIterateOutputFormats() { return 0; }
int PendingVerifyOutputFormat() { return 0; }

int PendingNextBuffer(MmfMra** buffer) {
  *buffer = nullptr;
  return 1;
}

int PendingConversion() { return kMmfNoConversion; }
int PendingSeekQuery() { return 1; }
int PendingTrickQuery() { return 0; }
