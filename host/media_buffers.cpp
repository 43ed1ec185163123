// Media buffers (MRAs) and their pools. A media buffer holds a reference to
// the pool buffer of each of its buffer elements from the moment the element
// is set until the media buffer is released or the element is replaced.
// Elements appended one after another on the same pool buffer (the frames of
// one input buffer) share one reference, so that each frame costs no locked
// instruction on a count that every channel's frames touch.

#include <condition_variable>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <type_traits>
#include <vector>

#include "host/call_failures.h"
#include "host/memory_pools.h"
#include "host/spin_lock.h"
#include "platform/channel.h"
#include "platform/mra_pool.h"

namespace {

using Element = host::MraElement;
static_assert(std::is_trivial_v<Element>, "elements are raw storage until set; none is read beyond ElementCount");

struct MraPoolState;

struct FreeDeleter {
  void operator()(void* block) const { std::free(block); }
};

// The framework record comes first so that a media buffer is the record's address.
struct HostMra {
  MmfMra record;
  Element* elements;  // Capacity of them
  MraPoolState* pool;
  // The pool buffer the last appended buffer element holds or shares a
  // reference to; null when no element may share it.
  MmfPoolBuffer* referenced;
  uint32_t in_use;
};
static_assert(std::is_standard_layout_v<HostMra>);

// Every output buffer is taken and given back once: the free list has a
// lock of its own that costs no system call, and only a taker that must wait
// for a buffer to come back uses the mutex and condition.
struct MraPoolState {
  host::SpinLock lock;  // the free list, the counts and `closed`
  std::mutex wait_mutex;
  std::condition_variable returned;
  std::atomic<uint32_t> waiting{0};  // takers waiting on `returned`
  std::vector<HostMra> mras;
  // Not zeroed: an element is read only once set, and a large pool costs no memory until its buffers fill.
  std::unique_ptr<Element[], FreeDeleter> elements;
  std::vector<HostMra*> free;
  uint32_t in_use = 0;
  bool closed = false;  // freed by its owner; deleted with the last media buffer
};

// The library is loaded with the program, never by dlopen: its own TLS block, reached directly.
[[gnu::tls_model("initial-exec")]] thread_local uint64_t acquired_on_this_thread = 0;

constexpr int kInvalid = 22;
constexpr int kOutOfRange = 28;
constexpr int kNoneFree = 11;
constexpr int kNoMemory = 12;

HostMra* Host(MmfMra* mra) { return reinterpret_cast<HostMra*>(mra); }
MraPoolState* State(MmfMraPool* pool) { return reinterpret_cast<MraPoolState*>(pool); }

const Element* Find(MmfMra* mra, uint32_t index) {
  if (!mra || index >= mra->ElementCount) return nullptr;
  return &Host(mra)->elements[index];
}

// Whether the element is a buffer element with a pool buffer reference of its own.
inline bool HoldsReference(const Element& element) {
  return element.kind == kMmfElementBuffer && element.type == host::kOwnReference;
}

// Gives back the pool buffer reference a buffer element holds of its own (a
// buffer element always has a handle: the setter refuses a null one). The
// element's bytes are left as they are: nothing reads an element at or past
// ElementCount.
inline void DropReference(const Element& element) {
  if (HoldsReference(element)) host::DropBufferReference(element.handle);
}

// Counts in the element at index when it is the next one and there is room
// (a filter appends nearly every element it sets); false otherwise.
inline bool Append(MmfMra* mra, uint32_t index) {
  const uint32_t count = mra->ElementCount;
  if (index != count || index >= mra->Capacity) return false;
  mra->ElementCount = count + 1;
  return true;
}

// Sets an existing element to `value` (a buffer element with a reference of
// its own), or answers that index is out of range. Rare (a filter fixing up
// what it appended), so it stays out of the setters' path. The new reference
// is taken before the old one goes: an element set again to the same pool
// buffer must not hand that buffer back. A replaced element that holds a
// reference others share hands it to the first of them instead of dropping it.
[[gnu::noinline]] int Replace(MmfMra* mra, uint32_t index, const Element& value) {
  if (index >= mra->ElementCount) return kOutOfRange;
  HostMra* host_mra = Host(mra);
  Element* element = &host_mra->elements[index];
  if (value.kind == kMmfElementBuffer) host::ReferenceBuffer(value.handle);
  if (HoldsReference(*element)) {
    Element* const end = host_mra->elements + mra->ElementCount;
    Element* sharer = element + 1;
    while (sharer != end && !(sharer->kind == kMmfElementBuffer && sharer->handle == element->handle &&
                              sharer->type == host::kSharedReference)) {
      ++sharer;
    }
    if (sharer != end) {
      sharer->type = host::kOwnReference;
    } else {
      host::DropBufferReference(element->handle);
    }
  }
  *element = value;
  host_mra->referenced = nullptr;
  return 0;
}

}  // namespace

