#include "filter/trick_play.h"

#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "filter/read_list.h"
#include "platform/ao_log.h"
#include "platform/graph.h"
#include "platform/mmf_status.h"

namespace {

constexpr uint64_t kTrackTypeAudio = 2;
constexpr uint32_t kListMode = 1;
constexpr uint32_t kNormalStreaming = 0;

void SetTrick(MkvContext* context, uint32_t mode, uint32_t speed) {
  StoreTrickMode(context, mode);
  context->TrickSpeed = speed;
}

int32_t InputBufferSize(const MkvFilter* filter) {
  return static_cast<int32_t>(filter->InputChannel->Format.buffer_size);
}

// Caller holds ReadListLock and has just acquired CurrentReadList.
void FillRequest(MkvContext* context, uint64_t time, uint64_t position, int32_t length) {
  MmfReadRequest& request = *context->CurrentReadList->Request;
  request.Time = time;
  request.Position = position;
  request.Length = length;
  request.Flags = 0;
  context->CurrentReadList->Ready = 1;
}

// Exactly one channel is acquired and the first acquired audio channel exists.
bool AudioOnly(const MkvFilter* filter) {
  const MkvContext* context = filter->Context;
  if (context->AcquiredChannelCount != 1) return false;
  for (int32_t k = 0; k < context->OutputChannelCount; ++k) {
    const MkvChannelState* state = filter->OutputChannels[k].State;
    if (state && state->Acquired && state->Track && state->Track->track_type == kTrackTypeAudio) return true;
  }
  return false;
}

// The bytes of TrickTime milliseconds of the stream, raised to a whole number
// of input buffers (unsigned 32-bit product, signed remainder).
int32_t ScanLength(const MkvFilter* filter) {
  const MkvContext* context = filter->Context;
  const uint32_t bytes =
      static_cast<uint32_t>(context->ByteRate) * static_cast<uint32_t>(context->TrickTime) / 1000u;
  const int32_t length = static_cast<int32_t>(bytes);
  const int32_t buffer_size = InputBufferSize(filter);
  if (length == 0 || buffer_size == 0) return length;
  const auto remainder = static_cast<int32_t>(static_cast<int64_t>(length) % buffer_size);
  if (remainder == 0) return length;
  return static_cast<int32_t>(bytes + static_cast<uint32_t>(buffer_size) - static_cast<uint32_t>(remainder));
}

int CurrentTimeOrLog(MkvFilter* filter, const char* operation, uint64_t* time) {
  int result = GetCurrentTime(filter, time);
  if (result != kMmfOk) AoLog(kAoLogFailure, "kelvane: %s failed to get current time.", operation);
  return result;
}

// Caller holds ReadListLock.
int AcquireEntryOrLog(MkvContext* context, const char* operation) {
  int result = MmfAcquireReadList(context->ReadList, &context->CurrentReadList);
  if (result != kMmfOk) AoLog(kAoLogFailure, "kelvane: %s MmfAcquireReadList() failed err = %d", operation, result);
  return result;
}

int SetListModeOrLog(MkvContext* context, uint32_t mode, const char* operation) {
  int result = MmfStreamerSetListMode(context->ReadList, mode);
  if (result != kMmfOk) {
    AoLog(kAoLogFailure, "kelvane: %s MmfStreamerSetListMode() failed err = %d", operation, result);
  }
  return result;
}

void LogNotEnoughCues(const char* operation) {
  AoLog(kAoLogDegraded, "kelvane: %s cueing points weren't enough to trick play.", operation);
}

// The scan that skips: the first request at the cue point after (forward) or
// at or before (backward) `now`, TrickTime's bytes long, then list mode.
int ScanSkipping(MkvFilter* filter, uint64_t now, uint32_t speed, uint32_t mode, const char* operation) {
  MkvContext* context = filter->Context;
  pthread_mutex_lock(&context->ReadListLock);
  if (int result = AcquireEntryOrLog(context, operation); result != kMmfOk) {
    pthread_mutex_unlock(&context->ReadListLock);
    return result;
  }
  uint64_t time = now;
  uint64_t position = kNoCuePosition;
  const uint32_t forward = mode == kTrickForward ? 1 : 0;
  const int found = GetCueingPosition(filter, &time, forward, &position);
  int32_t length = kMmfReadEndOfStream;
  if (found == kMmfOk && position != kNoCuePosition && context->ByteRate != 0) {
    length = ScanLength(filter);
  } else {
    LogNotEnoughCues(operation);
  }
  FillRequest(context, time, position, length);
  SetTrick(context, mode, speed);
  pthread_mutex_unlock(&context->ReadListLock);
  return SetListModeOrLog(context, kListMode, operation);
}

// An audio-only scan slower than TrickPlaySkipStartSpeed: every frame is
// delivered, streaming goes on normally from the next cue point.
int ScanWithoutSkipping(MkvFilter* filter, uint64_t now) {
  MkvContext* context = filter->Context;
  uint64_t time = now;
  uint64_t position = kNoCuePosition;
  if (int result = GetCueingPosition(filter, &time, 1, &position); result != kMmfOk) {
    LogNotEnoughCues("ScanForward");
    return result;
  }
  pthread_mutex_lock(&context->ReadListLock);
  if (int result = MmfAcquireReadList(context->ReadList, &context->CurrentReadList); result != kMmfOk) {
    pthread_mutex_unlock(&context->ReadListLock);
    return result;
  }
  FillRequest(context, time, position, InputBufferSize(filter));
  pthread_mutex_unlock(&context->ReadListLock);
  return MmfStreamerSetListMode(context->ReadList, kNormalStreaming);
}

}  // namespace

