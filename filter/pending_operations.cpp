#include "filter/pending_operations.h"

#include "platform/mmf_status.h"

int PendingNotAvailable() { return kPendingNotAvailable; }

int PendingNextBuffer(MmfMra** buffer) {
  *buffer = nullptr;
  return 1;
}

int PendingTrickQuery() { return 0; }
