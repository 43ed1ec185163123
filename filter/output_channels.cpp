#include "filter/output_channels.h"

#include <atomic>

#include "filter/mkv_context.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"
#include "platform/read_list.h"

namespace {

constexpr uint32_t kReadListEntries = 2;
constexpr uint32_t kReadListRequests = 2;

// Acquire counts up under StateLock while Release counts down without a
// lock: both go through atomic operations so neither step is lost.
std::atomic_ref<int32_t> AcquiredCount(MkvContext* context) {
  return std::atomic_ref<int32_t>(context->AcquiredChannelCount);
}

}  // namespace

bool LogWithoutTrack(const MkvChannel* channel, const char* operation) {
  const MkvFilter* filter = channel->Filter;
  const MkvChannel* first = filter ? filter->OutputChannels : nullptr;
  const int32_t count = filter && filter->Context ? filter->Context->OutputChannelCount : 0;
  const bool listed = first && channel >= first && channel < first + count;
  const int index = listed ? static_cast<int>(channel - first) : -1;
  const uint32_t track = channel->State->LeftOutTrack;
  if (listed && track != 0 && track <= kMaxTracks && filter->Context->FileInfo.tracks[track - 1].encrypted) {
    // The track as the file numbers it (TrackNumber), as players and tools name it.
    AoLog(kAoLogFailure, "kelvane: %s channel %d has no track: track %llu is encrypted.", operation, index,
          static_cast<unsigned long long>(filter->Context->FileInfo.tracks[track - 1].track_number));
  } else {
    AoLog(kAoLogFailure, "kelvane: %s channel %d has no track.", operation, index);
  }
  return true;
}

MkvChannel* IterateOutputChannels(MkvFilter* filter, int32_t* iterator) {
  if (!filter || !iterator || !filter->Context) return nullptr;
  int32_t index = *iterator;
  if (index < 0 || index >= filter->Context->OutputChannelCount || !filter->OutputChannels) return nullptr;
  *iterator = index + 1;
  return &filter->OutputChannels[index];
}

int AcquireOutputChannel(MkvChannel* channel) {
  if (!channel || !channel->Filter || !channel->State) return kMmfInvalidArgument;
  if (channel->Flags & kChannelAcquired) return kMmfAlreadyAcquired;
  channel->Flags |= kChannelAcquired;

  MkvFilter* filter = channel->Filter;
  MkvContext* context = filter->Context;
  pthread_mutex_lock(&context->StateLock);
  channel->State->Acquired = 1;
  AcquiredCount(context).fetch_add(1);
  // One read list per instance: a later acquisition replaces the earlier list.
  if (context->ReadList) {
    (void)MmfFreeReadlist(context->ReadList);
    context->ReadList = nullptr;
  }
  int result = MmfAllocateReadlist(&context->ReadList, AsFrameworkChannel(filter->InputChannel), kReadListEntries,
                                   kReadListRequests);
  if (result != 0) {
    AoLog(kAoLogFailure, "kelvane: %s MmfAllocateReadlist() failed err = %d", "AcquireOutputChannel", result);
  }
  pthread_mutex_unlock(&context->StateLock);
  return result;
}

int ReleaseOutputChannel(MkvChannel* channel) {
  if (!channel || !channel->Filter || !channel->State) return kMmfInvalidArgument;
  if (!(channel->Flags & kChannelAcquired)) return kMmfNotAcquired;
  channel->Flags &= ~kChannelAcquired;

  MkvContext* context = channel->Filter->Context;
  MkvChannelState* state = channel->State;
  // The frame prefix was written through the CPU, so it goes back as a mapped
  // buffer. The pointer is cleared too: a later acquisition must not reuse or
  // release again a buffer the pool may already have handed to someone else.
  if (state->ConfigBuffer && context->InputPool) {
    (void)context->InputPool->ReleaseMappedBuffer(state->ConfigBuffer);
    state->ConfigBuffer = nullptr;
  }
  if (state->MraPool) {
    (void)MmfFreeMraPool(state->MraPool);
    state->MraPool = nullptr;
  }
  if (context->ReadList) {
    (void)MmfFreeReadlist(context->ReadList);
    context->ReadList = nullptr;
  }
  AcquiredCount(context).fetch_sub(1);
  state->Acquired = 0;
  return kMmfOk;
}