int GetCurrentTime(MkvFilter* filter, uint64_t* time) {
  MmfClock* clock = nullptr;
  const MmfClockOps* ops = nullptr;
  if (int result = MmfGetGraphClock(filter->Graph, &clock, &ops); result != kMmfOk) return result;
  *time = ops->GetTime(clock, 0, 1, 0, 0, 0);
  return kMmfOk;
}

int TrickQuery() { return kTrickCapabilities; }

int ScanForward(MkvFilter* filter, uint32_t speed) {
  uint64_t now = 0;
  if (int result = CurrentTimeOrLog(filter, "ScanForward", &now); result != kMmfOk) return result;
  const auto skip_start = static_cast<uint32_t>(filter->Context->TrickPlaySkipStartSpeed);
  if (skip_start > speed && AudioOnly(filter)) return ScanWithoutSkipping(filter, now);
  return ScanSkipping(filter, now, speed, kTrickForward, "ScanForward");
}

int ScanBackward(MkvFilter* filter, uint32_t speed) {
  uint64_t now = 0;
  if (int result = CurrentTimeOrLog(filter, "ScanBackward", &now); result != kMmfOk) return result;
  return ScanSkipping(filter, now, speed, kTrickBackward, "ScanBackward");
}

int ScanEnd(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  const uint32_t noted_mode = LoadTrickMode(context);
  uint64_t now = 0;
  if (int result = CurrentTimeOrLog(filter, "ScanEnd", &now); result != kMmfOk) return result;
  pthread_mutex_lock(&context->ReadListLock);
  if (int result = AcquireEntryOrLog(context, "ScanEnd"); result != kMmfOk) {
    pthread_mutex_unlock(&context->ReadListLock);
    return result;
  }
  uint64_t time = now;
  uint64_t position = kNoCuePosition;
  const uint32_t forward = noted_mode == kTrickForward ? 1 : 0;
  int32_t length = kMmfReadEndOfStream;
  if (GetCueingPosition(filter, &time, forward, &position) == kMmfOk && position != kNoCuePosition) {
    length = InputBufferSize(filter);
  } else {
    LogNotEnoughCues("ScanEnd");
  }
  FillRequest(context, time, position, length);
  SetTrick(context, 0, 0);
  pthread_mutex_unlock(&context->ReadListLock);
  return SetListModeOrLog(context, kNormalStreaming, "ScanEnd");
}
