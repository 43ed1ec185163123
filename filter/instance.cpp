#include "filter/instance.h"

#include <atomic>
#include <cstdio>
#include <cstring>

#include "core/memory.h"
#include "filter/mkv_context.h"
#include "filter/resource_table.h"

namespace {

// Numbers the instances of the process; only grows, so names never repeat.
std::atomic<uint32_t> counter{0};

constexpr int32_t kDefaultTrickTime = 500;  // milliseconds

char* CopyString(const char* text) {
  size_t size = std::strlen(text) + 1;
  auto* copy = static_cast<char*>(mem_alloc(size));
  if (copy) std::memcpy(copy, text, size);
  return copy;
}

// The locks in the order Create makes them; Destroy and a failing Create take
// down the ones made.
enum class LocksMade { none, state, ring, ring_cond, all };

void DestroyLocks(MkvContext* context, LocksMade made) {
  if (made >= LocksMade::state) pthread_mutex_destroy(&context->StateLock);
  if (made >= LocksMade::ring) pthread_mutex_destroy(&context->RingLock);
  if (made >= LocksMade::ring_cond) pthread_cond_destroy(&context->RingCond);
  if (made >= LocksMade::all) pthread_mutex_destroy(&context->ReadListLock);
}

LocksMade InitLocks(MkvContext* context) {
  if (pthread_mutex_init(&context->StateLock, nullptr) != 0) return LocksMade::none;
  if (pthread_mutex_init(&context->RingLock, nullptr) != 0) return LocksMade::state;
  if (pthread_cond_init(&context->RingCond, nullptr) != 0) return LocksMade::ring;
  if (pthread_mutex_init(&context->ReadListLock, nullptr) != 0) return LocksMade::ring_cond;
  return LocksMade::all;
}

MkvChannel* MakeInputChannel(MkvFilter* filter) {
  auto* channel = mem_new_zeroed<MkvChannel>();
  if (!channel) return nullptr;
  channel->Name = CopyString("mkvStreamIn");
  if (!channel->Name) {
    mem_free(channel);
    return nullptr;
  }
  channel->Kind = kMmfChannelKind;
  channel->Filter = filter;
  channel->Flags |= kChannelCreated;
  channel->Direction = kMmfDirectionInput;
  channel->Format.stream_type = 0;
  return channel;
}

void FreeHandle(MkvFilter* filter) {
  mem_free(filter->Name);
  mem_free(filter);
}

}  // namespace

MkvFilter* Create() {
  auto* filter = mem_new_zeroed<MkvFilter>();
  if (!filter) return nullptr;

  char name[24];
  std::snprintf(name, sizeof name, "kelvane%u", counter.fetch_add(1));
  filter->Name = CopyString(name);
  if (!filter->Name) {
    FreeHandle(filter);
    return nullptr;
  }
  filter->Kind = kMmfFilterKind;

  MkvContext* context = mem_new_zeroed<MkvContext>();
  if (!context) {
    FreeHandle(filter);
    return nullptr;
  }
  filter->Context = context;

  LocksMade locks = InitLocks(context);
  if (locks != LocksMade::all) {
    DestroyLocks(context, locks);
    mem_free(context);
    FreeHandle(filter);
    return nullptr;
  }

  context->Resources = MakeResourceTable(context);
  if (!context->Resources) {
    DestroyLocks(context, locks);
    mem_free(context);
    FreeHandle(filter);
    return nullptr;
  }

  filter->InputChannel = MakeInputChannel(filter);
  if (!filter->InputChannel) {
    mem_free(context->Resources);
    DestroyLocks(context, locks);
    mem_free(context);
    FreeHandle(filter);
    return nullptr;
  }

  context->TrickTime = kDefaultTrickTime;
  context->TrackAudioLang = nullptr;
  context->TrackVideoLang = nullptr;
  return filter;
}

void FreeOutputChannels(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  if (filter->OutputChannels) {
    for (int32_t i = 0; i < context->OutputChannelCount; ++i) {
      mem_free(filter->OutputChannels[i].State);
      mem_free(filter->OutputChannels[i].Name);
    }
    mem_free(filter->OutputChannels);
    filter->OutputChannels = nullptr;
  }
  context->OutputChannelCount = 0;
}

int Destroy(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  FreeOutputChannels(filter);
  if (context->Metadata) FreeMetadata(context->Metadata);
  mem_free(context->TrackVideoLang);
  mem_free(context->TrackAudioLang);
  mem_free(context->Ring);
  destroy_mkv_file_info(&context->FileInfo);
  DestroyLocks(context, LocksMade::all);

  mem_free(context->Resources);
  mem_free(context);
  mem_free(filter->InputChannel->Name);
  mem_free(filter->InputChannel);
  FreeHandle(filter);
  return 0;
}
