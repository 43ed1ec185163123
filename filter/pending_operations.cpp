#include "filter/pending_operations.h"

#include "platform/mmf_status.h"

int PendingNotAvailable() { return kPendingNotAvailable; }

int PendingTrickQuery() { return 0; }