namespace host {

MmfMraPool* MakeMraPool(uint32_t count, uint32_t capacity) {
  if (count == 0 || capacity == 0) return nullptr;
  const size_t element_count = static_cast<size_t>(count) * capacity;
  auto* elements = static_cast<Element*>(std::malloc(element_count * sizeof(Element)));
  if (!elements) return nullptr;
  auto* state = new MraPoolState;
  state->elements.reset(elements);
  state->mras.resize(count);
  for (uint32_t i = 0; i < count; ++i) {
    HostMra& mra = state->mras[i];
    mra.record.Capacity = capacity;
    mra.record.ElementCount = 0;
    mra.elements = &state->elements[static_cast<size_t>(i) * capacity];
    mra.pool = state;
    mra.referenced = nullptr;
    mra.in_use = 0;
    state->free.push_back(&mra);
  }
  return reinterpret_cast<MmfMraPool*>(state);
}

const MraElement* MraElements(MmfMra* mra) { return Host(mra)->elements; }

uint64_t MrasAcquiredOnThisThread() { return acquired_on_this_thread; }

uint32_t MraPoolFreeCount(MmfMraPool* pool) {
  std::lock_guard lock(State(pool)->lock);
  return static_cast<uint32_t>(State(pool)->free.size());
}

}  // namespace host

extern "C" int MmfAllocateMraPool(MmfMraPool** pool, MmfChannel* channel, uint32_t capacity) {
  if (!pool || !channel || capacity == 0) return kInvalid;
  uint32_t count = channel->Format.buffer_count ? channel->Format.buffer_count : 1;
  MmfMraPool* made = host::MakeMraPool(count, capacity < host::kOutputBufferElements ? capacity : host::kOutputBufferElements);
  if (!made) return kNoMemory;
  *pool = made;
  return 0;
}

extern "C" int MmfFreeMraPool(MmfMraPool* pool) {
  if (!pool) return kInvalid;
  MraPoolState* state = State(pool);
  bool last;
  {
    std::lock_guard lock(state->lock);
    state->closed = true;
    last = state->in_use == 0;
  }
  {
    std::lock_guard lock(state->wait_mutex);
    state->returned.notify_all();
  }
  if (last) delete state;
  return 0;
}

extern "C" int MmfAcquireMra(MmfMraPool* pool, MmfMra** mra, uint32_t flags) {
  if (!pool || !mra) return kInvalid;
  if (int error = host::TakeInjectedFailure(host::FrameworkCall::kAcquireMra)) return error;
  MraPoolState* state = State(pool);
  auto available = [state] {
    std::lock_guard lock(state->lock);
    return !state->free.empty() || state->closed;
  };
  if (!(flags & kMmfAcquireNoWait) && !available()) {
    // Counted before the last look, so that a buffer given back after it wakes this taker.
    std::unique_lock lock(state->wait_mutex);
    state->waiting.fetch_add(1);
    state->returned.wait(lock, available);
    state->waiting.fetch_sub(1);
  }
  std::lock_guard lock(state->lock);
  if (state->free.empty() || state->closed) return kNoneFree;
  HostMra* taken = state->free.back();
  state->free.pop_back();
  taken->in_use = 1;
  taken->record.ElementCount = 0;
  ++state->in_use;
  ++acquired_on_this_thread;
  *mra = &taken->record;
  return 0;
}

