#pragma once
// The per-instance context, zero-filled by Create. Lock order: StateLock
// before RingLock; ReadListLock is never held together with another.

#include <pthread.h>

#include <cstdint>

#include "core/file_model.h"
#include "core/metadata_list.h"
#include "platform/interfaces.h"
#include "platform/read_list.h"
#include "platform/resources.h"

struct RingSlot {
  MmfMra* buffer;     // input media buffer; null when the slot is free
  uint8_t use_count;  // output channels that have not yet moved past the slot
};

constexpr int32_t kRingSlots = 40;

// ControlState values the filter sets itself.
constexpr uint32_t kControlNotRated = 0;
constexpr uint32_t kControlStopped = 16;

struct MkvContext {
  // Framework links.
  const MmfMediaOutputOps* MediaOutput;  // the upstream filter's output operations
  const MmfMemoryPoolOps* InputPool;
  MmfMemoryPool* InputPoolParam;

  // Input-buffer ring; guarded by RingLock.
  int32_t RingSize;
  RingSlot* Ring;    // owned; null until rated
  int32_t RingTail;  // oldest slot not yet released
  int32_t RingHead;  // next slot to fill; RingTail == RingHead: empty
  pthread_cond_t RingCond;
  pthread_mutex_t RingLock;
  int32_t ExtraBufferCount;

  mkv_file_info FileInfo;  // read-only once the stream is rated
  uint64_t MicrosecondsPerTick;  // FileInfo's TimecodeScale / 1000: a block's time costs no division

  // Stream set-up.
  uint32_t Rated;
  uint32_t RatingTried;  // an earlier rating may have left a file model, channels or a ring behind
  int32_t OutputChannelCount;
  int32_t AcquiredChannelCount;
  uint64_t Duration;  // "Duration", microseconds
  uint32_t Seekable;

  // Seeking.
  uint32_t CueTableFlags;
  int32_t ByteRate;  // 0 = unknown

  // Read lists and trick play; guarded by ReadListLock.
  uint32_t TrickMode;
  MmfReadList* ReadList;
  MmfReadListEntry* CurrentReadList;
  uint32_t TrickSpeed;
  pthread_mutex_t ReadListLock;

  // Resource values.
  int32_t TrickTime;  // milliseconds
  int32_t TrickPlaySkipStartSpeed;
  int32_t CurrentAudioTrack;
  int32_t TrackCountAudio;
  int32_t CurrentVideoTrack;
  int32_t TrackCountVideo;
  char* TrackAudioLang;  // owned
  char* TrackVideoLang;  // owned

  // Control.
  pthread_mutex_t StateLock;
  uint32_t ControlState;

  mkv_metadata_list* Metadata;  // owned

  int32_t AVSyncDelay;
  int32_t EnablePreroll;

  uint64_t LastPositionTime;

  AoResource* Resources;  // owned: this instance's table
  MmfEventPost EventPost;
};

// ControlState is written under StateLock, but WaitForPool reads it holding
// only RingLock (a waiting channel must see Stop without taking StateLock,
// which would break the lock order). Every write and that read are atomic
// word accesses, so the reader always sees a whole, recent value.
inline uint32_t LoadControlState(const MkvContext* context) {
  return __atomic_load_n(&context->ControlState, __ATOMIC_RELAXED);
}
inline void StoreControlState(MkvContext* context, uint32_t state) {
  __atomic_store_n(&context->ControlState, state, __ATOMIC_RELAXED);
}

// TrickMode is written under ReadListLock, but read before that lock is taken
// (GetNextReadList notes the lookup direction first) and by a channel meeting
// a time marker, which holds only RingLock: every access is an atomic word
// access, as for ControlState.
inline uint32_t LoadTrickMode(const MkvContext* context) { return __atomic_load_n(&context->TrickMode, __ATOMIC_RELAXED); }
inline void StoreTrickMode(MkvContext* context, uint32_t mode) {
  __atomic_store_n(&context->TrickMode, mode, __ATOMIC_RELAXED);
}
