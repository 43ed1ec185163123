#include "host/read_lists.h"

#include <algorithm>
#include <new>

#include "host/call_failures.h"
#include "platform/mmf_status.h"

namespace {

constexpr int kOutOfMemory = 12;

}  // namespace

extern "C" int MmfAllocateReadlist(MmfReadList** list, MmfChannel* channel, uint32_t entry_count,
                                   uint32_t request_count) {
  if (!list || !channel || entry_count == 0 || request_count == 0) return kMmfInvalidArgument;
  if (int error = host::TakeInjectedFailure(host::FrameworkCall::kAllocateReadlist)) return error;
  auto* made = new (std::nothrow) MmfReadList;
  if (!made) return kOutOfMemory;
  made->Channel = channel;
  made->Entries.resize(entry_count);
  made->Requests.resize(static_cast<size_t>(entry_count) * request_count);
  for (uint32_t i = 0; i < entry_count; ++i) {
    MmfReadListEntry& entry = made->Entries[i];
    entry.Index = i;
    entry.RequestCount = request_count;
    entry.Request = &made->Requests[static_cast<size_t>(i) * request_count];
  }
  *list = made;
  return kMmfOk;
}

extern "C" int MmfFreeReadlist(MmfReadList* list) {
  if (!list) return kMmfInvalidArgument;
  delete list;
  return kMmfOk;
}

extern "C" int MmfAcquireReadList(MmfReadList* list, MmfReadListEntry** entry) {
  if (!list || !entry) return kMmfInvalidArgument;
  if (int error = host::TakeInjectedFailure(host::FrameworkCall::kAcquireReadList)) return error;
  std::lock_guard lock(list->Mutex);
  MmfReadListEntry& next = list->Entries[list->NextEntry];
  list->NextEntry = (list->NextEntry + 1) % static_cast<uint32_t>(list->Entries.size());
  next.Ready = 0;
  std::fill_n(next.Request, next.RequestCount, MmfReadRequest{});
  *entry = &next;
  return kMmfOk;
}
