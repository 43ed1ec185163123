#include "filter/read_list.h"

#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "platform/ao_log.h"

namespace {

struct CueHit {
  int result;
  uint64_t time;
  uint64_t position;
};

CueHit LookUp(MkvFilter* filter, uint64_t time, uint32_t forward) {
  CueHit hit{0, time, kNoCuePosition};
  hit.result = GetCueingPosition(filter, &hit.time, forward, &hit.position);
  return hit;
}

}  // namespace

int GetNextReadList(MkvChannel* input, MmfReadListEntry** out, MmfReadListEntry* previous) {
  MkvFilter* filter = input->Filter;
  MkvContext* context = filter->Context;
  const uint32_t noted_mode = LoadTrickMode(context);
  pthread_mutex_lock(&context->ReadListLock);
  if (!previous || previous != context->CurrentReadList) {
    *out = context->CurrentReadList;
    pthread_mutex_unlock(&context->ReadListLock);
    return 0;
  }
  if (int error = MmfAcquireReadList(context->ReadList, &context->CurrentReadList); error != 0) {
    AoLog(kAoLogFailure, "kelvane: %s MmfAcquireReadList() failed err = %d", "GetNextReadList", error);
    pthread_mutex_unlock(&context->ReadListLock);
    return error;
  }
  const MmfReadRequest& before = *previous->Request;
  MmfReadRequest& request = *context->CurrentReadList->Request;
  request.Length = before.Length;

  const uint32_t skip = static_cast<uint32_t>(context->TrickTime) * (1000u * context->TrickSpeed) / 100u;
  uint64_t time = before.Time;
  if (LoadTrickMode(context) == kTrickForward) {
    time = before.Time + 1000u * static_cast<uint64_t>(static_cast<uint32_t>(context->TrickTime)) + skip;
  } else if (before.Time > skip) {
    time = before.Time - skip;
  }
  const uint32_t forward = noted_mode == kTrickForward ? 1 : 0;
  CueHit hit = LookUp(filter, time, forward);
  if (hit.result != 0 || hit.position == kNoCuePosition || context->ByteRate == 0) {
    request.Length = kMmfReadEndOfStream;
    AoLog(kAoLogDegraded, "kelvane: %s cueing points weren't enough to trick play.", "GetNextReadList");
  } else if (hit.time == before.Time) {
    request.Length = kMmfReadEndOfStream;
    AoLog(kAoLogNotice, "kelvane: %s detected EOS internally. time = %lld", "GetNextReadList",
          static_cast<long long>(hit.time));
  } else {
    while (hit.position == before.Position) {
      const uint64_t found = hit.time;
      const uint64_t nudged = LoadTrickMode(context) == kTrickForward ? found + 1 : found - 1;
      hit = LookUp(filter, nudged, forward);
      if (hit.time == found) {
        request.Length = kMmfReadEndOfStream;
        AoLog(kAoLogNotice, "kelvane: %s detected EOS internally. time = %lld", "GetNextReadList",
              static_cast<long long>(hit.time));
        break;
      }
    }
  }
  request.Time = hit.time;
  request.Position = hit.position;
  request.Flags = 0;
  context->CurrentReadList->Ready = 1;
  *out = context->CurrentReadList;
  pthread_mutex_unlock(&context->ReadListLock);
  return 0;
}
