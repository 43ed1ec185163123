#include <malloc.h>
#include <pthread.h>

#include <atomic>
#include <cstdlib>

#include "host/heap_control.h"
#include "platform/system.h"

// The plug-in allocates and frees a small block for nearly every block it
// delivers, so small blocks are kept on per-thread free lists by size class,
// as a real-time framework's pool allocator would, instead of going through
// malloc each time. Under AddressSanitizer every block goes to malloc with
// its exact size, so overruns and uses after free are still caught.

#if defined(__SANITIZE_ADDRESS__)
#define KELVANE_HOST_HEAP_CACHE 0
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KELVANE_HOST_HEAP_CACHE 0
#endif
#endif
#ifndef KELVANE_HOST_HEAP_CACHE
#define KELVANE_HOST_HEAP_CACHE 1
#endif

namespace {

// Allocations and live blocks are counted per thread, by the thread alone,
// so that counting costs no locked instruction and no cache line moving
// between cores; the totals are summed when asked for. A thread that ends
// adds its counts to the totals of ended threads.
// Plain fields (a thread_local with atomics would need an initialisation
// check at every use), written by their thread and read by others through
// atomic_ref.
struct ThreadCounts {
  uint64_t allocations;
  int64_t live;
  ThreadCounts* next;  // in the list of running threads' counts
};

pthread_mutex_t counts_lock = PTHREAD_MUTEX_INITIALIZER;
ThreadCounts* running_counts = nullptr;  // guarded by counts_lock
uint64_t ended_allocations = 0;          // guarded by counts_lock
int64_t ended_live = 0;                  // guarded by counts_lock

// Armed by FailNthAllocation: the allocation that takes the count from 1 to 0 fails.
std::atomic<bool> failure_armed{false};
std::atomic<int64_t> failure_countdown{0};

template <typename T>
inline T Read(T& counter) {
  return std::atomic_ref<T>(counter).load(std::memory_order_relaxed);
}

template <typename T>
inline void AddOwn(T& counter, T amount) {
  std::atomic_ref<T>(counter).store(counter + amount, std::memory_order_relaxed);
}

#if KELVANE_HOST_HEAP_CACHE

// Blocks are kept by the size malloc says they can hold (no header of our
// own, so a block costs what malloc's does): list c holds blocks of
// c * kGranule to c * kGranule + kGranule - 1 bytes. A request takes from the
// list of the block malloc gives for its size, found once at load time.
constexpr size_t kGranule = 8;
constexpr size_t kLargestCached = 120;
constexpr uint32_t kClasses = 32;  // room for what malloc gives for kLargestCached bytes
constexpr uint32_t kMostCachedPerClass = 256;

struct RequestClasses {
  uint8_t of[kLargestCached + 1];  // the list a request of n bytes takes from, or kClasses
  // A list never holds blocks smaller than the request: every block in list
  // c holds at least c * kGranule bytes, so the list is at least the
  // request's size in granules, rounded up (an allocator that gives exactly
  // what was asked, as ThreadSanitizer's does, gets no larger list).
  RequestClasses() {
    for (size_t size = 0; size <= kLargestCached; ++size) {
      void* probe = std::malloc(size < 8 ? 8 : size);
      size_t size_class = probe ? malloc_usable_size(probe) / kGranule : kClasses;
      const size_t least = (size + kGranule - 1) / kGranule;
      if (size_class < least) size_class = least;
      of[size] = static_cast<uint8_t>(size_class < kClasses ? size_class : kClasses);
      std::free(probe);
    }
  }
};
const RequestClasses request_classes;

struct FreeBlock {
  FreeBlock* next;
};

// Blocks freed on this thread, by size class; `registered` as in ThreadHeap.
struct ThreadCache {
  FreeBlock* lists[kClasses];
  uint32_t counts[kClasses];
  bool registered;
};

#else

struct ThreadCache {
  bool registered;
};

#endif

// Plain thread data (no initialisation check on each use), registered at the
// thread's first allocation or free (cache.registered); the key's destructor
// gives the cache back to malloc and folds the counts into the ended totals
// when the thread ends.
struct ThreadHeap {
  ThreadCounts counts;
  ThreadCache cache;
};

// Initial-exec: this library is loaded with the program, so its thread data
// sits at a fixed offset and is reached without a call.
[[gnu::tls_model("initial-exec")]] thread_local ThreadHeap thread_heap;

#if KELVANE_HOST_HEAP_CACHE

void EmptyCache(ThreadCache* cache) {
  for (FreeBlock*& list : cache->lists) {
    while (list) {
      FreeBlock* next = list->next;
      std::free(list);
      list = next;
    }
  }
  for (uint32_t& count : cache->counts) count = 0;
}

void* NewBlock(size_t size) {
  ThreadCache& cache = thread_heap.cache;
  if (size <= kLargestCached && request_classes.of[size] < kClasses) {
    const size_t size_class = request_classes.of[size];
    if (FreeBlock* block = cache.lists[size_class]) {
      cache.lists[size_class] = block->next;
      --cache.counts[size_class];
      return block;
    }
  }
  return std::malloc(size < sizeof(FreeBlock) ? sizeof(FreeBlock) : size);
}

void DeleteBlock(void* block) {
  ThreadCache& cache = thread_heap.cache;
  const size_t size_class = malloc_usable_size(block) / kGranule;
  if (size_class < kClasses && cache.counts[size_class] < kMostCachedPerClass && cache.registered) {
    auto* free_block = static_cast<FreeBlock*>(block);
    free_block->next = cache.lists[size_class];
    cache.lists[size_class] = free_block;
    ++cache.counts[size_class];
    return;
  }
  std::free(block);
}

#else

void* NewBlock(size_t size) { return std::malloc(size); }
void DeleteBlock(void* block) { std::free(block); }
void EmptyCache(ThreadCache*) {}

#endif

pthread_key_t heap_key;
pthread_once_t heap_key_once = PTHREAD_ONCE_INIT;

void ThreadEnded(void* data) {
  auto* heap = static_cast<ThreadHeap*>(data);
  EmptyCache(&heap->cache);
  pthread_mutex_lock(&counts_lock);
  ended_allocations += Read(heap->counts.allocations);
  ended_live += Read(heap->counts.live);
  for (ThreadCounts** link = &running_counts; *link; link = &(*link)->next) {
    if (*link == &heap->counts) {
      *link = heap->counts.next;
      break;
    }
  }
  pthread_mutex_unlock(&counts_lock);
  std::atomic_ref<uint64_t>(heap->counts.allocations).store(0, std::memory_order_relaxed);
  std::atomic_ref<int64_t>(heap->counts.live).store(0, std::memory_order_relaxed);
  heap->cache.registered = false;
}

void MakeHeapKey() {
  if (pthread_key_create(&heap_key, ThreadEnded) != 0) std::abort();
}

// The calling thread's heap data, registered on first use. Should the
// registration fail, the counts still go to the thread's record, and a block
// freed there goes back to malloc.
ThreadHeap& OwnHeap() {
  ThreadHeap& heap = thread_heap;
  if (!heap.cache.registered) [[unlikely]] {
    if (pthread_once(&heap_key_once, MakeHeapKey) == 0 && pthread_setspecific(heap_key, &heap) == 0) {
      pthread_mutex_lock(&counts_lock);
      heap.counts.next = running_counts;
      running_counts = &heap.counts;
      pthread_mutex_unlock(&counts_lock);
      heap.cache.registered = true;
    }
  }
  return heap;
}

// The counts of running threads and of those that ended, summed.
template <typename Counter>
int64_t Total(Counter ThreadCounts::*counter, const Counter* ended) {
  pthread_mutex_lock(&counts_lock);
  auto total = static_cast<int64_t>(*ended);
  for (ThreadCounts* counts = running_counts; counts; counts = counts->next) {
    total += static_cast<int64_t>(Read(counts->*counter));
  }
  pthread_mutex_unlock(&counts_lock);
  return total;
}

}  // namespace

namespace host {

void FailNthAllocation(uint64_t n) {
  failure_armed.store(false);
  failure_countdown.store(static_cast<int64_t>(n));
  if (n != 0) failure_armed.store(true);
}

uint64_t AllocationCount() { return static_cast<uint64_t>(Total(&ThreadCounts::allocations, &ended_allocations)); }
int64_t LiveBlockCount() { return Total(&ThreadCounts::live, &ended_live); }

}  // namespace host

extern "C" void* SysAlloc(size_t size) {
  ThreadHeap& heap = OwnHeap();
  AddOwn(heap.counts.allocations, uint64_t{1});
  if (failure_armed.load(std::memory_order_relaxed) && failure_countdown.fetch_sub(1) == 1) {
    failure_armed.store(false);
    return nullptr;
  }
  void* block = NewBlock(size == 0 ? 1 : size);
  if (block) AddOwn(heap.counts.live, int64_t{1});
  return block;
}

extern "C" void SysFree(void* block) {
  if (!block) return;
  AddOwn(OwnHeap().counts.live, int64_t{-1});
  DeleteBlock(block);
}