extern "C" int MmfReleaseMra(MmfMra* mra) {
  if (!mra) return kInvalid;
  HostMra* host_mra = Host(mra);
  const Element* elements = host_mra->elements;
  for (uint32_t i = 0, count = mra->ElementCount; i < count; ++i) DropReference(elements[i]);
  mra->ElementCount = 0;
  host_mra->referenced = nullptr;
  MraPoolState* state = host_mra->pool;
  bool delete_pool = false, wake = false;
  {
    std::lock_guard lock(state->lock);
    if (!host_mra->in_use) return kInvalid;
    host_mra->in_use = 0;
    state->free.push_back(host_mra);
    --state->in_use;
    delete_pool = state->closed && state->in_use == 0;
    wake = state->waiting.load() > 0;  // read before the owner may free a pool with none in use
  }
  if (wake) {
    std::lock_guard lock(state->wait_mutex);
    state->returned.notify_one();
  }
  if (delete_pool) delete state;
  return 0;
}

extern "C" int MmfGetMraElementType(MmfMra* mra, uint32_t index, uint32_t* kind) {
  const Element* element = Find(mra, index);
  if (!element || !kind) return kInvalid;
  *kind = element->kind;
  return 0;
}

extern "C" int MmfGetMraBufferElement(MmfMra* mra, uint32_t index, MmfPoolBuffer** handle, uint8_t** address,
                                      uint32_t* size) {
  const Element* element = Find(mra, index);
  if (!element || element->kind != kMmfElementBuffer || !handle || !address || !size) return kInvalid;
  *handle = element->handle;
  *address = element->address;
  *size = element->size;
  return 0;
}

extern "C" int MmfGetMraPropertyElement(MmfMra* mra, uint32_t index, uint32_t* type, uint32_t* low,
                                        uint16_t* high) {
  const Element* element = Find(mra, index);
  if (!element || element->kind != kMmfElementProperty || !type || !low || !high) return kInvalid;
  *type = element->type;
  *low = element->low;
  *high = element->high;
  return 0;
}

extern "C" int MmfSetMraPropertyElement(MmfMra* mra, uint32_t index, uint32_t type, uint32_t low, uint16_t high) {
  if (!mra) return kInvalid;
  if (!Append(mra, index)) {
    return Replace(mra, index, Element{kMmfElementProperty, type, low, high, nullptr, nullptr, 0});
  }
  Element* element = &Host(mra)->elements[index];
  element->kind = kMmfElementProperty;
  element->type = type;
  element->low = low;
  element->high = high;
  return 0;
}

extern "C" int MmfSetMraBufferElement(MmfMra* mra, uint32_t index, MmfPoolBuffer* handle, uint8_t* address,
                                      uint32_t size) {
  if (!mra || !handle || !address) return kInvalid;
  // The bytes must lie inside the pool buffer that keeps them alive: an
  // address before Data wraps to an offset whose end lies past Size or past
  // the top of the address space.
  const uintptr_t offset = reinterpret_cast<uintptr_t>(address) - reinterpret_cast<uintptr_t>(handle->Data);
  uintptr_t end = 0;
  if (__builtin_add_overflow(offset, size, &end) || end > handle->Size) return kInvalid;
  if (!Append(mra, index)) {
    return Replace(mra, index, Element{kMmfElementBuffer, host::kOwnReference, 0, 0, handle, address, size});
  }
  HostMra* host_mra = Host(mra);
  Element* element = &host_mra->elements[index];
  if (handle == host_mra->referenced) {
    element->type = host::kSharedReference;
  } else {
    host::ReferenceBuffer(handle);
    element->type = host::kOwnReference;
    host_mra->referenced = handle;
  }
  element->kind = kMmfElementBuffer;
  element->handle = handle;
  element->address = address;
  element->size = size;
  return 0;
}
